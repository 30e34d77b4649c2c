// What changes of tasks mean for the records of their runs. Nothing of this makes a change fail.
#pragma once

#include "tavischeduler.h"

#include <cstdint>

namespace sched {

// The id is free, or a new task's, from here on: the runs that there are were not its. To be called
// when that is stored.
void separateFromRemovedTask(int32_t id);
void separateFromNewTask(int32_t id);

// Records the times at which tasks were due since the last look and nothing started them. To be
// called before tasks change, as it goes by what they are now.
void recordMissedRuns();
// Records, where that is asked for, that cron has asked for a task and why it does not run.
void recordSkipped(const TAVI_SCHED_TASK &task, int32_t result);
// The same when nothing changes: what may still be on its way is left for the next look. 0 or -1.
int findMissedRuns();
// The same after the machine's start, from which on looks are taken.
void beginRecording();

} // namespace sched
