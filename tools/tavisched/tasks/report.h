// What is told of a task that was stored.
#pragma once

#include "tasks/tasks.h"

#include <string>
#include <vector>

namespace tavisched {

// "task 3 (Backup): Mon, Fri 22:00, next run 2026-11-23 22:00", and a note where one is due. A
// power schedule whose id was another one before has that behind its name.
std::vector<std::string> reportOf(const TAVI_SCHED_TASK &stored, int32_t idBefore);

void print(const std::vector<std::string> &lines);

} // namespace tavisched
