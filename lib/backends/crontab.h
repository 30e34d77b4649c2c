// The schedule backend's lines of /etc/crontab.
#pragma once

#include <string>
#include <vector>

namespace sched {

// What the crontab is to say of the runner.
struct RunnerLines {
    std::string text;                    // the lines of enabled tasks, each with its line feed
    std::vector<std::string> unreadable; // ids of tasks whose lines stay as they are
    unsigned int openFailure = 0;        // the error of a crontab that cannot be opened, if any
};

// Replaces /etc/crontab atomically: lines that name the runner go but for those of unreadable
// tasks, the new ones come, and all other lines stay as they are. Then cron is told. 0, or -1 with
// the crontab untouched; the error state names the backend's source and a stable line.
int rewriteCrontab(const RunnerLines &lines);

} // namespace sched
