// The subcommand "run". The library runs a task in a detached process, and tells when it has ended,
// also when that gave up before it recorded anything.
#include "commands/commands.h"
#include "failure.h"
#include "tasks/runs.h"
#include "tasks/tasks.h"
#include "text/words.h"
#include "waiting.h"

#include <algorithm>
#include <csignal>
#include <cstdio>
#include <ctime>
#include <iterator>
#include <optional>
#include <poll.h>
#include <string_view>
#include <unistd.h>

namespace tavisched {

namespace {

constexpr int kNotKnown = 1;
constexpr int kSignalBase = 128;
constexpr int kPause = 50; // milliseconds

// A task that was started; the descriptor ends with the run.
struct Started {
    const TAVI_SCHED_TASK *task;
    int32_t runner = -1;
    int end = -1;
    int64_t asked = 0; // milliseconds since the epoch, at the earliest
};

void onInterrupt(int) {
    constexpr std::string_view kSaid =
        "\ntavisched: no longer waiting; what was started goes on (\"tavisched stop\" ends it)\n";
    [[maybe_unused]] const ssize_t written = write(STDERR_FILENO, kSaid.data(), kSaid.size());
    _exit(kSignalBase + SIGINT);
}

// Ctrl-C ends this program alone: a run has a session of its own.
void tellWhenInterrupted() {
    struct sigaction action {};
    if (sigaction(SIGINT, nullptr, &action) == 0 && action.sa_handler != SIG_IGN) {
        action = {};
        action.sa_handler = onInterrupt;
        sigaction(SIGINT, &action, nullptr);
    }
}

Started start(const TAVI_SCHED_TASK &task) {
    timespec now{};
    clock_gettime(CLOCK_REALTIME, &now);
    Started started{.task = &task, .asked = now.tv_sec * 1000LL + now.tv_nsec / 1000000};
    if (TAVISchedTaskRunFollowed(task.id, 0, 0, &started.runner, &started.end) != 0) {
        throw Failure(called(task) + " could not be started: " + libraryError());
    }
    return started;
}

// Whether the run ends within so many milliseconds; without a limit for -1.
bool ends(const Started &started, int milliseconds) {
    pollfd end{.fd = started.end, .events = POLLIN, .revents = 0};
    return poll(&end, 1, milliseconds) == 1;
}

// Its record, when there is one yet. An earlier run may have had the same process id.
std::optional<Run> recordOf(const Started &started) {
    TAVI_SCHED_RUN_FILTER filter = runsOf(started.task->id);
    filter.since = started.asked;
    const std::vector<Run> runs = readRuns(filter);
    const auto run = std::find_if(runs.begin(), runs.end(),
                                  [&](const Run &one) { return one.pid == started.runner; });
    return run == runs.end() ? std::nullopt : std::optional(*run);
}

// Shows what it prints until its end.
void follow(const Started &started) {
    std::optional<Run> run;
    while (!(run = recordOf(started)) && !ends(started, kPause)) {
    }
    if (run || (run = recordOf(started))) {
        printOutput(run->run, true);
    }
    while (!ends(started, -1)) {
    }
    close(started.end);
}

// The run's exit status, when it has ended.
int reportEnd(const Started &started) {
    const auto run = recordOf(started);
    std::printf("%s: %s\n", called(*started.task).c_str(),
                run ? resultInWords(*run).c_str()
                    : "its record is missing; the system log tells why");
    std::fflush(stdout);
    return run ? exitStatusOf(*run) : kNotKnown;
}

std::vector<Task> readTasks(const Ids &ids) {
    std::vector<Task> tasks;
    for (auto id = ids.begin(); id != ids.end(); ++id) {
        if (std::find(ids.begin(), id, *id) == id) {
            tasks.push_back(readTask(*id));
        }
    }
    return tasks;
}

} // namespace

int run(const Ids &ids, bool wait) {
    const std::vector<Task> tasks = readTasks(ids);
    std::vector<Started> runs;
    if (wait) {
        tellWhenInterrupted();
    }
    std::transform(tasks.begin(), tasks.end(), std::back_inserter(runs),
                   [](const Task &task) { return start(*task); });
    // A reader that goes away keeps none from being started.
    for (const Started &started : runs) {
        std::printf("%s: started\n", called(*started.task).c_str());
    }
    std::fflush(stdout);
    tellNoMoreOfWaiting();
    int status = 0;
    for (const Started &started : wait ? runs : std::vector<Started>()) {
        follow(started);
        const int result = reportEnd(started);
        status = status == 0 ? result : status;
    }
    return status;
}

} // namespace tavisched
