// Bringing every backend's outside state in line with its tasks.
#include "sched_backend.h"
#include "sched_error.h"
#include "tavischeduler.h"

int TAVISchedTaskSync() {
    if (sched::initBackends(SCHED_SITE) != 0) {
        return -1;
    }
    const auto rows = sched::registeredBackends();
    for (size_t row = 0; row < rows.size(); ++row) {
        if (rows[row].sync && rows[row].sync() < 0) {
            SCHED_LOG("Failed to sync for backend [%d] [0x%04X %s:%d]", static_cast<int>(row),
                      SCHED_LAST_ERROR);
        }
    }
    return 0;
}
