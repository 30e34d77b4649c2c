// Runs as the status database remembers them.
#pragma once

#include "tavischeduler.h"

#include <cstdint>
#include <ctime>
#include <limits>
#include <map>
#include <optional>
#include <string>
#include <sys/types.h>
#include <vector>

namespace tavisched {

struct Run {
    int32_t statusId;
    int32_t taskId;
    time_t start;
    pid_t pid;
    int32_t code;                // SCHED_STATUS_CODE_*
    std::string comment;         // exit code or signal number, as the code tells
    std::optional<time_t> end{}; // when that is known
};
using LatestRuns = std::map<int32_t, Run>; // by task

// The runs of a task, or of all, newest first, at most so many. Empty before the first run since
// the machine's start.
std::vector<Run> readRuns(std::optional<int32_t> taskId = std::nullopt,
                          size_t most = std::numeric_limits<size_t>::max());
// The newest run of every task that has one. Nothing, with a warning, when they cannot be read:
// tasks can be shown all the same.
LatestRuns readLatestRuns();

// The command was not started, as its owner does not exist. The task may be nullptr.
bool lackedOwner(const Run &run, const TAVI_SCHED_TASK *task);
// A run that did not come to a good end.
bool hasFailed(const Run &run);
// How a command's shell would tell of the run: 0, its exit code, or 128 and the signal's number.
int exitStatusOf(const Run &run, const TAVI_SCHED_TASK *task);

} // namespace tavisched
