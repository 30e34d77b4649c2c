// Power schedules.
#include "finding.h"
#include "sched_handle.h"
#include "sched_paths.h"
#include "tavischeduler.h"

#include <array>
#include <cstring>
#include <unistd.h>

namespace sched {

namespace {

bool isEnabled(const TAVI_SCHED_TASK &task, const char *arguments) {
    return task.state == TAVI_SCHED_STATE_ENABLED && std::strcmp(task.appArgs, arguments) == 0;
}

bool isAny(const TAVI_SCHED_TASK *tasks, const char *arguments) {
    for (; tasks; tasks = tasks->next) {
        if (isEnabled(*tasks, arguments)) {
            return true;
        }
    }
    return false;
}

// A change by the id finds only one of them.
void inspectTwins(const TAVI_SCHED_TASK *tasks, Inspection &inspection) {
    for (; tasks; tasks = tasks->next) {
        for (const TAVI_SCHED_TASK *other = tasks->next; other; other = other->next) {
            if (other->id == tasks->id) {
                inspection.add({"power schedule " + std::to_string(tasks->id) +
                                    " is there more than once, and a change by its id finds only "
                                    "one of them",
                                "remove one of them",
                                [id = tasks->id] { return TAVISchedTaskRemove(id) == 0; },
                                "one of them was removed"});
                break;
            }
        }
    }
}

} // namespace

void inspectPower(Inspection &inspection) {
    TaskList tasks;
    if (TAVISchedTaskListGetOf(TAVI_SCHED_BACKEND_AUTOPOWER, tasks.address(), nullptr) < 0) {
        inspection.canReadPower = false;
        inspection.add("the power schedules cannot be read",
                       "mend or remove the damaged entry, four numbers each: enabled, week bits, "
                       "hour, minute; the system log names it");
        return;
    }
    inspectTwins(tasks.head(), inspection);
    if (isAny(tasks.head(), "poweroff") && access(kPowerOffCheck, X_OK) != 0) {
        inspection.add(std::string(kPowerOffCheck) +
                           ", which power-off schedules run, is missing or no program",
                       "install one; a default one comes with the package");
    }
    std::array<char, 256> reason{};
    if (TAVISchedPowerOnCheck(reason.data(), reason.size()) == 1) {
        const bool isAsked = isAny(tasks.head(), "poweron");
        inspection.add(
            {.what = (isAsked ? "there are power-on schedules, but this machine" : "this machine") +
                     std::string(" has no clock that can wake it (") + reason.data() + ")",
             .advice = isAsked ? "remove or disable them" : "power-on schedules are not possible",
             .isNote = !isAsked});
    }
}

} // namespace sched
