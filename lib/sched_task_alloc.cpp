// Allocation and release of a single task.
#include "sched_error.h"
#include "sched_handle.h"
#include "tavischeduler.h"

TAVI_SCHED_TASK *TAVISchedTaskAlloc() {
    auto task = sched::allocateTask();
    if (!task) {
        SCHED_LOG("Allocate TAVI_SCHED_TASK failed. %m");
        SCHED_SET_ERROR(sched::kTaskOutOfMemory);
        return nullptr;
    }
    task->backend = TAVI_SCHED_BACKEND_SCHEDULE;
    if (TAVISchedTaskGetDefault(task.get()) < 0) {
        SCHED_LOG("Init task to default failed. [0x%04X %s:%d]", SCHED_LAST_ERROR);
        return nullptr;
    }
    return task.release();
}

int TAVISchedTaskFree(TAVI_SCHED_TASK *pTask) {
    SCHED_REQUIRE(pTask, "((void *)0) != pTask", -1);
    std::free(pTask);
    return 0;
}
