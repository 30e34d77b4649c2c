// Creating a task while 100 are stored and a cron daemon is there to be signalled. The folders of
// the sandbox lie in memory, where fsync costs next to nothing: a disk would favour the product.
#include "bench_support.h"

#include <array>
#include <cstdlib>
#include <fcntl.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

namespace {

constexpr int kTasks = 100;
constexpr const char *kCrontab = "/etc/crontab";

// Puts a process in cron's place that stays when it is signalled and ends with the sandbox.
void startCronStandIn() {
    bench::require(
        std::system(
            "(trap '' HUP; exec sleep 1000 > /dev/null 2>&1) & echo $! > /var/run/crond.pid; "
            "sleep 0.1") == 0,
        "starting a process to be signalled");
}

// The files with 100 tasks, to start every iteration from.
struct Stored {
    Stored() {
        bench::writeFile(kCrontab, "SHELL=/bin/sh\n17 *\t* * *\troot\ttrue\n");
        startCronStandIn();
        bench::storeTasks(kTasks);
        bench::require(TAVISchedTaskSync() == 0, "TAVISchedTaskSync");
        tasks = bench::readFile(bench::kWorkingCopy);
        crontab = bench::readFile(kCrontab);
    }
    void restore() const {
        bench::writeFile(bench::kPersistent, tasks);
        bench::writeFile(bench::kWorkingCopy, tasks);
        bench::writeFile(kCrontab, crontab);
        bench::makeWorkingCopyNew();
    }
    std::string tasks;
    std::string crontab;
};

void copy(const char *from, const char *to) {
    const std::array<const char *, 5> argv = {"/bin/cp", "-f", from, to, nullptr};
    pid_t pid = -1;
    int status = -1;
    bench::require(posix_spawn(&pid, argv[0], nullptr, nullptr,
                               const_cast<char *const *>(argv.data()), environ) == 0 &&
                       waitpid(pid, &status, 0) == pid && status == 0,
                   "cp");
}

void signalCronAndSync() {
    bench::require(
        std::system("/bin/kill -HUP `/bin/cat /var/run/crond.pid` > /dev/null 2>&1") == 0, "kill");
    const int fd = open("/etc/bench_crontab", O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0600);
    bench::require(write(fd, "\n", 1) == 1 && fsync(fd) == 0 && close(fd) == 0, "fsync");
}

// Three copies of the file of 100 tasks, the shell that signals cron, and one fsync; not the
// reading of the tasks, the new section, nor the new crontab.
void startProgramsAndSync() {
    copy(bench::kWorkingCopy, "/tmp/bench_scratch");
    copy("/tmp/bench_scratch", "/usr/tavi/etc/bench_persistent");
    copy("/tmp/bench_scratch", "/tmp/bench_working");
    signalCronAndSync();
}

void create(benchmark::State &state) {
    const Stored stored;
    TAVI_SCHED_TASK *task = TAVISchedTaskAlloc();
    bench::require(task, "TAVISchedTaskAlloc");
    TAVISchedCTaskSetCommand(task, bench::kCommand);
    bench::Comparison comparison;
    for (auto _ : state) {
        stored.restore();
        comparison.product([&] { bench::require(TAVISchedTaskCreate(task) == 0, "create"); });
        bench::require(task->id == kTasks + 1, "the new task's id");
        stored.restore();
        comparison.reference(startProgramsAndSync);
    }
    TAVISchedTaskFree(task);
    comparison.reportTo(state, "create with 100 tasks stored, to the programs it starts", 1.3);
}

BENCHMARK(create)->Iterations(30);

} // namespace
