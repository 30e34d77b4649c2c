// Starting a task: from the call, or from the start of the runner's process, to the first
// instruction of its command, which tells through a FIFO. Every run has ended, its result stored,
// before the next start.
#include "bench_support.h"

#include <algorithm>
#include <array>
#include <cstdlib>
#include <fcntl.h>
#include <grp.h>
#include <sqlite3.h>
#include <string>
#include <sys/file.h>
#include <sys/prctl.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

namespace {

constexpr const char *kFifo = "/tmp/bench_fifo";
constexpr const char *kCommand = "echo > /tmp/bench_fifo";
constexpr const char *kStatus = "/tmp/sched_status.sqlite";
constexpr const char *kReferenceStatus = "/tmp/bench_status.sqlite";
constexpr const char *kReferenceLock = "/tmp/bench_lock";
constexpr const char *kRunNumber = "/var/lib/tavischeduler/run_number";
constexpr const char *kNumberAside = "/var/lib/tavischeduler/bench_number";
constexpr int kManyTasks = 1000;
constexpr int kDueTask = 500;

void awaitByte(int fifo) {
    char byte = 0;
    bench::require(read(fifo, &byte, 1) == 1, "reading the FIFO");
}

void waitForAll() {
    while (wait(nullptr) != -1) {
    }
}

// Children come to us, and groups are as cron leaves them.
int prepare() {
    const gid_t root = 0;
    bench::require(setgroups(1, &root) == 0, "setgroups");
    prctl(PR_SET_CHILD_SUBREAPER, 1);
    mkfifo(kFifo, 0600);
    const int fifo = open(kFifo, O_RDWR | O_CLOEXEC);
    bench::require(fifo != -1, kFifo);
    return fifo;
}

// Two empty status databases of the same form: the rows of earlier runs would slow the next.
void makeStatusDatabases() {
    for (const char *path : {kReferenceStatus, kStatus}) {
        unlink(kStatus);
        sqlite3 *db = TAVISchedDBInit();
        bench::require(db && sqlite3_close(db) == SQLITE_OK, "TAVISchedDBInit");
        bench::require(rename(kStatus, path) == 0, "rename");
    }
}

void openAndExecute(const char *sql) {
    sqlite3 *db = nullptr;
    bench::require(sqlite3_open(kReferenceStatus, &db) == SQLITE_OK &&
                       sqlite3_exec(db, "SELECT count(*) FROM task_status WHERE status_id=0",
                                    nullptr, nullptr, nullptr) == SQLITE_OK &&
                       sqlite3_exec(db, sql, nullptr, nullptr, nullptr) == SQLITE_OK,
                   sql);
    sqlite3_close(db);
}

[[noreturn]] void start(const char *program, const std::array<const char *, 4> &argv) {
    execv(program, const_cast<char *const *>(argv.data()));
    _exit(1);
}

void startShell() {
    if (fork() == 0) {
        start("/bin/sh", {"sh", "-c", kCommand, nullptr});
    }
}

// ---- From the call ----

// A double fork, one lock, two opens of a database with a trivial read each and one insert that is
// committed, and the fork and start of the shell; not the task's section, the checks for live runs,
// nor the owner's groups.
void forkTwiceRecordAndStart() {
    const pid_t middle = fork();
    if (middle == 0) {
        if (fork() != 0) {
            _exit(0);
        }
        const int lock = open(kReferenceLock, O_RDWR | O_CREAT | O_CLOEXEC, 0600);
        bench::require(flock(lock, LOCK_EX) == 0, "flock");
        openAndExecute("");
        openAndExecute("INSERT INTO task_status (app, pid, timestamp, task_id, status_code) "
                       "VALUES ('app', 1, 1, 1, 2)");
        close(lock);
        startShell();
        _exit(0);
    }
    waitpid(middle, nullptr, 0);
}

void run(benchmark::State &state) {
    bench::storeTasks(1, kCommand);
    bench::makeWorkingCopyNew();
    makeStatusDatabases();
    const int fifo = prepare();
    bench::Comparison comparison;
    for (auto _ : state) {
        comparison.product([&] {
            bench::require(TAVISchedTaskRun(1, 0, 0) == 0, "TAVISchedTaskRun");
            awaitByte(fifo);
        });
        waitForAll();
        comparison.reference([&] {
            forkTwiceRecordAndStart();
            awaitByte(fifo);
        });
        waitForAll();
    }
    close(fifo);
    comparison.reportTo(state, "run until the command starts, to forks, database and shell", 1.3);
}

BENCHMARK(run)->Iterations(100);

// The same run without a record and without a pipe for its output, as it can have no number: a link
// stands in the place of the file.
void setRecording(bool isOn) {
    const bool isSet =
        isOn ? rename(kNumberAside, kRunNumber) == 0
             : rename(kRunNumber, kNumberAside) == 0 && symlink("nowhere", kRunNumber) == 0;
    bench::require(isSet, "rename");
}

void recordedRun(benchmark::State &state) {
    bench::storeTasks(1, kCommand);
    bench::makeWorkingCopyNew();
    makeStatusDatabases();
    const int fifo = prepare();
    const auto startAndAwait = [&] {
        bench::require(TAVISchedTaskRun(1, 0, 0) == 0, "TAVISchedTaskRun");
        awaitByte(fifo);
    };
    startAndAwait(); // makes the records
    waitForAll();
    bench::Comparison comparison;
    for (auto _ : state) {
        comparison.product(startAndAwait);
        waitForAll();
        setRecording(false);
        comparison.reference(startAndAwait);
        waitForAll();
        setRecording(true);
    }
    close(fifo);
    comparison.reportTo(state, "recorded run until the command starts, to one unrecorded", 1.3);
}

BENCHMARK(recordedRun)->Iterations(100);

// ---- From the start of the runner's process ----

// Makes one of the tasks due in this minute, with enough of it left, unless it is already.
void makeDue(TAVI_SCHED_DATE &due) {
    TAVI_SCHED_DATE now{};
    while (time(nullptr) % 60 > 57) {
        usleep(100000);
    }
    TAVISchedDateGet(&now);
    if (now.hour == due.hour && now.minute == due.minute) {
        return;
    }
    due = now;
    static TAVI_SCHED_TASK task{};
    bench::require(TAVISchedTaskGetByID(kDueTask, &task) == 0, "TAVISchedTaskGetByID");
    TAVISchedCTaskSetRunHour(&task, static_cast<int>(now.hour));
    TAVISchedCTaskSetRunMin(&task, static_cast<int>(now.minute));
    bench::require(TAVISchedTaskEdit(&task) == 0, "TAVISchedTaskEdit");
    bench::makeWorkingCopyNew();
}

void startRunner(const char *option) {
    static const std::string id = "id=" + std::to_string(kDueTask);
    if (fork() == 0) {
        start(RUNNER, {RUNNER, option, id.c_str(), nullptr});
    }
}

// A part of a run, in a process that has just been forked, as runs are.
void inChild(void (*part)()) {
    const pid_t child = fork();
    if (child == 0) {
        part();
        _exit(0);
    }
    waitpid(child, nullptr, 0);
}

void wholeRunner() {
    startRunner("--run");
}
void startsAndEnds() {
    startRunner("--no-such-option");
    wait(nullptr);
}
void forks() {
    inChild([] {});
}
void readsSection() {
    inChild([] {
        static TAVI_SCHED_TASK task{};
        bench::require(TAVISchedTaskGetByID(kDueTask, &task) == 0, "TAVISchedTaskGetByID");
    });
}
void records() {
    inChild([] {
        static TAVI_SCHED_TASK task{};
        TAVI_SCHED_STATUS status{};
        sqlite3 *db = TAVISchedDBInit();
        bench::require(db && TAVISchedDBIsTaskRunning(db, 1, &status) == 0 &&
                           TAVISchedDBAddRecord(db, &task, nullptr) == 0,
                       "recording a run");
        sqlite3_close(db);
    });
}
void findsGroups() {
    inChild([] { bench::require(initgroups("root", 0) == 0, "initgroups"); });
}

// The whole, and how much of it parts take by themselves; parts without an aim.
void runner(benchmark::State &state, void (*part)(), const char *what, double aim) {
    bench::storeTasks(kManyTasks, kCommand);
    makeStatusDatabases();
    const int fifo = prepare();
    const int null = open("/dev/null", O_WRONLY | O_CLOEXEC);
    const int errors = dup(2);
    dup2(null, 2);
    TAVI_SCHED_DATE due{};
    bench::Comparison comparison;
    for (auto _ : state) {
        makeDue(due);
        comparison.product([&] {
            part();
            if (part == wholeRunner) {
                awaitByte(fifo);
            }
        });
        waitForAll();
        comparison.reference([&] {
            startShell();
            awaitByte(fifo);
        });
        waitForAll();
    }
    dup2(errors, 2);
    for (const int fd : {fifo, null, errors}) {
        close(fd);
    }
    comparison.reportTo(state, what, aim);
}

// ---- While the command runs ----

// Of the process that waits for a command, which has printed and has been recorded.
void memoryOfWaiting(benchmark::State &state) {
    constexpr const char *kHold = "/tmp/bench_hold";
    constexpr double kAim = 2048; // KiB
    bench::storeTasks(kManyTasks,
                      "head -c 1000000 /dev/zero; echo $PPID > /tmp/bench_fifo; read x < "
                      "/tmp/bench_hold");
    makeStatusDatabases();
    const int fifo = prepare();
    mkfifo(kHold, 0600);
    TAVI_SCHED_DATE due{};
    double most = 0;
    for (auto _ : state) {
        makeDue(due);
        startRunner("--run");
        std::array<char, 32> pid{};
        bench::require(read(fifo, pid.data(), pid.size() - 1) > 1, "reading the FIFO");
        usleep(500000); // its record is written while the command goes on
        most = std::max(most, bench::privateKilobytes(std::atoi(pid.data())));
        const int hold = open(kHold, O_WRONLY | O_CLOEXEC);
        close(hold);
        waitForAll();
    }
    close(fifo);
    bench::report(state, "private memory of a waiting run, in 2 MiB", most / kAim, 1);
}

BENCHMARK(memoryOfWaiting)->Iterations(3);

BENCHMARK_CAPTURE(runner, whole, wholeRunner, "runner's process until the command starts, to sh -c",
                  2.9)
    ->Iterations(100);
BENCHMARK_CAPTURE(runner, start, startsAndEnds, "  of that its start with its libraries", 0)
    ->Iterations(100);
BENCHMARK_CAPTURE(runner, fork, forks, "  a fork, which the next three have too", 0)
    ->Iterations(100);
BENCHMARK_CAPTURE(runner, section, readsSection, "  reading one section of 1,000", 0)
    ->Iterations(100);
BENCHMARK_CAPTURE(runner, database, records, "  the database", 0)->Iterations(100);
BENCHMARK_CAPTURE(runner, groups, findsGroups, "  the owner's groups", 0)->Iterations(100);

} // namespace
