// The text that "tavisched import" reads: what it takes is sound, and comes back from both forms of
// an export; what it refuses can go to a terminal.
#include "failure.h"
#include "fuzz.h"
#include "text/utf8.h"
#include "json/import.h"
#include "json/json.h"
#include "json/web.h"

#include <algorithm>
#include <json/writer.h>

namespace {

using tavisched::Imported;

// ---- What the members say ----

constexpr struct {
    const char *name;
    uint32_t TAVI_SCHED_TASK::*field;
} kNumbers[] = {
    {"runHour", &TAVI_SCHED_TASK::runHour},       {"runMinute", &TAVI_SCHED_TASK::runMin},
    {"repeatHour", &TAVI_SCHED_TASK::repeatHour}, {"lastWorkHour", &TAVI_SCHED_TASK::lastWorkHour},
    {"startYear", &TAVI_SCHED_TASK::startYear},   {"startMonth", &TAVI_SCHED_TASK::startMonth},
    {"startDay", &TAVI_SCHED_TASK::startDay}};
constexpr struct {
    const char *name;
    int32_t TAVI_SCHED_TASK::*field;
} kFlags[] = {{"canRunTaskSameTime", &TAVI_SCHED_TASK::canRunTaskSameTime},
              {"canRunAppSameTime", &TAVI_SCHED_TASK::canRunAppSameTime},
              {"listable", &TAVI_SCHED_TASK::listable},
              {"canEditName", &TAVI_SCHED_TASK::canEditName},
              {"canEditOwner", &TAVI_SCHED_TASK::canEditOwner},
              {"canRunFromUI", &TAVI_SCHED_TASK::canRunFromUI},
              {"canDeleteFromUI", &TAVI_SCHED_TASK::canDeleteFromUI},
              {"canEditFromUI", &TAVI_SCHED_TASK::canEditFromUI},
              {"simpleEditForm", &TAVI_SCHED_TASK::simpleEditForm}};

std::string weekOf(const Json::Value &days) {
    std::string week = "0000000";
    for (const Json::Value &day : days) {
        for (size_t i = 0; i < week.size(); ++i) {
            week[i] = day == TAVISchedWeekDayNames[i] ? '1' : week[i];
        }
    }
    return week;
}

bool isOfNames(const Json::Value &days) {
    return days.isArray() && std::all_of(days.begin(), days.end(), [](const Json::Value &day) {
               return std::any_of(std::begin(TAVISchedWeekDayNames),
                                  std::end(TAVISchedWeekDayNames),
                                  [&day](const char *name) { return day == name; });
           });
}

void requirePlain(const Json::Value &element, const TAVI_SCHED_TASK &task) {
    for (const auto &[name, field] : kNumbers) {
        REQUIRE(!element.isMember(name) || element[name].asUInt() == task.*field);
    }
    for (const auto &[name, field] : kFlags) {
        REQUIRE(!element.isMember(name) || element[name].asBool() == (task.*field == 1));
    }
    const std::pair<const char *, const char *> texts[] = {
        {"name", task.name},
        {"command", task.command},
        {"app", task.app},
        {"appName", task.appName},
        {"appArgs", task.appArgs},
        {"action", task.action},
        {"editDialog", task.editDialog},
        {"editForm", task.editForm},
        {"state", TAVISchedEnumToName(TAVISchedStateTable, task.state)},
        {"type", TAVISchedEnumToName(TAVISchedTypeTable, task.type)}};
    for (const auto &[name, text] : texts) {
        REQUIRE(!element.isMember(name) || element[name] == text);
    }
    const bool isEveryDay =
        task.backend == TAVI_SCHED_BACKEND_AUTOPOWER && task.type == TAVI_SCHED_TYPE_DAILY;
    REQUIRE(isEveryDay || !isOfNames(element["week"]) || weekOf(element["week"]) == task.week);
}

// Without the member "backend" by id and arguments.
bool isPowerInWeb(const Json::Value &element) {
    Json::Value value;
    const auto textOf = [&](const char *key) {
        return element.isMember(key) && !tavisched::parseJson(element[key].asString(), true, value)
                   ? value.asString()
                   : "";
    };
    const int id = std::atoi(textOf("id").c_str());
    const std::string arguments = textOf("app args");
    return element.isMember("backend") ? textOf("backend") == "-3"
                                       : id >= 60'000'000 && id <= 99'999'999 &&
                                             (arguments == "poweron" || arguments == "poweroff");
}

void requireMembers(const Json::Value &element, const TAVI_SCHED_TASK &task) {
    const bool isWeb = tavisched::isWebTask(element);
    REQUIRE(tavisched::isPower(task) == (isWeb ? isPowerInWeb(element) : element["backend"] == -3));
    if (!isWeb) {
        requirePlain(element, task);
        return;
    }
    const fuzz::Pairs form = fuzz::formOf(task);
    for (const std::string &key : element.getMemberNames()) {
        Json::Value value;
        const bool isRead = !tavisched::parseJson(element[key].asString(), true, value);
        const bool differs = key == "owner" || key == "week"; // by the owner's name, and the type
        REQUIRE(isRead && (!form.contains(key) || differs || value == form.at(key)));
    }
}

void requireMembers(const std::string &text, const std::vector<Imported> &tasks) {
    Json::Value root;
    REQUIRE(!tavisched::parseJson(text, false, root));
    REQUIRE(tasks.size() == (root.isObject() ? 1 : root.size()));
    for (Json::ArrayIndex i = 0; i < tasks.size(); ++i) {
        requireMembers(root.isObject() ? root : root[i], *tasks[i].task);
    }
}

// ---- Another import ----

Json::Value exported(const TAVI_SCHED_TASK &task, bool web) {
    return web ? tavisched::webTask(task) : tavisched::plainStored(task);
}

void requireSame(const std::vector<Imported> &tasks, bool web) {
    Json::Value array(Json::arrayValue);
    for (const Imported &each : tasks) {
        if (!web && !tavisched::isUtf8(each.task->command)) {
            return; // an export refuses it
        }
        array.append(exported(*each.task, web));
    }
    const auto again =
        tavisched::parseImport(Json::writeString(Json::StreamWriterBuilder(), array));
    REQUIRE(again.size() == tasks.size());
    for (size_t i = 0; i < tasks.size(); ++i) {
        REQUIRE(again[i].task->backend == tasks[i].task->backend);
        REQUIRE(fuzz::formOf(*again[i].task) == fuzz::formOf(*tasks[i].task));
    }
}

} // namespace

void fuzz::test(Input input) {
    const std::string text = input.rest();
    std::vector<Imported> tasks;
    try {
        tasks = tavisched::parseImport(text);
    } catch (const tavisched::Refusal &refusal) {
        REQUIRE(refusal.what() == tavisched::printableLines(refusal.what()));
        return;
    }
    for (const Imported &each : tasks) {
        TAVI_SCHED_FAULT fault{};
        REQUIRE(TAVISchedTaskCheck(each.task.get(), &fault) == 0);
        tavisched::requireExchangeable(*each.task);
    }
    requireMembers(text, tasks);
    requireSame(tasks, false);
    requireSame(tasks, true);
}
