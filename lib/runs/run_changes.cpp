// Records and changes of tasks: ids that are given again, and times that were missed.
#include "run_changes.h"
#include "backends/task_file.h"
#include "base/descriptor.h"
#include "limits.h"
#include "run_output.h"
#include "run_records.h"
#include "sched_error.h"
#include "sched_guard.h"
#include "sched_handle.h"
#include "sched_paths.h"
#include "sched_text.h"

#include <array>
#include <cstdlib>
#include <ctime>
#include <dirent.h>
#include <fcntl.h>
#include <memory>
#include <optional>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>
#include <vector>

namespace {

using sched::RunRecords;

constexpr int64_t kMinute = 60;
constexpr int64_t kDay = 86400;
constexpr int64_t kFarthest = 31 * kDay; // nobody asks for more
constexpr size_t kMostStarts = 32 * 24;
constexpr size_t kMostMissed = 10; // of a task at once, the latest
// A run that cron has just started may not be recorded yet.
constexpr int64_t kMargin = 180;
constexpr int kPatience = 500; // milliseconds

void separate(int32_t id, bool onlyIfNeeded) {
    if (geteuid() != 0 || !sched::hasRunRecords()) {
        return;
    }
    sched::guarded(SCHED_SITE, [&] {
        RunRecords records(RunRecords::Mode::Write, {}, kPatience);
        if (records && (!onlyIfNeeded || records.hasRunsOf(id))) {
            records.separate(id, sched::nextRunNumber());
        }
        return 0;
    });
}

// ---- Missed times ----

struct Look {
    int64_t from;
    int64_t settled; // what was due before has been recorded by now
    int64_t until;
    int64_t now;
};

// The runs that are known, from both databases: what could not be recorded is in the status
// database all the same, for as long as that lasts.
class KnownRuns {
  public:
    explicit KnownRuns(RunRecords &records) : records_(records) {}
    // Milliseconds since the epoch. Also when that cannot be told.
    bool has(int32_t taskId, int64_t due) {
        return records_.hasRunDue(taskId, due) || hasRow(taskId, due / 1000);
    }
    // Something could not be told.
    bool areIncomplete() const { return isUnreadable_ || records_.isIncomplete(); }

  private:
    bool hasRow(int32_t taskId, int64_t due) {
        if (!open()) {
            return isUnreadable_;
        }
        sqlite3_stmt *statement = nullptr;
        sqlite3_prepare_v2(database_.get(),
                           "SELECT 1 FROM task_status WHERE task_id=?1 AND timestamp>=?2 AND "
                           "timestamp<?2+60",
                           -1, &statement, nullptr);
        sqlite3_bind_int(statement, 1, taskId);
        sqlite3_bind_int64(statement, 2, due);
        const int result = statement ? sqlite3_step(statement) : SQLITE_ERROR;
        sqlite3_finalize(statement);
        isUnreadable_ = isUnreadable_ || (result != SQLITE_ROW && result != SQLITE_DONE);
        return result != SQLITE_DONE;
    }
    bool open() {
        if (!isTried_) {
            isTried_ = true;
            sqlite3 *handle = nullptr;
            isUnreadable_ = TAVISchedDBOpenForReading(&handle) < 0;
            database_.reset(handle);
        }
        return database_ != nullptr;
    }

    RunRecords &records_;
    sched::Database database_;
    bool isTried_ = false;
    bool isUnreadable_ = false;
};

// Those of the task's times that no record tells of, the latest of them; nothing when that cannot
// be told.
std::optional<std::vector<int64_t>> missedTimes(const TAVI_SCHED_TASK &task, const Look &look,
                                                RunRecords &records, KnownRuns &known) {
    std::array<int64_t, kMostStarts> starts; // NOLINT: filled before it is read
    const int count =
        TAVISchedTaskStarts(&task, look.from, look.until, starts.data(), starts.size());
    const int64_t gone = count > 0 ? records.prunedUntil(task.id) : 0;
    std::vector<int64_t> missed;
    for (int i = count - 1; i >= 0 && missed.size() < kMostMissed; --i) {
        const int64_t due = starts[static_cast<size_t>(i)] * 1000;
        if (due > gone && !known.has(task.id, due)) {
            missed.insert(missed.begin(), due);
        }
    }
    return count < 0 || known.areIncomplete() ? std::nullopt : std::optional(std::move(missed));
}

// What cron should have started, or asked for in vain; the rest of the record is the caller's.
sched::RunRecord recordOf(const TAVI_SCHED_TASK &task, int32_t result) {
    sched::RunRecord record{};
    record.taskId = task.id;
    record.owner = task.owner;
    record.mode = 1;
    record.result = result;
    sched::copyText(record.name, sizeof record.name, task.name);
    return record;
}

bool writeNumbered(sched::RunRecord &record, RunRecords &records) {
    const auto number = sched::claimRunNumber();
    record.run = number.value_or(0);
    return number && records.write(record);
}

bool recordMissed(const TAVI_SCHED_TASK &task, int64_t due, const Look &look, RunRecords &records) {
    const bool isSettled = due < look.settled * 1000;
    sched::RunRecord record = recordOf(task, isSettled ? TAVI_SCHED_RUN_MISSED : sched::kAwaited);
    record.due = due;
    record.asked = due;
    record.ended = look.now * 1000;
    return writeNumbered(record, records);
}

// What was awaited at an earlier look, by the schedule that there was then.
bool settleAwaited(const Look &look, RunRecords &records, KnownRuns &known) {
    bool done = true;
    for (sched::RunRecord &record : records.awaited(look.settled * 1000)) {
        record.result = TAVI_SCHED_RUN_MISSED;
        const bool hasRun = known.has(record.taskId, record.due);
        done = done && !known.areIncomplete() &&
               (hasRun ? records.remove(record.run) : records.write(record));
    }
    return done && !known.areIncomplete();
}

bool recordMissedOfAll(const Look &look) {
    RunRecords records(RunRecords::Mode::Write, {}, kPatience);
    KnownRuns known(records);
    if (!records || !settleAwaited(look, records, known)) {
        return false;
    }
    const TAVI_SCHED_RUN_LIMITS limits = sched::readRunLimits();
    bool done = true;
    const auto onTask = [&](const char *, TAVI_SCHED_TASK *task) {
        const auto missed = missedTimes(*task, look, records, known);
        done = done && missed;
        for (size_t i = 0; done && i < missed->size(); ++i) {
            done = recordMissed(*task, (*missed)[i], look, records);
        }
        if (done && !missed->empty()) {
            records.prune(limits, task->id);
        }
        return done;
    };
    return sched::forEachStoredTask({.onTask = onTask}) == 0 && done;
}

// Whether a minute begins there, as tasks are due at no other moment.
bool hasMinute(int64_t from, int64_t until) {
    return (from + kMinute - 1) / kMinute * kMinute < until;
}

// What is about to change makes the tasks others than those of the time before: what may still be
// on its way then is awaited by what they are now.
enum class Next { Change, Nothing };

// The time of the last look is that of a file. It stays when the look could not be taken, unless
// tasks are about to become others, which would be taken to have missed what was never theirs.
int takeLook(int fd, Next next) {
    struct stat last {};
    const int64_t now = std::time(nullptr);
    if (fstat(fd, &last) != 0 || access(sched::kWorkingCopy, F_OK) != 0) {
        return -1;
    }
    const bool isFirst = last.st_size == 0;
    const bool isChange = next == Next::Change;
    Look look{.from = std::max<int64_t>(last.st_mtime, now - kFarthest),
              .settled = now - kMargin,
              .until = isChange ? now : now - kMargin,
              .now = now};
    if (!isFirst && look.from <= now && !hasMinute(look.from, now)) {
        return 0;
    }
    if (!isFirst && !recordMissedOfAll(look) && !isChange) {
        return -1;
    }
    if (isFirst) {
        (void)!write(fd, "the time of this file is that of the last look for missed runs\n", 63);
        look.until = now;
    }
    const int64_t lookedUntil = look.from > now ? now : std::max(look.from, look.until);
    const timespec until{.tv_sec = lookedUntil, .tv_nsec = 0};
    const std::array<timespec, 2> times{until, until};
    return futimens(fd, times.data());
}

int look(Next next) {
    const base::Descriptor file(
        open(sched::kLastLook, O_RDWR | O_CREAT | O_NOFOLLOW | O_CLOEXEC, 0600));
    const int wait = next == Next::Change ? LOCK_NB : 0; // a change has no time for others' looks
    if (!file || flock(file.get(), LOCK_EX | wait) != 0) {
        return -1;
    }
    const sched::KeptError error;
    return sched::guarded(SCHED_SITE, [&] { return takeLook(file.get(), next); });
}

// ---- Outputs without records ----

// A run that goes on may not be recorded, but nothing runs that long without a word.
void removeOrphans() {
    RunRecords records(RunRecords::Mode::Read);
    const std::unique_ptr<DIR, int (*)(DIR *)> folder(opendir(sched::kOutputFolder), closedir);
    while (const dirent *const entry = records && folder ? readdir(folder.get()) : nullptr) {
        struct stat status {};
        const int64_t run = std::strtoll(entry->d_name, nullptr, 10);
        if (run > 0 && fstatat(dirfd(folder.get()), entry->d_name, &status, 0) == 0 &&
            status.st_mtime < std::time(nullptr) - kDay && !records.has(run)) {
            unlinkat(dirfd(folder.get()), entry->d_name, 0);
        }
    }
}

} // namespace

void sched::separateFromRemovedTask(int32_t id) {
    separate(id, false);
}

void sched::separateFromNewTask(int32_t id) {
    separate(id, true);
}

void sched::recordSkipped(const TAVI_SCHED_TASK &task, int32_t result) {
    if (geteuid() != 0) {
        return;
    }
    const KeptError error;
    guarded(SCHED_SITE, [&] {
        const TAVI_SCHED_RUN_LIMITS limits = readRunLimits();
        if (limits.skipped == 1) {
            RunRecords records(RunRecords::Mode::Write, {}, kPatience);
            RunRecord record = recordOf(task, result);
            record.asked = record.ended = std::time(nullptr) * 1000;
            if (records && writeNumbered(record, records)) {
                records.prune(limits, task.id);
            }
        }
        return 0;
    });
}

void sched::recordMissedRuns() {
    if (geteuid() == 0 && access(kRecordFolder, F_OK) == 0) {
        look(Next::Change);
    }
}

int sched::findMissedRuns() {
    return guarded(SCHED_SITE, [] { return mendRunNumber() ? look(Next::Nothing) : -1; });
}

void sched::beginRecording() {
    guarded(SCHED_SITE, [] {
        if (mendRunNumber()) {
            removeOrphans();
            look(Next::Nothing);
        }
        return 0;
    });
}
