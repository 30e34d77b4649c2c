// How "add" and "edit" tell of the task that they have stored, or would store.
#pragma once

#include "commands/commands.h"
#include "tasks/tasks.h"

namespace tavisched {

// `idBefore` is the task's own when it was stored under it, or is new.
void tellStored(const TAVI_SCHED_TASK &task, int32_t idBefore, const Manner &manner);
void tellPreview(TAVI_SCHED_TASK &task, const Tasks &stored, const Manner &manner);

} // namespace tavisched
