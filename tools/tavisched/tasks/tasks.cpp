// Tasks as commands work with them.
#include "tasks/tasks.h"
#include "failure.h"
#include "text/utf8.h"

#include <algorithm>
#include <array>
#include <iostream>
#include <utility>

namespace tavisched {

namespace {

// The library finds a task by the name of its section.
bool isKeptUnderItsId(const TAVI_SCHED_TASK &task) {
    const auto found = std::make_unique<TAVI_SCHED_TASK>();
    return isPower(task) ||
           (TAVISchedTaskGetByID(task.id, found.get()) == 0 && found->id == task.id);
}

[[noreturn]] void refuseMissing(int32_t id) {
    throw Refusal("there is no task " + std::to_string(id) +
                  "; \"tavisched list --all\" shows all");
}

void requireKeptUnderItsId(const TAVI_SCHED_TASK &task) {
    if (!isKeptUnderItsId(task)) {
        throw Refusal(called(task) +
                      " is kept under another number; \"tavisched check\" tells more");
    }
}

} // namespace

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

std::optional<std::string> crontabLine(const TAVI_SCHED_TASK &task) {
    if (isPower(task) || !isEnabled(task)) {
        return std::nullopt;
    }
    std::array<char, 512> line{};
    if (TAVISchedCrontabLine(&task, line.data(), line.size()) != 0) {
        throw Failure(called(task) + " has no line: " + libraryError());
    }
    return line.data();
}

std::optional<std::string> whyCronRejects(const TAVI_SCHED_TASK &task) {
    const auto line = crontabLine(task);
    std::array<char, 512> reason{};
    return line && TAVISchedCrontabLineCheck(line->c_str(), nullptr, reason.data(),
                                             reason.size()) == 1
               ? std::optional<std::string>(reason.data())
               : std::nullopt;
}

void computeNextRun(TAVI_SCHED_TASK &task) {
    if (TAVISchedNextTriggerTime(&task) != 0) {
        throw Failure("the next run cannot be computed: " + libraryError());
    }
}

bool isSameSchedule(const TAVI_SCHED_TASK &one, const TAVI_SCHED_TASK &other) {
    return isPower(one) && isPower(other) && std::string_view(one.appArgs) == other.appArgs &&
           std::string_view(one.week) == other.week && one.state == other.state &&
           one.runHour == other.runHour && one.runMin == other.runMin;
}

const TAVI_SCHED_TASK *findSameSchedule(const TaskPointers &tasks,
                                        const TAVI_SCHED_TASK &schedule) {
    const auto found = std::find_if(tasks.begin(), tasks.end(), [&](const auto *task) {
        return isSameSchedule(*task, schedule);
    });
    return found == tasks.end() ? nullptr : *found;
}

bool Tasks::add(int32_t backend) {
    TAVI_SCHED_TASK *head = nullptr;
    if (TAVISchedTaskListGetOf(backend, &head, nullptr) < 0) {
        return false;
    }
    lists_.emplace_back(head);
    for (const TAVI_SCHED_TASK *task = head; task; task = TAVISchedTaskNext(task)) {
        ordered_.push_back(task);
    }
    std::stable_sort(ordered_.begin(), ordered_.end(),
                     [](const auto *one, const auto *other) { return one->id < other->id; });
    return true;
}

void Tasks::addPower() {
    lacksPower_ = !add(TAVI_SCHED_BACKEND_AUTOPOWER);
    if (static bool told = false; lacksPower_ && !std::exchange(told, true)) {
        std::cerr << "tavisched: warning: power schedules cannot be read: " << libraryError()
                  << "\n";
    }
}

Tasks Tasks::read() {
    Tasks tasks;
    if (!tasks.add(TAVI_SCHED_BACKEND_SCHEDULE)) {
        throw Failure("the tasks cannot be read: " + libraryError() +
                      "; \"tavisched check\" looks for the cause");
    }
    tasks.addPower();
    return tasks;
}

Tasks Tasks::readPower() {
    Tasks tasks;
    tasks.addPower();
    return tasks;
}

const TAVI_SCHED_TASK *Tasks::find(int32_t id) const {
    const auto found = std::find_if(ordered_.begin(), ordered_.end(),
                                    [id](const auto *task) { return task->id == id; });
    return found == ordered_.end() ? nullptr : *found;
}

TaskPointers Tasks::select(const std::vector<int32_t> &ids) const {
    if (ids.empty()) {
        return ordered_;
    }
    TaskPointers selected;
    for (const int32_t id : ids) {
        const TAVI_SCHED_TASK *const task = find(id);
        if (!task) {
            refuseMissing(id);
        }
        if (std::count_if(ordered_.begin(), ordered_.end(),
                          [id](const auto *other) { return other->id == id; }) > 1) {
            throw Refusal("several tasks have the id " + std::to_string(id) +
                          "; \"tavisched check\" tells more");
        }
        requireKeptUnderItsId(*task);
        if (std::find(selected.begin(), selected.end(), task) == selected.end()) {
            selected.push_back(task);
        }
    }
    return selected;
}

Task readTask(int32_t id) {
    auto task = std::make_unique<TAVI_SCHED_TASK>();
    if (TAVISchedTaskGetByID(id, task.get()) == 0) {
        if (isPower(*task)) {
            return copyOf(*Tasks::readPower().select({id}).front()); // lists name them otherwise
        }
        if (task->id != id) {
            throw Refusal(called(*task) +
                          " is kept under another number; \"tavisched check\" tells more");
        }
        return task;
    }
    if (PLATCErrGet() != TAVI_SCHED_ERR_NOT_FOUND) {
        throw Failure("task " + std::to_string(id) + " cannot be read: " + libraryError() +
                      "; \"tavisched check\" looks for the cause");
    }
    Tasks::read().select({id}); // knows tasks under other numbers too
    refuseMissing(id);
}

std::string called(const TAVI_SCHED_TASK &task) {
    const std::string number = task.id == -1 ? "the task" : "task " + std::to_string(task.id);
    constexpr size_t kWidest = 60;
    return task.name[0] == '\0' ? number
                                : number + " (" + cutTo(printable(task.name), kWidest) + ")";
}

} // namespace tavisched
