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
#include <unistd.h>

namespace {

bool recorded = false; // by the change of this process that goes on

// Both backends bring the crontab in line with what their tasks are now. What fails is logged, and
// the next change or sync tries again.
void syncBackends(const sched::Before &before) {
    if (TAVISchedBackendInit() != 0) {
        return;
    }
    for (const TAVI_SCHED_BACKEND_RECORD &backend : sched::registeredBackends()) {
        const bool concerned = backend.id != TAVI_SCHED_BACKEND_AUTOPOWER || before.hasPower();
        if (concerned && backend.sync) {
            backend.sync();
        }
    }
}

// What was recorded is there again; nothing when that failed, and then whoever comes next tries.
std::optional<sched::Before> restoreRecorded() {
    const sched::KeptError error;
    return sched::guarded(
        SCHED_SITE,
        []() -> std::optional<sched::Before> {
            auto record = sched::readRecord();
            const bool restored = record && sched::restore(*record) == 0;
            return restored ? std::optional(std::move(record->before)) : std::nullopt;
        },
        std::nullopt);
}

} // namespace

int sched::takeBackCutOffChange() {
    switch (recordState()) {
    case RecordState::None:
        return 0;
    case RecordState::Unreadable:
        SCHED_LOG("%s cannot be looked at: %m", kRecord);
        SCHED_SET_ERROR(kOpenFailed);
        return -1;
    case RecordState::Present:
        break;
    }
    return guarded(
        SCHED_SITE,
        [] {
            removeLeftovers();
            const auto record = readRecord();
            if (!record || restore(*record) != 0) {
                return -1;
            }
            syncBackends(record->before);
            SCHED_LOG("a change was cut off and is taken back, process %d",
                      static_cast<int>(record->process));
            return 0;
        },
        -1);
}

sched::Change::Change() {
    if (!lock_) {
        return;
    }
    isOutermost_ = lock_.isOutermost();
    ready_ = !isOutermost_ || takeBackCutOffChange() == 0;
    recorded = recorded && !isOutermost_;
}

// The tasks alone: before the end nothing else has changed.
sched::Change::~Change() {
    if (isOutermost_ && recorded) {
        recorded = false;
        restoreRecorded();
    }
}

void sched::Change::rollBack() {
    if (!isOutermost_ || !recorded) {
        return;
    }
    recorded = false;
    const KeptError error;
    if (const auto before = restoreRecorded()) {
        syncBackends(*before);
    }
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

int sched::Change::discard() {
    if (isOutermost_ && recorded) {
        recorded = false;
        return removeRecord();
    }
    return 0;
}

// ---- Reading ----

sched::Reading::Reading() : path_(kWorkingCopy) {
    if (lock_ && recordState() == RecordState::Present && !ChangeLock::isHeldHere()) {
        lock_.release();
        path_ = choosePath();
        lock_.acquire();
    }
}

// A change that goes on has the lock, and the working copy is whole whenever it can be read at all.
// Else the change was cut off, and who has the rights takes it back.
const char *sched::Reading::choosePath() {
    const ChangeLock lock(ChangeLock::Wait::No);
    if (!lock || !ChangeLock::isUsable() || takeBackCutOffChange() == 0) {
        return kWorkingCopy;
    }
    return guarded(
               SCHED_SITE, [] { return recordHasTasks(); }, false)
               ? kRecord
               : kWorkingCopy;
}
