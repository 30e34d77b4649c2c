// What is told of a task that was stored, or would be.
#pragma once

#include "tasks/tasks.h"

#include <string>
#include <vector>

namespace tavisched {

// A task that was just stored as the stored tasks have it: power schedules have other names there.
Task asListed(const TAVI_SCHED_TASK &task, const Tasks &stored);

// "task 3 (Backup): Mon, Fri 22:00, next run 2026-11-23 22:00", and a note for each that is due. A
// power schedule whose id was another one before has that behind its name.
std::vector<std::string> reportOf(const TAVI_SCHED_TASK &task, int32_t idBefore,
                                  const Tasks &stored);
// What would come of it: the schedule, the line of the crontab, the next starts, and notes.
std::vector<std::string> previewOf(const TAVI_SCHED_TASK &task, const Tasks &stored);

void print(const std::vector<std::string> &lines);

} // namespace tavisched
