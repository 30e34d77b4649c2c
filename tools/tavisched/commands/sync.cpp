// The subcommand "sync": writes what follows from the tasks anew.
#include "commands/commands.h"
#include "failure.h"
#include "tasks/change.h"
#include "tasks/findings.h"

#include <cstdio>

namespace tavisched {

int syncTasks() {
    {
        Change change;
        if (change.tasks().lacksPower()) {
            throw Failure("the power schedules cannot be set while they cannot be read; "
                          "\"tavisched check\" tells more");
        }
        change.sync();
        change.commit();
    }
    std::printf("/etc/crontab has the lines of all enabled tasks.\n");
    return warnWhenNothingRuns() ? 1 : 0;
}

} // namespace tavisched
