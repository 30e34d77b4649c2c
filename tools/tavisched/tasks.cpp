// Tasks as commands work with them.
#include "tasks.h"
#include "failure.h"
#include "files.h"
#include "paths.h"
#include "stored_form.h"
#include "text.h"

#include <algorithm>
#include <iostream>
#include <unistd.h>
#include <utility>

namespace tavisched {

namespace {

void requireReadable() {
    if (access(kWorkingCopy, R_OK) == 0) {
        return;
    }
    if (errno != ENOENT) {
        throw Failure(std::string("cannot read the tasks: ") + kWorkingCopy + ": " +
                      systemReason());
    }
    const auto persistent = statusOf(kPersistent);
    if (persistent && persistent->st_size > 0) {
        std::cerr << "tavisched: warning: " << kWorkingCopy
                  << " is missing, so that no tasks are found; \"tavisched check --repair\" makes "
                     "it from "
                  << kPersistent << "\n";
    }
}

// The library finds a task by the name of its section.
bool isKeptUnderItsId(const TAVI_SCHED_TASK &task) {
    const std::string id = std::to_string(task.id);
    Hash pairs;
    return isPower(task) || (PLATCFileGetSection(kWorkingCopy, id.c_str(), pairs.address()) == 1 &&
                             pairs.value("id") == id);
}

} // namespace

std::span<const TAVI_SCHED_BACKEND_RECORD> registeredBackends() {
    if (TAVISchedBackendInit() != 0) {
        throw Failure("the library cannot be used: " + libraryError());
    }
    return {SchedBackends, cBackend};
}

Task newTask(int32_t backend) {
    auto task = std::make_unique<TAVI_SCHED_TASK>();
    task->backend = backend;
    if (TAVISchedTaskGetDefault(task.get()) != 0) {
        throw Failure("a new task could not be made: " + libraryError());
    }
    return task;
}

Task copyOf(const TAVI_SCHED_TASK &task) {
    auto copy = std::make_unique<TAVI_SCHED_TASK>(task);
    copy->next = nullptr;
    return copy;
}

std::optional<TAVI_SCHED_FAULT> findFault(const TAVI_SCHED_TASK &task) {
    TAVI_SCHED_FAULT fault{};
    const int found = TAVISchedTaskCheck(&task, &fault);
    if (found < 0) {
        throw Failure(called(task) + " cannot be checked: " + libraryError());
    }
    return found > 0 ? std::optional(fault) : std::nullopt;
}

std::string inWords(const TAVI_SCHED_FAULT &fault) {
    return fault.key[0] == '\0'
               ? fault.reason
               : "its \"" + std::string(fault.key) + "\" is wrong: " + fault.reason;
}

bool isEnabledPower(const TAVI_SCHED_TASK &task, std::string_view arguments) {
    return isPower(task) && task.state == TAVI_SCHED_STATE_ENABLED && task.appArgs == arguments;
}

bool isSameSchedule(const TAVI_SCHED_TASK &one, const TAVI_SCHED_TASK &other) {
    return isPower(one) && isPower(other) && std::string_view(one.appArgs) == other.appArgs &&
           std::string_view(one.week) == other.week && one.state == other.state &&
           one.runHour == other.runHour && one.runMin == other.runMin;
}

// The library's own list only logs when a backend cannot list its tasks, so each is asked itself.
Tasks Tasks::read() {
    requireReadable();
    Tasks tasks;
    TAVI_SCHED_TASK *head = nullptr;
    bool lacksSchedule = false;
    for (const TAVI_SCHED_BACKEND_RECORD &backend : registeredBackends()) {
        const bool failed = backend.list_get(&head, nullptr) < 0;
        lacksSchedule |= failed && backend.id == TAVI_SCHED_BACKEND_SCHEDULE;
        tasks.lacksPower_ |= failed && backend.id == TAVI_SCHED_BACKEND_AUTOPOWER;
    }
    tasks.list_.reset(head);
    if (lacksSchedule) {
        throw Failure("the tasks cannot be read: " + libraryError() +
                      "; \"tavisched check\" looks for the cause");
    }
    if (static bool told = false; tasks.lacksPower_ && !std::exchange(told, true)) {
        std::cerr << "tavisched: warning: power schedules cannot be read: " << libraryError()
                  << "\n";
    }
    for (TAVI_SCHED_TASK *task = head; task; task = TAVISchedTaskNext(task)) {
        tasks.ordered_.push_back(task);
    }
    std::stable_sort(tasks.ordered_.begin(), tasks.ordered_.end(),
                     [](const auto *one, const auto *other) { return one->id < other->id; });
    return tasks;
}

TAVI_SCHED_TASK *Tasks::find(int32_t id) const {
    const auto found = std::find_if(ordered_.begin(), ordered_.end(),
                                    [id](const auto *task) { return task->id == id; });
    return found == ordered_.end() ? nullptr : *found;
}

TAVI_SCHED_TASK *Tasks::findSameSchedule(const TAVI_SCHED_TASK &schedule) const {
    const auto found = std::find_if(ordered_.begin(), ordered_.end(), [&](const auto *task) {
        return isSameSchedule(*task, schedule);
    });
    return found == ordered_.end() ? nullptr : *found;
}

std::vector<TAVI_SCHED_TASK *> Tasks::select(const std::vector<int32_t> &ids) const {
    if (ids.empty()) {
        return ordered_;
    }
    std::vector<TAVI_SCHED_TASK *> selected;
    for (const int32_t id : ids) {
        TAVI_SCHED_TASK *const task = find(id);
        if (!task) {
            throw Refusal("there is no task " + std::to_string(id) +
                          "; \"tavisched list --all\" shows those that there are");
        }
        const auto count = std::count_if(ordered_.begin(), ordered_.end(),
                                         [id](const auto *other) { return other->id == id; });
        if (!isKeptUnderItsId(*task)) {
            throw Refusal(called(*task) +
                          " is kept under another number; \"tavisched check\" tells "
                          "what to do");
        }
        if (count > 1) {
            throw Refusal(std::to_string(count) + " tasks have the id " + std::to_string(id) +
                          "; \"tavisched check\" tells what to do");
        }
        if (std::find(selected.begin(), selected.end(), task) == selected.end()) {
            selected.push_back(task);
        }
    }
    return selected;
}

std::string called(const TAVI_SCHED_TASK &task) {
    const std::string number = task.id == -1 ? "the task" : "task " + std::to_string(task.id);
    constexpr size_t kColumns = 60;
    return task.name[0] == '\0' ? number
                                : number + " (" + cutTo(printable(task.name), kColumns) + ")";
}

Copies compareCopies() {
    if (stateOf(kWorkingCopy) == FileState::Strange || stateOf(kPersistent) == FileState::Strange) {
        return Copies::Strange;
    }
    const auto working = contentIfThere(kWorkingCopy);
    const auto persistent = contentIfThere(kPersistent);
    if (working.value_or("") == persistent.value_or("")) {
        return Copies::Same;
    }
    if (working.value_or("").empty()) {
        return Copies::WorkingMissing;
    }
    return persistent ? Copies::Different : Copies::PersistentMissing;
}

} // namespace tavisched
