// The subcommands "enable" and "disable".
#include "commands/commands.h"
#include "tasks/change.h"
#include "tasks/findings.h"
#include "tasks/report.h"

namespace tavisched {

namespace {

struct Changed {
    Task task;
    int32_t idBefore;
};

std::vector<Changed> changeStates(const Ids &ids, bool enabled) {
    Change change;
    std::vector<Changed> changed;
    for (const TAVI_SCHED_TASK *const before : change.tasks().select(ids)) {
        Task task = copyOf(*before);
        TAVISchedCTaskSetState(task.get(), enabled ? 1 : 0);
        if (enabled && !whyCronRejects(*task)) {
            refusePast(*task);
        }
        if (task->state != before->state) {
            change.edit(*task, *before);
        }
        changed.push_back({std::move(task), before->id});
    }
    change.commit();
    return changed;
}

} // namespace

int setEnabled(const Ids &ids, bool enabled) {
    const std::vector<Changed> changed = changeStates(ids, enabled);
    const Tasks stored = Tasks::read();
    for (const auto &[task, idBefore] : changed) {
        print(reportOf(*task, idBefore, stored));
    }
    if (enabled) {
        warnWhenNothingRuns();
    }
    return 0;
}

} // namespace tavisched
