// The subcommand "calendar": some days of all tasks as a timeline.
#include "tasks/calendar.h"
#include "commands/commands.h"
#include "text/moments.h"
#include "text/timeline.h"
#include "text/words.h"
#include "json/json.h"
#include "json/plain.h"

#include <cstdio>

namespace tavisched {

namespace {

Json::Value plainEntry(const Calendar::Entry &entry) {
    const char *const state = TAVISchedEnumToName(TAVISchedStateTable, entry.task->state);
    Json::Value value;
    value["id"] = entry.task->id;
    value["name"] = plainText(entry.task->name);
    value["state"] = state ? state : "";
    value["owner"] = ownerName(entry.task->owner);
    value["schedule"] = scheduleInWords(*entry.task);
    value["power"] = plainPower(*entry.task);
    value["starts"] = plainTimes(entry.starts);
    value["runs"] = Json::Value(Json::arrayValue);
    for (const Run &run : entry.runs) {
        value["runs"].append(plainRun(run));
    }
    return value;
}

void printAsJson(const Calendar &calendar) {
    const auto list = [] { return Json::Value(Json::arrayValue); };
    Json::Value value;
    value["from"] = isoTime(calendar.from);
    value["until"] = isoTime(calendar.until);
    value["now"] = isoTime(calendar.now);
    value["days"] = plainTimes(calendar.days);
    value["tasks"] = list();
    for (const Calendar::Entry &entry : calendar.entries) {
        value["tasks"].append(plainEntry(entry));
    }
    value["off"] = list();
    for (const TAVI_SCHED_SPAN &span : calendar.off) {
        Json::Value hours;
        hours["from"] = isoTime(span.from);
        hours["until"] = isoTime(span.until);
        value["off"].append(std::move(hours));
    }
    value["busy"] = list();
    for (const Calendar::Minute &minute : calendar.busy) {
        Json::Value busy;
        busy["time"] = isoTime(minute.time);
        busy["tasks"] = list();
        for (const int32_t id : minute.tasks) {
            busy["tasks"].append(id);
        }
        value["busy"].append(std::move(busy));
    }
    printJson(value);
}

} // namespace

int calendar(const CalendarOptions &options) {
    const Tasks all = Tasks::read();
    TaskPointers shown = all.all();
    if (!options.all) {
        std::erase_if(shown, [](const auto *task) { return task->listable != 1; });
    }
    const Calendar calendar = makeCalendar(all.all(), shown, options.past, options.days);
    if (options.json) {
        printAsJson(calendar);
    } else if (shown.empty()) {
        std::printf("There are no tasks%s.\n",
                    all.all().empty() ? "" : " to show; --all shows all");
    } else {
        printTimeline(calendar, options.hours);
    }
    return 0;
}

} // namespace tavisched
