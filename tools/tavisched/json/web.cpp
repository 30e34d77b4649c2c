// Tasks as the web back end exchanges them.
#include "json/web.h"
#include "failure.h"
#include "text/words.h"
#include "json/json.h"
#include "json/stored_form.h"

#include <algorithm>
#include <charconv>
#include <json/reader.h>
#include <json/writer.h>
#include <map>
#include <sstream>

namespace tavisched {

namespace {

constexpr size_t kTextSize = 160 * 1024;         // holds every task
constexpr const char *kOwnerName = "owner name"; // nor has it this one

using Members = std::map<std::string, std::string>;

std::string inner(const std::string &text) {
    return Json::valueToQuotedString(text.c_str()) + "\n";
}

bool isBackend(const std::string &value) {
    return value == std::to_string(TAVI_SCHED_BACKEND_SCHEDULE) ||
           value == std::to_string(TAVI_SCHED_BACKEND_AUTOPOWER);
}

Members readMembers(const Json::Value &element, ImportFaults &faults) {
    Members members;
    for (const std::string &key : element.getMemberNames()) {
        Json::Value text;
        if (!element[key].isString() || parseJson(element[key].asString(), true, text) ||
            !text.isString()) {
            faults.add(key, "accepted: a string whose text is a JSON string, such as "
                            "\"\\\"daily\\\"\"");
        } else if ((key + text.asString()).find('\0') != std::string::npos) {
            faults.add(key, "it holds a NUL; accepted: text without one");
        } else if (key == kBackend && !isBackend(text.asString())) {
            faults.add(key, "accepted: -2, a task, or -3, a power schedule");
        } else {
            members[key] = text.asString();
        }
    }
    return members;
}

std::string valueIn(const Members &members, const char *key) {
    const auto member = members.find(key);
    return member == members.end() ? "" : member->second;
}

// The ids that the power backend makes begin with 6 to 9 and have eight digits.
bool isPowerId(const std::string &text) {
    constexpr int32_t kLowest = 60'000'000;
    constexpr int32_t kHighest = 99'999'999;
    int32_t id = 0;
    std::from_chars(text.data(), text.data() + text.size(), id);
    return id >= kLowest && id <= kHighest;
}

// The member "backend" tells; a text of the web back end has none, and there a power schedule shows
// by its id and arguments.
bool isPowerSchedule(const Members &members) {
    if (members.contains(kBackend)) {
        return valueIn(members, kBackend) == std::to_string(TAVI_SCHED_BACKEND_AUTOPOWER);
    }
    const std::string arguments = valueIn(members, "app args");
    return isPowerId(valueIn(members, "id")) && (arguments == kPowerOn || arguments == kPowerOff);
}

std::string sameName(const std::string &key) {
    return key;
}

} // namespace

Json::Value webTask(const TAVI_SCHED_TASK &task) {
    std::string text(kTextSize, '\0');
    if (TAVISchedTaskConvertToJson(&task, text.data(), text.size()) != 0) {
        throw Failure(called(task) + " cannot be written as JSON: " + libraryError());
    }
    Json::Value value;
    std::istringstream(text.c_str()) >> value;
    value[kBackend] = inner(std::to_string(task.backend));
    value[kOwnerName] = inner(ownerName(task.owner));
    return value;
}

// The other form has no member with a blank in its name, and calls the command otherwise.
bool isWebTask(const Json::Value &element) {
    const auto names = element.getMemberNames();
    return std::any_of(names.begin(), names.end(), [](const std::string &name) {
        return name == "cmd" || name.find(' ') != std::string::npos;
    });
}

Imported readWeb(const Json::Value &element, ImportFaults &faults) {
    const size_t before = faults.count();
    const Members members = readMembers(element, faults);
    Hash form;
    for (const auto &[key, value] : members) {
        if (key != kBackend && key != kOwnerName) {
            form.set(key, value);
        }
    }
    for (const TAVI_SCHED_FAULT &fault : form.faults()) {
        // A member that is there but could not be taken has been told already.
        if (fault.kind != TAVI_SCHED_FAULT_MISSING || !element.isMember(fault.key)) {
            faults.add(fault.key, fault.reason);
        }
    }
    if (faults.count() != before) {
        return {};
    }
    const bool power = isPowerSchedule(members);
    Imported imported{newTask(power ? TAVI_SCHED_BACKEND_AUTOPOWER : TAVI_SCHED_BACKEND_SCHEDULE),
                      ""};
    if (TAVISchedInitTaskFromHash(form.get(), imported.task.get()) != 0) {
        faults.add("", "it cannot be read: " + libraryError());
        return {};
    }
    if (power && imported.task->type == TAVI_SCHED_TYPE_DAILY) {
        TAVISchedCTaskSetWeek(imported.task.get(), "1111111"); // the days alone count there
    }
    if (members.contains(kOwnerName)) {
        takeOwner(members.at(kOwnerName), kOwnerName, imported, faults);
    }
    return faults.count() == before && requireGood(*imported.task, sameName, faults)
               ? std::move(imported)
               : Imported{};
}

} // namespace tavisched
