// A task as JSON text: one object with the members of its stored form. Every member's text is the
// JSON rendering of the value once more; the saving side parses it twice as well.
#include "platc.h"
#include "sched_error.h"
#include "sched_handle.h"
#include "sched_text.h"
#include "tavischeduler.h"
#include "validity/utf8.h"

#include <exception>
#include <json/json.h>
#include <string>

namespace {

constexpr size_t kSmallestBuffer = 40960;

// JsonCpp takes what follows the first byte of a character for the rest of it, whatever it is.
std::string render(PLATCSZHASH *hash, const PLATCSZLIST *keys, int count) {
    Json::FastWriter writer;
    Json::Value root;
    for (int i = 0; i < count; ++i) {
        const char *const key = PLATCSzListGet(keys, i);
        root[key] = writer.write(Json::Value(sched::toUtf8(PLATCSzHashGetValue(hash, key))));
    }
    return writer.write(root);
}

int convert(const TAVI_SCHED_TASK *task, char *buffer, size_t size) {
    sched::Hash hash(512);
    sched::List keys(512);
    if (!hash || !keys) {
        SCHED_LOG("Out of memory");
        return -1;
    }
    if (TAVISchedInitHashFromTask(hash.address(), task) < 0) {
        SCHED_LOG("Task to hash failed");
        return -1;
    }
    const int count = PLATCSzHashEnumKey(hash.get(), keys.address());
    if (count < 0) {
        SCHED_LOG("enum hash key failed");
        return -1;
    }
    sched::copyText(buffer, size, render(hash.get(), keys.get(), count).c_str());
    return 0;
}

} // namespace

int TAVISchedTaskConvertToJson(const TAVI_SCHED_TASK *pTask, char *szBuf, size_t cbBuf) {
    if (!pTask || !szBuf || cbBuf < kSmallestBuffer) {
        SCHED_LOG("Bad parameter");
        return -1;
    }
    try {
        return convert(pTask, szBuf, cbBuf);
    } catch (const std::exception &) {
        SCHED_LOG("Out of memory");
        return -1;
    }
}

int TAVISchedTaskConvertToJsonById(int32_t id, char *szBuf, size_t cbBuf) {
    if (id < 0 || !szBuf || cbBuf < kSmallestBuffer) {
        SCHED_LOG("Bad parameter");
        return -1;
    }
    const sched::Allocated<TAVI_SCHED_TASK> task(TAVISchedTaskAlloc());
    if (!task) {
        SCHED_LOG("TAVISchedTaskAlloc failed");
        return -1;
    }
    if (TAVISchedTaskGetByID(id, task.get()) < 0) {
        SCHED_LOG("cannot get scheduler task, id=%ld", static_cast<long>(id));
        return -1;
    }
    if (TAVISchedTaskConvertToJson(task.get(), szBuf, cbBuf) < 0) {
        SCHED_LOG("scheduler task to json failed, task=%ld", static_cast<long>(id));
        return -1;
    }
    return 0;
}
