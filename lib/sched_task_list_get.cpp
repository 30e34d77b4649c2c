// Task lists: gathering the tasks of all backends, walking a list and freeing it.
#include "sched_backend.h"
#include "sched_error.h"
#include "sched_handle.h"
#include "tavischeduler.h"

namespace {

int listOf(size_t row, sched::TaskList &tasks, TAVI_SCHED_FILTER filter) {
    const int count = SchedBackends[row].list_get(tasks.address(), filter);
    if (count < 0) {
        SCHED_LOG("Failed to list_get for backend [%d] [0x%04X %s:%d]", static_cast<int>(row),
                  SCHED_LAST_ERROR);
    }
    return count;
}

} // namespace

int TAVISchedTaskListGet(TAVI_SCHED_TASK **pTaskList, TAVI_SCHED_FILTER filter) {
    SCHED_REQUIRE(pTaskList, "((void *)0) != pTaskList", -1);
    sched::TaskList tasks;
    if (sched::initBackends(SCHED_SITE) != 0) {
        return -1;
    }
    int total = 0;
    int count = 0; // the last that any row answered: a row without the operation adds it once more
    const auto rows = sched::registeredBackends();
    for (size_t row = 0; row < rows.size(); ++row) {
        if (rows[row].list_get) {
            const int result = listOf(row, tasks, filter);
            if (result < 0) {
                continue;
            }
            count = result;
        }
        total += count;
    }
    if (total > 0) {
        *pTaskList = tasks.release();
    }
    return total;
}

int TAVISchedTaskListGetOf(int32_t backend, TAVI_SCHED_TASK **pTaskList, TAVI_SCHED_FILTER filter) {
    SCHED_REQUIRE(pTaskList, "((void *)0) != pTaskList", -1);
    if (sched::initBackends(SCHED_SITE) != 0) {
        return -1;
    }
    const auto row = sched::findBackend(backend, &TAVI_SCHED_BACKEND_RECORD::list_get);
    if (!row) {
        SCHED_LOG("No %s backend (%ld) is found", "list_get", static_cast<long>(backend));
        sched::setNoBackend(SCHED_SITE);
        return -1;
    }
    sched::TaskList tasks;
    const int count = listOf(*row, tasks, filter);
    if (count > 0) {
        *pTaskList = tasks.release();
    }
    return count;
}

TAVI_SCHED_TASK *TAVISchedTaskNext(const TAVI_SCHED_TASK *pTask) {
    return pTask ? pTask->next : nullptr;
}

void TAVISchedTaskListFree(TAVI_SCHED_TASK **pTaskList) {
    while (pTaskList && *pTaskList) {
        TAVI_SCHED_TASK *const task = *pTaskList;
        *pTaskList = task->next;
        std::free(task);
    }
}
