// Changing tasks while a cron daemon is there to be signalled. The folders of the sandbox lie in
// memory, where flushing costs next to nothing; one row has those that outlive a restart on the
// file system of the checkout.
#include "bench_support.h"

#include <array>
#include <cstdlib>
#include <fcntl.h>
#include <functional>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

namespace {

constexpr const char *kCrontab = "/etc/crontab";

// Puts a process in cron's place that stays when it is signalled and ends with the sandbox.
void startCronStandIn() {
    bench::require(
        std::system(
            "[ -e /var/run/crond.pid ] || { (trap '' HUP; exec sleep 10000 > /dev/null 2>&1) & "
            "echo $! > /var/run/crond.pid; sleep 0.1; }") == 0,
        "starting a process to be signalled");
}

// The files with so many tasks, to start every iteration from.
struct Stored {
    explicit Stored(int count) {
        startCronStandIn();
        bench::writeFile(kCrontab, "SHELL=/bin/sh\n17 *\t* * *\troot\ttrue\n");
        bench::storeTasks(count);
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

struct NewTask {
    NewTask() : task(TAVISchedTaskAlloc()) {
        bench::require(task, "TAVISchedTaskAlloc");
        TAVISchedCTaskSetCommand(task, bench::kCommand);
    }
    ~NewTask() { TAVISchedTaskFree(task); }
    NewTask(const NewTask &) = delete;
    NewTask &operator=(const NewTask &) = delete;
    void create() const { bench::require(TAVISchedTaskCreate(task) == 0, "TAVISchedTaskCreate"); }

    TAVI_SCHED_TASK *task;
};

// ---- A create against what it cannot do without ----

void copy(const char *from, const char *to) {
    const std::array<const char *, 5> argv = {"/bin/cp", "-f", from, to, nullptr};
    pid_t pid = -1;
    int status = -1;
    bench::require(posix_spawn(&pid, argv[0], nullptr, nullptr,
                               const_cast<char *const *>(argv.data()), environ) == 0 &&
                       waitpid(pid, &status, 0) == pid && status == 0,
                   "cp");
}

void flush(const char *path) {
    const int fd = open(path, O_RDONLY | O_CLOEXEC);
    bench::require(fsync(fd) == 0 && close(fd) == 0, path);
}

void writeAndFlush(const char *path, const std::string &text) {
    bench::writeFile(path, text);
    flush(path);
}

// Three copies of the task file, the shell that signals cron, and the flushes of a durable change:
// a record of what was there, the persistent file, the crontab, and their folders. Not the reading
// of the tasks, the new section, nor the crontab's lines.
void startProgramsAndFlush(const Stored &stored) {
    copy(bench::kWorkingCopy, "/tmp/bench_scratch");
    writeAndFlush("/usr/tavi/etc/bench_record", stored.tasks);
    flush("/usr/tavi/etc");
    copy("/tmp/bench_scratch", "/usr/tavi/etc/bench_persistent");
    flush("/usr/tavi/etc/bench_persistent");
    copy("/tmp/bench_scratch", "/tmp/bench_working");
    writeAndFlush("/etc/bench_crontab.new", stored.crontab);
    bench::require(rename("/etc/bench_crontab.new", "/etc/bench_crontab") == 0, "rename");
    flush("/etc");
    bench::require(
        std::system("/bin/kill -HUP `/bin/cat /var/run/crond.pid` > /dev/null 2>&1") == 0, "kill");
    unlink("/usr/tavi/etc/bench_record");
    flush("/usr/tavi/etc");
}

void compareCreate(benchmark::State &state, const char *what, double aim) {
    constexpr int kTasks = 100;
    const Stored stored(kTasks);
    const NewTask fresh;
    bench::Comparison comparison;
    for (auto _ : state) {
        stored.restore();
        comparison.product([&] { fresh.create(); });
        bench::require(fresh.task->id == kTasks + 1, "the new task's id");
        stored.restore();
        comparison.reference([&] { startProgramsAndFlush(stored); });
    }
    comparison.reportTo(state, what, aim);
}

void create(benchmark::State &state) {
    compareCreate(state, "create with 100 tasks stored, to programs and flushes", 1.2);
}

void createOnDisk(benchmark::State &state) {
    bench::require(std::system("disk=build/bench/disk && rm -rf $disk && mkdir -p $disk/tavi && "
                               "cp -a /etc $disk/ && mount --bind $disk/etc /etc && "
                               "mount --bind $disk/tavi /usr/tavi/etc") == 0,
                   "folders on the checkout's file system");
    compareCreate(state, "the same on a real file system", 1.2);
    bench::require(std::system("umount /etc /usr/tavi/etc && rm -rf build/bench/disk") == 0,
                   "umount");
}

// ---- Many at once, and many stored ----

void batch(benchmark::State &state) {
    constexpr int kCreates = 1000;
    const Stored none(0);
    const Stored thousand(kCreates);
    const NewTask fresh;
    bench::Comparison comparison;
    for (auto _ : state) {
        none.restore();
        comparison.product([&] {
            bench::require(TAVISchedChangeBegin() == 0, "TAVISchedChangeBegin");
            for (int i = 0; i < kCreates; ++i) {
                fresh.create();
            }
            bench::require(TAVISchedChangeCommit() == 0, "TAVISchedChangeCommit");
        });
        thousand.restore();
        TAVI_SCHED_TASK *list = nullptr;
        comparison.reference(
            [&] { bench::require(TAVISchedTaskListGet(&list, nullptr) == kCreates, "the list"); });
        TAVISchedTaskListFree(&list);
    }
    comparison.reportTo(state, "a batch of 1,000 creates, to a list of 1,000", 5.0);
}

void edit() {
    TAVI_SCHED_TASK task{};
    bench::require(TAVISchedTaskGetByID(500, &task) == 0 && TAVISchedTaskEdit(&task) == 0, "edit");
}

void removeOne() {
    bench::require(TAVISchedTaskRemove(500) == 0, "remove");
}

void scale(benchmark::State &state, const std::function<void()> &change, const char *what) {
    const Stored large(10000);
    const Stored small(1000);
    bench::Comparison comparison;
    for (auto _ : state) {
        large.restore();
        comparison.product(change);
        small.restore();
        comparison.reference(change);
    }
    comparison.reportTo(state, what, 11.0);
}

void createMany(benchmark::State &state) {
    const NewTask fresh;
    scale(
        state, [&] { fresh.create(); }, "create with 10,000 tasks stored, to 1,000");
}

void editMany(benchmark::State &state) {
    scale(state, edit, "edit with 10,000 tasks stored, to 1,000");
}

void removeMany(benchmark::State &state) {
    scale(state, removeOne, "remove with 10,000 tasks stored, to 1,000");
}

BENCHMARK(create)->Iterations(30);
BENCHMARK(createOnDisk)->Iterations(20);
BENCHMARK(batch)->Iterations(5);
BENCHMARK(createMany)->Iterations(5);
BENCHMARK(editMany)->Iterations(5);
BENCHMARK(removeMany)->Iterations(5);

} // namespace
