// Tasks and runs as JSON.
#include "json.h"
#include "failure.h"
#include "stored_form.h"
#include "text.h"
#include "words.h"

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <json/reader.h>
#include <json/writer.h>
#include <memory>
#include <optional>
#include <sstream>

namespace tavisched {

namespace {

constexpr size_t kWebTextSize = 160 * 1024; // holds every task
constexpr const char *kBackend = "backend"; // the member that the stored form does not have

// Strict JSON. What is wrong with the text, or nothing when it is in `value`.
std::optional<std::string> parseJson(const std::string &text, bool anyRoot, Json::Value &value) {
    Json::CharReaderBuilder builder;
    Json::CharReaderBuilder::strictMode(&builder.settings_);
    builder["strictRoot"] = !anyRoot;
    const std::unique_ptr<Json::CharReader> reader(builder.newCharReader());
    std::string errors;
    try {
        if (reader->parse(text.data(), text.data() + text.size(), &value, &errors)) {
            return std::nullopt;
        }
    } catch (const Json::Exception &refusal) { // of deep nesting
        errors = refusal.what();
    }
    std::replace(errors.begin(), errors.end(), '\n', ' ');
    return printable(errors);
}

// ---- Import ----

// Reads the elements of an import into tasks and gathers what is wrong with them.
class Import {
  public:
    void add(const Json::Value &element) {
        ++number_;
        if (!element.isObject()) {
            addFault("", "it is no object");
            return;
        }
        const size_t faultsBefore = faults_.size();
        const std::map<std::string, std::string> members = readMembers(element);
        Hash form;
        for (const auto &[key, value] : members) {
            if (key != kBackend) {
                form.set(key, value);
            }
        }
        for (const TAVI_SCHED_FAULT &fault : form.faults()) {
            // A member that is there but could not be taken has been told already.
            if (fault.kind != TAVI_SCHED_FAULT_MISSING || !element.isMember(fault.key)) {
                addFault(fault.key, fault.reason);
            }
        }
        if (faults_.size() == faultsBefore) {
            addTask(members, form);
        }
    }

    std::vector<Task> take() {
        if (!faults_.empty()) {
            throw Refusal("nothing was imported:\n  " + join(faults_, "\n  "));
        }
        return std::move(tasks_);
    }

  private:
    void addFault(const std::string &key, const std::string &what) {
        faults_.push_back("element " + std::to_string(number_) +
                          (key.empty() ? "" : ", member \"" + printable(key) + "\"") + ": " + what);
    }

    std::map<std::string, std::string> readMembers(const Json::Value &element) {
        std::map<std::string, std::string> members;
        for (const std::string &key : element.getMemberNames()) {
            Json::Value inner;
            if (!element[key].isString() || parseJson(element[key].asString(), true, inner) ||
                !inner.isString()) {
                addFault(key, "accepted: a string whose text is a JSON string, such as "
                              "\"\\\"daily\\\"\"");
            } else if ((key + inner.asString()).find('\0') != std::string::npos) {
                addFault(key, "it holds a NUL; accepted: text without one");
            } else if (key == kBackend && !isBackend(inner.asString())) {
                addFault(key, "accepted: -2, a task, or -3, a power schedule");
            } else {
                members[key] = inner.asString();
            }
        }
        return members;
    }

    static bool isBackend(const std::string &value) {
        return value == std::to_string(TAVI_SCHED_BACKEND_SCHEDULE) ||
               value == std::to_string(TAVI_SCHED_BACKEND_AUTOPOWER);
    }

    // The member "backend" tells; a text of the web back end has none, and there a power schedule
    // shows by its id and arguments.
    static bool isPowerSchedule(const std::map<std::string, std::string> &members) {
        const auto value = [&](const char *key) {
            const auto member = members.find(key);
            return member == members.end() ? "" : member->second;
        };
        if (members.contains(kBackend)) {
            return value(kBackend) == std::to_string(TAVI_SCHED_BACKEND_AUTOPOWER);
        }
        const int32_t id = std::atoi(value("id").c_str());
        const auto backends = registeredBackends();
        const bool isClaimed =
            std::any_of(backends.begin(), backends.end(), [id](const auto &backend) {
                return backend.owns_id && backend.owns_id(id) != 0;
            });
        return isClaimed && (value("app args") == kPowerOn || value("app args") == kPowerOff);
    }

    // All members are good; the task as a whole may not be.
    void addTask(const std::map<std::string, std::string> &members, const Hash &form) {
        const bool power = isPowerSchedule(members);
        Task task = newTask(power ? TAVI_SCHED_BACKEND_AUTOPOWER : TAVI_SCHED_BACKEND_SCHEDULE);
        if (TAVISchedInitTaskFromHash(form.get(), task.get()) != 0) {
            addFault("", "it cannot be read: " + libraryError());
            return;
        }
        if (power && task->type == TAVI_SCHED_TYPE_DAILY) {
            TAVISchedCTaskSetWeek(task.get(), "1111111"); // the backend looks at the days alone
        }
        if (const auto fault = findFault(*task)) {
            addFault(fault->key, fault->reason);
        }
        tasks_.push_back(std::move(task));
    }

    int number_ = 0;
    std::vector<std::string> faults_;
    std::vector<Task> tasks_;
};

std::string write(const Json::Value &value, const char *indentation) {
    Json::StreamWriterBuilder builder;
    builder["indentation"] = indentation;
    builder["emitUTF8"] = true;
    builder["enableYAMLCompatibility"] = true; // no blank before a colon
    return Json::writeString(builder, value);
}

} // namespace

// ---- For scripts ----

Json::Value plainRun(const Run &run) {
    Json::Value value;
    value["task"] = run.taskId;
    value["start"] = localTime(run.start);
    value["startTime"] = static_cast<Json::Int64>(run.start);
    value["result"] = printable(resultInWords(run));
    value["statusCode"] = run.code;
    value["comment"] = printable(run.comment);
    value["pid"] = run.pid;
    return value;
}

Json::Value plainTask(const TAVI_SCHED_TASK &task, const std::map<int32_t, Run> &latestRuns) {
    const auto text = [](const char *name) { return name ? Json::Value(name) : Json::Value(); };
    const auto utf8 = [](const char *bytes) { return isUtf8(bytes) ? bytes : printable(bytes); };
    const auto next = nextRun(task);
    const auto run = latestRuns.find(task.id);
    Json::Value value;
    value["id"] = task.id;
    value["backend"] = task.backend;
    value["name"] = utf8(task.name);
    value["state"] = text(TAVISchedEnumToName(TAVISchedStateTable, task.state));
    value["type"] = text(TAVISchedEnumToName(TAVISchedTypeTable, task.type));
    value["schedule"] = scheduleInWords(task);
    value["nextRun"] = next ? Json::Value(*next) : Json::Value();
    value["owner"] = ownerName(task.owner);
    value["ownerId"] = task.owner;
    value["listable"] = task.listable == 1;
    value["app"] = utf8(task.app);
    value["command"] = utf8(task.command);
    value["lastRun"] = run == latestRuns.end() ? Json::Value() : plainRun(run->second);
    return value;
}

void printJson(const Json::Value &value) {
    std::printf("%s\n", write(value, "  ").c_str());
}

// ---- For exchange ----

std::string webText(const TAVI_SCHED_TASK &task) {
    std::string text(kWebTextSize, '\0');
    if (TAVISchedTaskConvertToJson(&task, text.data(), text.size()) != 0) {
        throw Failure(called(task) + " cannot be written as JSON: " + libraryError());
    }
    text.resize(text.find('\0'));
    while (!text.empty() && text.back() == '\n') {
        text.pop_back();
    }
    return text;
}

Json::Value exportedTask(const TAVI_SCHED_TASK &task) {
    const Hash form(task);
    for (const std::string &key : form.keys()) {
        if (!isUtf8(form.value(key))) {
            throw Failure(called(task) + ": its \"" + key +
                          "\" is not valid UTF-8 and would not come back from an import");
        }
    }
    Json::Value value;
    std::istringstream(webText(task)) >> value;
    value[kBackend] = "\"" + std::to_string(task.backend) + "\"\n";
    return value;
}

std::vector<Task> parseImport(const std::string &text) {
    Json::Value root;
    if (const auto fault = parseJson(text, false, root)) {
        throw Refusal("nothing was imported: the text is no JSON: " + *fault);
    }
    if (!root.isArray()) {
        throw Refusal("nothing was imported: the text is no JSON array of tasks, such as "
                      "\"tavisched export\" writes");
    }
    Import import;
    for (const Json::Value &element : root) {
        import.add(element);
    }
    return import.take();
}

} // namespace tavisched
