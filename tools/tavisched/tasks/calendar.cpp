// Some days of all tasks.
#include "tasks/calendar.h"

#include <algorithm>
#include <limits>

namespace tavisched {

namespace {

constexpr int64_t kSecond = 1000;
constexpr time_t kHour = 3600;

// The beginning of a day so many days after today.
time_t beginningOf(time_t now, int days) {
    tm local{};
    localtime_r(&now, &local);
    local.tm_mday += days;
    local.tm_hour = local.tm_min = local.tm_sec = 0;
    local.tm_isdst = -1;
    return mktime(&local);
}

void addRuns(Calendar &calendar) {
    std::map<int32_t, Calendar::Entry *> entries;
    for (Calendar::Entry &entry : calendar.entries) {
        entries[entry.task->id] = &entry;
    }
    TAVI_SCHED_RUN_FILTER filter = kAllRuns;
    filter.since = (calendar.from - kHour) * kSecond; // a run may have waited
    for (const Run &run : readRuns(filter)) {
        const auto entry = entries.find(run.taskId);
        const time_t time = startOf(run);
        if (run.isOfRemovedTask != 1 && entry != entries.end() && time >= calendar.from &&
            time < calendar.until) {
            entry->second->runs.push_back(run);
        }
    }
}

// Power schedules start nothing that could get in another one's way.
void addBusyMinutes(Calendar &calendar) {
    std::map<time_t, std::vector<int32_t>> minutes;
    for (const Calendar::Entry &entry : calendar.entries) {
        for (const time_t start : isPower(*entry.task) ? std::vector<time_t>() : entry.starts) {
            minutes[start].push_back(entry.task->id);
        }
    }
    for (const auto &[time, tasks] : minutes) {
        if (tasks.size() > 1) {
            calendar.busy.push_back({time, tasks});
        }
    }
}

} // namespace

Calendar makeCalendar(const TaskPointers &all, const TaskPointers &shown, int past, int days) {
    const time_t now = time(nullptr);
    Calendar calendar{.from = beginningOf(now, -past),
                      .until = beginningOf(now, days),
                      .now = now,
                      .days{},
                      .entries{},
                      .off{},
                      .busy{}};
    constexpr size_t kAll = std::numeric_limits<size_t>::max();
    for (const TAVI_SCHED_TASK *const task : shown) {
        calendar.entries.push_back({task, startsOf(*task, now, calendar.until, kAll), {}});
    }
    for (int day = -past; day < days; ++day) {
        calendar.days.push_back(beginningOf(now, day));
    }
    addRuns(calendar);
    addBusyMinutes(calendar);
    calendar.off = offHours(all, calendar.from, calendar.until);
    return calendar;
}

} // namespace tavisched
