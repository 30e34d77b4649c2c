// Telling handlers of a run that has ended.
#pragma once

#include "tavischeduler.h"

#include <sys/types.h>

namespace sched {

// Runs all handlers, one after the other, in the name order. To be called in a process of its own:
// handlers take as long as they take.
void runHandlers(const TAVI_SCHED_RUN &run);

// Ends the handlers of that process that have run for a minute, with what they have started.
void endHangingHandlers(pid_t process);

} // namespace sched
