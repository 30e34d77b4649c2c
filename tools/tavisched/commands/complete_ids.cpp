// The subcommand "complete-ids", which shells call while a command line is typed.
#include "commands/commands.h"
#include "tasks/tasks.h"
#include "text/utf8.h"

#include <cstdio>

namespace tavisched {

int completeIds() {
    const Tasks tasks = Tasks::read();
    for (const TAVI_SCHED_TASK *const task : tasks.all()) {
        std::printf("%ld\t%s\n", static_cast<long>(task->id), printable(task->name).c_str());
    }
    return 0;
}

} // namespace tavisched
