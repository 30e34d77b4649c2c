// The subcommand "add": stores a new task, or shows what would come of it.
#include "commands/commands.h"
#include "failure.h"
#include "tasks/change.h"
#include "tasks/findings.h"
#include "tasks/report.h"
#include "text/words.h"

#include <cstdio>

namespace tavisched {

namespace {

Task makeTask(const TaskOptions &options) {
    if (!options.power && !options.command) {
        throw Refusal("a task needs --command, or --power for a power schedule");
    }
    Task task = newTask(options.power ? TAVI_SCHED_BACKEND_AUTOPOWER : TAVI_SCHED_BACKEND_SCHEDULE);
    apply(options, *task);
    return task;
}

std::string withoutSchedule(const TaskOptions &options) {
    return options.schedule() ? "" : "Note: no schedule was given, so it is daily at 00:00.";
}

// What the machine does at the time of a power schedule.
std::string effectOf(const TAVI_SCHED_TASK &task) {
    if (!isEnabled(task)) {
        return "nothing while it is disabled";
    }
    return task.appArgs == kPowerOn
               ? "the machine's clock is set to switch it on, should it be off then"
               : "cron runs the power-off check, which switches the machine off if it may be";
}

int dryRun(const TaskOptions &options, bool quiet) {
    const Tasks tasks = Tasks::read();
    const Task task = makeTask(options);
    requirePossible(Tasks::readPower(), *task, nullptr);
    requireGoodLines(tasks.all(), {task.get()});
    if (!isPower(*task)) {
        TAVISchedTaskNextId(&task->id);
    }
    computeNextRun(*task);
    if (quiet) {
        std::printf("%ld\n", static_cast<long>(task->id));
        return 0;
    }
    std::printf("Schedule: %s\n", scheduleInWords(*task).c_str());
    if (isPower(*task)) {
        std::printf("What happens: %s\n", effectOf(*task).c_str());
    } else {
        std::printf("Crontab line: %s\n",
                    crontabLine(*task).value_or("none while disabled").c_str());
    }
    std::printf("Next run: %s\n", nextRun(*task).value_or("never").c_str());
    std::vector<std::string> notes;
    if (const std::string remark = remarkOn(*task); !remark.empty()) {
        notes.push_back("Note: " + remark + ".");
    }
    if (const std::string note = withoutSchedule(options); !note.empty()) {
        notes.push_back(note);
    }
    print(notes);
    return 0;
}

Task store(const TaskOptions &options) {
    Change change;
    Task task = makeTask(options);
    change.create(*task);
    change.commit();
    return task;
}

} // namespace

int add(const TaskOptions &options, bool isDryRun, bool quiet) {
    if (isDryRun) {
        return dryRun(options, quiet);
    }
    const Task task = store(options);
    if (quiet) {
        std::printf("%ld\n", static_cast<long>(task->id));
    } else {
        print(reportOf(*task, task->id));
        if (const std::string note = withoutSchedule(options); !note.empty()) {
            print({note});
        }
    }
    warnWhenNothingRuns();
    return 0;
}

} // namespace tavisched
