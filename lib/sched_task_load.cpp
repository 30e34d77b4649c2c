// Loading a task for an editor: the defaults of a new one, or a stored one.
#include "sched_error.h"
#include "tavischeduler.h"

int TAVISchedTaskLoad(int32_t id, TAVI_SCHED_TASK *pTask) {
    SCHED_REQUIRE(id >= -1, "-1 <= id", -1);
    SCHED_REQUIRE(pTask, "NULL != pTask", -1);
    if (id == -1) {
        if (TAVISchedTaskGetDefault(pTask) < 0) {
            SCHED_LOG("get default task failed. [0x%04X %s:%d]", SCHED_LAST_ERROR);
            return -1;
        }
        return 0;
    }
    if (TAVISchedTaskGetByID(id, pTask) < 0) {
        SCHED_LOG("get task failed. [%ld] [0x%04X %s:%d]", static_cast<long>(id), SCHED_LAST_ERROR);
        return -1;
    }
    return 0;
}
