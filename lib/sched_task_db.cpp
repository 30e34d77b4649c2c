// The status database: a row for every run of a task. Many runners use it at once, so a statement
// that meets a locked database is tried again after a random pause.
#include "base/trust.h"
#include "platc.h"
#include "sched_error.h"
#include "sched_handle.h"
#include "sched_paths.h"
#include "sched_shared_file.h"
#include "sched_text.h"
#include "tavischeduler.h"

#include <array>
#include <cerrno>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <sqlite3.h>
#include <sys/stat.h>
#include <unistd.h>

namespace {

using sched::LogText;
using sched::SqlText;

constexpr const char *kCreateTable =
    "CREATE TABLE if not exists task_status(status_id INTEGER PRIMARY KEY ASC, pid INTEGER, "
    "timestamp INTEGER, app STRING, task_id INTEGER, status_code INTEGER, comment STRING);";
// Keeps the journal's file, which is claimed beside the database, in place.
constexpr const char *kKeepJournal = "PRAGMA journal_mode=TRUNCATE;";
constexpr int kMaxRetries = 100;

using RowReader = int (*)(void *context, int columns, char **values, char **names);

// A pause of 0.1 s to 1 s. The product wraps, a negative sum counts as a large unsigned number: the
// distribution of the pauses is that of the runners which share the database on an appliance that
// is being upgraded.
void pauseBeforeRetry() {
    const auto product = static_cast<int32_t>(static_cast<uint32_t>(std::rand()) * 32U);
    const auto sum = static_cast<uint32_t>(product % 1000000 + 100000);
    usleep(std::min(sum, 999999U));
}

int execute(sqlite3 *db, const char *sql, RowReader reader = nullptr, void *context = nullptr) {
    for (int retries = 0;; ++retries) {
        char *text = nullptr;
        const int result = sqlite3_exec(db, sql, reader, context, &text);
        const SqlText error(text);
        if (result == SQLITE_OK || (reader && result == SQLITE_ABORT)) { // the reader has enough
            return 0;
        }
        if (!error) {
            return -1;
        }
        if (!std::strstr(error.get(), "database is locked") || retries >= kMaxRetries) {
            SCHED_LOG("Exec sql:[%s] error: %s\n", LogText(sql).c_str(), error.get());
            return -1;
        }
        pauseBeforeRetry();
    }
}

// Statements are built from formats with %q for texts: a quote in a value is doubled and stays part
// of the value.
template <typename... Args> SqlText format(const char *sql, Args... args) {
    return SqlText(sqlite3_mprintf(sql, args...));
}

int executeBuilt(sqlite3 *db, const SqlText &sql, RowReader reader = nullptr,
                 void *context = nullptr) {
    return sql ? execute(db, sql.get(), reader, context) : -1;
}

int32_t number(const char *value) {
    return value ? static_cast<int32_t>(std::strtol(value, nullptr, 10)) : 0;
}

void storeColumn(TAVI_SCHED_STATUS &status, const char *name, const char *value) {
    if (std::strcmp(name, "pid") == 0) {
        status.pid = number(value);
    } else if (std::strcmp(name, "status_id") == 0) {
        status.statusId = number(value);
    } else if (std::strcmp(name, "timestamp") == 0) {
        status.timestamp = number(value);
    } else if (std::strcmp(name, "task_id") == 0) {
        status.taskId = number(value);
    } else if (std::strcmp(name, "status_code") == 0) {
        status.statusCode = number(value);
    } else if (std::strcmp(name, "app") == 0) {
        sched::copyText(status.app, sizeof status.app, value ? value : "");
    } else if (std::strcmp(name, "comment") == 0) {
        sched::copyText(status.comment, sizeof status.comment, value ? value : "");
    }
}

void storeRow(TAVI_SCHED_STATUS &status, int columns, char **values, char **names) {
    for (int i = 0; i < columns; ++i) {
        storeColumn(status, names[i], values[i]);
    }
}

// Takes the first row and ignores the others.
int readFirstRow(void *argument, int columns, char **values, char **names) {
    auto &status = *static_cast<TAVI_SCHED_STATUS *>(argument);
    if (!status.found) {
        status.found = 1;
        storeRow(status, columns, values, names);
    }
    return 0;
}

bool isAlive(int32_t pid) {
    return pid > 0 && PLATCProcAlive(pid) == 1;
}

// Takes row after row up to one whose process is alive.
int readLiveRow(void *argument, int columns, char **values, char **names) {
    auto &status = *static_cast<TAVI_SCHED_STATUS *>(argument);
    if (!status.found) {
        storeRow(status, columns, values, names);
        status.found = isAlive(status.pid) ? 1 : 0;
    }
    return 0;
}

// The row's code, or that it was interrupted: nobody is left to end it.
int32_t reportedCode(const TAVI_SCHED_STATUS &status) {
    const bool gone = status.statusCode == SCHED_STATUS_CODE_RUNNING && status.pid > 0 &&
                      PLATCProcAlive(status.pid) != 1;
    return gone ? SCHED_STATUS_CODE_INTERRUPTED : status.statusCode;
}

// Hands a row out as a read of the last status: 1, or 0 when there was no row.
int reportStatus(const TAVI_SCHED_STATUS &status, int32_t *code, char *comment, size_t cbComment) {
    if (!status.found) {
        return 0;
    }
    *code = reportedCode(status);
    if (comment && cbComment > 0) {
        sched::copyText(comment, cbComment, status.comment);
    }
    return 1;
}

// A journal or a write-ahead log that another user put beside the database would be obeyed; SQLite
// looks for them again and again, so their names are held by empty files.
bool claimJournals() {
    return sched::claimSharedFile(sched::kStatusWal) == 0 &&
           sched::claimSharedFile(sched::kStatusJournal) == 0;
}

void failToOpen(const char *reason) {
    SCHED_LOG("Can't open database: %s\n", reason);
    SCHED_SET_ERROR(sched::kOpenFailed);
}

sched::Database openDatabase(int flags) {
    sqlite3 *handle = nullptr;
    const int result = sqlite3_open_v2(sched::kStatusDatabase, &handle, flags, nullptr);
    sched::Database db(handle);
    if (result != SQLITE_OK) {
        failToOpen(sqlite3_errmsg(db.get()));
        return nullptr;
    }
    return db;
}

// The pragma counts for the next commit. While the database is locked it fails, and the statement
// that matters does the waiting.
int createTable(sqlite3 *db) {
    const bool keeps = sqlite3_exec(db, kKeepJournal, nullptr, nullptr, nullptr) == SQLITE_OK;
    const int created = execute(db, kCreateTable);
    return created != 0 || keeps ? created : execute(db, kKeepJournal);
}

// Hands rows over to a caller's function.
struct Listing {
    TAVI_SCHED_STATUS_READER reader;
    void *context;
    bool lastOnly;
    int count = 0;
    TAVI_SCHED_STATUS status{};
};

int handOver(void *argument, int columns, char **values, char **names) {
    auto &listing = *static_cast<Listing *>(argument);
    TAVI_SCHED_STATUS &status = listing.status;
    const int32_t taskBefore = status.taskId;
    storeRow(status, columns, values, names);
    if (listing.lastOnly && listing.count > 0 && status.taskId == taskBefore) {
        return 0;
    }
    status.statusCode = reportedCode(status);
    status.found = 1;
    ++listing.count;
    return listing.reader(listing.context, &status);
}

// Rows are in memory one at a time. With `lastOnly` those of a task stand together, the newest
// first.
int list(sqlite3 *db, int32_t taskId, Listing &&listing) {
    const SqlText sql = format("SELECT status_id, pid, timestamp, app, task_id, status_code, "
                               "comment FROM task_status WHERE %d = -1 OR task_id = %d "
                               "ORDER BY %s timestamp DESC, status_id DESC",
                               taskId, taskId, listing.lastOnly ? "task_id," : "");
    return executeBuilt(db, sql, handOver, &listing) == 0 ? listing.count : -1;
}

// A statement put together piece by piece in a bounded buffer.
class BoundedStatement {
  public:
    void append(const SqlText &piece) {
        const size_t length = piece ? std::strlen(piece.get()) : text_.size();
        fits_ = fits_ && length < text_.size() - length_;
        if (fits_) {
            std::memcpy(text_.data() + length_, piece.get(), length + 1);
            length_ += length;
        }
    }
    bool fits() const { return fits_; }
    const char *c_str() const { return text_.data(); }

  private:
    std::array<char, 4096> text_{};
    size_t length_ = 0;
    bool fits_ = true;
};

} // namespace

sqlite3 *TAVISchedDBInit() {
    TAVISchedRandInit();
    if (!claimJournals() || sched::claimSharedFile(sched::kStatusDatabase) != 0) {
        failToOpen(std::strerror(errno));
        return nullptr;
    }
    sched::Database db = openDatabase(SQLITE_OPEN_READWRITE | SQLITE_OPEN_CREATE);
    if (!db) {
        return nullptr;
    }
    return createTable(db.get()) == 0 ? db.release() : nullptr;
}

// The handle may write, or what a dead writer left in the journal could not be taken back.
int TAVISchedDBOpenForReading(sqlite3 **ppDb) {
    SCHED_REQUIRE(ppDb, "((void *)0) != ppDb", -1);
    *ppDb = nullptr;
    struct stat status {};
    if (lstat(sched::kStatusDatabase, &status) != 0 && errno == ENOENT) {
        return 0;
    }
    const char *const strange = base::whyNotTrusted(status, base::kSharedFile);
    if (!strange && status.st_size == 0) {
        return 0; // the first runner is about to fill it
    }
    if (strange || access(sched::kStatusDatabase, R_OK | W_OK) != 0 || !claimJournals()) {
        failToOpen(strange ? strange : std::strerror(errno));
        return -1;
    }
    TAVISchedRandInit();
    *ppDb = openDatabase(SQLITE_OPEN_READWRITE).release();
    return *ppDb ? 1 : -1;
}

int TAVISchedDBClose(sqlite3 *db) {
    SCHED_REQUIRE(db, "((void *)0) != db", -1);
    if (sqlite3_close(db) != SQLITE_OK) {
        SCHED_LOG("Can't close database: %s\n", sqlite3_errmsg(db));
        SCHED_SET_ERROR(sched::kReadWriteFailed);
        return -1;
    }
    return 0;
}

int TAVISchedDBAddRecord(sqlite3 *db, const TAVI_SCHED_TASK *pTask, int32_t *pStatusId) {
    const auto now = static_cast<long>(std::time(nullptr));
    const int pid = getpid();
    SCHED_REQUIRE(db, "((void *)0) != db", -1);
    SCHED_REQUIRE(pTask, "NULL != pTask", -1);
    const long id = pTask->id;
    if (executeBuilt(db, format("INSERT INTO task_status (app, pid, timestamp, task_id, "
                                "status_code) VALUES ('%q', %d, %ld, %ld, %d);",
                                pTask->app, pid, now, id, SCHED_STATUS_CODE_RUNNING)) != 0) {
        return -1;
    }
    TAVI_SCHED_STATUS status{};
    if (executeBuilt(db,
                     format("SELECT status_id from task_status WHERE app='%q' AND task_id=%ld AND "
                            "timestamp=%ld AND status_code=%d AND pid=%d;",
                            pTask->app, id, now, SCHED_STATUS_CODE_RUNNING, pid),
                     readFirstRow, &status) != 0) {
        return -1;
    }
    if (!status.found) {
        SCHED_SET_ERROR(sched::kReadWriteFailed);
        return -1;
    }
    if (pStatusId) {
        *pStatusId = status.statusId;
    }
    return 0;
}

int TAVISchedDBSetStatus(sqlite3 *db, int32_t statusId, int32_t orgStatusCode,
                         int32_t newStatusCode, const char *szComment) {
    SCHED_REQUIRE(db, "((void *)0) != db", -1);
    SCHED_REQUIRE(orgStatusCode != SCHED_STATUS_CODE_NONE || statusId != -1,
                  "SCHED_STATUS_CODE_NONE != orgStatusCode || -1 != iStatusID", -1);
    BoundedStatement sql;
    sql.append(format("UPDATE task_status SET status_code=%d", newStatusCode));
    if (szComment && *szComment != '\0') {
        sql.append(format(", comment='%q'", szComment));
    }
    if (statusId == -1) {
        sql.append(format(" WHERE status_code=%d", orgStatusCode));
    } else {
        sql.append(format(" WHERE status_id=%d", statusId));
        if (orgStatusCode != SCHED_STATUS_CODE_NONE) {
            sql.append(format(" AND status_code=%d", orgStatusCode));
        }
    }
    // Executed without its end, the statement would change every row.
    if (!sql.fits()) {
        SCHED_LOG("status update is too long, status_id:[%d]", statusId);
        SCHED_SET_ERROR(sched::kInvalidArgument);
        return -1;
    }
    return execute(db, sql.c_str());
}

int TAVISchedDBGetStatusByTaskID(sqlite3 *db, int32_t taskId, int32_t *pTimestamp,
                                 int32_t *pStatusCode, char *szComment, size_t cbComment) {
    SCHED_REQUIRE(db, "((void *)0) != db", -1);
    SCHED_REQUIRE(pStatusCode, "NULL != pStatusCode", -1);
    TAVI_SCHED_STATUS status{};
    if (executeBuilt(db,
                     format("SELECT pid,timestamp,status_code,comment from task_status WHERE "
                            "task_id=%ld ORDER BY timestamp DESC",
                            static_cast<long>(taskId)),
                     readFirstRow, &status) != 0) {
        return -1;
    }
    if (status.found && pTimestamp) {
        *pTimestamp = status.timestamp;
    }
    return reportStatus(status, pStatusCode, szComment, cbComment);
}

int TAVISchedDBGetStatusByStatusID(sqlite3 *db, int32_t statusId, int32_t *pStatusCode,
                                   char *szComment, size_t cbComment) {
    SCHED_REQUIRE(db, "((void *)0) != db", -1);
    SCHED_REQUIRE(pStatusCode, "NULL != pStatusCode", -1);
    TAVI_SCHED_STATUS status{};
    if (executeBuilt(
            db,
            format("SELECT pid,status_code,comment from task_status WHERE status_id=%d", statusId),
            readFirstRow, &status) != 0) {
        return -1;
    }
    return reportStatus(status, pStatusCode, szComment, cbComment);
}

int TAVISchedDBIsTaskRunning(sqlite3 *db, int32_t taskId, TAVI_SCHED_STATUS *pStatus) {
    SCHED_REQUIRE(pStatus, "((void *)0) != pStatus", -1);
    SCHED_REQUIRE(db, "NULL != db", -1);
    return executeBuilt(db,
                        format("SELECT pid,status_id,task_id from task_status WHERE task_id=%ld "
                               "AND status_code=%d;",
                               static_cast<long>(taskId), SCHED_STATUS_CODE_RUNNING),
                        readLiveRow, pStatus);
}

int TAVISchedDBIsAppRunning(sqlite3 *db, const char *szApp, TAVI_SCHED_STATUS *pStatus) {
    SCHED_REQUIRE(db, "((void *)0) != db", -1);
    SCHED_REQUIRE(szApp, "((void *)0) != szApp", -1);
    SCHED_REQUIRE(pStatus, "NULL != pStatus", -1);
    return executeBuilt(db,
                        format("SELECT pid,status_id,task_id from task_status WHERE app='%q' AND "
                               "status_code=%d;",
                               szApp, SCHED_STATUS_CODE_RUNNING),
                        readLiveRow, pStatus);
}

int TAVISchedDBListStatus(sqlite3 *db, int32_t taskId, TAVI_SCHED_STATUS_READER reader,
                          void *pContext) {
    SCHED_REQUIRE(db, "((void *)0) != db", -1);
    SCHED_REQUIRE(reader, "NULL != reader", -1);
    return list(db, taskId, {.reader = reader, .context = pContext, .lastOnly = false});
}

int TAVISchedDBListLastStatus(sqlite3 *db, TAVI_SCHED_STATUS_READER reader, void *pContext) {
    SCHED_REQUIRE(db, "((void *)0) != db", -1);
    SCHED_REQUIRE(reader, "NULL != reader", -1);
    return list(db, -1, {.reader = reader, .context = pContext, .lastOnly = true});
}
