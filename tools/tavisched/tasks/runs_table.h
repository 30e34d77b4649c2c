// Runs as a table.
#pragma once

#include "tasks/runs.h"
#include "text/table.h"

namespace tavisched {

Style styleOf(const Run &run);
void printRunsTable(const std::vector<Run> &runs);

} // namespace tavisched
