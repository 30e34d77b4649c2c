// The subcommand "run". The library runs a task in a detached process; to follow it to its end this
// program makes itself the one to whom the kernel gives orphans, so that it learns when the process
// ends, also when that gives up before it records anything.
#include "commands.h"
#include "failure.h"
#include "runs.h"
#include "store.h"
#include "words.h"

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <set>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

namespace tavisched {

namespace {

constexpr int kGaveUp = 1;

// The children of this process that run this program. What a task's command leaves behind becomes a
// child too, but has a name of its own.
std::set<pid_t> runnersBelow() {
    const auto describe = [](const std::string &pid) {
        std::ifstream file("/proc/" + pid + "/stat");
        std::string line;
        std::getline(file, line);
        return line;
    };
    const auto nameIn = [](const std::string &line) {
        const size_t begin = line.find('(');
        const size_t end = line.rfind(')');
        return end == std::string::npos ? "" : line.substr(begin, end - begin);
    };
    const std::string self = nameIn(describe("self"));
    std::set<pid_t> found;
    for (const auto &entry : std::filesystem::directory_iterator("/proc")) {
        const std::string pid = entry.path().filename();
        if (!std::all_of(pid.begin(), pid.end(), [](unsigned char c) { return std::isdigit(c); })) {
            continue;
        }
        const std::string line = describe(pid);
        int parent = 0;
        const size_t end = line.rfind(')');
        if (end != std::string::npos && nameIn(line) == self &&
            std::sscanf(line.c_str() + end, ") %*c %d", &parent) == 1 && parent == getpid()) {
            found.insert(std::stoi(pid));
        }
    }
    return found;
}

void start(const TAVI_SCHED_TASK &task) {
    if (TAVISchedTaskRun(task.id, 0, 0) != 0) {
        throw Failure(called(task) + " could not be started: " + libraryError());
    }
    std::printf("%s: started\n", called(task).c_str());
    std::fflush(stdout);
}

struct Started {
    const TAVI_SCHED_TASK *task;
    pid_t pid;
};

std::vector<Started> startAll(const std::vector<TAVI_SCHED_TASK *> &tasks) {
    std::vector<Started> started;
    std::set<pid_t> known;
    for (const TAVI_SCHED_TASK *const task : tasks) {
        start(*task);
        pid_t runner = -1;
        for (const pid_t pid : runnersBelow()) {
            if (known.insert(pid).second) {
                runner = pid;
            }
        }
        started.push_back({task, runner});
    }
    return started;
}

void waitFor(pid_t pid) {
    while (waitpid(pid, nullptr, 0) == -1 && errno == EINTR) {
    }
}

// The run's exit status, when its process has ended.
int reportEnd(const Started &started) {
    for (const Run &run : readRuns(started.task->id)) {
        if (run.pid == started.pid) {
            std::printf("%s: %s\n", called(*started.task).c_str(), resultInWords(run).c_str());
            return exitStatusOf(run);
        }
    }
    std::printf("%s: did not run; the system log tells why\n", called(*started.task).c_str());
    return kGaveUp;
}

} // namespace

int run(const Ids &ids, bool wait) {
    const Tasks tasks = Tasks::read();
    const auto selected = tasks.select(ids);
    if (!wait) {
        for (const TAVI_SCHED_TASK *const task : selected) {
            start(*task);
        }
        return 0;
    }
    if (prctl(PR_SET_CHILD_SUBREAPER, 1) != 0) {
        throw Failure("the runs cannot be followed; run them without --wait");
    }
    int status = 0;
    for (const Started &started : startAll(selected)) {
        waitFor(started.pid);
        const int result = reportEnd(started);
        status = status == 0 ? result : status;
    }
    return status;
}

} // namespace tavisched
