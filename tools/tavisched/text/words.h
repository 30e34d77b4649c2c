// Tasks and runs in words: schedules, times, results and owners as people say them.
#pragma once

#include "tasks/runs.h"
#include "tavischeduler.h"

#include <ctime>
#include <optional>
#include <string>

namespace tavisched {

// "Mon, Fri 22:00", "daily 08:00 every 4 h until 20:00", "monthly on day 15 at 08:10", ...
std::string scheduleInWords(const TAVI_SCHED_TASK &task);
// "enabled", "disabled", and "done" or "past" for a once task whose time has come; `run` is its
// last one, or nullptr.
std::string stateInWords(const TAVI_SCHED_TASK &task, const Run *run);
// The next run as the library shows it, "2026-12-24 18:00"; nothing when there will be none or the
// task is disabled. When it will really be started, nextStart of tasks/starts.h tells.
std::optional<std::string> nextRun(const TAVI_SCHED_TASK &task);
// "ok", "exit 2", "killed by signal 9", "running", "waiting for task 3 since ...", "missed", ...
std::string resultInWords(const Run &run);
// "cron", or the user who started it by hand.
std::string startInWords(const Run &run);
// "just now", "5 min ago", "2 h ago", "yesterday", "3 days ago", "2026-10-01"
std::string ago(time_t then, time_t now);
// "4 s", "2 min 5 s", "1 h 3 min"
std::string durationInWords(time_t seconds);
std::string localTime(time_t time);   // "2026-12-24 18:00:00"
std::string localMinute(time_t time); // "2026-12-24 18:00"
std::string weekDayOf(time_t time);   // "Thu"
// The user's name, or the number when there is no such user.
std::string ownerName(uint32_t uid);

} // namespace tavisched
