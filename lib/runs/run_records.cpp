// The database of the runs' records, and the number of the next run.
#include "run_records.h"
#include "base/child.h"
#include "base/descriptor.h"
#include "base/file.h"
#include "base/trust.h"
#include "run_output.h"
#include "sched_error.h"
#include "sched_paths.h"
#include "sched_text.h"

#include <cerrno>
#include <cinttypes>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <fcntl.h>
#include <poll.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <type_traits>
#include <unistd.h>

namespace {

using sched::RunRecord;

constexpr int kPause = 10; // milliseconds
constexpr int kSchema = 2;

// Each brings the database from the version that is its place to the next one.
constexpr const char *kUpgrades[kSchema] = {
    "CREATE TABLE runs(run INTEGER PRIMARY KEY, task_id INTEGER NOT NULL, owner INTEGER NOT NULL, "
    "mode INTEGER NOT NULL, started_by INTEGER NOT NULL, result INTEGER NOT NULL, "
    "number INTEGER NOT NULL, due INTEGER NOT NULL, asked INTEGER NOT NULL, "
    "began INTEGER NOT NULL, ended INTEGER NOT NULL, duration INTEGER NOT NULL, "
    "waiting_since INTEGER NOT NULL, waited INTEGER NOT NULL, waited_for INTEGER NOT NULL, "
    "output_size INTEGER NOT NULL, pid INTEGER NOT NULL, process_start INTEGER NOT NULL, "
    "boot TEXT NOT NULL, name TEXT NOT NULL);"
    "CREATE INDEX runs_of_task ON runs(task_id, run);"
    "CREATE TABLE tasks(task_id INTEGER PRIMARY KEY, first_run INTEGER NOT NULL DEFAULT 0, "
    "pruned_until INTEGER NOT NULL DEFAULT 0);"
    "PRAGMA user_version=1;",
    // Those that are awaited.
    "CREATE INDEX runs_awaited ON runs(due) WHERE result=-1;"
    "PRAGMA user_version=2;"};

// The first run that can be the present task's, of the task of a row of runs.
constexpr const char *kFirstRun =
    "ifnull((SELECT first_run FROM tasks AS t WHERE t.task_id=runs.task_id), 0)";

// The one list of columns: statements, what is bound and what is read follow it.
template <typename Row, typename Visit> void forEachColumn(Row &row, Visit &&visit) {
    visit("run", row.run);
    visit("task_id", row.taskId);
    visit("owner", row.owner);
    visit("mode", row.mode);
    visit("started_by", row.startedBy);
    visit("result", row.result);
    visit("number", row.number);
    visit("due", row.due);
    visit("asked", row.asked);
    visit("began", row.began);
    visit("ended", row.ended);
    visit("duration", row.duration);
    visit("waiting_since", row.waitingSince);
    visit("waited", row.waited);
    visit("waited_for", row.waitedFor);
    visit("output_size", row.outputSize);
    visit("pid", row.pid);
    visit("process_start", row.processStart);
    visit("boot", row.boot);
    visit("name", row.name);
}

template <typename Value> constexpr bool isNumber = std::is_integral_v<std::decay_t<Value>>;

const char *textOf(const char *text) {
    return text;
}
template <size_t size> const char *textOf(const std::array<char, size> &text) {
    return text.data();
}
template <size_t size> void setText(char (&text)[size], const char *value) {
    sched::copyText(text, size, value);
}
template <size_t size> void setText(std::array<char, size> &text, const char *value) {
    sched::copyText(text.data(), size, value);
}

std::string columns() {
    std::string names;
    const RunRecord none{};
    forEachColumn(none, [&](const char *name, const auto &) {
        names.append(names.empty() ? "" : ", ").append(name);
    });
    return names;
}

void bind(sqlite3_stmt *statement, const RunRecord &record) {
    int place = 0;
    forEachColumn(record, [&](const char *, const auto &value) {
        if constexpr (isNumber<decltype(value)>) {
            sqlite3_bind_int64(statement, ++place, static_cast<int64_t>(value));
        } else {
            sqlite3_bind_text(statement, ++place, textOf(value), -1, SQLITE_STATIC);
        }
    });
}

void take(sqlite3_stmt *statement, RunRecord &record) {
    int place = 0;
    forEachColumn(record, [&](const char *, auto &value) {
        if constexpr (isNumber<decltype(value)>) {
            value = static_cast<std::decay_t<decltype(value)>>(
                sqlite3_column_int64(statement, place++));
        } else {
            const auto *const text = sqlite3_column_text(statement, place++);
            setText(value, text ? reinterpret_cast<const char *>(text) : "");
        }
    });
}

bool hasFailed(int32_t result) {
    switch (result) {
    case TAVI_SCHED_RUN_NONE:
    case TAVI_SCHED_RUN_RUNNING:
    case TAVI_SCHED_RUN_SUCCESS:
    case TAVI_SCHED_RUN_WAITING:
    case TAVI_SCHED_RUN_NOT_DUE:
        return false;
    default:
        return true;
    }
}

// What is known only now: whether it still goes on, and how much it has printed.
void complete(RunRecord &record) {
    const bool isOpen =
        record.result == TAVI_SCHED_RUN_RUNNING || record.result == TAVI_SCHED_RUN_WAITING;
    if (isOpen && !sched::goesOn(record)) {
        record.result = TAVI_SCHED_RUN_INTERRUPTED;
    }
    const sched::OutputSize size = sched::outputSizeOf(record.run);
    record.outputSize = std::max(record.outputSize, size.total);
    record.outputKept = size.kept;
}

int64_t monotonicNow() {
    timespec now{};
    clock_gettime(CLOCK_MONOTONIC, &now);
    return now.tv_sec * 1000LL + now.tv_nsec / 1000000;
}

void setBoot(std::array<char, 40> &boot) {
    const base::Descriptor file(open("/proc/sys/kernel/random/boot_id", O_RDONLY | O_CLOEXEC));
    const ssize_t length = file ? read(file.get(), boot.data(), boot.size() - 1) : 0;
    boot[length > 0 ? static_cast<size_t>(length) : 0] = '\0';
    boot[std::strcspn(boot.data(), "\n")] = '\0';
}

// ---- The folder and the number ----

bool makeFolder(const char *path) {
    if (mkdir(path, 0700) != 0 && errno != EEXIST) {
        return false;
    }
    if (base::look(path, base::kRootsFolder) != base::Found::Trusted) {
        errno = EPERM;
        return false;
    }
    return chmod(path, 0700) == 0;
}

base::Descriptor openNumber() {
    const auto open = [] {
        return base::Descriptor(
            ::open(sched::kRunNumber, O_RDWR | O_CREAT | O_NOFOLLOW | O_CLOEXEC, 0600));
    };
    base::Descriptor file = open();
    if (!file && errno == ENOENT && makeFolder(sched::kRecordFolder)) {
        file = open();
    }
    return file;
}

// 0 when the file has none.
int64_t readNumber(int fd) {
    std::array<char, 32> text{};
    return pread(fd, text.data(), text.size() - 1, 0) > 0
               ? std::max<int64_t>(std::strtoll(text.data(), nullptr, 10), 0)
               : 0;
}

bool writeNumber(int fd, int64_t number) {
    std::array<char, 32> text{};
    const int length = std::snprintf(text.data(), text.size(), "%20" PRId64 "\n", number);
    return pwrite(fd, text.data(), static_cast<size_t>(length), 0) == length;
}

int64_t newestRecorded() {
    sched::RunRecords records(sched::RunRecords::Mode::Read);
    return records ? records.newest() : 0;
}

} // namespace

void sched::setProcess(RunRecord &record) {
    const auto process = base::findProcess(getpid());
    record.pid = getpid();
    record.processStart = process ? process->start : 0;
    setBoot(record.boot);
}

bool sched::goesOn(const RunRecord &record) {
    if (record.ended != 0) {
        return false;
    }
    std::array<char, 40> boot{};
    setBoot(boot);
    const auto process = base::findProcess(record.pid);
    return boot == record.boot && process && process->start == record.processStart;
}

bool sched::hasRunRecords() {
    return access(kRunDatabase, F_OK) == 0;
}

std::optional<int64_t> sched::claimRunNumber() {
    const base::Descriptor file = openNumber();
    if (file && flock(file.get(), LOCK_EX) == 0) {
        int64_t number = readNumber(file.get());
        if (number == 0) {
            number = newestRecorded() + 1;
        }
        // What is there was claimed before a power cut set the number back.
        while (access(outputPathOf(number).c_str(), F_OK) == 0) {
            ++number;
        }
        if (writeNumber(file.get(), number + 1)) {
            return number;
        }
    }
    SCHED_LOG("a run is not recorded: %s: %m", kRunNumber);
    return std::nullopt;
}

int64_t sched::nextRunNumber() {
    const base::Descriptor file(open(kRunNumber, O_RDONLY | O_NOFOLLOW | O_CLOEXEC));
    return file ? readNumber(file.get()) : 0;
}

bool sched::mendRunNumber() {
    const base::Descriptor file = openNumber();
    if (!file || flock(file.get(), LOCK_EX) != 0) {
        SCHED_LOG("%s: %m", kRunNumber);
        return false;
    }
    const int64_t newest = newestRecorded();
    return readNumber(file.get()) > newest || writeNumber(file.get(), newest + 1);
}

// ---- The database ----

sched::RunRecords::RunRecords(Mode mode, Pause pause, int patience)
    : pause_(std::move(pause)), patience_(monotonicNow() + patience) {
    isMissing_ = !hasRunRecords();
    if (mode == Mode::Write || !isMissing_) {
        if (!open(mode)) {
            wasDamaged_ = isDamaged();
            database_.reset();
        }
    }
}

bool sched::RunRecords::failed(const char *what) {
    if (hasGivenUp_) {
        return false;
    }
    SCHED_LOG("%s: %s: %s", kRunDatabase, what,
              database_ ? sqlite3_errmsg(database_.get()) : "out of memory");
    return false;
}

int sched::RunRecords::onBusy(void *self, int) {
    auto &records = *static_cast<RunRecords *>(self);
    if (monotonicNow() >= records.patience_) {
        return 0;
    }
    if (records.pause_) {
        records.hasGivenUp_ = !records.pause_(kPause);
        return records.hasGivenUp_ ? 0 : 1;
    }
    poll(nullptr, 0, kPause);
    return 1;
}

bool sched::RunRecords::open(Mode mode) {
    return openOnce(mode) ||
           (isDamaged() && mode == Mode::Write ? replace() : failed("cannot be opened"));
}

// Once, whoever else finds it damaged.
bool sched::RunRecords::replace() {
    const base::Descriptor folder(::open(kRecordFolder, O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    if (!folder || flock(folder.get(), LOCK_EX) != 0) {
        return failed("is damaged and cannot be put aside");
    }
    const bool isOpen = openOnce(Mode::Write);
    const Health found = health();
    if (found != Health::Damaged) {
        return (isOpen && found == Health::Whole) || failed("cannot be opened");
    }
    failed("is damaged and put aside");
    database_.reset();
    for (const char *path : {kRunDatabaseWal, kRunDatabaseIndex}) {
        unlink(path);
    }
    return (std::rename(kRunDatabase, kDamagedRuns) == 0 && openOnce(Mode::Write)) ||
           failed("cannot be made");
}

sched::RunRecords::Health sched::RunRecords::health() {
    if (!database_) {
        return wasDamaged_ ? Health::Damaged : Health::Unknown;
    }
    const Statement statement = prepare("PRAGMA quick_check(1)");
    if (statement && sqlite3_step(statement.get()) == SQLITE_ROW) {
        const auto *const said = sqlite3_column_text(statement.get(), 0);
        const bool isWhole = said && std::strcmp(reinterpret_cast<const char *>(said), "ok") == 0;
        return isWhole ? Health::Whole : Health::Damaged;
    }
    return isDamaged() ? Health::Damaged : Health::Unknown;
}

bool sched::RunRecords::isDamaged() const {
    const int code = database_ ? sqlite3_errcode(database_.get()) : SQLITE_OK;
    return code == SQLITE_NOTADB || code == SQLITE_CORRUPT;
}

bool sched::RunRecords::openOnce(Mode mode) {
    sqlite3 *handle = nullptr;
    const int flags = SQLITE_OPEN_READWRITE | SQLITE_OPEN_NOFOLLOW |
                      (mode == Mode::Write ? SQLITE_OPEN_CREATE : 0);
    const int result = sqlite3_open_v2(kRunDatabase, &handle, flags, nullptr);
    database_.reset(handle);
    if (result != SQLITE_OK) {
        return false;
    }
    sqlite3_busy_handler(handle, onBusy, this);
    // Leaving the log to whoever writes enough saves every run two flushes.
    sqlite3_db_config(handle, SQLITE_DBCONFIG_NO_CKPT_ON_CLOSE, 1, nullptr);
    const auto version = number("PRAGMA user_version", {});
    if (!version || *version > kSchema) {
        return false;
    }
    if (*version == 0 && mode == Mode::Read) { // whoever made it has not come further
        isMissing_ = true;
        database_.reset();
        return true;
    }
    return (*version == kSchema || upgrade()) && execute("PRAGMA synchronous=FULL") &&
           execute("PRAGMA wal_autocheckpoint=100");
}

// SQLite does not wait by itself for another that makes the new database just now.
bool sched::RunRecords::keepLog() {
    while (!execute("PRAGMA journal_mode=WAL")) {
        if (sqlite3_errcode(database_.get()) != SQLITE_BUSY || onBusy(this, 0) == 0) {
            return false;
        }
    }
    return true;
}

bool sched::RunRecords::upgrade() {
    if (!keepLog() || !execute("BEGIN IMMEDIATE")) {
        return false;
    }
    auto version = number("PRAGMA user_version", {}); // another process may have been faster
    while (version && *version < kSchema && execute(kUpgrades[*version])) {
        version = number("PRAGMA user_version", {});
    }
    return execute(version == kSchema ? "COMMIT" : "ROLLBACK") && version == kSchema;
}

bool sched::RunRecords::execute(const char *sql) {
    return sqlite3_exec(database_.get(), sql, nullptr, nullptr, nullptr) == SQLITE_OK;
}

sched::RunRecords::Statement sched::RunRecords::prepare(const std::string &sql) {
    sqlite3_stmt *statement = nullptr;
    sqlite3_prepare_v2(database_.get(), sql.c_str(), -1, &statement, nullptr);
    return {statement, sqlite3_finalize};
}

std::optional<int64_t> sched::RunRecords::number(const char *sql,
                                                 std::initializer_list<int64_t> values) {
    const Statement statement = prepare(sql);
    int place = 0;
    for (const int64_t value : values) {
        sqlite3_bind_int64(statement.get(), ++place, value);
    }
    switch (statement ? sqlite3_step(statement.get()) : SQLITE_ERROR) {
    case SQLITE_ROW:
        return sqlite3_column_int64(statement.get(), 0);
    case SQLITE_DONE:
        return 0;
    default:
        isIncomplete_ = true;
        return std::nullopt;
    }
}

bool sched::RunRecords::insert(const RunRecord &record) {
    static const std::string sql = [] {
        std::string places;
        const RunRecord none{};
        forEachColumn(none,
                      [&](const char *, const auto &) { places += places.empty() ? "?" : ",?"; });
        return "INSERT OR REPLACE INTO runs(" + columns() + ") VALUES(" + places + ")";
    }();
    const Statement statement = prepare(sql);
    if (!statement) {
        return false;
    }
    bind(statement.get(), record);
    return sqlite3_step(statement.get()) == SQLITE_DONE;
}

bool sched::RunRecords::write(const RunRecord &record) {
    return insert(record) || (isDamaged() && replace() && insert(record)) ||
           failed("a run is not recorded");
}

namespace {

struct Surplus {
    int64_t run;
    int64_t taskId;
    int64_t time; // of its minute, in milliseconds
};

constexpr const char *kBeyondTasks =
    "SELECT run, task_id, max(due, asked), ended, pid, process_start, boot FROM runs "
    "WHERE task_id=?2 AND run<=(SELECT run FROM runs WHERE task_id=?2 ORDER BY run DESC LIMIT 1 "
    "OFFSET ?1)";
constexpr const char *kBeyondAll =
    "SELECT run, task_id, max(due, asked), ended, pid, process_start, boot FROM runs "
    "WHERE run<=(SELECT run FROM runs ORDER BY run DESC LIMIT 1 OFFSET ?1) AND ?2=?2";

// What goes on stays: its record is still to be written.
std::vector<Surplus> surplusOf(sqlite3_stmt *statement) {
    std::vector<Surplus> found;
    while (statement && sqlite3_step(statement) == SQLITE_ROW) {
        RunRecord record{};
        record.ended = sqlite3_column_int64(statement, 3);
        record.pid = sqlite3_column_int(statement, 4);
        record.processStart = sqlite3_column_int64(statement, 5);
        const auto *const boot = sqlite3_column_text(statement, 6);
        setText(record.boot, boot ? reinterpret_cast<const char *>(boot) : "");
        if (!sched::goesOn(record)) {
            found.push_back({sqlite3_column_int64(statement, 0), sqlite3_column_int64(statement, 1),
                             sqlite3_column_int64(statement, 2)});
        }
    }
    return found;
}

} // namespace

bool sched::RunRecords::prune(const TAVI_SCHED_RUN_LIMITS &limits, int32_t taskId) {
    std::vector<Surplus> surplus;
    for (const auto &[sql, limit] :
         {std::pair(kBeyondTasks, limits.runsPerTask), std::pair(kBeyondAll, limits.runs)}) {
        const Statement statement = prepare(sql);
        sqlite3_bind_int64(statement.get(), 1, limit);
        sqlite3_bind_int64(statement.get(), 2, taskId);
        const auto found = surplusOf(statement.get());
        surplus.insert(surplus.end(), found.begin(), found.end());
    }
    if (surplus.empty()) {
        return true;
    }
    if (!execute("BEGIN IMMEDIATE")) {
        return failed("old records are not removed");
    }
    bool done = true;
    for (const Surplus &row : surplus) {
        done =
            done && remove(row.run) &&
            number("INSERT INTO tasks(task_id, pruned_until) VALUES(?1, ?2) ON CONFLICT(task_id) "
                   "DO UPDATE SET pruned_until=max(pruned_until, ?2)",
                   {row.taskId, row.time});
    }
    if (!execute(done ? "COMMIT" : "ROLLBACK") || !done) {
        return failed("old records are not removed");
    }
    for (const Surplus &row : surplus) {
        unlink(outputPathOf(row.run).c_str());
    }
    return true;
}

int64_t sched::RunRecords::firstRunOf(int32_t taskId) {
    return number("SELECT first_run FROM tasks WHERE task_id=?", {taskId}).value_or(0);
}

bool sched::RunRecords::separate(int32_t taskId, int64_t firstRun) {
    return number("INSERT INTO tasks(task_id, first_run) VALUES(?1, ?2) ON CONFLICT(task_id) "
                  "DO UPDATE SET first_run=max(first_run, ?2)",
                  {taskId, firstRun}) ||
           failed("a removed task's runs stay the next one's");
}

bool sched::RunRecords::hasRunsOf(int32_t taskId) {
    return number("SELECT count(*) FROM runs WHERE task_id=? AND run>=?",
                  {taskId, firstRunOf(taskId)})
               .value_or(1) != 0;
}

int64_t sched::RunRecords::newest() {
    return number("SELECT max(run) FROM runs", {}).value_or(0);
}

int64_t sched::RunRecords::prunedUntil(int32_t taskId) {
    return number("SELECT pruned_until FROM tasks WHERE task_id=?", {taskId}).value_or(0);
}

bool sched::RunRecords::has(int64_t run) {
    return number("SELECT count(*) FROM runs WHERE run=?", {run}).value_or(1) != 0;
}

bool sched::RunRecords::hasRunDue(int32_t taskId, int64_t due) {
    return number("SELECT count(*) FROM runs WHERE task_id=? AND due=? AND result>=0",
                  {taskId, due})
               .value_or(1) != 0;
}

std::vector<RunRecord> sched::RunRecords::awaited(int64_t before) {
    const Statement statement =
        prepare("SELECT " + columns() + " FROM runs WHERE result=-1 AND due<?");
    sqlite3_bind_int64(statement.get(), 1, before);
    std::vector<RunRecord> found;
    int result = SQLITE_ERROR;
    while (statement && (result = sqlite3_step(statement.get())) == SQLITE_ROW) {
        take(statement.get(), found.emplace_back());
    }
    isIncomplete_ = isIncomplete_ || result != SQLITE_DONE;
    return found;
}

bool sched::RunRecords::remove(int64_t run) {
    return number("DELETE FROM runs WHERE run=?", {run}).has_value();
}

// ---- Reading ----

std::optional<std::vector<int64_t>>
sched::RunRecords::numbersOf(const TAVI_SCHED_RUN_FILTER &filter) {
    // Of a group the row of the greatest time is the one that the columns are of.
    const bool isGrouped = filter.newestOnly != 0;
    const Statement statement =
        prepare(std::string("SELECT run") + (isGrouped ? ", max(asked)" : "") +
                " FROM runs WHERE (?1=-1 OR task_id=?1) AND asked>=?2 AND result>=0 AND "
                "((?1=-1 AND ?3=0) OR run>=" +
                kFirstRun + ") " + (isGrouped ? "GROUP BY task_id " : "") +
                "ORDER BY asked DESC, run DESC");
    sqlite3_bind_int64(statement.get(), 1, filter.taskId);
    sqlite3_bind_int64(statement.get(), 2, filter.since);
    sqlite3_bind_int64(statement.get(), 3, filter.newestOnly);
    std::vector<int64_t> numbers;
    int result = SQLITE_ERROR;
    while (statement && (result = sqlite3_step(statement.get())) == SQLITE_ROW) {
        numbers.push_back(sqlite3_column_int64(statement.get(), 0));
    }
    return result == SQLITE_DONE ? std::optional(std::move(numbers)) : std::nullopt;
}

sched::RunRecords::Statement sched::RunRecords::prepareFind() {
    return prepare("SELECT " + columns() + ", run<" + kFirstRun +
                   " FROM runs WHERE run=? AND result>=0");
}

// Nothing when there is no such record any more, or it cannot be read: the database's error tells.
std::optional<RunRecord> sched::RunRecords::fetch(sqlite3_stmt *statement, int64_t run) {
    sqlite3_bind_int64(statement, 1, run);
    std::optional<RunRecord> record;
    if (sqlite3_step(statement) == SQLITE_ROW) {
        record.emplace();
        take(statement, *record);
        record->isOfRemovedTask =
            sqlite3_column_int(statement, sqlite3_column_count(statement) - 1);
    }
    sqlite3_reset(statement);
    if (record) {
        complete(*record);
    }
    return record;
}

// The numbers come first: however long the reader takes, nothing of the database is held meanwhile,
// and no more than one record is in memory.
int sched::RunRecords::list(const TAVI_SCHED_RUN_FILTER &filter,
                            const std::function<bool(const RunRecord &)> &reader) {
    const auto numbers = numbersOf(filter);
    const Statement statement = prepareFind();
    if (!numbers || !statement) {
        failed("cannot be read");
        return -1;
    }
    int count = 0;
    for (auto run = numbers->begin();
         run != numbers->end() && (filter.limit <= 0 || count < filter.limit); ++run) {
        const auto record = fetch(statement.get(), *run);
        if (!record && sqlite3_errcode(database_.get()) != SQLITE_OK) {
            failed("cannot be read");
            return -1;
        }
        if (record && (filter.failedOnly == 0 || hasFailed(record->result))) {
            ++count;
            if (!reader(*record)) {
                break;
            }
        }
    }
    return count;
}

std::optional<RunRecord> sched::RunRecords::find(int64_t run) {
    const Statement statement = prepareFind();
    auto record = statement ? fetch(statement.get(), run) : std::nullopt;
    if (!record && sqlite3_errcode(database_.get()) != SQLITE_OK) {
        failed("cannot be read");
    }
    return record;
}
