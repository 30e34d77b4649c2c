// What "add" and "edit" can say about a task, as it was typed, and turning it into a task.
#pragma once

#include "tavischeduler.h"

#include <optional>
#include <string>

namespace tavisched {

// Texts that are not there were not given.
struct TaskOptions {
    std::optional<std::string> name, command, at, weekly, monthly, yearly, once, every, until,
        owner, app, power;
    bool daily = false;
    bool enabled = false, disabled = false;
    bool allowOverlap = false, noOverlap = false;

    bool any() const;
    // Says when the task runs.
    bool schedule() const;
};

// Changes the task as the options say and leaves the rest of it. Refused, with the option's name,
// when an option cannot be accepted or the task as a whole would be wrong.
void apply(const TaskOptions &options, TAVI_SCHED_TASK &task);

// Refused when the task has no run ahead: a schedule that has passed is a slip.
void refusePast(TAVI_SCHED_TASK &task);

} // namespace tavisched
