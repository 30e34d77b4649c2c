// Runs as a table.
#pragma once

#include "tasks/runs.h"
#include "tasks/tasks.h"
#include "text/table.h"

namespace tavisched {

Style styleOf(const Run &run);
// The run's task among others, or nullptr when it was removed.
const TAVI_SCHED_TASK *taskOf(const Run &run, const TaskPointers &tasks);
void printRunsTable(const std::vector<Run> &runs, const TaskPointers &tasks);

} // namespace tavisched
