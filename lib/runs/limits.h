// How many records of runs are kept.
#pragma once

#include "tavischeduler.h"

namespace sched {

TAVI_SCHED_RUN_LIMITS readRunLimits();

} // namespace sched
