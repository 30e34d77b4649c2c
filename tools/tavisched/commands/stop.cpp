// The subcommand "stop": ends the going runs of tasks.
#include "commands/commands.h"
#include "failure.h"
#include "tasks/runs.h"
#include "tasks/tasks.h"

#include <algorithm>
#include <cstdio>

namespace tavisched {

namespace {

constexpr unsigned int kNotFound = 0x2000;

struct Going {
    Task task;
    std::vector<Run> runs;
};

// Refused when none goes on.
Going goingRunsOf(int32_t id) {
    Going going{readTask(id), {}};
    forEachRun(runsOf(id), [&](const Run &run) {
        if (goesOn(run)) {
            going.runs.push_back(run);
        }
        return true;
    });
    if (going.runs.empty()) {
        throw Refusal(called(*going.task) + " is not running");
    }
    return going;
}

void stopRun(const TAVI_SCHED_TASK &task, const Run &run, int graceSeconds) {
    const std::string what = called(task) + ", run " + std::to_string(run.run);
    if (TAVISchedRunStop(run.run, graceSeconds) == 0) {
        std::printf("%s: asked to end; what is left in %d s is killed\n", what.c_str(),
                    graceSeconds);
    } else if (PLATCErrGet() == kNotFound) {
        std::printf("%s: has ended meanwhile\n", what.c_str());
    } else {
        throw Failure(what + " could not be stopped: " + libraryError());
    }
}

} // namespace

int stop(const Ids &ids, int graceSeconds) {
    std::vector<Going> all;
    for (auto id = ids.begin(); id != ids.end(); ++id) {
        if (std::find(ids.begin(), id, *id) == id) {
            all.push_back(goingRunsOf(*id));
        }
    }
    for (const Going &going : all) {
        for (const Run &run : going.runs) {
            stopRun(*going.task, run, graceSeconds);
        }
    }
    return 0;
}

} // namespace tavisched
