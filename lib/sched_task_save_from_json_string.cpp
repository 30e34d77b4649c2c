// Saving a task from its JSON text: the stored task that the text describes is overwritten, or a
// new one created.
#include "platc.h"
#include "sched_error.h"
#include "sched_handle.h"
#include "tavischeduler.h"

#include <cstring>
#include <exception>
#include <json/json.h>
#include <optional>
#include <string>

namespace {

// The text's object. Comments are not collected: they change no value and cost a pass over the text
// each.
std::optional<Json::Value> parseObject(const char *json) {
    Json::Value root;
    Json::Reader reader;
    if (!reader.parse(json, json + std::strlen(json), root, false) || !root.isObject()) {
        return std::nullopt;
    }
    for (const std::string &name : root.getMemberNames()) {
        if (name.find('\0') != std::string::npos) {
            return std::nullopt;
        }
    }
    return root;
}

// A member's text is JSON once more. What is no JSON there counts as an empty text, and a value
// that has no text throws.
std::string memberText(const Json::Value &member) {
    Json::Value inner;
    const char *const text = member.asCString();
    Json::Reader().parse(text, text + std::strlen(text), inner, false);
    return inner.asString();
}

int fillHash(const Json::Value &root, PLATCSZHASH **hash) {
    for (const std::string &name : root.getMemberNames()) {
        if (PLATCSzHashSetValue(hash, name.c_str(), memberText(root[name]).c_str()) < 0) {
            SCHED_LOG("save appargs failed");
            return -1;
        }
    }
    return 0;
}

int create(TAVI_SCHED_TASK *task) {
    if (TAVISchedTaskCreate(task) < 0) {
        SCHED_LOG("create task failed, task id=%ld", static_cast<long>(task->id));
        return -1;
    }
    return task->id;
}

// The text describes the stored task when application and name are the same.
bool describesStored(const TAVI_SCHED_TASK &task, const TAVI_SCHED_TASK &stored) {
    return std::strcmp(stored.app, task.app) == 0 && std::strcmp(stored.name, task.name) == 0;
}

int store(TAVI_SCHED_TASK *task, bool forceCreate) {
    TAVI_SCHED_TASK stored{};
    if (forceCreate || TAVISchedTaskGetByID(task->id, &stored) != 0 ||
        !describesStored(*task, stored)) {
        return create(task);
    }
    // The text does not name the backend; the record still has the one of a new task.
    task->backend = stored.backend;
    if (TAVISchedTaskEdit(task) != 0) {
        SCHED_LOG("overwrite failed, task=%ld", static_cast<long>(task->id));
        return -1;
    }
    return task->id;
}

int save(TAVI_SCHED_TASK *task, const char *json, bool forceCreate) {
    const std::optional<Json::Value> root = parseObject(json);
    if (!root) {
        SCHED_LOG("parse json failed, szJson=%s", sched::LogText(json).c_str());
        return -1;
    }
    sched::Hash hash(512);
    if (!hash) {
        SCHED_LOG("Out of memory");
        return -1;
    }
    if (root->empty()) {
        return task->id;
    }
    if (fillHash(*root, hash.address()) < 0) {
        return -1;
    }
    if (TAVISchedInitTaskFromHash(hash.get(), task) < 0) {
        SCHED_LOG("hash to task failed, task id=%ld", static_cast<long>(task->id));
        return -1;
    }
    return store(task, forceCreate);
}

} // namespace

int32_t TAVISchedTaskSaveFromJson(const char *szJson, int create) {
    if (!szJson || *szJson == '\0') {
        SCHED_LOG("Bad parameter");
        return -1;
    }
    const sched::Allocated<TAVI_SCHED_TASK> task(TAVISchedTaskAlloc());
    if (!task) {
        SCHED_LOG("alloc task failed.[0x%04X %s:%d]", SCHED_LAST_ERROR);
        return -1;
    }
    try {
        return save(task.get(), szJson, create != 0);
    } catch (const std::exception &) {
        // JsonCpp throws on texts that are nested too deeply and on members that are no strings.
        SCHED_LOG("parse json failed, szJson=%s", sched::LogText(szJson).c_str());
        return -1;
    }
}
