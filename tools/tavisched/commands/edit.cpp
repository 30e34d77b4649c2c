// The subcommand "edit": changes a task as the options say.
#include "commands/tell.h"
#include "failure.h"
#include "tasks/change.h"
#include "tasks/findings.h"

namespace tavisched {

namespace {

Task changed(const TAVI_SCHED_TASK &before, const TaskOptions &options) {
    Task task = copyOf(before);
    apply(options, *task);
    return task;
}

void dryRun(int32_t id, const TaskOptions &options, const Manner &manner) {
    const Tasks tasks = Tasks::read();
    const TAVI_SCHED_TASK *const before = tasks.select({id}).front();
    const Task task = changed(*before, options);
    requirePossible(Tasks::readPower(), *task, before);
    TaskPointers others = tasks.all();
    std::erase(others, before);
    requireGoodLines(others, {task.get()});
    tellPreview(*task, tasks, manner);
}

Task store(int32_t id, const TaskOptions &options) {
    Change change;
    const TAVI_SCHED_TASK &before = *change.tasks().select({id}).front();
    Task task = changed(before, options);
    change.edit(*task, before);
    change.commit();
    return task;
}

} // namespace

int edit(int32_t id, const TaskOptions &options, const Manner &manner) {
    if (!options.any()) {
        throw Refusal("nothing is to be changed; \"tavisched edit --help\" shows what can be");
    }
    if (manner.dryRun) {
        dryRun(id, options, manner);
        return 0;
    }
    tellStored(*store(id, options), id, manner);
    warnWhenNothingRuns();
    return 0;
}

} // namespace tavisched
