// Runs as the status database remembers them.
#include "runs.h"
#include "failure.h"
#include "paths.h"
#include "tavischeduler.h"

#include <array>
#include <charconv>
#include <memory>
#include <sqlite3.h>
#include <string_view>
#include <unistd.h>

namespace tavisched {

namespace {

constexpr int kBusyTimeout = 5000; // milliseconds
constexpr int kAnyFailure = 1;
constexpr int kNotStarted = 127;
constexpr int kSignalBase = 128;

using Database = std::unique_ptr<sqlite3, decltype(&sqlite3_close)>;
using Statement = std::unique_ptr<sqlite3_stmt, decltype(&sqlite3_finalize)>;

Database openDatabase() {
    if (access(kStatusDatabase, R_OK | W_OK) != 0) {
        throw Failure(std::string("cannot read ") + kStatusDatabase + ": " + systemReason());
    }
    Database database(TAVISchedDBInit(), sqlite3_close);
    if (!database) {
        throw Failure(std::string("cannot open ") + kStatusDatabase + ": " + libraryError());
    }
    sqlite3_busy_timeout(database.get(), kBusyTimeout);
    return database;
}

Run readRow(sqlite3_stmt *row) {
    const auto *const comment = reinterpret_cast<const char *>(sqlite3_column_text(row, 5));
    return {.statusId = sqlite3_column_int(row, 0),
            .taskId = sqlite3_column_int(row, 1),
            .start = static_cast<time_t>(sqlite3_column_int64(row, 2)),
            .pid = sqlite3_column_int(row, 3),
            .code = sqlite3_column_int(row, 4),
            .comment = comment ? comment : ""};
}

// The library tells a run that goes on from one whose process is gone.
void settleRunning(sqlite3 *database, Run &run) {
    std::array<char, 1024> comment{};
    TAVISchedDBGetStatusByStatusID(database, run.statusId, &run.code, comment.data(),
                                   comment.size());
    run.comment = comment.data();
}

int numberIn(std::string_view text) {
    int number = 0;
    std::from_chars(text.data(), text.data() + text.size(), number);
    return number;
}

} // namespace

std::vector<Run> readRuns(std::optional<int32_t> taskId) {
    if (access(kStatusDatabase, F_OK) != 0) {
        return {};
    }
    const Database database = openDatabase();
    sqlite3_stmt *prepared = nullptr;
    sqlite3_prepare_v2(database.get(),
                       "SELECT status_id, task_id, timestamp, pid, status_code, comment "
                       "FROM task_status WHERE ?1 IS NULL OR task_id = ?1 "
                       "ORDER BY timestamp DESC, status_id DESC",
                       -1, &prepared, nullptr);
    const Statement statement(prepared, sqlite3_finalize);
    if (taskId) {
        sqlite3_bind_int(prepared, 1, *taskId);
    }
    std::vector<Run> runs;
    int step = SQLITE_ROW;
    while ((step = sqlite3_step(prepared)) == SQLITE_ROW) {
        runs.push_back(readRow(prepared));
    }
    if (step != SQLITE_DONE) {
        throw Failure(std::string("cannot read ") + kStatusDatabase + ": " +
                      sqlite3_errmsg(database.get()));
    }
    for (Run &run : runs) {
        if (run.code == SCHED_STATUS_CODE_RUNNING) {
            settleRunning(database.get(), run);
        }
    }
    return runs;
}

std::map<int32_t, Run> readLatestRuns() {
    std::map<int32_t, Run> latest;
    for (Run &run : readRuns()) {
        latest.try_emplace(run.taskId, std::move(run));
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
