// Records and changes of tasks: ids that are given again, and times that were missed.
#include "run_changes.h"
#include "backends/task_file.h"
#include "base/descriptor.h"
#include "limits.h"
#include "run_output.h"
#include "run_records.h"
#include "sched_error.h"
#include "sched_guard.h"
#include "sched_paths.h"
#include "sched_text.h"

#include <array>
#include <cstdlib>
#include <ctime>
#include <dirent.h>
#include <fcntl.h>
#include <memory>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>
#include <vector>

namespace {

using sched::RunRecords;

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

struct Span {
    int64_t from;
    int64_t until;
};

// Those of the task's times in the span that no record tells of, the latest of them.
std::vector<int64_t> missedTimes(const TAVI_SCHED_TASK &task, const Span &span,
                                 RunRecords &records) {
    std::array<int64_t, kMostStarts> starts; // NOLINT: filled before it is read
    const int count =
        TAVISchedTaskStarts(&task, span.from, span.until, starts.data(), starts.size());
    const int64_t known = count > 0 ? records.prunedUntil(task.id) : 0;
    std::vector<int64_t> missed;
    for (int i = count - 1; i >= 0 && missed.size() < kMostMissed; --i) {
        const int64_t due = starts[static_cast<size_t>(i)] * 1000;
        if (due > known && !records.hasRunDue(task.id, due)) {
            missed.insert(missed.begin(), due);
        }
    }
    return missed;
}

bool recordMissed(const TAVI_SCHED_TASK &task, int64_t due, int64_t now, RunRecords &records) {
    const auto number = sched::claimRunNumber();
    if (!number) {
        return false;
    }
    sched::RunRecord record{};
    record.run = *number;
    record.taskId = task.id;
    record.owner = task.owner;
    record.mode = 1;
    record.result = TAVI_SCHED_RUN_MISSED;
    record.due = due;
    record.asked = due;
    record.ended = now * 1000;
    sched::copyText(record.name, sizeof record.name, task.name);
    return records.write(record);
}

bool recordMissedOfAll(const Span &span, int64_t now) {
    RunRecords records(RunRecords::Mode::Write, {}, kPatience);
    if (!records) {
        return false;
    }
    const TAVI_SCHED_RUN_LIMITS limits = sched::readRunLimits();
    bool done = true;
    const auto look = [&](const char *, TAVI_SCHED_TASK *task) {
        const auto missed = missedTimes(*task, span, records);
        for (const int64_t due : missed) {
            done = done && recordMissed(*task, due, now, records);
        }
        if (!missed.empty()) {
            records.prune(limits, task->id);
        }
        return done;
    };
    return sched::forEachStoredTask({.onTask = look}) == 0 && done;
}

// What is about to change makes the tasks others than those of the time before: what may still be
// on its way then is not looked for any more.
enum class Next { Change, Nothing };

// The time of the last look is that of a file; it stays when the look could not be taken.
int takeLook(int fd, Next next) {
    struct stat last {};
    const int64_t now = std::time(nullptr);
    if (fstat(fd, &last) != 0 || access(sched::kWorkingCopy, F_OK) != 0) {
        return -1;
    }
    const bool isFirst = last.st_size == 0;
    const Span span{.from = std::max<int64_t>(last.st_mtime, now - kFarthest),
                    .until = now - kMargin};
    if (!isFirst && span.from < span.until && !recordMissedOfAll(span, now)) {
        return -1;
    }
    if (isFirst) {
        (void)!write(fd, "the time of this file is that of the last look for missed runs\n", 63);
    }
    const bool isOver = isFirst || next == Next::Change || last.st_mtime > now;
    const timespec until{.tv_sec = isOver ? now : std::max<int64_t>(span.until, last.st_mtime),
                         .tv_nsec = 0};
    const std::array<timespec, 2> times{until, until};
    return futimens(fd, times.data());
}

void look(Next next) {
    const base::Descriptor file(
        open(sched::kLastLook, O_RDWR | O_CREAT | O_NOFOLLOW | O_CLOEXEC, 0600));
    if (file && flock(file.get(), LOCK_EX | LOCK_NB) == 0) {
        const sched::KeptError error;
        sched::guarded(SCHED_SITE, [&] { return takeLook(file.get(), next); });
    }
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

void sched::recordMissedRuns() {
    if (geteuid() == 0 && access(kRecordFolder, F_OK) == 0) {
        look(Next::Change);
    }
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
