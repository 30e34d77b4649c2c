// Saving a task: a new one is created, any other edited.
#include "sched_error.h"
#include "tavischeduler.h"

int TAVISchedTaskSave(TAVI_SCHED_TASK *pTask) {
    SCHED_REQUIRE(pTask, "((void *)0) != pTask", -1);
    if (pTask->id == -1) {
        if (TAVISchedTaskCreate(pTask) < 0) {
            SCHED_LOG("Add task failed. [0x%04X %s:%d]", SCHED_LAST_ERROR);
            return -1;
        }
        return 0;
    }
    if (TAVISchedTaskEdit(pTask) < 0) {
        SCHED_LOG("Set task failed. [%ld] [0x%04X %s:%d]", static_cast<long>(pTask->id),
                  SCHED_LAST_ERROR);
        return -1;
    }
    return 0;
}
