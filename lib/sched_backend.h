// How the task operations reach the backends. A task belongs to the backend in its `backend` field;
// an operation that a backend does not offer makes it be passed over.
#pragma once

#include "sched_error.h"
#include "tavischeduler.h"

#include <optional>
#include <span>

namespace sched {

inline std::span<TAVI_SCHED_BACKEND_RECORD> registeredBackends() {
    return {SchedBackends, cBackend};
}

// The number of the first row with this id that offers the operation.
template <typename Operation>
std::optional<size_t> findBackend(int32_t backend,
                                  Operation TAVI_SCHED_BACKEND_RECORD::*operation) {
    const auto rows = registeredBackends();
    for (size_t row = 0; row < rows.size(); ++row) {
        if (rows[row].id == backend && rows[row].*operation) {
            return row;
        }
    }
    return std::nullopt;
}

// Registers the backends when that has not been done; a failure is logged for the site.
inline int initBackends(const Site &site) {
    if (TAVISchedBackendInit() != 0) {
        SCHED_LOG_FOR(site, "Init backend failed. [0x%04X %s:%d]", SCHED_LAST_ERROR);
        return -1;
    }
    return 0;
}

// Logs that a row's operation failed on a task.
inline void logBackendFailure(const Site &site, const char *word, size_t row, int32_t id) {
    SCHED_LOG_FOR(site, "Failed to %s for backend [%ld] id:[%ld] [0x%04X %s:%d]", word,
                  static_cast<long>(row), static_cast<long>(id), SCHED_LAST_ERROR);
}

// Sets the error of a task that no backend serves. The caller has logged it.
inline void setNoBackend(const Site &site) {
    PLATCErrSetEx(kNotFound, site.file, site.line);
}

// Calls the operation of the task's backend with the task. Its own result, or nothing when no
// backend serves the task; that is logged and an error.
inline std::optional<int>
dispatch(const Site &site, const char *word, TAVI_SCHED_TASK *task,
         int (*TAVI_SCHED_BACKEND_RECORD::*operation)(TAVI_SCHED_TASK *)) {
    const auto row = findBackend(task->backend, operation);
    if (!row) {
        SCHED_LOG_FOR(site, "No %s backend (%ld) is found for task [%ld] ", word,
                      static_cast<long>(task->backend), static_cast<long>(task->id));
        setNoBackend(site);
        return std::nullopt;
    }
    const int result = (SchedBackends[*row].*operation)(task);
    if (result < 0) {
        logBackendFailure(site, word, *row, task->id);
    }
    return result;
}

} // namespace sched
