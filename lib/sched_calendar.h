// What a schedule means on the calendar, shared by the next trigger time, the due test and the
// crontab line, and the conversion of system time to a date record.
#pragma once

#include "sched_error.h"
#include "tavischeduler.h"

#include <algorithm>
#include <cstdint>
#include <ctime>

namespace sched {

inline bool runsOnWeekDay(const TAVI_SCHED_TASK &task, uint32_t wday) {
    return task.week[wday] != '0';
}

// Calls the function with each hour of a day at which the task runs, in rising order, until it
// answers false. The last work hour may be any 32-bit number: callers stop when they have enough.
template <typename Function> void forEachRunHour(const TAVI_SCHED_TASK &task, Function &&function) {
    const uint64_t last = std::max(task.runHour, task.lastWorkHour);
    uint64_t hour = task.runHour;
    while (function(hour) && task.repeatHour > 0) {
        hour += task.repeatHour;
        if (hour > last) {
            return;
        }
    }
}

// Fills the record with the local date and time; the site is the caller's.
inline int toLocalDate(time_t time, TAVI_SCHED_DATE &date, const Site &site) {
    const tm *local = std::localtime(&time);
    if (!local) {
        SCHED_LOG_FOR(site, "localtime failed. %m");
        PLATCErrSetEx(kSystemCallFailed, site.file, site.line);
        return -1;
    }
    date = {.year = static_cast<uint32_t>(local->tm_year) + 1900,
            .month = static_cast<uint32_t>(local->tm_mon) + 1,
            .day = static_cast<uint32_t>(local->tm_mday),
            .wday = static_cast<uint32_t>(local->tm_wday),
            .hour = static_cast<uint32_t>(local->tm_hour),
            .minute = static_cast<uint32_t>(local->tm_min)};
    return 0;
}

} // namespace sched
