// The subcommand "run". The library runs a task in a detached process, and tells when it has ended,
// also when that gave up before it recorded anything.
#include "commands/commands.h"
#include "failure.h"
#include "tasks/runs.h"
#include "tasks/tasks.h"
#include "text/words.h"
#include "waiting.h"

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <iterator>
#include <sys/prctl.h>
#include <unistd.h>

namespace tavisched {

namespace {

constexpr int kGaveUp = 1;

// A task that was started; the descriptor ends with the run.
struct Started {
    const TAVI_SCHED_TASK *task;
    int32_t runner = -1;
    int end = -1;
};

Started start(const TAVI_SCHED_TASK &task) {
    Started started{.task = &task};
    if (TAVISchedTaskRunFollowed(task.id, 0, 0, &started.runner, &started.end) != 0) {
        throw Failure(called(task) + " could not be started: " + libraryError());
    }
    return started;
}

void waitForEnd(const Started &started) {
    char nothing = 0;
    while (read(started.end, &nothing, 1) == -1 && errno == EINTR) {
    }
    close(started.end);
}

// The run's exit status, when its process has ended.
int reportEnd(const Started &started) {
    for (const Run &run : readRuns(started.task->id)) {
        if (run.pid == started.runner) {
            std::printf("%s: %s\n", called(*started.task).c_str(),
                        resultInWords(run, started.task).c_str());
            return exitStatusOf(run, started.task);
        }
    }
    std::printf("%s: did not run; the system log tells why\n", called(*started.task).c_str());
    return kGaveUp;
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
    // What is waited for stays below us: when a plug-in handler waits for a task that reads tasks,
    // the task knows that the change which it would wait for waits for it.
    if (wait && prctl(PR_SET_CHILD_SUBREAPER, 1) != 0) {
        throw Failure(std::string("no task was started: ") + std::strerror(errno));
    }
    std::vector<Started> runs;
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
        waitForEnd(started);
        const int result = reportEnd(started);
        status = status == 0 ? result : status;
    }
    return status;
}

} // namespace tavisched
