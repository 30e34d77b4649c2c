// Runs as their records tell them.
#pragma once

#include "tavischeduler.h"

#include <cstdint>
#include <ctime>
#include <functional>
#include <map>
#include <optional>
#include <string>
#include <vector>

namespace tavisched {

using Run = TAVI_SCHED_RUN;
using LatestRuns = std::map<int32_t, Run>; // by task

constexpr TAVI_SCHED_RUN_FILTER kAllRuns{
    .taskId = -1, .failedOnly = 0, .newestOnly = 0, .limit = 0, .since = 0};
constexpr TAVI_SCHED_RUN_FILTER runsOf(int32_t taskId) {
    return {.taskId = taskId, .failedOnly = 0, .newestOnly = 0, .limit = 0, .since = 0};
}
// Hands over the runs that the filter keeps, newest first, until the reader answers false; none
// where there are no records.
void forEachRun(const TAVI_SCHED_RUN_FILTER &filter,
                const std::function<bool(const Run &)> &reader);
std::vector<Run> readRuns(const TAVI_SCHED_RUN_FILTER &filter);
// The newest of them of which the condition holds.
std::optional<Run> findNewest(const TAVI_SCHED_RUN_FILTER &filter,
                              const std::function<bool(const Run &)> &condition);
// The newest run of every task that has one. Nothing, with a warning, when they cannot be read:
// tasks can be shown all the same.
LatestRuns readLatestRuns();
// The same for one task.
LatestRuns readLatestRunOf(int32_t taskId);
// One run, or nothing when it has no record.
std::optional<Run> findRun(int64_t run);

inline time_t seconds(int64_t milliseconds) {
    return static_cast<time_t>(milliseconds / 1000);
}
// When it began, or was asked for while its command has not begun.
inline time_t startOf(const Run &run) {
    return seconds(run.began != 0 ? run.began : run.asked);
}
// Waits, or its command runs.
inline bool goesOn(const Run &run) {
    return run.result == TAVI_SCHED_RUN_RUNNING || run.result == TAVI_SCHED_RUN_WAITING;
}
// A run that did not come to a good end.
bool hasFailed(const Run &run);
// How a command's shell would tell of the run: 0, its exit code, or 128 and the signal's number.
int exitStatusOf(const Run &run);

// Writes what the run prints to standard output: what is there, or, when it is followed, all until
// its end. A terminal is sent escapes instead of what could control it. What was cut out is said on
// standard error. False when nothing is kept of it.
bool printOutput(int64_t run, bool follow);

} // namespace tavisched
