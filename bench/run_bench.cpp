// Starting a task: from the call to the first instruction of its command, which tells through a
// FIFO. Every run has ended, its result stored, before the next start.
#include "bench_support.h"

#include <fcntl.h>
#include <sqlite3.h>
#include <sys/prctl.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

namespace {

constexpr const char *kFifo = "/tmp/bench_fifo";
constexpr const char *kCommand = "echo > /tmp/bench_fifo";
constexpr const char *kStatus = "/tmp/sched_status.sqlite";
constexpr const char *kReferenceStatus = "/tmp/bench_status.sqlite";

void awaitByte(int fifo) {
    char byte = 0;
    bench::require(read(fifo, &byte, 1) == 1, "reading the FIFO");
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

// A double fork, two opens of a database with a trivial read each, and one insert, until it is
// committed and told; not the task's section, the lock, the checks for live runs, nor the shell.
void forkTwiceAndRecord(int fifo) {
    const pid_t middle = fork();
    if (middle == 0) {
        if (fork() != 0) {
            _exit(0);
        }
        openAndExecute("");
        openAndExecute("INSERT INTO task_status (app, pid, timestamp, task_id, status_code) "
                       "VALUES ('app', 1, 1, 1, 2)");
        bench::require(write(fifo, "\n", 1) == 1, "write");
        _exit(0);
    }
    waitpid(middle, nullptr, 0);
    awaitByte(fifo);
}

void startShell(int fifo) {
    if (fork() == 0) {
        execl("/bin/sh", "sh", "-c", kCommand, nullptr);
        _exit(1);
    }
    awaitByte(fifo);
}

void runTask(int fifo) {
    bench::require(TAVISchedTaskRun(1, 0, 0) == 0, "TAVISchedTaskRun");
    awaitByte(fifo);
}

// How the start of a task, or of the bare shell in it, compares with the reference.
void compareStarts(benchmark::State &state, void (*start)(int), const char *what, double aim) {
    prctl(PR_SET_CHILD_SUBREAPER, 1); // detached children become ours to wait for
    bench::storeTasks(1, kCommand);
    bench::makeWorkingCopyNew();
    makeStatusDatabases();
    mkfifo(kFifo, 0600);
    const int fifo = open(kFifo, O_RDWR | O_CLOEXEC);
    bench::require(fifo != -1, kFifo);
    bench::Comparison comparison;
    for (auto _ : state) {
        comparison.product([&] { start(fifo); });
        while (wait(nullptr) != -1) {
        }
        comparison.reference([&] { forkTwiceAndRecord(fifo); });
        while (wait(nullptr) != -1) {
        }
    }
    close(fifo);
    comparison.reportTo(state, what, aim);
}

BENCHMARK_CAPTURE(compareStarts, run, runTask,
                  "run until the command starts, to forks and database", 1.5)
    ->Iterations(100);
// No aim: what the start of the shell, which the reference leaves out, adds to the row above.
BENCHMARK_CAPTURE(compareStarts, shell, startShell, "  of that the start of the bare shell", 0)
    ->Iterations(100);

} // namespace
