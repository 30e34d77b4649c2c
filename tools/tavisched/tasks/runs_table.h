// Runs as a table.
#pragma once

#include "tasks/runs.h"
#include "text/table.h"

namespace tavisched {

Style styleOf(const Run &run);
void printRunsTable(const std::vector<Run> &runs);
// The runs that the filter keeps, none of which is kept in memory.
void printRunsTable(const TAVI_SCHED_RUN_FILTER &filter);

} // namespace tavisched
