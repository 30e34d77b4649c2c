// The schedule backend's lines of /etc/crontab.
#pragma once

#include "tavischeduler.h"

namespace sched {

// Replaces /etc/crontab atomically: lines that name the runner go, one line for each enabled task
// of the list comes, in list order, and all other lines stay as they are. Then cron is told. 0, or
// -1 with the crontab untouched; the error state names the backend's source and a stable line.
int rewriteCrontab(const TAVI_SCHED_TASK *tasks);

} // namespace sched
