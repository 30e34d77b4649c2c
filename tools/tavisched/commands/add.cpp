// The subcommand "add": stores a new task, or shows what would come of it.
#include "commands/tell.h"
#include "failure.h"
#include "tasks/change.h"
#include "tasks/findings.h"

#include <cstdio>

namespace tavisched {

namespace {

Task makeTask(const TaskOptions &options) {
    if (!options.power && !options.command) {
        throw Refusal("a task needs --command, or --power for a power schedule", "command");
    }
    Task task = newTask(options.power ? TAVI_SCHED_BACKEND_AUTOPOWER : TAVI_SCHED_BACKEND_SCHEDULE);
    apply(options, *task);
    return task;
}

void dryRun(const TaskOptions &options, const Manner &manner) {
    const Tasks tasks = Tasks::read();
    const Task task = makeTask(options);
    requirePossible(Tasks::readPower(), *task, nullptr);
    requireGoodLines(tasks.all(), {task.get()});
    if (!isPower(*task)) {
        TAVISchedTaskNextId(&task->id);
    }
    tellPreview(*task, tasks, manner);
}

Task store(const TaskOptions &options) {
    Change change;
    Task task = makeTask(options);
    change.create(*task);
    change.commit();
    return task;
}

} // namespace

int add(const TaskOptions &options, const Manner &manner) {
    if (manner.dryRun) {
        dryRun(options, manner);
    } else {
        const Task task = store(options);
        tellStored(*task, task->id, manner);
    }
    if (!manner.quiet && !manner.json && !options.schedule()) {
        std::printf("Note: no schedule was given, so it is daily at 00:00.\n");
    }
    if (!manner.dryRun) {
        warnWhenNothingRuns();
    }
    return 0;
}

} // namespace tavisched
