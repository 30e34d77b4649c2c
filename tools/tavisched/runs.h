// Runs as the status database remembers them.
#pragma once

#include <cstdint>
#include <ctime>
#include <map>
#include <optional>
#include <string>
#include <sys/types.h>
#include <vector>

namespace tavisched {

struct Run {
    int32_t taskId;
    time_t start;
    pid_t pid;
    int32_t code;        // SCHED_STATUS_CODE_*
    std::string comment; // exit code or signal number, as the code tells
};

// The runs of a task, or of all, newest first. Empty before the first run since the machine's
// start.
std::vector<Run> readRuns(std::optional<int32_t> taskId = std::nullopt);
// The newest run of every task that has one.
std::map<int32_t, Run> readLatestRuns();

// How a command's shell would tell of the run: 0, its exit code, or 128 and the signal's number.
int exitStatusOf(const Run &run);

} // namespace tavisched
