// Tasks as commands work with them: reading, the lock that makes changes follow one another, and
// storing.
#pragma once

#include "crontab.h"
#include "failure.h"
#include "tavischeduler.h"

#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace tavisched {

using Task = std::unique_ptr<TAVI_SCHED_TASK>;

// A new task with the defaults of a backend (TAVI_SCHED_BACKEND_*).
Task newTask(int32_t backend);
Task copyOf(const TAVI_SCHED_TASK &task);

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
    // there.
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

// Held from before a change's first read to after its last write, so that changes through this
// program follow one another. Fails without the rights to change tasks, when another change keeps
// the lock for a minute, and, unless anything is expected, when the two task files tell different
// things, as a change would then lose one of them. Signals that ask the program to end wait until
// the change is done.
class ChangeLock {
  public:
    enum class Expecting { SameCopies, Anything };
    explicit ChangeLock(Expecting expecting = Expecting::SameCopies);
    ~ChangeLock();
    ChangeLock(const ChangeLock &) = delete;
    ChangeLock &operator=(const ChangeLock &) = delete;

  private:
    struct Descriptor {
        int number = -1;
        Descriptor() = default;
        ~Descriptor();
        Descriptor(const Descriptor &) = delete;
        Descriptor &operator=(const Descriptor &) = delete;
    };
    Descriptor lock_;
};

// How the two task files stand to each other.
enum class Copies { Same, WorkingMissing, PersistentMissing, Different };
Copies compareCopies();

// The line of an enabled task of the schedule backend.
std::string crontabLine(const TAVI_SCHED_TASK &task);
// Why cron would reject the task's line of /etc/crontab, or nothing.
std::optional<std::string> whyCronRejects(const TAVI_SCHED_TASK &task);
// cron ignores all of /etc/crontab for one line that it rejects, and every change writes the lines
// of all tasks. Refused when these tasks, as they would be after a change, have a line that cron
// rejects, unless that line stands in the file already.
void requireGoodCrontab(const std::vector<const TAVI_SCHED_TASK *> &tasksAfterwards);

// How the tasks' lines of /etc/crontab differ from what the tasks ask.
struct CrontabDifference {
    std::vector<std::string> missing, surplus;
    bool any() const { return !missing.empty() || !surplus.empty(); }
};
CrontabDifference compareCrontab(const Tasks &tasks);
// Whether its power-off lines are those of the power-off schedules.
bool arePowerOffLinesRight(const Tasks &tasks, const Crontab &crontab);
// The library stores a change also when the crontab cannot be written; this fails then.
void requireSyncedCrontab();

// Each fails with what the task is called. A power schedule that is stored but cannot be set on
// this machine is taken back; an edit gives it another id.
void create(TAVI_SCHED_TASK &task);
void edit(const TAVI_SCHED_TASK &before, TAVI_SCHED_TASK &task);
void remove(const TAVI_SCHED_TASK &task);
// Stores a task of the schedule backend under its id, which must be free.
void createWithId(TAVI_SCHED_TASK &task);
// No section, be it one that cannot be read, is named by the id.
bool isSectionFree(int32_t id);

} // namespace tavisched
