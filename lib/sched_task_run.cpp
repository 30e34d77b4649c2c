// Running a stored task. The caller's process decides whether it is due; a detached child waits
// until nothing conflicts, records the run, executes the command as the task's owner and stores how
// it ended. The lock covers the check for conflicts and the recording only, never the execution.
#include "base/descriptor.h"
#include "platc.h"
#include "runs/run.h"
#include "runs/run_changes.h"
#include "runs/run_connection.h"
#include "sched_backend.h"
#include "sched_calendar.h"
#include "sched_error.h"
#include "sched_guard.h"
#include "sched_handle.h"
#include "sched_paths.h"
#include "sched_shared_file.h"
#include "tavischeduler.h"
#include "tavisdk.h"

#include <array>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <grp.h>
#include <sys/file.h>
#include <unistd.h>

FILE *pfLock = nullptr;

namespace {

constexpr int kLockTries = 101;
constexpr useconds_t kLockPause = 50000; // microseconds
constexpr int kMaxWaits = 20;

// ---- Due test ----

bool isDayDue(const TAVI_SCHED_TASK &task, const TAVI_SCHED_DATE &now) {
    TAVI_SCHED_DATE start{};
    start.year = task.startYear;
    start.month = task.startMonth;
    start.day = task.startDay;
    const int order = TAVISchedDateComp(&now, &start);
    if (order <= 0) {
        return order == 0; // on its start day a task of every type may run
    }
    switch (task.type) {
    case TAVI_SCHED_TYPE_DAILY:
        return true;
    case TAVI_SCHED_TYPE_WEEKLY:
        return sched::runsOnWeekDay(task, now.wday);
    case TAVI_SCHED_TYPE_MONTHLY:
        return now.day == start.day;
    case TAVI_SCHED_TYPE_YEARLY:
        return now.month == start.month && now.day == start.day;
    default:
        return false;
    }
}

bool isMinuteDue(const TAVI_SCHED_TASK &task, const TAVI_SCHED_DATE &now) {
    bool due = false;
    sched::forEachRunHour(task, [&](uint64_t hour) {
        due = hour == now.hour;
        return hour < now.hour;
    });
    return due && now.minute == task.runMin;
}

// 1 due in this minute, 0 not, -1.
int isDue(const TAVI_SCHED_TASK &task) {
    TAVI_SCHED_DATE now{};
    if (TAVISchedDateGet(&now) != 0) {
        SCHED_LOG("get date failed. [0x%04X %s:%d]", SCHED_LAST_ERROR);
        return -1;
    }
    return isDayDue(task, now) && isMinuteDue(task, now) ? 1 : 0;
}

// ---- Run lock ----

int releaseLock() {
    if (!pfLock) {
        return 0;
    }
    if (flock(fileno(pfLock), LOCK_UN) != 0) {
        SCHED_SET_ERROR(sched::kUnlockFailed);
        return -1;
    }
    std::fclose(pfLock);
    pfLock = nullptr;
    return 0;
}

// Waits as long as another runner holds the lock.
bool takeLock() {
    if (sched::claimSharedFolder(sched::kRunLockFolder) != 0 ||
        sched::claimSharedFile(sched::kRunLock) != 0) {
        return false;
    }
    for (int tries = 0; tries < kLockTries; ++tries) {
        if (pfLock) {
            return true;
        }
        if (tries > 0) {
            usleep(kLockPause);
        }
        sched::File file(std::fopen(sched::kRunLock, "re"));
        if (file && flock(fileno(file.get()), LOCK_EX) == 0) {
            pfLock = file.release();
            return true;
        }
    }
    SCHED_SET_ERROR(sched::kLockFailed);
    return false;
}

// ---- User ----

// Every step is tried, also after an earlier one failed.
bool switchTo(const TAVIUSER &user, uid_t uid) {
    bool switched = true;
    if (seteuid(0) != 0) {
        SCHED_LOG("Failed to change to ROOT. %m");
        switched = false;
    }
    if (setegid(user.gid) != 0) {
        SCHED_LOG("Failed to set egid: [%u] %m", user.gid);
        switched = false;
    }
    if (initgroups(user.szName, user.gid) != 0) {
        SCHED_LOG("Failed to initgroups: [%u] %m", uid); // scripts look for the user's id here
        switched = false;
    }
    if (seteuid(uid) != 0) {
        SCHED_LOG("Failed to set euid: [%u] %m", uid);
        switched = false;
    }
    return switched;
}

int setUserContext(uid_t uid) {
    if (geteuid() == uid) {
        return 0;
    }
    TAVIUSER *found = nullptr;
    if (TAVIUserGetByUID(uid, &found) < 0) {
        SCHED_LOG("Get uid [%u] failed. [0x%04X %s:%d]", uid, SCHED_LAST_ERROR);
        SCHED_SET_ERROR(sched::kSystemCallFailed);
        return -1;
    }
    const sched::User user(found);
    if (!switchTo(*user, uid)) {
        SCHED_SET_ERROR(sched::kSystemCallFailed);
        return -1;
    }
    return 0;
}

// The same, with the log line of the run.
bool enterUserContext(uid_t uid) {
    if (setUserContext(uid) != 0) {
        SCHED_LOG("Failed to set user context. uid:[%u] [0x%04X %s:%d]", uid, SCHED_LAST_ERROR);
        return false;
    }
    return true;
}

// ---- The child ----

// One run of a task. Every failure is logged and ends it; the process that asked never learns of
// it.
class TaskRun {
  public:
    TaskRun(TAVI_SCHED_TASK &task, const sched::RunOrigin &origin)
        : task_(task), wasEnabled_(task.state == TAVI_SCHED_STATE_ENABLED), run_(task, origin) {}
    ~TaskRun() {
        database_.reset();
        releaseLock();
    }
    TaskRun(const TaskRun &) = delete;
    TaskRun &operator=(const TaskRun &) = delete;

    // Until the result is stored.
    void perform() {
        Admission admission = Admission::Wait;
        while (admission == Admission::Wait && !run_.isStopped()) {
            admission = isStillToRun() ? tryAdmission() : Admission::Refused;
        }
        if (run_.isStopped()) {
            outcome_ = TAVI_SCHED_RUN_STOPPED_BY_USER;
        } else if (admission == Admission::Granted && record() && execute()) {
            storeResult();
        }
        database_.reset();
        releaseLock();
        run_.end(outcome_, std::atoi(comment_.data()));
    }
    // What nobody waits for.
    void finish() { run_.finish(); }

  private:
    enum class Admission { Granted, Wait, Refused };

    bool mayOverlapTask() const { return task_.canRunTaskSameTime == 1; }
    bool mayOverlapApp() const { return task_.canRunAppSameTime == 1; }
    long id() const { return task_.id; }

    // The length of a pause: 3 to 30 seconds.
    static unsigned int drawPause() { return static_cast<unsigned int>(std::rand() % 10) * 3 + 3; }

    Admission refuse(int32_t outcome) {
        outcome_ = outcome;
        return Admission::Refused;
    }

    // Waits before the next attempt, with neither lock nor database held. 0 stands for the lock.
    Admission pause(unsigned int seconds, int32_t taskId) {
        ++waits_;
        database_.reset();
        releaseLock();
        run_.waitFor(taskId);
        sleep(seconds);
        return Admission::Wait;
    }

    bool openDatabase() {
        database_.reset(TAVISchedDBInit());
        if (!database_) {
            SCHED_LOG("Init sqlite failed. [0x%04X %s:%d]", SCHED_LAST_ERROR);
        }
        return database_ != nullptr;
    }

    // One pass: granted with lock and database held.
    Admission tryAdmission() {
        const bool needsLock = !(mayOverlapTask() && mayOverlapApp());
        if (needsLock && !takeLock()) {
            return afterLockFailure();
        }
        if (!openDatabase()) {
            return refuse(TAVI_SCHED_RUN_DATABASE_FAILED);
        }
        const Admission admission = mayOverlapTask() ? Admission::Granted : checkTask();
        return admission != Admission::Granted || mayOverlapApp() ? admission : checkApp();
    }

    Admission afterLockFailure() {
        if (waits_ >= kMaxWaits) {
            return refuse(TAVI_SCHED_RUN_LOCK_FAILED);
        }
        const unsigned int seconds = drawPause();
        SCHED_LOG("Lock failed (retry=%d), sleep %u secs.", waits_ + 1, seconds);
        return pause(seconds, 0);
    }

    Admission checkTask() {
        TAVI_SCHED_STATUS status{};
        if (TAVISchedDBIsTaskRunning(database_.get(), task_.id, &status) < 0) {
            SCHED_LOG("Check task running status failed. id:[%ld][0x%04X %s:%d]", id(),
                      SCHED_LAST_ERROR);
            return refuse(TAVI_SCHED_RUN_DATABASE_FAILED);
        }
        return status.found ? afterConflict(status) : Admission::Granted;
    }

    Admission checkApp() {
        TAVI_SCHED_STATUS status{};
        if (TAVISchedDBIsAppRunning(database_.get(), task_.app, &status) < 0) {
            SCHED_LOG("Check app running status failed. app:[%s][0x%04X %s:%d]", task_.app,
                      SCHED_LAST_ERROR);
            return refuse(TAVI_SCHED_RUN_DATABASE_FAILED);
        }
        return status.found ? afterConflict(status) : Admission::Granted;
    }

    Admission afterConflict(const TAVI_SCHED_STATUS &running) {
        releaseLock();
        if (waits_ >= kMaxWaits) {
            return refuse(TAVI_SCHED_RUN_GIVEN_UP);
        }
        const unsigned int seconds = drawPause();
        SCHED_LOG("Task %ld conflict with task %ld (running), retry = %d, wait %u secs.", id(),
                  static_cast<long>(running.taskId), waits_ + 1, seconds);
        return pause(seconds, running.taskId);
    }

    // What waited reads its task once more: it may be gone, disabled or another by now, and is then
    // admitted as that. One that cannot be read is run as it was.
    bool isStillToRun() {
        const auto row =
            waits_ == 0 ? std::nullopt
                        : sched::findBackend(task_.backend, &TAVI_SCHED_BACKEND_RECORD::get_by_id);
        if (!row) {
            return true;
        }
        auto present = sched::allocateTask();
        if (!present) {
            return true;
        }
        const int found = SchedBackends[*row].get_by_id(task_.id, present.get());
        if (found == 0 || present->state == TAVI_SCHED_STATE_NOT_EXISTED ||
            !run_.isOfPresentTask()) {
            outcome_ = TAVI_SCHED_RUN_TASK_REMOVED;
            return found < 0;
        }
        if (wasEnabled_ && present->state == TAVI_SCHED_STATE_DISABLED) {
            outcome_ = TAVI_SCHED_RUN_TASK_DISABLED;
            return found < 0;
        }
        if (found > 0) {
            std::memcpy(&task_, present.get(), sizeof task_);
            run_.setTask(task_);
        }
        return true;
    }

    bool record() {
        outcome_ = TAVI_SCHED_RUN_DATABASE_FAILED;
        const int result = TAVISchedDBAddRecord(database_.get(), &task_, &statusId_);
        if (result < 0) {
            SCHED_LOG("Add status record failed. id:[%ld][0x%04X %s:%d]", id(), SCHED_LAST_ERROR);
        }
        database_.reset();
        releaseLock();
        return result >= 0;
    }

    // Runs the command as the owner and comes back to the user that this process was.
    bool execute() {
        outcome_ = TAVI_SCHED_RUN_START_FAILED;
        if (sched::initBackends(SCHED_SITE) != 0) {
            return false;
        }
        const uid_t caller = geteuid();
        run_.beginCommand();
        if (!enterUserContext(task_.owner)) {
            outcome_ = TAVI_SCHED_RUN_OWNER_UNKNOWN;
            return false;
        }
        const bool ran = runBackend();
        outcome_ = ran ? statusCode_ : outcome_;
        return enterUserContext(caller) && ran;
    }

    // A backend that cannot run tasks is no failure: the status code stays 0.
    bool runBackend() {
        const auto row = sched::findBackend(task_.backend, &TAVI_SCHED_BACKEND_RECORD::run);
        if (row &&
            SchedBackends[*row].run(&task_, &statusCode_, comment_.data(), comment_.size()) < 0) {
            sched::logBackendFailure(SCHED_SITE, "run", *row, task_.id);
            return false;
        }
        return true;
    }

    void storeResult() {
        if (!openDatabase()) {
            return;
        }
        if (TAVISchedDBSetStatus(database_.get(), statusId_, SCHED_STATUS_CODE_RUNNING, statusCode_,
                                 comment_.data()) < 0) {
            SCHED_LOG("Update status record failed. id:[%ld][0x%04X %s:%d]", id(),
                      SCHED_LAST_ERROR);
        }
    }

    TAVI_SCHED_TASK &task_;
    bool wasEnabled_;
    sched::Run run_;
    sched::Database database_;
    int waits_ = 0;
    int32_t outcome_ = TAVI_SCHED_RUN_LOCK_FAILED; // as the records tell it
    int32_t statusId_ = -1;
    int statusCode_ = SCHED_STATUS_CODE_NONE;
    std::array<char, 1024> comment_{};
};

// The caller's side of the connection reads its end when the result is stored.
[[noreturn]] void runInChild(TAVI_SCHED_TASK &task, const sched::RunOrigin &origin,
                             base::Descriptor connection) {
    TAVISchedRandInit();
    sched::guarded(SCHED_SITE, [&] {
        sched::leaveCaller(connection);
        TaskRun run(task, origin);
        run.perform();
        connection.close();
        run.finish();
        return 0;
    });
    _exit(0);
}

// ---- Following the child ----

struct Followed {
    int32_t &pid;
    int &end;
};

int failToRun(int32_t id) {
    SCHED_LOG("run task failed. [%ld] [0x%04X %s:%d]", static_cast<long>(id), SCHED_LAST_ERROR);
    return -1;
}

int startChild(int32_t id, int32_t mode, TAVI_SCHED_TASK &task, const Followed *followed) {
    const sched::RunOrigin origin = sched::originOf(mode);
    sched::RunConnection connection;
    if (followed && !connection.make()) {
        SCHED_LOG("socketpair failed. %m");
        SCHED_SET_ERROR(sched::kSystemCallFailed);
        return failToRun(id);
    }
    switch (PLATCProcForkChildNoWait()) {
    case 1:
        if (followed) {
            followed->end = connection.takePid(followed->pid).release();
        }
        return 0;
    case 0:
        runInChild(task, origin, followed ? connection.tellPid() : base::Descriptor());
    default:
        SCHED_LOG("Fork error! [0x%04X %s:%d]", SCHED_LAST_ERROR);
        return failToRun(id);
    }
}

// No failure.
int skip(const TAVI_SCHED_TASK &task, int32_t mode, int32_t why) {
    if (mode == 1) {
        sched::recordSkipped(task, why);
    }
    return 0;
}

int runTask(int32_t id, int32_t mode, int32_t enabledOnly, const Followed *followed) {
    TAVI_SCHED_TASK task{};
    if (TAVISchedTaskGetByID(id, &task) < 0) {
        SCHED_LOG("get task failed. [%ld] [0x%04X %s:%d]", static_cast<long>(id), SCHED_LAST_ERROR);
        return -1;
    }
    if (task.state == TAVI_SCHED_STATE_NOT_EXISTED) {
        SCHED_LOG("task [%ld] does not exist. ", static_cast<long>(id));
        SCHED_SET_ERROR(sched::kNotFound);
        return -1;
    }
    if (mode != 0 && mode != 1) {
        return 0;
    }
    if (enabledOnly == 1 && task.state == TAVI_SCHED_STATE_DISABLED) {
        return skip(task, mode, TAVI_SCHED_RUN_TASK_DISABLED);
    }
    const int due = mode == 1 ? isDue(task) : 1;
    if (due < 0) {
        SCHED_LOG("check run time failed. [%ld] [0x%04X %s:%d]", static_cast<long>(id),
                  SCHED_LAST_ERROR);
    }
    if (due != 1) {
        return due == 0 ? skip(task, mode, TAVI_SCHED_RUN_NOT_DUE) : due;
    }
    return startChild(id, mode, task, followed);
}

} // namespace

int TAVISchedTaskRun(int32_t id, int32_t mode, int32_t enabledOnly) {
    return runTask(id, mode, enabledOnly, nullptr);
}

int TAVISchedTaskRunFollowed(int32_t id, int32_t mode, int32_t enabledOnly, int32_t *pPid,
                             int *pEnd) {
    SCHED_REQUIRE(pPid, "((void *)0) != pPid", -1);
    SCHED_REQUIRE(pEnd, "NULL != pEnd", -1);
    *pPid = -1;
    *pEnd = -1;
    const Followed followed{.pid = *pPid, .end = *pEnd};
    return runTask(id, mode, enabledOnly, &followed);
}
