// The records of runs: a database in a folder that only root enters. Whoever writes it goes on
// without it when that cannot be done soon: each function that fails has logged why.
#pragma once

#include "tavischeduler.h"

#include <array>
#include <cstdint>
#include <functional>
#include <initializer_list>
#include <memory>
#include <optional>
#include <sqlite3.h>
#include <string>
#include <vector>

namespace sched {

// A record, with what tells whether its process is still there.
struct RunRecord : TAVI_SCHED_RUN {
    int64_t processStart = 0;
    std::array<char, 40> boot{}; // of the machine's start that the process belongs to
};

// The result of a record that is not shown: its task was due, and what came of it is not known yet.
inline constexpr int32_t kAwaited = -1;

// Notes this process as the one that the run goes on in.
void setProcess(RunRecord &record);
// What has been recorded as going on, and still does.
bool goesOn(const RunRecord &record);

// The number of a new run, claimed with root's rights. Makes the folder when it is missing. Nothing
// when it cannot be had; that has been logged.
std::optional<int64_t> claimRunNumber();
// Numbers below this one have been claimed; 0 when that is not known.
int64_t nextRunNumber();
// Brings the number behind all records, after a power cut may have set it back, and makes the
// folder.
bool mendRunNumber();

// Whether there are records at all.
bool hasRunRecords();

class RunRecords {
  public:
    enum class Mode { Read, Write };
    // What to do while somebody else has the database, for some milliseconds; false: wait no more.
    using Pause = std::function<bool(int milliseconds)>;

    // Reading makes no database. A locked one is waited for so many milliseconds.
    explicit RunRecords(Mode mode, Pause pause = {}, int patience = 3000);
    RunRecords(const RunRecords &) = delete;
    RunRecords &operator=(const RunRecords &) = delete;

    explicit operator bool() const { return database_ != nullptr; }
    bool isMissing() const { return isMissing_; }
    // Something of it could not be read or written since it was opened.
    bool isIncomplete() const { return isIncomplete_; }
    // Whether everything in it can be read.
    enum class Health { Whole, Damaged, Unknown };
    Health health();
    // Puts a damaged database aside and makes another one.
    bool replace();

    bool write(const RunRecord &record);
    // Removes what is beyond the limits, of the task and of all, with its outputs.
    bool prune(const TAVI_SCHED_RUN_LIMITS &limits, int32_t taskId);

    // The first run that can be the present task's: earlier ones were of tasks that had its id.
    int64_t firstRunOf(int32_t taskId);
    bool separate(int32_t taskId, int64_t firstRun);
    // Whether there are runs that the present task would be taken to have done.
    bool hasRunsOf(int32_t taskId);

    // Hands the records over, the newest first. How many, or -1.
    int list(const TAVI_SCHED_RUN_FILTER &filter,
             const std::function<bool(const RunRecord &)> &reader);
    std::optional<RunRecord> find(int64_t run);
    // Also when that cannot be told.
    bool has(int64_t run);
    int64_t newest();

    // The last minute of the task's runs whose records are gone, in milliseconds.
    int64_t prunedUntil(int32_t taskId);
    bool hasRunDue(int32_t taskId, int64_t due);
    // Those of kAwaited that were due before that moment.
    std::vector<RunRecord> awaited(int64_t before);
    bool remove(int64_t run);

  private:
    using Handle = std::unique_ptr<sqlite3, int (*)(sqlite3 *)>;
    using Statement = std::unique_ptr<sqlite3_stmt, int (*)(sqlite3_stmt *)>;

    static int onBusy(void *self, int tries);
    bool open(Mode mode);
    bool openOnce(Mode mode);
    bool isDamaged() const;
    bool keepLog();
    bool upgrade();
    bool execute(const char *sql);
    Statement prepare(const std::string &sql);
    bool insert(const RunRecord &record);
    std::optional<std::vector<int64_t>> numbersOf(const TAVI_SCHED_RUN_FILTER &filter);
    Statement prepareFind();
    std::optional<RunRecord> fetch(sqlite3_stmt *statement, int64_t run);
    std::optional<int64_t> number(const char *sql, std::initializer_list<int64_t> values);
    bool failed(const char *what);

    Pause pause_;
    int64_t patience_ = 0;    // until then a locked database is waited for
    bool hasGivenUp_ = false; // on purpose
    bool isIncomplete_ = false;
    bool isMissing_ = false;
    bool wasDamaged_ = false; // and is not open
    Handle database_{nullptr, sqlite3_close};
};

} // namespace sched
