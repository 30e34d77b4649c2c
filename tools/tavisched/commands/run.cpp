// The subcommand "run". The library runs a task in a detached process, and tells when it has ended,
// also when that gave up before it recorded anything or could not record it.
#include "commands/commands.h"
#include "failure.h"
#include "tasks/runs.h"
#include "tasks/tasks.h"
#include "text/words.h"
#include "waiting.h"

#include <algorithm>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <ctime>
#include <iostream>
#include <iterator>
#include <optional>
#include <poll.h>
#include <string_view>
#include <unistd.h>

namespace tavisched {

namespace {

constexpr int kNotKnown = 1;
constexpr int kSignalBase = 128;
// Milliseconds; a run that cannot be recorded is asked after less and less.
constexpr int kFirstPause = 20;
constexpr int kLongestPause = 1000;
constexpr int64_t kPatience = 2000;

// A task that was started; the descriptor ends with the run.
struct Started {
    const TAVI_SCHED_TASK *task;
    int32_t runner = -1;
    int end = -1;
    int64_t asked = 0; // milliseconds since the epoch, at the earliest
};

int64_t now() {
    timespec time{};
    clock_gettime(CLOCK_REALTIME, &time);
    return time.tv_sec * 1000LL + time.tv_nsec / 1000000;
}

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
    Started started{.task = &task, .asked = now()};
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
    return findNewest(filter, [&](const Run &run) { return run.pid == started.runner; });
}

// The same when the run has ended, or the time is over.
std::optional<Run> awaitRecord(const Started &started, int64_t milliseconds) {
    const int64_t until = now() + milliseconds;
    for (int pause = kFirstPause; now() < until; pause = std::min(2 * pause, kLongestPause)) {
        const auto run = recordOf(started);
        if (run || ends(started, pause)) {
            return run ? run : recordOf(started);
        }
    }
    return std::nullopt;
}

// What the status database tells of it, as a record would.
std::optional<Run> statusOf(const Started &started) {
    struct Search {
        const Started &started;
        std::optional<Run> found{};
    } search{.started = started};
    const auto take = [](void *context, const TAVI_SCHED_STATUS *row) {
        auto &[wanted, found] = *static_cast<Search *>(context);
        if (row->pid == wanted.runner && row->timestamp >= seconds(wanted.asked)) {
            found.emplace();
            found->result = row->statusCode;
            found->number = std::atoi(row->comment);
        }
        return found ? 1 : 0;
    };
    sqlite3 *database = nullptr;
    if (TAVISchedDBOpenForReading(&database) == 1) {
        TAVISchedDBListStatus(database, started.task->id, take, &search);
        TAVISchedDBClose(database);
    }
    return search.found;
}

// Records that cannot be read keep nobody from waiting for the end. False, with a warning, when
// they cannot.
template <typename Read> bool readRecords(Read &&read) {
    try {
        read();
        return true;
    } catch (const Failure &failure) {
        std::cerr << "tavisched: warning: " << failure.what() << "\n";
        return false;
    }
}

// Says of each run that it has started, or what it waits for or why it did not start, which is on
// record then: who asks for missed ones again finds that they were made up for. Whether records can
// be read.
bool tellOfStarts(const std::vector<Started> &runs) {
    const int64_t until = now() + kPatience;
    bool hasRecords = true;
    for (const Started &started : runs) {
        std::optional<Run> run;
        hasRecords = hasRecords && readRecords([&] { run = awaitRecord(started, until - now()); });
        std::printf("%s: %s\n", called(*started.task).c_str(),
                    run && run->began == 0 ? resultInWords(*run).c_str() : "started");
    }
    std::fflush(stdout);
    return hasRecords;
}

// Shows what it prints until its end.
void follow(const Started &started, bool hasRecords) {
    const auto show = [&] {
        if (const auto run = awaitRecord(started, INT32_MAX)) {
            printOutput(run->run, true);
        }
    };
    if (hasRecords) {
        readRecords(show);
    }
    while (!ends(started, -1)) {
    }
    close(started.end);
}

// The run's exit status, when it has ended. One whose end could not be recorded seems interrupted
// by its record.
int reportEnd(const Started &started) {
    std::optional<Run> run;
    try {
        run = recordOf(started);
    } catch (const Failure &) { // that has been told
    }
    const bool isDoubtful = !run || run->result == TAVI_SCHED_RUN_INTERRUPTED;
    const auto status = isDoubtful ? statusOf(started) : std::nullopt;
    const bool isRecorded = run && (!status || status->result == run->result);
    run = status ? status : run;
    std::printf("%s: %s%s\n", called(*started.task).c_str(),
                run ? resultInWords(*run).c_str() : "no result",
                isRecorded ? "" : ", and not recorded; the system log tells why");
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

// ---- What was missed ----

// The last time that is known of the task was missed, and no command of its has begun since, nor
// will one: what gave up has not made up for it.
bool hasMissedLast(const TAVI_SCHED_TASK &task) {
    const auto last = findNewest(runsOf(task.id), [](const Run &run) {
        return run.due != 0 || run.began != 0 || goesOn(run);
    });
    return last && last->result == TAVI_SCHED_RUN_MISSED;
}

std::vector<Task> readMissed() {
    if (TAVISchedMissedRunsFind() != 0) {
        throw Failure("missed times cannot be looked for: " + libraryError());
    }
    TAVI_SCHED_RUN_FILTER filter = kAllRuns;
    filter.newestOnly = 1;
    std::vector<int32_t> idle; // whose newest run has not begun, so that it may have been missed
    forEachRun(filter, [&](const Run &run) {
        if (run.began == 0 && !goesOn(run)) {
            idle.push_back(run.taskId);
        }
        return true;
    });
    std::vector<Task> missed;
    std::sort(idle.begin(), idle.end());
    const Tasks tasks = Tasks::read();
    for (const TAVI_SCHED_TASK *const task : tasks.all()) {
        if (isEnabled(*task) && std::binary_search(idle.begin(), idle.end(), task->id) &&
            hasMissedLast(*task)) {
            missed.push_back(readTask(task->id));
        }
    }
    return missed;
}

int runAll(const std::vector<Task> &tasks, bool wait) {
    std::vector<Started> runs;
    if (wait) {
        tellWhenInterrupted();
    }
    std::transform(tasks.begin(), tasks.end(), std::back_inserter(runs),
                   [](const Task &task) { return start(*task); });
    // A reader that goes away has kept none from being started.
    const bool hasRecords = tellOfStarts(runs);
    tellNoMoreOfWaiting();
    int status = 0;
    for (const Started &started : wait ? runs : std::vector<Started>()) {
        follow(started, hasRecords);
        const int result = reportEnd(started);
        status = status == 0 ? result : status;
    }
    return status;
}

} // namespace

int run(const Ids &ids, const RunOptions &options) {
    if (ids.empty() != options.missed) {
        throw Refusal(options.missed ? "--missed is for all tasks: it takes no ids"
                                     : "ids of tasks are needed, or --missed");
    }
    const std::vector<Task> tasks = options.missed ? readMissed() : readTasks(ids);
    if (tasks.empty()) {
        std::printf("No task has missed its last time.\n");
    }
    return runAll(tasks, options.wait);
}

} // namespace tavisched
