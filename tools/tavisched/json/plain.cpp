// Tasks and runs as plain JSON.
#include "json/plain.h"
#include "failure.h"
#include "text/days.h"
#include "text/moments.h"
#include "text/utf8.h"
#include "text/words.h"
#include "json/stored_form.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <pwd.h>

namespace tavisched {

namespace {

enum class Kind { Number, Flag, Text, Days, Command };

// The members, and the keys of the stored form that they stand for.
constexpr struct Member {
    const char *name;
    const char *key;
    Kind kind = Kind::Text;
} kMembers[] = {
    {"id", "id", Kind::Number},
    {"name", "name"},
    {"state", "state"},
    {"type", "type"},
    {"week", "week", Kind::Days},
    {"startYear", "start year", Kind::Number},
    {"startMonth", "start month", Kind::Number},
    {"startDay", "start day", Kind::Number},
    {"runHour", "run hour", Kind::Number},
    {"runMinute", "run min", Kind::Number},
    {"repeatHour", "repeat hour", Kind::Number},
    {"lastWorkHour", "last work hour", Kind::Number},
    {"ownerId", "owner", Kind::Number},
    {"command", "cmd", Kind::Command},
    {"app", "app"},
    {"appName", "app name"},
    {"appArgs", "app args"},
    {"action", "action"},
    {"canRunTaskSameTime", "can run task same time", Kind::Flag},
    {"canRunAppSameTime", "can run app same time", Kind::Flag},
    {"listable", "listable", Kind::Flag},
    {"canEditName", "can edit name", Kind::Flag},
    {"canEditOwner", "can edit owner", Kind::Flag},
    {"canRunFromUI", "can run from ui", Kind::Flag},
    {"canDeleteFromUI", "can delete from ui", Kind::Flag},
    {"canEditFromUI", "can edit from ui", Kind::Flag},
    {"editDialog", "edit dialog"},
    {"editForm", "edit form"},
    {"simpleEditForm", "simple edit form", Kind::Flag},
};
constexpr const char *kOwner = "owner";
constexpr std::array<std::string_view, 6> kThatFollow = {"schedule", "nextRun", "nextStart",
                                                         "lastRun",  "notes",   "starts"};

const Member *memberNamed(std::string_view name) {
    const auto *const member = std::find_if(std::begin(kMembers), std::end(kMembers),
                                            [&](const Member &row) { return row.name == name; });
    return member == std::end(kMembers) ? nullptr : member;
}

std::string nameOfKey(const std::string &key) {
    const auto *const member = std::find_if(std::begin(kMembers), std::end(kMembers),
                                            [&](const Member &row) { return row.key == key; });
    return member == std::end(kMembers) ? key : member->name;
}

// ---- Writing ----

// A mask that is none is written as it is.
Json::Value daysOf(const std::string &week) {
    if (week.size() != TAVI_SCHED_WEEK_DAYS || week.find_first_not_of("01") != std::string::npos) {
        return plainText(week);
    }
    Json::Value days(Json::arrayValue);
    for (size_t day = 0; day < week.size(); ++day) {
        if (week[day] == '1') {
            days.append(TAVISchedWeekDayNames[day]);
        }
    }
    return days;
}

Json::Value valueOf(Kind kind, const std::string &text, const TAVI_SCHED_TASK &task) {
    int64_t number = 0;
    switch (kind) {
    case Kind::Number:
        std::from_chars(text.data(), text.data() + text.size(), number);
        return static_cast<Json::Int64>(number);
    case Kind::Flag:
        return text == "1";
    case Kind::Days:
        return daysOf(text);
    case Kind::Command:
        return plainText(task.command);
    default:
        return plainText(text);
    }
}

// ---- Reading ----

bool isNumberText(std::string_view text) {
    return !text.empty() && text.find_first_not_of("0123456789") == std::string_view::npos;
}

// The stored text of a member, or nothing, which is a fault then.
std::optional<std::string> textOf(const Member &member, const Json::Value &value,
                                  ImportFaults &faults) {
    const auto refuse = [&](const char *accepted) {
        faults.add(member.name, std::string("accepted: ") + accepted);
        return std::nullopt;
    };
    switch (member.kind) {
    case Kind::Number:
        return value.isIntegral() ? std::optional(value.asString()) : refuse("a whole number");
    case Kind::Flag:
        return value.isBool() ? std::optional<std::string>(value.asBool() ? "1" : "0")
                              : refuse("true or false");
    case Kind::Days:
        break;
    default:
        if (!value.isString()) {
            return refuse("a text");
        }
        return value.asString().find('\0') == std::string::npos ? std::optional(value.asString())
                                                                : refuse("a text without a NUL");
    }
    // An array of days, or a text with them.
    std::vector<std::string> days;
    for (const Json::Value &day : value.isArray() ? value : Json::Value(Json::arrayValue)) {
        days.push_back(day.isString() ? day.asString() : "");
    }
    if (value.isArray() && value.empty()) {
        return std::string(TAVI_SCHED_WEEK_DAYS, '0');
    }
    try {
        return parseDays(value.isString() ? value.asString() : join(days, ","), "--weekly");
    } catch (const Refusal &) {
        return refuse("days, such as [\"Mon\", \"Fri\"]");
    }
}

int32_t backendOf(const Json::Value &element, ImportFaults &faults) {
    const Json::Value &value = element[kBackend];
    if (value.isNull() || value == TAVI_SCHED_BACKEND_SCHEDULE) {
        return TAVI_SCHED_BACKEND_SCHEDULE;
    }
    if (value != TAVI_SCHED_BACKEND_AUTOPOWER) {
        faults.add(kBackend, "accepted: -2, a task, or -3, a power schedule");
    }
    return TAVI_SCHED_BACKEND_AUTOPOWER;
}

bool isKnown(const std::string &name) {
    return memberNamed(name) || name == kBackend || name == kOwner ||
           std::find(kThatFollow.begin(), kThatFollow.end(), name) != kThatFollow.end();
}

std::string allNames() {
    std::vector<std::string> names = {kBackend, kOwner};
    for (const Member &member : kMembers) {
        names.emplace_back(member.name);
    }
    return join(names, ", ");
}

void readMembers(const Json::Value &element, Hash &form, ImportFaults &faults) {
    for (const std::string &name : element.getMemberNames()) {
        const Member *const member = memberNamed(name);
        if (!isKnown(name)) {
            faults.add(name, "no task has it; accepted: " + allNames());
        } else if (const auto text =
                       member ? textOf(*member, element[name], faults) : std::nullopt) {
            // The command has a coded form, and is set when the task is there.
            if (member->kind != Kind::Command) {
                form.set(member->key, *text);
            }
        }
    }
    for (const TAVI_SCHED_FAULT &fault : form.faults()) {
        faults.add(nameOfKey(fault.key), fault.reason);
    }
}

} // namespace

std::string plainText(const std::string &text) {
    return isUtf8(text) ? text : printable(text);
}

Json::Value plainStored(const TAVI_SCHED_TASK &task) {
    const Hash form(task);
    Json::Value value;
    for (const Member &member : kMembers) {
        value[member.name] = valueOf(member.kind, form.value(member.key), task);
    }
    value[kBackend] = task.backend;
    value[kOwner] = ownerName(task.owner);
    return value;
}

Json::Value plainRun(const Run &run) {
    const auto timeOf = [](int64_t milliseconds) {
        return milliseconds == 0 ? Json::Value() : Json::Value(isoTime(seconds(milliseconds)));
    };
    const auto number = [](int64_t value) { return static_cast<Json::Int64>(value); };
    constexpr double kSecond = 1000;
    const bool hasRun = run.began != 0 && run.ended != 0;
    const bool hasWaited = run.waitingSince != 0;
    Json::Value value;
    value["run"] = number(run.run);
    value["task"] = run.taskId;
    value["name"] = plainText(run.name);
    value["taskRemoved"] = run.isOfRemovedTask == 1;
    value["owner"] = ownerName(run.owner);
    value["startedBy"] = run.mode == 1 ? Json::Value() : Json::Value(startInWords(run));
    value["byCron"] = run.mode == 1;
    value["due"] = timeOf(run.due);
    value["asked"] = timeOf(run.asked);
    value["start"] = timeOf(run.began);
    value["end"] = timeOf(run.ended);
    value["duration"] =
        hasRun ? Json::Value(static_cast<double>(run.duration) / kSecond) : Json::Value();
    value["waitingSince"] = timeOf(run.waitingSince);
    value["waited"] = run.waited;
    value["waitedFor"] = hasWaited ? Json::Value(run.waitedFor) : Json::Value();
    value["result"] = resultInWords(run);
    value["statusCode"] = run.result;
    value["number"] = run.number;
    value["outputSize"] = number(run.outputSize);
    value["outputKept"] = number(run.outputKept);
    value["pid"] = run.pid;
    return value;
}

Json::Value plainTimes(const std::vector<time_t> &times) {
    Json::Value value(Json::arrayValue);
    for (const time_t time : times) {
        value.append(isoTime(time));
    }
    return value;
}

Json::Value plainPower(const TAVI_SCHED_TASK &task) {
    return isPower(task) ? Json::Value(task.appArgs == kPowerOn ? "on" : "off") : Json::Value();
}

Json::Value plainTask(const TAVI_SCHED_TASK &task, const LatestRuns &latestRuns,
                      const Notes &notes) {
    const auto next = nextRun(task);
    const auto start = nextStart(task);
    const auto run = latestRuns.find(task.id);
    Json::Value value = plainStored(task);
    value["schedule"] = scheduleInWords(task);
    value["nextRun"] = next ? Json::Value(*next) : Json::Value();
    value["nextStart"] = start ? Json::Value(isoTime(*start)) : Json::Value();
    value["lastRun"] = run == latestRuns.end() ? Json::Value() : plainRun(run->second);
    value["notes"] = Json::Value(Json::arrayValue);
    for (const std::string &note : notes) {
        value["notes"].append(note);
    }
    return value;
}

Json::Value plainTaskWithStarts(const TAVI_SCHED_TASK &task, const LatestRuns &latestRuns,
                                const Notes &notes) {
    Json::Value value = plainTask(task, latestRuns, notes);
    value["starts"] = plainTimes(comingStarts(task));
    return value;
}

void takeOwner(const std::string &name, const std::string &member, Imported &imported,
               ImportFaults &faults) {
    TAVI_SCHED_TASK &task = *imported.task;
    if (isNumberText(name)) {
        return; // it had no name where it was written
    }
    const passwd *const user = getpwnam(name.c_str());
    if (!user) {
        faults.add(member, "there is no user \"" + name + "\", who has the number " +
                               std::to_string(task.owner) +
                               " where it was written; accepted: a user of this machine");
    } else if (user->pw_uid != task.owner) {
        imported.note = "the owner " + name + " has the number " + std::to_string(user->pw_uid) +
                        " here, not " + std::to_string(task.owner);
        TAVISchedCTaskSetOwner(&task, static_cast<int>(user->pw_uid));
    }
}

bool requireGood(const TAVI_SCHED_TASK &task, std::string (*nameOf)(const std::string &key),
                 ImportFaults &faults) {
    const auto fault = findFault(task);
    if (fault) {
        faults.add(nameOf(fault->key), fault->reason);
    }
    return !fault;
}

Imported readPlain(const Json::Value &element, ImportFaults &faults) {
    const size_t before = faults.count();
    const int32_t backend = backendOf(element, faults);
    Imported imported{newTask(backend), ""};
    Hash form(*imported.task);
    form.set("id", "-1");
    form.set("name", ""); // the library makes one of the id
    readMembers(element, form, faults);
    const bool needsCommand = backend == TAVI_SCHED_BACKEND_SCHEDULE;
    if (needsCommand && !element.isMember("command")) {
        faults.add("command", "it is missing");
    }
    if (element.isMember(kOwner) && !element[kOwner].isString()) {
        faults.add(kOwner, "accepted: the name of a user");
    }
    if (faults.count() != before) {
        return {};
    }
    if (TAVISchedInitTaskFromHash(form.get(), imported.task.get()) != 0) {
        faults.add("", "it cannot be read: " + libraryError());
        return {};
    }
    const std::string command = element["command"].asString();
    if (command.size() > TAVI_SCHED_MAX_COMMAND) {
        faults.add("command", std::to_string(command.size()) + " bytes; accepted: at most " +
                                  std::to_string(TAVI_SCHED_MAX_COMMAND));
        return {};
    }
    TAVISchedCTaskSetCommand(imported.task.get(), command.c_str());
    const bool isEveryDay = imported.task->type == TAVI_SCHED_TYPE_DAILY;
    if (backend == TAVI_SCHED_BACKEND_AUTOPOWER && isEveryDay) {
        TAVISchedCTaskSetWeek(imported.task.get(), "1111111"); // the days alone count there
    }
    if (element.isMember(kOwner)) {
        const bool hasNumber = element.isMember("ownerId");
        takeOwner(element[kOwner].asString(), kOwner, imported, faults);
        imported.note = hasNumber ? imported.note : "";
    }
    return faults.count() == before && requireGood(*imported.task, nameOfKey, faults)
               ? std::move(imported)
               : Imported{};
}

} // namespace tavisched
