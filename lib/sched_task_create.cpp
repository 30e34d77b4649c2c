// Storing a new task.
#include "change/batch.h"
#include "change/change.h"
#include "runs/run_changes.h"
#include "sched_backend.h"
#include "sched_error.h"
#include "sched_hook.h"
#include "tavischeduler.h"

int TAVISchedTaskCreate(TAVI_SCHED_TASK *pTask) {
    if (sched::initBackends(SCHED_SITE) != 0) {
        return -1;
    }
    if (!sched::isBatchOpen()) {
        sched::recordMissedRuns();
    }
    const auto result =
        sched::dispatch(SCHED_SITE, "create", pTask, &TAVI_SCHED_BACKEND_RECORD::create);
    if (result == 0) {
        sched::whenStored(sched::separateFromNewTask, pTask->id);
    }
    if (result) {
        return *result;
    }
    // The hook fires only here, unlike those of edit and remove: handlers have come to take a
    // "task_create" as news of a creation that found no backend.
    const sched::KeptError error;
    sched::ChangeHook hook(SCHED_SITE, "task_create", nullptr, pTask);
    hook.after(-1);
    return -1;
}

namespace {

// Of the schedule backend alone: the others compute their ids.
bool isFree(int32_t id) {
    for (const TAVI_SCHED_BACKEND_RECORD &backend : sched::registeredBackends()) {
        TAVI_SCHED_TASK present{};
        if ((backend.owns_id && backend.owns_id(id) != 0) ||
            (backend.get_by_id && backend.get_by_id(id, &present) != 0)) {
            return false;
        }
    }
    return id > 0;
}

} // namespace

int TAVISchedTaskCreateWithId(TAVI_SCHED_TASK *pTask) {
    SCHED_REQUIRE(pTask, "((void *)0) != pTask", -1);
    if (sched::initBackends(SCHED_SITE) != 0) {
        return -1;
    }
    sched::Change change;
    if (!change) {
        return -1;
    }
    SCHED_REQUIRE(pTask->backend == TAVI_SCHED_BACKEND_SCHEDULE && isFree(pTask->id), "id is free",
                  -1);
    if (!sched::isBatchOpen()) {
        sched::recordMissedRuns();
    }
    const int result =
        sched::dispatch(SCHED_SITE, "edit", pTask, &TAVI_SCHED_BACKEND_RECORD::edit).value_or(-1);
    if (result != 0 || change.finish() != 0) {
        return -1;
    }
    sched::whenStored(sched::separateFromNewTask, pTask->id);
    return 0;
}
