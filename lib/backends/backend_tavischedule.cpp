// The schedule backend: ordinary tasks, kept as sections of a file and executed by cron.
//
// The line numbers in messages and errors are stable site numbers.
#include "change/batch.h"
#include "change/change.h"
#include "crontab.h"
#include "platc.h"
#include "sched_command.h"
#include "sched_error.h"
#include "sched_field.h"
#include "sched_guard.h"
#include "sched_handle.h"
#include "staged_tasks.h"
#include "task_file.h"
#include "tavischeduler.h"

#include <algorithm>
#include <array>
#include <cstdio>
#include <cstring>
#include <functional>
#include <string_view>
#include <sys/wait.h>

namespace {

using sched::LogText;
using sched::TaskList;

constexpr std::string_view kName = "tavischedule";

// ---- Reading ----

int ListGet(TAVI_SCHED_TASK **pTaskList, TAVI_SCHED_FILTER filter) {
    SCHED_REQUIRE_AT(26, pTaskList, "((void *)0) != pTaskList", -1);
    TaskList tasks;
    int count = 0;
    const auto keep = [&](const char *, TAVI_SCHED_TASK *fresh) {
        sched::Allocated<TAVI_SCHED_TASK> task(fresh);
        if (!filter || filter(task.get())) {
            task->backend = TAVI_SCHED_BACKEND_SCHEDULE;
            tasks.pushFront(std::move(task));
            ++count;
        }
        return true;
    };
    if (sched::forEachStoredTask({.fresh = true, .onTask = std::ref(keep)}) != 0) {
        return -1;
    }
    tasks.appendTo(pTaskList);
    return count;
}

int GetByID(int32_t id, TAVI_SCHED_TASK *pTask) {
    SCHED_REQUIRE_AT(520, pTask, "((void *)0) != pTask", -1);
    pTask->state = TAVI_SCHED_STATE_NOT_EXISTED;
    pTask->backend = TAVI_SCHED_BACKEND_SCHEDULE;
    return sched::readStoredTask(id, pTask);
}

int GetNextId(int32_t *pID) {
    SCHED_REQUIRE_AT(310, pID, "((void *)0) != pID", -1);
    return sched::nextFreeId(pID);
}

// ---- Crontab ----

// The lines stand in the order in which the tasks were read, which is that of their records.
int gatherLines(sched::RunnerLines &lines, int &unreadable) {
    int count = 0;
    const auto add = [&](const char *, TAVI_SCHED_TASK *task) {
        ++count;
        std::array<char, 8192> line{};
        if (task->state == TAVI_SCHED_STATE_ENABLED &&
            TAVISchedCrontabLine(task, line.data(), line.size()) == 0) {
            lines.text.append(line.data()).append("\n");
        }
        return true;
    };
    const auto keep = [&](const char *section) {
        if (sched::idOfSection(section)) {
            lines.unreadable.emplace_back(section);
        }
        ++unreadable;
    };
    return sched::forEachStoredTask({.onTask = add, .onUnreadable = keep}) == 0 ? count : -1;
}

struct Synced {
    int count; // of tasks, or -1
    bool isWritten;
    int unreadable; // sections whose lines stayed as they were
};

Synced syncCrontab() {
    sched::RunnerLines lines;
    int unreadable = 0;
    const int count = gatherLines(lines, unreadable);
    if (count < 0) {
        SCHED_LOG_AT(272, "get task list failed. [0x%04X %s:%d]", SCHED_LAST_ERROR);
        return {count, false, unreadable};
    }
    const bool isWritten =
        sched::guarded(SCHED_SITE, [&] { return sched::rewriteCrontab(lines); }) == 0;
    if (!isWritten || unreadable > 0) {
        SCHED_LOG_AT(280, "sync task list failed. [0x%04X %s:%d]", SCHED_LAST_ERROR);
    }
    return {count, isWritten, unreadable};
}

// A failed rewrite answers the number of tasks, not -1: the change itself is stored, and the front
// ends take only a negative answer for a change that is not. Only the log and the error state tell.
int SyncCrontab() {
    const Synced synced = sched::guarded(SCHED_SITE, syncCrontab, {-1, false, 0});
    return synced.isWritten && synced.unreadable == 0 ? 0 : synced.count;
}

bool crontabIsStaged = false; // a batch asks for the crontab at its end

int Sync() {
    const sched::Change change;
    if (!change) {
        return -1;
    }
    if (sched::isBatchOpen()) {
        crontabIsStaged = true;
        return 0;
    }
    return SyncCrontab();
}

// ---- Changes ----

// What follows from a changed section, in a change; the site number is the operation's.
int finishChange(sched::Change &change, int syncLine) {
    if (sched::isBatchOpen()) {
        return 0;
    }
    if (SyncCrontab() < 0) {
        SCHED_LOG_AT(syncLine, "sync crontab failed. [0x%04X %s:%d]", SCHED_LAST_ERROR);
        return -1;
    }
    return change.finish();
}

// Stores the task and rewrites the crontab; the two site numbers are the operation's.
int storeTask(sched::Change &change, const TAVI_SCHED_TASK &task, int setLine, int syncLine) {
    if (sched::setTaskSection(task.id, &task) < 0) {
        SCHED_LOG_AT(setLine, "set task failed. [%ld] [0x%04X %s:%d]", static_cast<long>(task.id),
                     SCHED_LAST_ERROR);
        return -1;
    }
    return finishChange(change, syncLine);
}

int Create(TAVI_SCHED_TASK *pTask) {
    SCHED_REQUIRE(pTask, "((void *)0) != pTask", -1);
    sched::Change change;
    int32_t id = 0;
    if (!change || GetNextId(&id) != 0) {
        return -1;
    }
    if (pTask->name[0] == '\0') {
        std::snprintf(pTask->name, sizeof pTask->name, "Task %ld", static_cast<long>(id));
    }
    pTask->id = id;
    return storeTask(change, *pTask, 452, 457);
}

int Edit(TAVI_SCHED_TASK *pTask) {
    SCHED_REQUIRE_AT(469, pTask, "((void *)0) != pTask", -1);
    sched::Change change;
    return change ? storeTask(change, *pTask, 472, 477) : -1;
}

int Remove(int32_t id) {
    sched::Change change;
    const int removed = change ? sched::setTaskSection(id, nullptr) : -1;
    if (removed < 0) {
        SCHED_LOG_AT(494, "set task failed. [%ld] [0x%04X %s:%d]", static_cast<long>(id),
                     SCHED_LAST_ERROR);
        return -1;
    }
    if (removed == 0) {
        return 0;
    }
    return finishChange(change, 502) == 0 ? 1 : -1;
}

// ---- Batches ----

bool isTouched() {
    return crontabIsStaged || sched::isAnyTaskStaged();
}

sched::RunnerLines batchLines; // as they are to be, gathered from what is staged

// The line of a task that cannot be read stays, which is right unless the batch has changed it.
int describe(sched::Before &before) {
    batchLines = {};
    batchLines.openFailure = sched::kOpenFailed;
    int unreadable = 0;
    if (gatherLines(batchLines, unreadable) < 0) {
        SCHED_LOG_AT(272, "get task list failed. [0x%04X %s:%d]", SCHED_LAST_ERROR);
        return -1;
    }
    if (unreadable > 0) {
        SCHED_LOG_AT(280, "sync task list failed. [0x%04X %s:%d]", SCHED_LAST_ERROR);
    }
    if (std::any_of(batchLines.unreadable.begin(), batchLines.unreadable.end(),
                    sched::isTaskStaged)) {
        return -1;
    }
    return sched::isAnyTaskStaged() ? sched::describeStaged(before) : 0;
}

int store() {
    return sched::isAnyTaskStaged() ? sched::storeStaged() : 0;
}

// Unlike outside of a batch, a crontab that cannot be written is a failure.
int apply() {
    sched::forgetStaged();
    const int written =
        sched::guarded(SCHED_SITE, [] { return sched::rewriteCrontab(batchLines); });
    if (written != 0) {
        SCHED_LOG_AT(280, "sync task list failed. [0x%04X %s:%d]", SCHED_LAST_ERROR);
    }
    return written;
}

void forget() {
    sched::forgetStaged();
    crontabIsStaged = false;
    batchLines = {};
}

// ---- New tasks ----

int GetDefault(TAVI_SCHED_TASK *pTask) {
    SCHED_REQUIRE_AT(574, pTask, "((void *)0) != pTask", -1);
    sched::Hash hash(1024);
    if (!hash) {
        SCHED_LOG_AT(577, "Alloc hash failed. [0x%04X %s:%d]", SCHED_LAST_ERROR);
        return -1;
    }
    int32_t id = 0;
    if (GetNextId(&id) != 0) {
        SCHED_LOG_AT(581, "Get next id failed. [0x%04X %s:%d]", SCHED_LAST_ERROR);
        return -1;
    }
    std::array<char, 32> name{};
    std::snprintf(name.data(), name.size(), "Task %ld", static_cast<long>(id));
    sched::setNewTaskValues(hash.address(), name.data(), "");
    return sched::fillTaskFromHash(hash.get(), *pTask, {SCHED_SOURCE, 604});
}

// ---- Running ----

struct RunResult {
    int code;
    int number; // for the comment; -1 = none
};

// The order of the tests is part of the contract: a status whose low seven bits are 127 is an exit.
RunResult interpret(int status) {
    if (status == 0) {
        return {SCHED_STATUS_CODE_SUCCESS, -1};
    }
    if (status == -1) {
        return {SCHED_STATUS_CODE_START_FAILED, -1};
    }
    const int signal = status & 0x7F;
    const int upper = (status >> 8) & 0xFF;
    if (signal == 0 || signal == 0x7F) {
        return {SCHED_STATUS_CODE_EXIT_FAILED, upper};
    }
    if ((status & 0xFF) == 0x7F) {
        return {SCHED_STATUS_CODE_STOPPED, upper};
    }
    return {SCHED_STATUS_CODE_SIGNALED, signal};
}

int Run(TAVI_SCHED_TASK *pTask, int *pStatusCode, char *szComment, size_t cbComment) {
    SCHED_REQUIRE_AT(614, pTask, "((void *)0) != pTask", -1);
    SCHED_REQUIRE_AT(614, pStatusCode, "((void *)0) != pStatusCode", -1);
    SCHED_REQUIRE_AT(614, szComment, "((void *)0) != szComment", -1);
    SCHED_REQUIRE_AT(614, cbComment > 0, "0 < cbComment", -1);
    szComment[0] = '\0';
    const RunResult result = interpret(sched::runCommand(pTask->command));
    *pStatusCode = result.code;
    if (result.number >= 0) {
        std::snprintf(szComment, std::min<size_t>(4, cbComment), "%d", result.number);
    }
    return 0;
}

} // namespace

int tavischedule_init(const char *szName, TAVI_SCHED_BACKEND_RECORD *pBackend) {
    SCHED_REQUIRE_AT(639, szName, "((void *)0) != szName", -1);
    SCHED_REQUIRE_AT(639, pBackend, "NULL != pBackend", -1);
    if (szName != kName) {
        SCHED_LOG_AT(642, "backend name is mismatch for tavischedule!! [%s]",
                     LogText(szName).c_str());
        return -1;
    }
    sched::joinBatches({isTouched, describe, store, apply, forget});
    // There is no owns_id: every look-up by id asks this backend.
    *pBackend = {.id = pBackend->id,
                 .name = szName,
                 .sync = Sync,
                 .create = Create,
                 .edit = Edit,
                 .remove = Remove,
                 .get_default = GetDefault,
                 .owns_id = nullptr,
                 .get_by_id = GetByID,
                 .run = Run,
                 .list_get = ListGet};
    return 0;
}

int TAVISchedTaskNextId(int32_t *pId) {
    SCHED_REQUIRE(pId, "((void *)0) != pId", -1);
    return GetNextId(pId);
}
