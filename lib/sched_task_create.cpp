// Storing a new task.
#include "sched_backend.h"
#include "sched_error.h"
#include "sched_hook.h"
#include "tavischeduler.h"

int TAVISchedTaskCreate(TAVI_SCHED_TASK *pTask) {
    if (sched::initBackends(SCHED_SITE) != 0) {
        return -1;
    }
    const auto result =
        sched::dispatch(SCHED_SITE, "create", pTask, &TAVI_SCHED_BACKEND_RECORD::create);
    if (result) {
        return *result;
    }
    // The hook fires only here, unlike those of edit and remove: handlers have come to take a
    // "task_create" as news of a creation that found no backend.
    sched::ChangeHook hook(SCHED_SITE, "task_create", nullptr, pTask);
    hook.after(-1);
    return -1;
}
