// Tasks as commands work with them.
#pragma once

#include "tavischeduler.h"

#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace tavisched {

using Task = std::unique_ptr<TAVI_SCHED_TASK>;

std::span<const TAVI_SCHED_BACKEND_RECORD> registeredBackends();

// A new task with the defaults of a backend (TAVI_SCHED_BACKEND_*).
Task newTask(int32_t backend);
Task copyOf(const TAVI_SCHED_TASK &task);
// What is wrong with a task, or nothing.
std::optional<TAVI_SCHED_FAULT> findFault(const TAVI_SCHED_TASK &task);
std::string inWords(const TAVI_SCHED_FAULT &fault);

// A power-on or power-off schedule of the machine.
inline bool isPower(const TAVI_SCHED_TASK &task) {
    return task.backend == TAVI_SCHED_BACKEND_AUTOPOWER;
}

// What a power schedule's application arguments say.
constexpr std::string_view kPowerOn = "poweron";
constexpr std::string_view kPowerOff = "poweroff";
bool isEnabledPower(const TAVI_SCHED_TASK &task, std::string_view arguments);
// Two power schedules of the same kind, days, time and state: a machine could not tell them apart.
bool isSameSchedule(const TAVI_SCHED_TASK &one, const TAVI_SCHED_TASK &other);

// All stored tasks, in the order of their ids.
class Tasks {
  public:
    // Fails when they cannot be read, and says why. Power schedules that cannot be read are left
    // out with a warning, as one damaged entry makes all of them unreadable.
    static Tasks read();
    bool lacksPower() const { return lacksPower_; }

    const std::vector<TAVI_SCHED_TASK *> &all() const { return ordered_; }
    // The task of that id, or nullptr.
    TAVI_SCHED_TASK *find(int32_t id) const;
    // The power schedule that is the same, or nullptr.
    TAVI_SCHED_TASK *findSameSchedule(const TAVI_SCHED_TASK &schedule) const;
    // The tasks of the ids, each once, or all tasks when there are no ids; refused when one is not
    // there, is the id of several, or is not the number of the task's section.
    std::vector<TAVI_SCHED_TASK *> select(const std::vector<int32_t> &ids) const;

  private:
    struct ListRelease {
        void operator()(TAVI_SCHED_TASK *head) const { TAVISchedTaskListFree(&head); }
    };
    std::unique_ptr<TAVI_SCHED_TASK, ListRelease> list_;
    std::vector<TAVI_SCHED_TASK *> ordered_;
    bool lacksPower_ = false;
};

// "task 3" or "task 3 (Nightly backup)" for messages.
std::string called(const TAVI_SCHED_TASK &task);

// How the two task files stand to each other. Strange: one of them is no file of root's alone, so
// that it must not be believed.
enum class Copies { Same, WorkingMissing, PersistentMissing, Different, Strange };
Copies compareCopies();

} // namespace tavisched
