// Reading a task: a backend's defaults, or a stored task by its id.
#include "sched_backend.h"
#include "sched_error.h"
#include "tavischeduler.h"

int TAVISchedTaskGetDefault(TAVI_SCHED_TASK *pTask) {
    SCHED_REQUIRE(pTask, "((void *)0) != pTask", -1);
    if (sched::initBackends(SCHED_SITE) != 0) {
        return -1;
    }
    return sched::dispatch(SCHED_SITE, "get_default", pTask,
                           &TAVI_SCHED_BACKEND_RECORD::get_default)
        .value_or(-1);
}

int TAVISchedTaskGetByID(int32_t id, TAVI_SCHED_TASK *pTask) {
    SCHED_REQUIRE(pTask, "((void *)0) != pTask", -1);
    if (sched::initBackends(SCHED_SITE) != 0) {
        return -1;
    }
    const auto rows = sched::registeredBackends();
    for (size_t row = 0; row < rows.size(); ++row) {
        const TAVI_SCHED_BACKEND_RECORD &backend = rows[row];
        if (!backend.get_by_id || (backend.owns_id && backend.owns_id(id) == 0)) {
            continue;
        }
        const int result = backend.get_by_id(id, pTask);
        if (result < 0) {
            sched::logBackendFailure(SCHED_SITE, "get_by_id", row, id);
            return -1;
        }
        if (result == 1) {
            return 0;
        }
    }
    SCHED_LOG("No %s backend is found for task [%ld] ", "get_by_id", static_cast<long>(id));
    sched::setNoBackend(SCHED_SITE);
    return -1;
}
