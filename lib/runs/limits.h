// How many records of runs are kept.
#pragma once

#include "tavischeduler.h"

#include <string>
#include <vector>

namespace sched {

// What is wrong in their file has been logged and is passed over.
TAVI_SCHED_RUN_LIMITS readRunLimits();
// That, a sentence each.
std::vector<std::string> faultsOfRunLimits();

} // namespace sched
