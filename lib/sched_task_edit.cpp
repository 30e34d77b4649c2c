// Replacing a stored task, between the plug-in hooks.
#include "change/batch.h"
#include "runs/run_changes.h"
#include "sched_backend.h"
#include "sched_error.h"
#include "sched_handle.h"
#include "sched_hook.h"
#include "tavischeduler.h"

namespace {

int editBetweenHooks(sched::ChangeHook &hook, TAVI_SCHED_TASK *task) {
    hook.before();
    if (sched::initBackends(SCHED_SITE) != 0) {
        return -1;
    }
    return sched::dispatch(SCHED_SITE, "edit", task, &TAVI_SCHED_BACKEND_RECORD::edit).value_or(-1);
}

// A power schedule's id follows from its content: the old one is free then, or another's.
void leaveOldPowerId(int32_t id) {
    const auto row =
        sched::findBackend(TAVI_SCHED_BACKEND_AUTOPOWER, &TAVI_SCHED_BACKEND_RECORD::get_by_id);
    auto present = sched::allocateTask();
    if (row && present && SchedBackends[*row].get_by_id(id, present.get()) == 0) {
        sched::separateFromRemovedTask(id);
    }
}

} // namespace

int TAVISchedTaskEdit(TAVI_SCHED_TASK *pTask) {
    SCHED_REQUIRE(pTask, "((void *)0) != pTask", -1);
    TAVI_SCHED_TASK oldTask{};
    if (TAVISchedTaskGetByID(pTask->id, &oldTask) < 0) {
        SCHED_LOG("get task failed. id:[%ld] [0x%04X %s:%d]", static_cast<long>(pTask->id),
                  SCHED_LAST_ERROR);
        return -1;
    }
    if (!sched::isBatchOpen()) {
        sched::recordMissedRuns();
    }
    sched::ChangeHook hook(SCHED_SITE, "task_edit", &oldTask, pTask);
    const int result = hook.initialised() ? editBetweenHooks(hook, pTask) : -1;
    if (result == 0 && oldTask.backend == TAVI_SCHED_BACKEND_AUTOPOWER) {
        sched::whenStored(leaveOldPowerId, oldTask.id);
    }
    if (sched::isBatchOpen()) {
        sched::deferHook(hook, result);
    } else {
        hook.after(result);
    }
    return result;
}
