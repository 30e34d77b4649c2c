// The subcommand "run". The library runs a task in a detached process. To follow it to its end,
// each task is started by a helper process to whom the kernel gives orphans: it learns when the
// detached process ends, also when that gives up before it records anything.
#include "commands.h"
#include "failure.h"
#include "lock.h"
#include "process.h"
#include "runs.h"
#include "tasks.h"
#include "words.h"

#include <array>
#include <cerrno>
#include <cstdio>
#include <fcntl.h>
#include <filesystem>
#include <iostream>
#include <string>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

namespace tavisched {

namespace {

constexpr int kGaveUp = 1;

// The oldest child that runs this program. What a task's command leaves behind becomes a child too,
// but it is younger.
pid_t oldestRunner() {
    const std::string self = describe("self").name;
    pid_t oldest = -1;
    unsigned long long oldestStart = 0;
    for (const auto &entry : std::filesystem::directory_iterator("/proc")) {
        const std::string name = entry.path().filename();
        if (name.find_first_not_of("0123456789") != std::string::npos) {
            continue;
        }
        const Process process = describe(name);
        if (process.parent == getpid() && process.name == self &&
            (oldest == -1 || process.startTime < oldestStart)) {
            oldest = std::stoi(name);
            oldestStart = process.startTime;
        }
    }
    return oldest;
}

void waitFor(pid_t pid) {
    while (waitpid(pid, nullptr, 0) == -1 && errno == EINTR) {
    }
}

void start(const TAVI_SCHED_TASK &task) {
    if (TAVISchedTaskRun(task.id, 0, 0) != 0) {
        throw Failure(called(task) + " could not be started: " + libraryError());
    }
}

// A task that was started with a helper, which lives as long as the run.
struct Started {
    const TAVI_SCHED_TASK *task;
    pid_t helper;
    pid_t runner;
};

// In the helper: starts the task, tells the runner's process id, and waits for its end.
[[noreturn]] void help(const TAVI_SCHED_TASK &task, int pipe) {
    pid_t runner = -1;
    try {
        if (prctl(PR_SET_CHILD_SUBREAPER, 1) == 0) {
            start(task);
            runner = oldestRunner();
        }
    } catch (const std::exception &failure) {
        std::cerr << "tavisched: " << failure.what() << "\n";
    }
    const bool told = write(pipe, &runner, sizeof runner) == sizeof runner;
    if (told && runner != -1) {
        waitFor(runner);
    }
    _exit(0);
}

Started startWithHelper(const TAVI_SCHED_TASK &task) {
    std::array<int, 2> pipes{};
    const pid_t helper = pipe2(pipes.data(), O_CLOEXEC) == 0 ? fork() : -1;
    if (helper == -1) {
        throw Failure(called(task) + " could not be started: " + systemReason());
    }
    if (helper == 0) {
        help(task, pipes[1]);
    }
    Started started{.task = &task, .helper = helper, .runner = -1};
    close(pipes[1]);
    const bool told = read(pipes[0], &started.runner, sizeof started.runner) ==
                      static_cast<ssize_t>(sizeof started.runner);
    close(pipes[0]);
    if (!told || started.runner == -1) {
        throw Failure(called(task) + " could not be started");
    }
    return started;
}

// The run's exit status, when its process has ended.
int reportEnd(const Started &started) {
    for (const Run &run : readRuns(started.task->id)) {
        if (run.pid == started.runner) {
            std::printf("%s: %s\n", called(*started.task).c_str(), resultInWords(run).c_str());
            return exitStatusOf(run);
        }
    }
    std::printf("%s: did not run; the system log tells why\n", called(*started.task).c_str());
    return kGaveUp;
}

Tasks readTasks() {
    const Lock lock(Lock::Kind::Reading);
    return Tasks::read();
}

} // namespace

int run(const Ids &ids, bool wait) {
    const Tasks tasks = readTasks();
    std::vector<Started> runs;
    for (const TAVI_SCHED_TASK *const task : tasks.select(ids)) {
        if (wait) {
            runs.push_back(startWithHelper(*task));
        } else {
            start(*task);
        }
    }
    // A reader that goes away keeps none from being started.
    for (const TAVI_SCHED_TASK *const task : tasks.select(ids)) {
        std::printf("%s: started\n", called(*task).c_str());
    }
    std::fflush(stdout);
    int status = 0;
    for (const Started &started : runs) {
        waitFor(started.helper);
        const int result = reportEnd(started);
        status = status == 0 ? result : status;
    }
    return status;
}

} // namespace tavisched
