// The subcommands that change tasks. Each takes the lock first, checks everything, and only then
// stores.
#include "commands.h"
#include "json.h"
#include "store.h"
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

constexpr size_t kMaxPowerSchedules = 100; // of a kind; more are stored but not read

using TaskPointers = std::vector<const TAVI_SCHED_TASK *>;

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

// The stored task with its next run, as the library has it now.
void report(const TAVI_SCHED_TASK &stored) {
    const Tasks tasks = Tasks::read();
    const TAVI_SCHED_TASK *const task = tasks.find(stored.id);
    if (!task) {
        throw Failure(called(stored) + " was stored, but cannot be read");
    }
    const std::string next = task->state == TAVI_SCHED_STATE_ENABLED
                                 ? "next run " + nextRun(*task).value_or("never")
                                 : "disabled";
    std::printf("%s: %s, %s\n", called(*task).c_str(), scheduleInWords(*task).c_str(),
                next.c_str());
    if (const std::string remark = remarkOn(*task); !remark.empty()) {
        std::printf("Note: %s.\n", remark.c_str());
    }
}

void reportChange(const TAVI_SCHED_TASK &stored, bool quiet) {
    if (quiet) {
        std::printf("%ld\n", static_cast<long>(stored.id));
    } else {
        report(stored);
    }
}

int printDryRun(TAVI_SCHED_TASK &task) {
    if (!isPower(task)) {
        // A new task's default name tells the id that it will get.
        const Task example = newTask(TAVI_SCHED_BACKEND_SCHEDULE);
        std::sscanf(example->name, "Task %d", &task.id);
    }
    if (TAVISchedNextTriggerTime(&task) != 0) {
        throw Failure("the next run cannot be computed: " + libraryError());
    }
    const bool enabled = task.state == TAVI_SCHED_STATE_ENABLED;
    std::printf("Crontab line: %s\n", isPower(task) ? "none of a task; the power schedule's own"
                                      : enabled     ? crontabLine(task).c_str()
                                                    : "none while disabled");
    std::printf("Next run: %s\n", nextRun(task).value_or("never").c_str());
    return 0;
}

bool confirmed(const TaskPointers &tasks) {
    if (isatty(STDIN_FILENO) == 0) {
        return true;
    }
    for (const TAVI_SCHED_TASK *const task : tasks) {
        std::printf("%s: %s\n", called(*task).c_str(), scheduleInWords(*task).c_str());
    }
    std::printf("Remove %s? [y/N] ", tasks.size() == 1 ? "it" : "them");
    std::fflush(stdout);
    std::string answer;
    std::getline(std::cin, answer);
    return answer == "y" || answer == "Y" || answer == "yes";
}

// ---- Import ----

std::string readWhole(const std::string &file) {
    if (file == "-") {
        return {std::istreambuf_iterator<char>(std::cin), {}};
    }
    if (std::error_code ignored; std::filesystem::is_directory(file, ignored)) {
        throw Refusal(file + " is a folder; accepted: a file, or - for standard input");
    }
    std::ifstream stream(file, std::ios::binary);
    std::string text(std::istreambuf_iterator<char>(stream), {});
    if (!stream) {
        throw Refusal(file + ": " + systemReason());
    }
    return text;
}

// Stores imported tasks; those that were stored go again when a later one fails.
class ImportStore {
  public:
    explicit ImportStore(const Tasks &present) : present_(present) {}

    void store(TAVI_SCHED_TASK &task) {
        const int32_t wanted = task.id;
        if (isPower(task)) {
            storePower(task);
        } else if (wanted > 0 && !present_.find(wanted) && isSectionFree(wanted)) {
            createWithId(task);
            stored_.push_back(&task);
        } else {
            create(task);
            stored_.push_back(&task);
        }
        lines_.push_back(called(task) + (task.id == wanted || wanted == -1
                                             ? ""
                                             : ", was " + std::to_string(wanted)));
    }

    void takeBack() const {
        for (const TAVI_SCHED_TASK *const task : stored_) {
            TAVISchedTaskRemove(task->id);
        }
    }

    void report() const {
        for (const std::string &line : lines_) {
            std::printf("%s\n", line.c_str());
        }
    }

  private:
    // A schedule that is there already, or was imported just now, is as good as stored.
    void storePower(TAVI_SCHED_TASK &task) {
        const TAVI_SCHED_TASK *same = present_.findSameSchedule(task);
        for (const TAVI_SCHED_TASK *const stored : stored_) {
            same = isSameSchedule(*stored, task) ? stored : same;
        }
        if (same) {
            task.id = same->id;
        } else {
            create(task);
            stored_.push_back(&task);
        }
    }

    const Tasks &present_;
    TaskPointers stored_;
    std::vector<std::string> lines_;
};

} // namespace

int add(const TaskOptions &options, bool dryRun, bool quiet) {
    std::optional<ChangeLock> lock;
    if (!dryRun) {
        lock.emplace();
    }
    if (!options.power && !options.command) {
        throw Refusal("a task needs --command, or --power for a power schedule");
    }
    const Tasks tasks = Tasks::read();
    const Task task =
        newTask(options.power ? TAVI_SCHED_BACKEND_AUTOPOWER : TAVI_SCHED_BACKEND_SCHEDULE);
    apply(options, *task);
    requireReadablePower(tasks, *task);
    refuseSameSchedule(tasks, *task, nullptr);
    requireStorable(afterwards(tasks, {task.get()}));
    if (dryRun) {
        return printDryRun(*task);
    }
    create(*task);
    requireSyncedCrontab();
    reportChange(*task, quiet);
    return 0;
}

int edit(int32_t id, const TaskOptions &options, bool quiet) {
    const ChangeLock lock;
    if (!options.any()) {
        throw Refusal("nothing is to be changed; \"tavisched edit --help\" shows what can be");
    }
    const Tasks tasks = Tasks::read();
    const TAVI_SCHED_TASK &before = *tasks.select({id}).front();
    const Task task = copyOf(before);
    apply(options, *task);
    refuseSameSchedule(tasks, *task, &before);
    requireStorable(afterwards(tasks, {task.get()}));
    edit(before, *task);
    requireSyncedCrontab();
    reportChange(*task, quiet);
    return 0;
}

int setEnabled(const Ids &ids, bool enabled) {
    const ChangeLock lock;
    const Tasks tasks = Tasks::read();
    const auto selected = tasks.select(ids);
    std::vector<Task> changed;
    TaskPointers pointers;
    for (const TAVI_SCHED_TASK *const task : selected) {
        changed.push_back(copyOf(*task));
        TAVISchedCTaskSetState(changed.back().get(), enabled ? 1 : 0);
        if (enabled) {
            refusePast(*changed.back());
        }
        refuseSameSchedule(tasks, *changed.back(), task);
        pointers.push_back(changed.back().get());
    }
    requireStorable(afterwards(tasks, pointers));
    for (size_t i = 0; i < selected.size(); ++i) {
        if (selected[i]->state != changed[i]->state) {
            edit(*selected[i], *changed[i]);
        }
        report(*changed[i]);
    }
    requireSyncedCrontab();
    return 0;
}

int removeTasks(const Ids &ids, bool yes) {
    // The question is asked without the lock: people take their time.
    if (const Tasks tasks = Tasks::read(); !yes) {
        const auto selected = tasks.select(ids);
        if (!confirmed({selected.begin(), selected.end()})) {
            std::printf("Nothing was removed.\n");
            return 1;
        }
    }
    const ChangeLock lock;
    const Tasks tasks = Tasks::read();
    const auto selected = tasks.select(ids);
    TaskPointers rest;
    for (const TAVI_SCHED_TASK *const task : tasks.all()) {
        if (std::find(selected.begin(), selected.end(), task) == selected.end()) {
            rest.push_back(task);
        }
    }
    requireGoodCrontab(rest);
    for (const TAVI_SCHED_TASK *const task : selected) {
        remove(*task);
        std::printf("%s: removed\n", called(*task).c_str());
    }
    requireSyncedCrontab();
    return 0;
}

int importTasks(const std::string &file) {
    const std::string text = readWhole(file);
    const ChangeLock lock;
    const std::vector<Task> imported = parseImport(text);
    const Tasks present = Tasks::read();
    TaskPointers pointers(present.all().begin(), present.all().end());
    for (const Task &task : imported) {
        requireReadablePower(present, *task);
        if (!present.findSameSchedule(*task)) {
            pointers.push_back(task.get());
        }
    }
    requireStorable(pointers);
    ImportStore store(present);
    try {
        for (const Task &task : imported) {
            store.store(*task);
        }
        requireSyncedCrontab();
    } catch (const Failure &failure) {
        store.takeBack();
        throw Failure(std::string(failure.what()) + "; what had been stored was taken back");
    }
    store.report();
    return 0;
}

int syncTasks() {
    const ChangeLock lock;
    const Tasks tasks = Tasks::read();
    requireGoodCrontab({tasks.all().begin(), tasks.all().end()});
    TAVISchedTaskSync(); // tells of no failure
    requireSyncedCrontab();
    const auto crontab = readCrontab();
    if (tasks.lacksPower() || !crontab || !arePowerOffLinesRight(tasks, *crontab)) {
        throw Failure("the power schedules could not be set: " + libraryError());
    }
    std::printf("/etc/crontab has the lines of all enabled tasks.\n");
    return 0;
}

} // namespace tavisched
