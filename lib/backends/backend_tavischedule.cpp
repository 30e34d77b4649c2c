// The schedule backend: ordinary tasks, kept as sections of a file and executed by cron. Every
// change goes through a scratch file to the persistent file first and the working copy second;
// every read takes the working copy.
//
// The line numbers in messages and errors are stable site numbers.
#include "crontab.h"
#include "platc.h"
#include "sched_command.h"
#include "sched_error.h"
#include "sched_field.h"
#include "sched_handle.h"
#include "sched_shared_file.h"
#include "tavischeduler.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <span>
#include <string_view>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

namespace {

using sched::Hash;
using sched::LogText;
using sched::TaskList;

constexpr std::string_view kName = "tavischedule";
constexpr const char *kPersistent = "/usr/tavi/etc/scheduled_tasks";
constexpr const char *kPersistentCopy = "/usr/tavi/etc/scheduled_tasks.bak";
constexpr const char *kWorkingCopy = "/tmp/scheduled_tasks";
constexpr const char *kScratchStem = "/tmp/scheduled_tasks.tmp";
constexpr int kCapacity = 1024;

using SectionName = std::array<char, 512>;

SectionName sectionName(int32_t id) {
    SectionName name{};
    std::snprintf(name.data(), name.size(), "%ld", static_cast<long>(id));
    return name;
}

// ---- Reading ----

// Reads one section into a fresh task. Nothing when it cannot be read, which is logged.
sched::Allocated<TAVI_SCHED_TASK> readSection(const char *section, Hash &hash, bool &outOfMemory) {
    PLATCHashRemoveAll(hash.get());
    if (PLATCFileGetSection(kWorkingCopy, section, hash.address()) <= 0) {
        SCHED_LOG_AT(51, "Get section [%s] from [%s] failed. [0x%04X %s:%d]",
                     LogText(section).c_str(), kWorkingCopy, SCHED_LAST_ERROR);
        return nullptr;
    }
    auto task = sched::allocateTask();
    if (!task) {
        SCHED_LOG_AT(55, "malloc TAVI_SCHED_TASK failed. key:[%s]", LogText(section).c_str());
        SCHED_SET_ERROR_AT(56, sched::kTaskOutOfMemory);
        outOfMemory = true;
        return nullptr;
    }
    if (TAVISchedInitTaskFromHash(hash.get(), task.get()) != 0) {
        SCHED_LOG_AT(60, "Init task from hash failed. [0x%04X %s:%d]", SCHED_LAST_ERROR);
        return nullptr;
    }
    if (TAVISchedNextTriggerTime(task.get()) != 0) {
        SCHED_LOG_AT(65, "Failed to obtain next trigger time. id:[%ld]. [0x%04X %s:%d]",
                     static_cast<long>(task->id), SCHED_LAST_ERROR);
        return nullptr;
    }
    return task;
}

// Lists the section names: their number, 0 when there is no working copy, or -1.
int enumerateSections(sched::List &sections) {
    if (!PLATCFileExist(kWorkingCopy)) {
        return 0;
    }
    return sections ? PLATCFileEnumSection(kWorkingCopy, sections.address()) : -1;
}

// Hands every task to the function, in file order; a section that cannot be read is passed over.
// 0, or -1 when out of memory.
template <typename Function>
int forEachTask(const sched::List &sections, int sectionCount, Function &&function) {
    Hash hash(kCapacity);
    if (!hash) {
        return -1;
    }
    for (int i = 0; i < sectionCount; ++i) {
        bool outOfMemory = false;
        auto task = readSection(PLATCSzListGet(sections.get(), i), hash, outOfMemory);
        if (outOfMemory) {
            return -1;
        }
        if (task) {
            function(std::move(task));
        }
    }
    return 0;
}

int ListGet(TAVI_SCHED_TASK **pTaskList, TAVI_SCHED_FILTER filter) {
    SCHED_REQUIRE_AT(26, pTaskList, "((void *)0) != pTaskList", -1);
    sched::List sections(kCapacity);
    const int sectionCount = enumerateSections(sections);
    if (sectionCount <= 0) {
        return sectionCount;
    }
    TaskList tasks;
    int count = 0;
    const auto keep = [&](sched::Allocated<TAVI_SCHED_TASK> task) {
        if (!filter || filter(task.get())) {
            task->backend = TAVI_SCHED_BACKEND_SCHEDULE;
            tasks.pushFront(std::move(task));
            ++count;
        }
    };
    if (forEachTask(sections, sectionCount, keep) != 0) {
        return -1;
    }
    tasks.appendTo(pTaskList);
    return count;
}

int GetByID(int32_t id, TAVI_SCHED_TASK *pTask) {
    SCHED_REQUIRE_AT(520, pTask, "((void *)0) != pTask", -1);
    Hash hash(kCapacity);
    if (!hash) {
        return -1;
    }
    pTask->state = TAVI_SCHED_STATE_NOT_EXISTED;
    pTask->backend = TAVI_SCHED_BACKEND_SCHEDULE;
    if (!PLATCFileExist(kWorkingCopy)) {
        return 0;
    }
    const SectionName section = sectionName(id);
    const int found = PLATCFileGetSection(kWorkingCopy, section.data(), hash.address());
    if (found < 0) {
        SCHED_LOG_AT(537, "Get section [%s] from [%s] failed. [0x%04X %s:%d]", section.data(),
                     kWorkingCopy, SCHED_LAST_ERROR);
        return -1;
    }
    if (found == 0) {
        return 0;
    }
    if (TAVISchedInitTaskFromHash(hash.get(), pTask) != 0) {
        SCHED_LOG_AT(545, "Init task from hash failed. [0x%04X %s:%d]", SCHED_LAST_ERROR);
        return -1;
    }
    if (TAVISchedNextTriggerTime(pTask) != 0) {
        SCHED_LOG_AT(550, "Failed to obtain next trigger time. id:[%ld]. [0x%04X %s:%d]",
                     static_cast<long>(pTask->id), SCHED_LAST_ERROR);
        return -1;
    }
    return 1;
}

// ---- Ids ----

// From 1 upward: a smallest id above 1 gives 1, else the first gap above the smallest id, else the
// largest plus 1. Nothing below the smallest id is looked at, and that is kept.
int32_t smallestFreeId(std::span<int32_t> ids) {
    std::sort(ids.begin(), ids.end());
    if (ids.empty() || ids.front() > 1) {
        return 1;
    }
    const auto gap = std::adjacent_find(ids.begin(), ids.end(), [](int32_t lower, int32_t upper) {
        return int64_t{upper} - lower >= 2;
    });
    return (gap == ids.end() ? ids.back() : *gap) + 1;
}

// Adds the name when it is the id of a section: one that cannot be read must not be overwritten.
void addSectionId(const char *name, int32_t *ids, size_t &count) {
    const char *const end = name + std::strlen(name);
    int32_t id = 0;
    const auto parsed = std::from_chars(name, end, id);
    if (parsed.ec == std::errc() && parsed.ptr == end && id > 0) {
        ids[count++] = id;
    }
}

// An id is in use when a task has it or a section is named by it. The tasks are read as for a list
// but none is kept: their number does not cost memory.
int GetNextId(int32_t *pID) {
    SCHED_REQUIRE_AT(310, pID, "((void *)0) != pID", -1);
    sched::List sections(kCapacity);
    const int sectionCount = enumerateSections(sections);
    if (sectionCount <= 0) {
        *pID = 1;
        return sectionCount;
    }
    const sched::Allocated<int32_t> ids(static_cast<int32_t *>(
        std::calloc(static_cast<size_t>(sectionCount) * 2, sizeof(int32_t))));
    if (!ids) {
        SCHED_LOG_AT(321, "Alloc id slot failed. num:[%d] [0x%04X %s:%d]", sectionCount,
                     SCHED_LAST_ERROR);
        return -1;
    }
    size_t count = 0;
    const auto addTaskId = [&](const sched::Allocated<TAVI_SCHED_TASK> &task) {
        ids.get()[count++] = task->id;
    };
    if (forEachTask(sections, sectionCount, addTaskId) != 0) {
        return -1;
    }
    for (int i = 0; i < sectionCount; ++i) {
        addSectionId(PLATCSzListGet(sections.get(), i), ids.get(), count);
    }
    *pID = smallestFreeId({ids.get(), count});
    return 0;
}

// ---- Writing ----

int logCopyFailure(const char *from, const char *to, int line) {
    SCHED_LOG_AT(line, "Copy sched conf failed. [%s] -> [%s] [0x%04X %s:%d]", from, to,
                 SCHED_LAST_ERROR);
    return -1;
}

// Runs cp without a shell; a failure is logged under the site number.
int copyFile(const char *from, const char *to, int line) {
    const std::array<const char *, 4> arguments = {"-f", from, to, nullptr};
    return PLATCExec("/bin/cp", arguments.data()) == 0 ? 0 : logCopyFailure(from, to, line);
}

// The scratch file of one change, named for this process.
class Scratch {
  public:
    Scratch() { std::snprintf(path_.data(), path_.size(), "%s.%d", kScratchStem, getpid()); }
    ~Scratch() { unlink(path_.data()); }
    Scratch(const Scratch &) = delete;
    Scratch &operator=(const Scratch &) = delete;

    const char *path() const { return path_.data(); }

    // Starts as a copy of the working copy, or empty when there is none.
    int prepare(bool workingCopyExists) const {
        unlink(path());
        const bool claimed = sched::claimSharedFile(path()) == 0;
        if (!claimed) {
            SCHED_SET_ERROR(sched::kOpenFailed);
        }
        if (workingCopyExists) {
            return claimed ? copyFile(kWorkingCopy, path(), 379)
                           : logCopyFailure(kWorkingCopy, path(), 379);
        }
        if (!claimed || PLATCFileTouch(path()) != 0) {
            SCHED_LOG_AT(374, "PLATCFileTouch [%s] failed. [0x%04X %s:%d]", path(),
                         SCHED_LAST_ERROR);
            return -1;
        }
        return 0;
    }

  private:
    std::array<char, 4096> path_{};
};

int writeSection(const char *path, const char *section, const TAVI_SCHED_TASK *task) {
    Hash hash(kCapacity);
    if (!hash) {
        SCHED_LOG_AT(398, "PLATCSzHashAlloc failed.[0x%04X %s:%d]", SCHED_LAST_ERROR);
        return -1;
    }
    if (TAVISchedInitHashFromTask(hash.address(), task) != 0) {
        SCHED_LOG_AT(403, "Init hash from task failed. [0x%04X %s:%d]", SCHED_LAST_ERROR);
        return -1;
    }
    const int replaced = PLATCFileSetSection(path, section, hash.get());
    if (replaced < 0) {
        SCHED_LOG_AT(408, "Save section [%s] to [%s] failed. [0x%04X %s:%d]", section, path,
                     SCHED_LAST_ERROR);
        return -1;
    }
    if (replaced == 0 && PLATCFileAddSection(path, section, hash.get()) < 0) {
        SCHED_LOG_AT(412, "Add section [%s] to [%s] failed. [0x%04X %s:%d]", section, path,
                     SCHED_LAST_ERROR);
        return -1;
    }
    return 1;
}

int removeSection(const char *path, const char *section, bool workingCopyExists) {
    const int removed = workingCopyExists ? PLATCFileRemoveSection(path, section) : 0;
    if (removed < 0) {
        SCHED_LOG_AT(393, "PLATCFileRemoveSection [%s] from [%s] failed.[0x%04X %s:%d]", section,
                     path, SCHED_LAST_ERROR);
    }
    return removed;
}

off_t sizeOf(const char *path) {
    struct stat status {};
    return stat(path, &status) == 0 ? status.st_size : 0;
}

// Without a working copy, or with one that a failed copy left empty, a change starts from nothing
// and would erase every task of the persistent file for good, so that file is put aside first. What
// was put aside before moves on to the next free number.
int savePersistent() {
    if (sizeOf(kWorkingCopy) > 0 || sizeOf(kPersistent) == 0) {
        return 0;
    }
    if (PLATCFileExist(kPersistentCopy)) {
        std::array<char, 512> older{};
        int number = 0;
        do {
            std::snprintf(older.data(), older.size(), "%s.%d", kPersistentCopy, ++number);
        } while (PLATCFileExist(older.data()));
        if (rename(kPersistentCopy, older.data()) != 0) {
            SCHED_SET_ERROR(sched::kRenameFailed);
            return logCopyFailure(kPersistentCopy, older.data(), __LINE__);
        }
    }
    return copyFile(kPersistent, kPersistentCopy, __LINE__);
}

// A working copy that this process makes is made before cp opens it, so that cp follows no link
// that somebody put there in between; it goes again when cp fails, as an empty one would hide a
// lost one.
int publish(const char *scratch) {
    if (copyFile(scratch, kPersistent, 419) != 0) {
        return -1;
    }
    const bool isNew = sched::checkSharedFile(kWorkingCopy) == 0;
    if (sched::claimSharedFile(kWorkingCopy) != 0) {
        SCHED_SET_ERROR(sched::kOpenFailed);
        return logCopyFailure(scratch, kWorkingCopy, 424);
    }
    const int result = copyFile(scratch, kWorkingCopy, 424);
    if (result != 0 && isNew) {
        unlink(kWorkingCopy);
    }
    return result;
}

// Writes the task's section, or removes the id's when there is no task: 1 changed, 0 nothing to
// remove, -1.
int SetTaskSection(int32_t id, const TAVI_SCHED_TASK *task) {
    const SectionName section = sectionName(id);
    if (sched::checkSharedFile(kWorkingCopy) < 0) {
        SCHED_SET_ERROR(sched::kOpenFailed);
        SCHED_LOG("[%s] is refused: another user may have put it there or may write it",
                  kWorkingCopy);
        return -1;
    }
    const bool exists = PLATCFileExist(kWorkingCopy) == 1;
    if (task && savePersistent() != 0) {
        return -1;
    }
    const Scratch scratch;
    if (scratch.prepare(exists) != 0) {
        return -1;
    }
    const int changed = task ? writeSection(scratch.path(), section.data(), task)
                             : removeSection(scratch.path(), section.data(), exists);
    if (changed <= 0) {
        return changed;
    }
    return publish(scratch.path()) == 0 ? 1 : -1;
}

// ---- Operations ----

// A failed rewrite answers the number of tasks, not -1: the change itself is stored, and callers
// have always been told so. Only the log and the error state tell.
int SyncCrontab() {
    TaskList tasks;
    const int count = ListGet(tasks.address(), nullptr);
    if (count < 0) {
        SCHED_LOG_AT(272, "get task list failed. [0x%04X %s:%d]", SCHED_LAST_ERROR);
        return count;
    }
    if (TAVISchedTaskListSort(tasks.address(), "id", 1) != 0) {
        SCHED_LOG_AT(276, "failed to sort task list. [0x%04X %s:%d]", SCHED_LAST_ERROR);
        return count;
    }
    if (sched::rewriteCrontab(tasks.head()) != 0) {
        SCHED_LOG_AT(280, "sync task list failed. [0x%04X %s:%d]", SCHED_LAST_ERROR);
        return count;
    }
    return 0;
}

// Stores the task and rewrites the crontab; the two site numbers are the operation's.
int storeTask(const TAVI_SCHED_TASK &task, int setLine, int syncLine) {
    if (SetTaskSection(task.id, &task) < 0) {
        SCHED_LOG_AT(setLine, "set task failed. [%ld] [0x%04X %s:%d]", static_cast<long>(task.id),
                     SCHED_LAST_ERROR);
        return -1;
    }
    if (SyncCrontab() < 0) {
        SCHED_LOG_AT(syncLine, "sync crontab failed. [0x%04X %s:%d]", SCHED_LAST_ERROR);
        return -1;
    }
    return 0;
}

int Create(TAVI_SCHED_TASK *task) {
    int32_t id = 0;
    if (GetNextId(&id) != 0) {
        return -1;
    }
    if (task->name[0] == '\0') {
        std::snprintf(task->name, sizeof task->name, "Task %ld", static_cast<long>(id));
    }
    task->id = id;
    return storeTask(*task, 452, 457);
}

int Edit(TAVI_SCHED_TASK *pTask) {
    SCHED_REQUIRE_AT(469, pTask, "((void *)0) != pTask", -1);
    return storeTask(*pTask, 472, 477);
}

int Remove(int32_t id) {
    const int removed = SetTaskSection(id, nullptr);
    if (removed < 0) {
        SCHED_LOG_AT(494, "set task failed. [%ld] [0x%04X %s:%d]", static_cast<long>(id),
                     SCHED_LAST_ERROR);
        return -1;
    }
    if (removed == 0) {
        return 0;
    }
    if (SyncCrontab() < 0) {
        SCHED_LOG_AT(502, "sync crontab failed. [0x%04X %s:%d]", SCHED_LAST_ERROR);
        return -1;
    }
    return 1;
}

int GetDefault(TAVI_SCHED_TASK *pTask) {
    SCHED_REQUIRE_AT(574, pTask, "((void *)0) != pTask", -1);
    Hash hash(kCapacity);
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
    // There is no owns_id: every look-up by id asks this backend.
    *pBackend = {.id = pBackend->id,
                 .name = szName,
                 .sync = SyncCrontab,
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
