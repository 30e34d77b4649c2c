// Results of runs in words, for the system log and for handlers.
#pragma once

#include "tavischeduler.h"

#include <string>

namespace sched {

// One stable word: "success", "exit", "signal", ...
const char *resultWord(int32_t result);
// The same with the number that belongs to it: "exit 3", "given up, task 4 was running".
std::string resultWords(const TAVI_SCHED_RUN &run);

} // namespace sched
