// The subcommand "edit": changes a task as the options say.
#include "commands/commands.h"
#include "failure.h"
#include "tasks/change.h"
#include "tasks/findings.h"
#include "tasks/report.h"

#include <cstdio>

namespace tavisched {

namespace {

Task change(int32_t id, const TaskOptions &options) {
    Change change;
    const TAVI_SCHED_TASK &before = *change.tasks().select({id}).front();
    Task task = copyOf(before);
    apply(options, *task);
    change.edit(*task, before);
    change.commit();
    return task;
}

} // namespace

int edit(int32_t id, const TaskOptions &options, bool quiet) {
    if (!options.any()) {
        throw Refusal("nothing is to be changed; \"tavisched edit --help\" shows what can be");
    }
    const Task task = change(id, options);
    if (quiet) {
        std::printf("%ld\n", static_cast<long>(task->id));
    } else {
        print(reportOf(*task, id));
    }
    warnWhenNothingRuns();
    return 0;
}

} // namespace tavisched
