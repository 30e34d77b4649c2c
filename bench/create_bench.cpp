// Changing tasks: a create with 100 tasks stored and a cron daemon there to be signalled, in memory
// and on a real file system, many creates as one, and changes among many tasks.
#include "bench_support.h"

#include <array>
#include <cstdlib>
#include <fcntl.h>
#include <linux/magic.h>
#include <spawn.h>
#include <sys/stat.h>
#include <sys/statfs.h>
#include <sys/wait.h>
#include <unistd.h>

namespace {

constexpr const char *kCrontab = "/etc/crontab";

// Puts a process in cron's place that stays when it is signalled and ends with the sandbox.
void startCronStandIn() {
    bench::require(
        std::system(
            "(trap '' HUP; exec sleep 1000 > /dev/null 2>&1) & echo $! > /var/run/crond.pid; "
            "sleep 0.1") == 0,
        "starting a process to be signalled");
}

// The files with so many tasks, to start every iteration from.
struct Stored {
    explicit Stored(int count) {
        bench::writeFile(kCrontab, "SHELL=/bin/sh\n17 *\t* * *\troot\ttrue\n");
        startCronStandIn();
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

void copy(const char *from, const char *to) {
    const std::array<const char *, 5> argv = {"/bin/cp", "-f", from, to, nullptr};
    pid_t pid = -1;
    int status = -1;
    bench::require(posix_spawn(&pid, argv[0], nullptr, nullptr,
                               const_cast<char *const *>(argv.data()), environ) == 0 &&
                       waitpid(pid, &status, 0) == pid && status == 0,
                   "cp");
}

void signalCron() {
    bench::require(
        std::system("/bin/kill -HUP `/bin/cat /var/run/crond.pid` > /dev/null 2>&1") == 0, "kill");
}

void sync(const char *path) {
    const int fd = open(path, O_RDONLY | O_CLOEXEC);
    bench::require(fsync(fd) == 0 && close(fd) == 0, path);
}

void writeDurably(const char *path, const std::string &text) {
    bench::writeFile(path, text);
    sync(path);
}

// Three copies of the tasks, the shell that signals cron, and the flushes without which the change
// could be lost: of the record and its folder, of the persistent file, of the crontab and its
// folder, and of the record's going; not the reading of the tasks, nor the new section or lines.
void startProgramsAndFlush(const Stored &stored) {
    writeDurably("/usr/tavi/etc/bench_record", stored.tasks);
    sync("/usr/tavi/etc");
    copy(bench::kWorkingCopy, "/tmp/bench_scratch");
    copy("/tmp/bench_scratch", "/usr/tavi/etc/bench_persistent");
    sync("/usr/tavi/etc/bench_persistent");
    copy("/tmp/bench_scratch", "/tmp/bench_working");
    writeDurably("/etc/bench_crontab.new", stored.crontab);
    bench::require(rename("/etc/bench_crontab.new", "/etc/bench_crontab") == 0, "rename");
    sync("/etc");
    signalCron();
    bench::require(unlink("/usr/tavi/etc/bench_record") == 0, "unlink");
    sync("/usr/tavi/etc");
}

struct Task {
    Task() : task(TAVISchedTaskAlloc()) {
        bench::require(task, "TAVISchedTaskAlloc");
        TAVISchedCTaskSetCommand(task, bench::kCommand);
    }
    ~Task() { TAVISchedTaskFree(task); }
    Task(const Task &) = delete;
    Task &operator=(const Task &) = delete;
    TAVI_SCHED_TASK *task;
};

void compareCreate(benchmark::State &state, const char *what) {
    constexpr int kTasks = 100;
    const Stored stored(kTasks);
    const Task task;
    bench::Comparison comparison;
    for (auto _ : state) {
        stored.restore();
        comparison.product([&] { bench::require(TAVISchedTaskCreate(task.task) == 0, "create"); });
        bench::require(task.task->id == kTasks + 1, "the new task's id");
        stored.restore();
        comparison.reference([&] { startProgramsAndFlush(stored); });
    }
    comparison.reportTo(state, what, 1.2);
}

void create(benchmark::State &state) {
    compareCreate(state, "create with 100 tasks stored, in memory");
}

// The folder that the benchmark is started from lies on one, as a rule.
bool isOnDisk() {
    struct statfs status {};
    return statfs(".", &status) == 0 && status.f_type != TMPFS_MAGIC &&
           status.f_type != OVERLAYFS_SUPER_MAGIC;
}

void createOnDisk(benchmark::State &state) {
    if (!isOnDisk()) {
        state.SkipWithError("the current folder is not on a disk");
        return;
    }
    bench::require(
        std::system("mkdir -p bench_disk/etc bench_disk/tavi && cp -a /etc/. bench_disk/etc "
                    "&& mount -n --bind bench_disk/etc /etc && "
                    "mount -n --bind bench_disk/tavi /usr/tavi/etc") == 0,
        "putting /etc and /usr/tavi/etc on the disk");
    compareCreate(state, "create with 100 tasks stored, on a disk");
    bench::require(std::system("umount -n -l /etc /usr/tavi/etc && rm -rf bench_disk") == 0,
                   "taking them away");
}

// ---- Many ----

int listAll() {
    TAVI_SCHED_TASK *list = nullptr;
    const int count = TAVISchedTaskListGet(&list, nullptr);
    TAVISchedTaskListFree(&list);
    return count;
}

void batch(benchmark::State &state) {
    constexpr int kMany = 1000;
    const Stored none(1);
    const Task task;
    bench::Comparison comparison;
    for (auto _ : state) {
        none.restore();
        comparison.product([&] {
            bench::require(TAVISchedChangeBegin() == 0, "begin");
            for (int i = 1; i < kMany; ++i) {
                bench::require(TAVISchedTaskCreate(task.task) == 0, "create");
            }
            bench::require(TAVISchedChangeCommit() == 0, "commit");
        });
        bench::makeWorkingCopyNew();
        comparison.reference([&] { bench::require(listAll() == kMany, "list"); });
    }
    comparison.reportTo(state, "a batch of 1,000 creates, to a list of 1,000", 5);
}

void changeAmong(const Stored &stored, const Task &task, int count, bench::Comparison &comparison,
                 bool isProduct) {
    stored.restore();
    const auto change = [&] {
        bench::require(TAVISchedTaskCreate(task.task) == 0 && TAVISchedTaskEdit(task.task) == 0 &&
                           TAVISchedTaskRemove(count / 2) == 0,
                       "create, edit and remove");
    };
    isProduct ? comparison.product(change) : comparison.reference(change);
}

void changesAmongMany(benchmark::State &state) {
    constexpr int kMany = 10000;
    constexpr int kFew = 1000;
    const Stored few(kFew);
    const Stored many(kMany);
    const Task task;
    bench::Comparison comparison;
    for (auto _ : state) {
        changeAmong(many, task, kMany, comparison, true);
        changeAmong(few, task, kFew, comparison, false);
    }
    comparison.reportTo(state, "create, edit and remove with 10,000 stored, to 1,000", 11);
}

BENCHMARK(create)->Iterations(30);
BENCHMARK(createOnDisk)->Iterations(15);
BENCHMARK(batch)->Iterations(5);
BENCHMARK(changesAmongMany)->Iterations(3);

} // namespace
