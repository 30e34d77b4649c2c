// When tasks will really be started, and what is remarkable about that.
#pragma once

#include "tasks/tasks.h"

#include <ctime>
#include <map>

namespace tavisched {

// The next moment at which it will be started; nothing when there is none.
std::optional<time_t> nextStart(const TAVI_SCHED_TASK &task);
// "2026-12-24 18:00", or "never".
std::string nextStartInWords(const TAVI_SCHED_TASK &task);

// Those from a moment on, at most so many.
std::vector<time_t> startsOf(const TAVI_SCHED_TASK &task, time_t from, time_t until, size_t most);
// Those that a person is shown of one task, the next five.
std::vector<time_t> comingStarts(const TAVI_SCHED_TASK &task);

// Parts of sentences about a task, such as "it will never run".
using Notes = std::vector<std::string>;
// On a task that need not be stored, beside those that are.
Notes notesOn(const TAVI_SCHED_TASK &task, const TaskPointers &stored);
std::map<const TAVI_SCHED_TASK *, Notes> notesOnAll(const TaskPointers &tasks);

// The hours in which power schedules have the machine off.
std::vector<TAVI_SCHED_SPAN> offHours(const TaskPointers &tasks, time_t from, time_t until);

} // namespace tavisched
