// Tasks as commands work with them.
#pragma once

#include "tavischeduler.h"

#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace tavisched {

using Task = std::unique_ptr<TAVI_SCHED_TASK>;
using TaskPointers = std::vector<const TAVI_SCHED_TASK *>;

// A new task with the defaults of a backend (TAVI_SCHED_BACKEND_*).
Task newTask(int32_t backend);
Task copyOf(const TAVI_SCHED_TASK &task);

// What is wrong with a task, or nothing.
std::optional<TAVI_SCHED_FAULT> findFault(const TAVI_SCHED_TASK &task);
std::string inWords(const TAVI_SCHED_FAULT &fault);

// The line of /etc/crontab that an enabled task asks for; power schedules ask for others.
std::optional<std::string> crontabLine(const TAVI_SCHED_TASK &task);
// Why cron would reject that line, and with it the whole file; nothing when it takes it.
std::optional<std::string> whyCronRejects(const TAVI_SCHED_TASK &task);

// Computes the next run of a task that was made here.
void computeNextRun(TAVI_SCHED_TASK &task);

// A power-on or power-off schedule of the machine.
inline bool isPower(const TAVI_SCHED_TASK &task) {
    return task.backend == TAVI_SCHED_BACKEND_AUTOPOWER;
}
inline bool isEnabled(const TAVI_SCHED_TASK &task) {
    return task.state == TAVI_SCHED_STATE_ENABLED;
}

// What a power schedule's application arguments say.
constexpr std::string_view kPowerOn = "poweron";
constexpr std::string_view kPowerOff = "poweroff";
// Two power schedules of the same kind, days, time and state: a machine could not tell them apart.
bool isSameSchedule(const TAVI_SCHED_TASK &one, const TAVI_SCHED_TASK &other);
// The task among others that is the same schedule, or nullptr.
const TAVI_SCHED_TASK *findSameSchedule(const TaskPointers &tasks, const TAVI_SCHED_TASK &schedule);

// Stored tasks, in the order of their ids.
class Tasks {
  public:
    // All of them. Fails when they cannot be read. Power schedules that cannot be read are left out
    // with a warning, as one damaged entry makes all of them unreadable.
    static Tasks read();
    // Power schedules alone; the same holds.
    static Tasks readPower();
    bool lacksPower() const { return lacksPower_; }

    const TaskPointers &all() const { return ordered_; }
    // The task of that id, or nullptr.
    const TAVI_SCHED_TASK *find(int32_t id) const;
    // The tasks of the ids, each once, or all tasks when there are no ids; refused when one is not
    // there, is the id of several, or is not the number of the task's section.
    TaskPointers select(const std::vector<int32_t> &ids) const;

  private:
    struct ListRelease {
        void operator()(TAVI_SCHED_TASK *head) const { TAVISchedTaskListFree(&head); }
    };
    bool add(int32_t backend);
    void addPower();

    std::vector<std::unique_ptr<TAVI_SCHED_TASK, ListRelease>> lists_;
    TaskPointers ordered_;
    bool lacksPower_ = false;
};

// One task, as a list has it, with no other one read but power schedules for one of them. Refused
// when it is not there.
Task readTask(int32_t id);

// "task 3" or "task 3 (Nightly backup)" for messages.
std::string called(const TAVI_SCHED_TASK &task);

} // namespace tavisched
