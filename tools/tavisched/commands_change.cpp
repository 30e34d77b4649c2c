// The subcommands that change tasks. Each checks everything under the lock before it stores
// anything, and prints when the lock is released: a reader that goes away ends nothing half done.
#include "change.h"
#include "commands.h"
#include "failure.h"
#include "json.h"
#include "words.h"

#include <algorithm>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <iostream>
#include <iterator>
#include <string_view>
#include <unistd.h>

namespace tavisched {

namespace {

constexpr size_t kMaxPowerSchedules = 100; // of a kind; the library reads no more

using Lines = std::vector<std::string>;

int print(const Lines &lines) {
    for (const std::string &line : lines) {
        std::printf("%s\n", line.c_str());
    }
    return 0;
}

// ---- What must hold ----

// The tasks as they will be when those of the same id have been replaced by the changed ones, and
// the new ones are there.
TaskPointers afterwards(const Tasks &tasks, const TaskPointers &changed) {
    TaskPointers result = changed;
    for (const TAVI_SCHED_TASK *const task : tasks.all()) {
        const bool replaced = std::any_of(changed.begin(), changed.end(),
                                          [&](const auto *other) { return other->id == task->id; });
        if (!replaced) {
            result.push_back(task);
        }
    }
    return result;
}

// Schedules that a machine could not tell apart are one.
void refuseSameSchedule(const Tasks &tasks, const TAVI_SCHED_TASK &task,
                        const TAVI_SCHED_TASK *before) {
    const TAVI_SCHED_TASK *const same = tasks.findSameSchedule(task);
    if (same && same != before) {
        throw Refusal("there is such a schedule already: " + called(*same));
    }
}

// Both kinds of power schedules must have room for what will be there.
void requirePowerRoom(const TaskPointers &tasksAfterwards) {
    for (const std::string_view kind : {kPowerOn, kPowerOff}) {
        const auto count = std::count_if(
            tasksAfterwards.begin(), tasksAfterwards.end(),
            [&](const TAVI_SCHED_TASK *task) { return isPower(*task) && task->appArgs == kind; });
        if (static_cast<size_t>(count) > kMaxPowerSchedules) {
            throw Refusal("there would be " + std::to_string(count) +
                          " power schedules of this kind; accepted: at most " +
                          std::to_string(kMaxPowerSchedules));
        }
    }
}

// The library would store a power schedule beside damaged ones and fail afterwards.
void requireReadablePower(const Tasks &tasks, const TAVI_SCHED_TASK &changed) {
    if (isPower(changed) && tasks.lacksPower()) {
        throw Failure("power schedules cannot be changed while they cannot be read; \"tavisched "
                      "check\" tells more");
    }
}

void requireStorable(const TaskPointers &tasksAfterwards) {
    requirePowerRoom(tasksAfterwards);
    requireGoodCrontab(tasksAfterwards);
}

// ---- What is told ----

// The stored task with its next run, as the library has it now.
void addReport(const TAVI_SCHED_TASK &stored, Lines &lines) {
    const Tasks tasks = Tasks::read();
    const TAVI_SCHED_TASK *const task = tasks.find(stored.id);
    if (!task) {
        throw Failure(called(stored) + " cannot be read back");
    }
    const std::string next = task->state == TAVI_SCHED_STATE_ENABLED
                                 ? "next run " + nextRun(*task).value_or("never")
                                 : "disabled";
    lines.push_back(called(*task) + ": " + scheduleInWords(*task) + ", " + next);
    if (const std::string remark = remarkOn(*task); !remark.empty()) {
        lines.push_back("Note: " + remark + ".");
    }
}

Lines reportOf(const TAVI_SCHED_TASK &stored, bool quiet) {
    Lines lines;
    if (quiet) {
        lines.push_back(std::to_string(stored.id));
    } else {
        addReport(stored, lines);
    }
    return lines;
}

// A next run is not to be believed while cron ignores the file.
void warnOfRejectedLines() {
    const auto crontab = readCrontab();
    for (size_t i = 0; crontab && i < crontab->lines.size(); ++i) {
        if (whyCronRejects(crontab->lines[i])) {
            std::cerr << "tavisched: warning: cron ignores all of /etc/crontab for its line "
                      << i + 1 << "; \"tavisched check\" tells more\n";
            return;
        }
    }
}

int printDryRun(TAVI_SCHED_TASK &task) {
    if (!isPower(task)) {
        // A new task's default name tells the id that it will get.
        std::sscanf(newTask(TAVI_SCHED_BACKEND_SCHEDULE)->name, "Task %d", &task.id);
    }
    if (TAVISchedNextTriggerTime(&task) != 0) {
        throw Failure("the next run cannot be computed: " + libraryError());
    }
    const bool enabled = task.state == TAVI_SCHED_STATE_ENABLED;
    std::printf("Crontab line: %s\n", !enabled        ? "none while disabled"
                                      : isPower(task) ? "that of a power schedule, if it needs one"
                                                      : crontabLine(task).c_str());
    std::printf("Next run: %s\n", nextRun(task).value_or("never").c_str());
    return 0;
}

// ---- Removing ----

// What a person was shown of a task; the task must still be that one when it is removed.
std::string shownOf(const TAVI_SCHED_TASK &task) {
    return called(task) + ": " + scheduleInWords(task);
}

Lines showToRemove(const Ids &ids) {
    const Lock lock(Lock::Kind::Reading);
    const Tasks tasks = Tasks::read();
    Lines shown;
    for (const TAVI_SCHED_TASK *const task : tasks.select(ids)) {
        shown.push_back(shownOf(*task));
    }
    return shown;
}

bool isConfirmed(const Lines &shown) {
    for (const std::string &line : shown) {
        std::cerr << line << "\n";
    }
    std::cerr << "Remove " << (shown.size() == 1 ? "it" : "them") << "? [y/N] ";
    std::string answer;
    std::getline(std::cin, answer);
    return answer == "y" || answer == "Y" || answer == "yes";
}

Lines removeShown(const Ids &ids, const Lines &shown) {
    Change change;
    const Tasks tasks = Tasks::read();
    const auto selected = tasks.select(ids);
    TaskPointers rest;
    for (const TAVI_SCHED_TASK *const task : tasks.all()) {
        if (std::find(selected.begin(), selected.end(), task) == selected.end()) {
            rest.push_back(task);
        }
    }
    for (size_t i = 0; i < selected.size(); ++i) {
        if (shownOf(*selected[i]) != shown[i]) {
            throw Refusal("it has changed meanwhile: " + shownOf(*selected[i]));
        }
    }
    requireGoodCrontab(rest);
    change.defuse({selected.begin(), selected.end()});
    Lines lines;
    for (const TAVI_SCHED_TASK *const task : selected) {
        change.remove(*task);
        lines.push_back(called(*task) + ": removed");
    }
    change.keep();
    return lines;
}

// ---- Import ----

std::string readWhole(const std::string &file) {
    if (file == "-") {
        return {std::istreambuf_iterator<char>(std::cin), {}};
    }
    std::error_code ignored;
    std::ifstream stream(file, std::ios::binary);
    if (!stream || std::filesystem::is_directory(file, ignored)) {
        throw Refusal(file + " cannot be read; accepted: a file, or - for standard input");
    }
    return {std::istreambuf_iterator<char>(stream), {}};
}

// A schedule that is there already, or was imported just now, is as good as stored.
void importPower(Change &change, const Tasks &present, const TaskPointers &stored,
                 TAVI_SCHED_TASK &task) {
    const TAVI_SCHED_TASK *same = present.findSameSchedule(task);
    for (const TAVI_SCHED_TASK *const other : stored) {
        same = isSameSchedule(*other, task) ? other : same;
    }
    if (same) {
        task.id = same->id;
    } else {
        change.create(task);
    }
}

void importTask(Change &change, const Tasks &present, const TaskPointers &stored,
                TAVI_SCHED_TASK &task) {
    if (isPower(task)) {
        importPower(change, present, stored, task);
    } else if (task.id > 0 && !present.find(task.id) && isFreeForSchedule(task.id)) {
        change.createWithId(task);
    } else {
        change.create(task);
    }
}

void requireImportable(const Tasks &present, const std::vector<Task> &imported) {
    TaskPointers pointers(present.all().begin(), present.all().end());
    for (const Task &task : imported) {
        requireReadablePower(present, *task);
        if (!present.findSameSchedule(*task)) {
            pointers.push_back(task.get());
        }
    }
    requireStorable(pointers);
}

Lines importAll(const std::string &text) {
    Change change;
    const std::vector<Task> imported = parseImport(text);
    const Tasks present = Tasks::read();
    requireImportable(present, imported);
    TaskPointers stored;
    Lines lines;
    for (const Task &task : imported) {
        const int32_t wanted = task->id;
        importTask(change, present, stored, *task);
        stored.push_back(task.get());
        const bool hasWanted = task->id == wanted || wanted == -1;
        lines.push_back(called(*task) + (hasWanted ? "" : ", was " + std::to_string(wanted)));
    }
    change.keep();
    return lines;
}

// ---- The others ----

// The checked task of "add".
Task taskToAdd(const TaskOptions &options, const Tasks &tasks) {
    if (!options.power && !options.command) {
        throw Refusal("a task needs --command, or --power for a power schedule");
    }
    Task task = newTask(options.power ? TAVI_SCHED_BACKEND_AUTOPOWER : TAVI_SCHED_BACKEND_SCHEDULE);
    apply(options, *task);
    requireReadablePower(tasks, *task);
    refuseSameSchedule(tasks, *task, nullptr);
    requireStorable(afterwards(tasks, {task.get()}));
    return task;
}

Lines addTask(const TaskOptions &options, bool quiet) {
    Change change;
    const Task task = taskToAdd(options, Tasks::read());
    change.create(*task);
    change.keep();
    return reportOf(*task, quiet);
}

Lines editTask(int32_t id, const TaskOptions &options, bool quiet) {
    Change change;
    const Tasks tasks = Tasks::read();
    const TAVI_SCHED_TASK &before = *tasks.select({id}).front();
    const Task task = copyOf(before);
    apply(options, *task);
    refuseSameSchedule(tasks, *task, &before);
    requireStorable(afterwards(tasks, {task.get()}));
    change.edit(*task);
    change.keep();
    return reportOf(*task, quiet);
}

// The tasks with the new state, checked.
std::vector<Task> withState(const Tasks &tasks, const std::vector<TAVI_SCHED_TASK *> &selected,
                            bool enabled) {
    std::vector<Task> changed;
    TaskPointers pointers;
    for (const TAVI_SCHED_TASK *const task : selected) {
        Task copy = copyOf(*task);
        TAVISchedCTaskSetState(copy.get(), enabled ? 1 : 0);
        if (const auto why = enabled ? whyCronRejects(*copy) : std::nullopt) {
            throw Refusal("cron would ignore all of /etc/crontab for the line of " + called(*copy) +
                          ": " + *why + "; mend its schedule with \"tavisched edit\"");
        }
        if (enabled) {
            refusePast(*copy);
        }
        refuseSameSchedule(tasks, *copy, task);
        pointers.push_back(copy.get());
        changed.push_back(std::move(copy));
    }
    requireStorable(afterwards(tasks, pointers));
    return changed;
}

Lines changeStates(const Ids &ids, bool enabled) {
    Change change;
    const Tasks tasks = Tasks::read();
    const auto selected = tasks.select(ids);
    const std::vector<Task> changed = withState(tasks, selected, enabled);
    if (!enabled) {
        change.defuse({selected.begin(), selected.end()});
    }
    Lines lines;
    for (size_t i = 0; i < selected.size(); ++i) {
        if (selected[i]->state != changed[i]->state) {
            change.edit(*changed[i]);
        }
        addReport(*changed[i], lines);
    }
    change.keep();
    return lines;
}

} // namespace

int add(const TaskOptions &options, bool dryRun, bool quiet) {
    if (dryRun) {
        const Lock lock(Lock::Kind::Reading);
        return printDryRun(*taskToAdd(options, Tasks::read()));
    }
    print(addTask(options, quiet));
    warnOfRejectedLines();
    return 0;
}

int edit(int32_t id, const TaskOptions &options, bool quiet) {
    if (!options.any()) {
        throw Refusal("nothing is to be changed; \"tavisched edit --help\" shows what can be");
    }
    print(editTask(id, options, quiet));
    warnOfRejectedLines();
    return 0;
}

int setEnabled(const Ids &ids, bool enabled) {
    print(changeStates(ids, enabled));
    warnOfRejectedLines();
    return 0;
}

// People take their time to answer: the question is asked without the lock.
int removeTasks(const Ids &ids, bool yes) {
    const Lines shown = showToRemove(ids);
    if (!yes && isatty(STDIN_FILENO) == 1 && !isConfirmed(shown)) {
        std::printf("Nothing was removed.\n");
        return 1;
    }
    return print(removeShown(ids, shown));
}

int importTasks(const std::string &file) {
    return print(importAll(readWhole(file)));
}

int syncTasks() {
    {
        const Change change; // changes no task, but none may change meanwhile
        syncCrontab();
    }
    std::printf("/etc/crontab has the lines of all enabled tasks.\n");
    return 0;
}

} // namespace tavisched
