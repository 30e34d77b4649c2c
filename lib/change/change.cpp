// A change of stored tasks, and reading them beside one.
#include "change.h"
#include "base/file.h"
#include "base/trust.h"
#include "leftovers.h"
#include "sched_backend.h"
#include "sched_error.h"
#include "sched_guard.h"
#include "sched_paths.h"

#include <cerrno>
#include <pthread.h>
#include <sys/stat.h>
#include <unistd.h>

namespace {

bool recorded = false;  // by the change of this process that goes on
int openChanges = 0;    // one within another
bool takesBack = false; // what a cut-off change left, just now

// Backends bring the crontab in line with what their tasks are now. What fails is logged, and the
// next change or sync tries again.
template <typename Concerned> void syncBackends(Concerned &&isConcerned) {
    if (TAVISchedBackendInit() != 0) {
        return;
    }
    for (const TAVI_SCHED_BACKEND_RECORD &backend : sched::registeredBackends()) {
        if (backend.sync && isConcerned(backend)) {
            backend.sync();
        }
    }
}

// What was recorded is there again. 0, or -1, and then whoever comes next tries.
int takeBack(const sched::Record &record, bool withCrontab) {
    if (sched::restoreWhatIsRead(record) != 0) {
        return -1;
    }
    if (withCrontab && !record.isInPlace) {
        syncBackends([&](const TAVI_SCHED_BACKEND_RECORD &backend) {
            return backend.id != TAVI_SCHED_BACKEND_AUTOPOWER || record.before.hasPower();
        });
    }
    return sched::restorePersistent(record);
}

void takeBackOwn(bool withCrontab) {
    const sched::KeptError error;
    sched::guarded(
        SCHED_SITE,
        [&] {
            const auto record = sched::readRecord();
            return record ? takeBack(*record, withCrontab) : -1;
        },
        -1);
}

void logCutOff(pid_t process) {
    SCHED_LOG("a change was cut off and is taken back, process %d", static_cast<int>(process));
}

timespec beginOf(const std::optional<sched::ChangeLock::CutOff> &left) {
    struct stat record {};
    return left ? left->since : stat(sched::kRecord, &record) == 0 ? record.st_mtim : timespec{};
}

int takeBackRecorded() {
    const auto &left = sched::ChangeLock::leftBehind();
    sched::removeLeftovers(beginOf(left));
    const auto record = sched::readRecord();
    if (!record || takeBack(*record, true) != 0) {
        return -1;
    }
    logCutOff(record->process != 0 ? record->process : left ? left->process : 0);
    return 0;
}

// Nothing that is recorded was overwritten: a sync was cut off, or a change before or after that.
// The power schedules' lines alone are not written in one step.
int finishUnrecorded() {
    sched::tellWorkingCopyIsWhole();
    if (const auto &left = sched::ChangeLock::leftBehind()) {
        sched::removeLeftovers(left->since);
        syncBackends([](const TAVI_SCHED_BACKEND_RECORD &backend) {
            return backend.id == TAVI_SCHED_BACKEND_AUTOPOWER;
        });
        logCutOff(left->process);
    }
    return 0;
}

} // namespace

int sched::takeBackCutOffChange() {
    const auto state = recordState();
    if (state == RecordState::Unreadable) {
        SCHED_LOG("%s cannot be looked at: %m", kRecord);
        SCHED_SET_ERROR(kOpenFailed);
        return -1;
    }
    takesBack = true;
    const int result = guarded(SCHED_SITE, [&] {
        return state == RecordState::Present ? takeBackRecorded() : finishUnrecorded();
    });
    takesBack = false;
    return result;
}

namespace {

// A child has no part in its parent's change.
void forgetChangesInChild() {
    recorded = false;
    openChanges = 0;
    takesBack = false;
}

void forgetChangesInChildren() {
    static const int registered = pthread_atfork(nullptr, nullptr, forgetChangesInChild);
    static_cast<void>(registered);
}

} // namespace

sched::Change::Change() {
    if (!lock_) {
        return;
    }
    forgetChangesInChildren();
    isOutermost_ = openChanges++ == 0 && !takesBack;
    ready_ = !isOutermost_ || takeBackCutOffChange() == 0;
    recorded = recorded && !isOutermost_;
}

// The tasks alone: before the end nothing else has changed.
sched::Change::~Change() {
    if (!lock_) {
        return;
    }
    openChanges -= openChanges > 0 ? 1 : 0; // none in a child
    if (isOutermost_ && recorded) {
        recorded = false;
        takeBackOwn(false);
    }
}

void sched::Change::rollBack() {
    if (!isOutermost_ || !recorded) {
        return;
    }
    recorded = false;
    takeBackOwn(true);
}

int sched::Change::record(const Before &before) {
    // Without the folder there is no persistent file that could be overwritten: the copy fails.
    const bool hasFolder = access(kTaskFolder, F_OK) == 0 || errno != ENOENT;
    if (hasFolder && writeRecord(before) != 0) {
        return -1;
    }
    recorded = hasFolder;
    return 0;
}

int sched::Change::finish() {
    if (!isOutermost_ || !recorded) {
        return 0;
    }
    if (removeRecord() != 0) {
        rollBack();
        return -1;
    }
    recorded = false;
    return 0;
}

// ---- Reading ----

sched::Reading::Reading() : path_(kWorkingCopy) {
    if (lock_ && lock_.isOutermost() && !ChangeLock::isHeldHere()) {
        settle();
    }
}

// None was cut off: a change that goes on waits with overwriting it.
bool sched::Reading::isWhole() {
    return !ReadingLock::isUnfinished() &&
           ((recordState() != RecordState::Present && !ChangeLock::isMarked()) ||
            changeLockHolder() != 0);
}

// While this process has the lock of reading, a working copy that is finished stays whole, and one
// that is not was left so by a change that takes it back itself, or by one that was cut off.
void sched::Reading::settle() {
    if (isWhole()) {
        return;
    }
    const bool settled = ReadingLock::waitUntil([&] {
        lock_.release();
        const bool isBlocked = takeBack() == Turn::Failed;
        lock_.acquire();
        return !lock_ || isBlocked || !ReadingLock::isUnfinished();
    });
    const bool isTorn = path_ == kWorkingCopy && ReadingLock::isUnfinished();
    if (lock_ && (!settled || isTorn)) {
        SCHED_SET_ERROR(kReadWriteFailed);
        SCHED_LOG("%s is not whole", kWorkingCopy);
        lock_.release();
    }
}

// Whoever has the rights takes back what was cut off; else what was before it is read.
sched::Reading::Turn sched::Reading::takeBack() {
    changeLock_.emplace(ChangeLock::Wait::No);
    if (!*changeLock_) {
        changeLock_.reset();
        return Turn::Others;
    }
    if (ChangeLock::isUsable() && takeBackCutOffChange() == 0) {
        changeLock_.reset();
        return Turn::Done;
    }
    if (guarded(
            SCHED_SITE, [] { return recordHasTasks(); }, false)) {
        path_ = kRecord;
    } else {
        changeLock_.reset();
    }
    return Turn::Failed;
}
