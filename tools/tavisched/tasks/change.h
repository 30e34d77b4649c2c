// A change of tasks: one or several that are stored together, or not at all.
#pragma once

#include "tasks/tasks.h"

#include <set>
#include <vector>

namespace tavisched {

// What must hold for a task beside what makes it valid: a power schedule must be the only one of
// its kind, days, time and state, have room, and a clock when it is to switch the machine on.
// `replaced` is the task whose place it takes, or nullptr.
void requirePossible(const Tasks &power, const TAVI_SCHED_TASK &task,
                     const TAVI_SCHED_TASK *replaced);
// Fails when power schedules could not be read.
void requirePower(const Tasks &power);
// Refused when these tasks, of which those are changed, have a line that cron rejects: it would
// ignore all of /etc/crontab. It may be one that it ignores already.
void requireGoodLines(const TaskPointers &unchanged, const TaskPointers &changed);

// Other processes' changes wait from its construction to its end; before commit() nothing is
// stored. Its construction fails when another change does not end, and when the task files are not
// the tasks, as storing would then lose some.
class Change {
  public:
    Change();
    Change(const Change &) = delete;
    Change &operator=(const Change &) = delete;

    // The tasks as they were when it began.
    const Tasks &tasks() const { return tasks_; }

    // Each is refused or fails with what the task is called, and then nothing is stored.
    void create(TAVI_SCHED_TASK &task);
    // Under the task's id; false when a section that cannot be read has it.
    bool createWithId(TAVI_SCHED_TASK &task);
    // `before` is one of tasks(). A power schedule gets another id.
    void edit(TAVI_SCHED_TASK &task, const TAVI_SCHED_TASK &before);
    void remove(const TAVI_SCHED_TASK &task);
    // Writes what follows from the tasks even when none was changed.
    void sync();

    void commit();
    // Whether this process has stored one.
    static bool isStored();

  private:
    // The library's; rolled back unless it was committed.
    struct Batch {
        Batch();
        ~Batch();
        Batch(const Batch &) = delete;
        Batch &operator=(const Batch &) = delete;
        bool isOpen = true;
    };
    void stored(const TAVI_SCHED_TASK &task);

    Batch batch_;
    Tasks tasks_;
    Tasks power_; // as they are in the batch
    std::set<const TAVI_SCHED_TASK *> gone_;
    std::vector<Task> changed_;
};

} // namespace tavisched
