// Runs as the status database remembers them.
#include "runs.h"
#include "failure.h"
#include "paths.h"
#include "tavischeduler.h"

#include <charconv>
#include <exception>
#include <memory>
#include <string_view>
#include <unistd.h>

namespace tavisched {

namespace {

constexpr int kAnyFailure = 1;
constexpr int kNotStarted = 127;
constexpr int kSignalBase = 128;

using Database = std::unique_ptr<sqlite3, decltype(&TAVISchedDBClose)>;

[[noreturn]] void failToRead(const std::string &reason) {
    throw Failure(std::string("cannot read ") + kStatusDatabase + ": " + reason);
}

// Nothing before the first run since the machine's start.
Database openDatabase() {
    sqlite3 *database = nullptr;
    if (access(kStatusDatabase, F_OK) == 0 && access(kStatusDatabase, R_OK | W_OK) != 0) {
        failToRead(systemReason());
    }
    if (TAVISchedDBOpenForReading(&database) < 0) {
        failToRead(libraryError());
    }
    return {database, TAVISchedDBClose};
}

// Collects rows; no exception may pass through the library.
struct Collector {
    std::vector<Run> runs;
    std::exception_ptr failure;

    static int add(void *collector, const TAVI_SCHED_STATUS *row) {
        auto &self = *static_cast<Collector *>(collector);
        try {
            self.runs.push_back({.taskId = row->taskId,
                                 .start = row->timestamp,
                                 .pid = row->pid,
                                 .code = row->statusCode,
                                 .comment = row->comment});
            return 0;
        } catch (...) {
            self.failure = std::current_exception();
            return -1;
        }
    }
    std::vector<Run> result(int count) {
        if (failure) {
            std::rethrow_exception(failure);
        }
        if (count < 0) {
            failToRead(libraryError());
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

std::vector<Run> readRuns(std::optional<int32_t> taskId) {
    const Database database = openDatabase();
    Collector runs;
    return database ? runs.result(TAVISchedDBListStatus(database.get(), taskId.value_or(-1),
                                                        Collector::add, &runs))
                    : std::vector<Run>();
}

std::map<int32_t, Run> readLatestRuns() {
    std::map<int32_t, Run> latest;
    if (const Database database = openDatabase()) {
        Collector runs;
        for (Run &run :
             runs.result(TAVISchedDBListLastStatus(database.get(), Collector::add, &runs))) {
            latest.try_emplace(run.taskId, std::move(run));
        }
    }
    return latest;
}

int exitStatusOf(const Run &run) {
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
        return kAnyFailure;
    }
}

} // namespace tavisched
