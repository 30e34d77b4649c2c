// Removing a stored task, between the plug-in hooks.
#include "change/batch.h"
#include "runs/run_changes.h"
#include "sched_backend.h"
#include "sched_error.h"
#include "sched_hook.h"
#include "tavischeduler.h"

namespace {

int removeBetweenHooks(sched::ChangeHook &hook, int32_t id, int32_t backend) {
    hook.before();
    if (sched::initBackends(SCHED_SITE) != 0) {
        return -1;
    }
    const auto row = sched::findBackend(backend, &TAVI_SCHED_BACKEND_RECORD::remove);
    if (!row) {
        SCHED_LOG("No %s backend is found for task [%ld] ", "remove", static_cast<long>(id));
        sched::setNoBackend(SCHED_SITE);
        return -1;
    }
    if (SchedBackends[*row].remove(id) < 0) {
        sched::logBackendFailure(SCHED_SITE, "remove", *row, id);
        return -1;
    }
    return 0;
}

} // namespace

int TAVISchedTaskRemove(int32_t id) {
    TAVI_SCHED_TASK oldTask{};
    if (TAVISchedTaskGetByID(id, &oldTask) < 0) {
        SCHED_LOG("get task failed. id:[%ld] [0x%04X %s:%d]", static_cast<long>(id),
                  SCHED_LAST_ERROR);
        return -1;
    }
    if (!sched::isBatchOpen()) {
        sched::recordMissedRuns();
    }
    sched::ChangeHook hook(SCHED_SITE, "task_remove", &oldTask, nullptr);
    const int result = hook.initialised() ? removeBetweenHooks(hook, id, oldTask.backend) : -1;
    if (result == 0) {
        sched::whenStored(sched::separateFromRemovedTask, id);
    }
    if (sched::isBatchOpen()) {
        sched::deferHook(hook, result);
    } else {
        hook.after(result);
    }
    return result;
}
