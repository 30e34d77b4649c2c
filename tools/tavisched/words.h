// Tasks and runs in words: schedules, times, results and owners as people say them.
#pragma once

#include "runs.h"
#include "tavischeduler.h"

#include <ctime>
#include <optional>
#include <string>

namespace tavisched {

// "Mon, Fri 22:00", "daily 08:00 every 4 h until 20:00", "monthly on day 15 at 08:10", ...
std::string scheduleInWords(const TAVI_SCHED_TASK &task);
// The next run as "2026-12-24 18:00"; nothing when there will be none or the task is disabled.
std::optional<std::string> nextRun(const TAVI_SCHED_TASK &task);
// "ok", "exit 2", "signal 9", "running", ...
std::string resultInWords(const Run &run);
// "just now", "5 min ago", "2 h ago", "yesterday", "3 days ago", "2026-10-01"
std::string ago(time_t then, time_t now);
std::string localTime(time_t time); // "2026-12-24 18:00:00"
// The user's name, or the number when there is no such user.
std::string ownerName(uint32_t uid);

} // namespace tavisched
