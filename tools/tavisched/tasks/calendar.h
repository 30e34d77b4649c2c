// Some days of all tasks: what has run, what will be started, and when the machine is off.
#pragma once

#include "tasks/runs.h"
#include "tasks/starts.h"

namespace tavisched {

struct Calendar {
    struct Entry {
        const TAVI_SCHED_TASK *task;
        std::vector<time_t> starts; // coming ones
        std::vector<Run> runs;      // that began or were due, the newest first
    };
    struct Minute {
        time_t time;
        std::vector<int32_t> tasks; // that all start then
    };

    time_t from, until, now;
    std::vector<time_t> days; // where they begin
    std::vector<Entry> entries;
    std::vector<TAVI_SCHED_SPAN> off;
    std::vector<Minute> busy;
};

// From the beginning of the day so many days ago until the end of so many days, today the first.
// The tasks to show are among all of them.
Calendar makeCalendar(const TaskPointers &all, const TaskPointers &shown, int past, int days);

} // namespace tavisched
