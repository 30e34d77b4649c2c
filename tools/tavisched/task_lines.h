// The lines of /etc/crontab that stand for tasks: what they are, whether cron takes them, and
// whether the file has them. cron ignores the whole file for one line that it rejects, and every
// change writes the lines of all tasks.
#pragma once

#include "tasks.h"

#include <optional>
#include <string>
#include <vector>

namespace tavisched {

// The lines of /etc/crontab, without their line feeds; nothing when the file cannot be read.
struct Crontab {
    std::vector<std::string> lines;
    bool endsWithLineFeed = true;
};
std::optional<Crontab> readCrontab();
// Why cron rejects a line, or nothing.
std::optional<std::string> whyCronRejects(const std::string &line);

using TaskPointers = std::vector<const TAVI_SCHED_TASK *>;

// The line of an enabled task of the schedule backend.
std::string crontabLine(const TAVI_SCHED_TASK &task);
// Why cron would reject the task's line, or nothing.
std::optional<std::string> whyCronRejects(const TAVI_SCHED_TASK &task);
bool anyRejected(const Tasks &tasks);
// Refused when these tasks, as they would be after a change, have a line that cron rejects, unless
// that line stands in the file already.
void requireGoodCrontab(const TaskPointers &tasksAfterwards);

// How the tasks' lines of the file differ from what the tasks ask.
struct CrontabDifference {
    std::vector<std::string> missing, surplus;
    bool any() const { return !missing.empty() || !surplus.empty(); }
};
CrontabDifference compareCrontab(const Tasks &tasks);
// Whether its power-off lines are those of the power-off schedules.
bool arePowerOffLinesRight(const Tasks &tasks);

// Writes all lines anew. Refused when cron would reject one; fails when the file does not have them
// afterwards, which the library only logs.
void syncCrontab();
// The second half of that, for after a change of tasks.
void requireSyncedCrontab();

} // namespace tavisched
