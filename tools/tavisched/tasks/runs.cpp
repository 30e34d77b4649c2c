// Runs as the status database remembers them.
#include "tasks/runs.h"
#include "failure.h"

#include <charconv>
#include <exception>
#include <iostream>
#include <memory>
#include <pwd.h>
#include <string_view>

namespace tavisched {

namespace {

constexpr int kAnyFailure = 1;
constexpr int kNotStarted = 127;
constexpr int kSignalBase = 128;

using Database = std::unique_ptr<sqlite3, decltype(&TAVISchedDBClose)>;

[[noreturn]] void failToRead() {
    throw Failure("how runs ended cannot be read: " + libraryError());
}

// Nothing before the first run since the machine's start.
Database openDatabase() {
    sqlite3 *database = nullptr;
    if (TAVISchedDBOpenForReading(&database) < 0) {
        failToRead();
    }
    return {database, TAVISchedDBClose};
}

// Collects rows; no exception may pass through the library.
struct Collector {
    size_t most = std::numeric_limits<size_t>::max();
    std::vector<Run> runs{};
    std::exception_ptr failure{};

    static int add(void *collector, const TAVI_SCHED_STATUS *row) {
        auto &self = *static_cast<Collector *>(collector);
        try {
            self.runs.push_back({.statusId = row->statusId,
                                 .taskId = row->taskId,
                                 .start = row->timestamp,
                                 .pid = row->pid,
                                 .code = row->statusCode,
                                 .comment = row->comment});
            return self.runs.size() < self.most ? 0 : 1;
        } catch (...) {
            self.failure = std::current_exception();
            return -1;
        }
    }
    std::vector<Run> result(int count, sqlite3 *database) {
        if (failure) {
            std::rethrow_exception(failure);
        }
        if (count < 0) {
            failToRead();
        }
        for (Run &run : runs) {
            int32_t end = 0;
            const int found = TAVISchedDBGetEnd(database, run.statusId, &end);
            if (found < 0) {
                failToRead();
            }
            run.end = found > 0 ? std::optional<time_t>(end) : std::nullopt;
        }
        return std::move(runs);
    }
};

int numberIn(std::string_view text) {
    int number = 0;
    std::from_chars(text.data(), text.data() + text.size(), number);
    return number;
}

} // namespace

std::vector<Run> readRuns(std::optional<int32_t> taskId, size_t most) {
    const Database database = openDatabase();
    Collector runs{.most = most};
    return database ? runs.result(TAVISchedDBListStatus(database.get(), taskId.value_or(-1),
                                                        Collector::add, &runs),
                                  database.get())
                    : std::vector<Run>();
}

LatestRuns readLatestRuns() {
    LatestRuns latest;
    try {
        if (const Database database = openDatabase()) {
            Collector runs;
            const int count = TAVISchedDBListLastStatus(database.get(), Collector::add, &runs);
            for (Run &run : runs.result(count, database.get())) {
                latest.try_emplace(run.taskId, std::move(run));
            }
        }
    } catch (const Failure &failure) {
        std::cerr << "tavisched: warning: " << failure.what() << "\n";
    }
    return latest;
}

// The row of such a run is left as a running one, without its process.
bool lackedOwner(const Run &run, const TAVI_SCHED_TASK *task) {
    return run.code == SCHED_STATUS_CODE_INTERRUPTED && task && !getpwuid(task->owner);
}

bool hasFailed(const Run &run) {
    return run.code != SCHED_STATUS_CODE_SUCCESS && run.code != SCHED_STATUS_CODE_RUNNING &&
           run.code != SCHED_STATUS_CODE_NONE;
}

int exitStatusOf(const Run &run, const TAVI_SCHED_TASK *task) {
    switch (run.code) {
    case SCHED_STATUS_CODE_SUCCESS:
        return 0;
    case SCHED_STATUS_CODE_START_FAILED:
        return kNotStarted;
    case SCHED_STATUS_CODE_EXIT_FAILED:
        return numberIn(run.comment);
    case SCHED_STATUS_CODE_STOPPED:
    case SCHED_STATUS_CODE_SIGNALED:
        return kSignalBase + numberIn(run.comment);
    default:
        return lackedOwner(run, task) ? kNotStarted : kAnyFailure;
    }
}

} // namespace tavisched
