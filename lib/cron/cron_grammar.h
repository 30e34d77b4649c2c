// The lines of /etc/crontab as cron reads them: the grammar of crontab(5) with a user before the
// command. cron ignores the whole file for one line that it does not take, so it must be known
// beforehand which ones those are.
#pragma once

#include "tavischeduler.h"

#include <string>
#include <string_view>

namespace sched {

using CronTimes = TAVI_SCHED_CRON_TIMES;

struct CronVerdict {
    enum class Kind { Ignored, Variable, Entry, Rejected };
    Kind kind;
    std::string reason{}; // why cron rejects it, for people to read
    CronTimes times{};    // when an entry is due; empty for one with "@"
};

// Judges a line without its line feed.
CronVerdict judgeCronLine(std::string_view line);

} // namespace sched
