// A change of tasks: the lock, what must hold before, storing, and taking everything back when it
// does not come to its end.
#pragma once

#include "files.h"
#include "lock.h"
#include "task_lines.h"
#include "tasks.h"

#include <csignal>
#include <map>
#include <optional>
#include <string>

namespace tavisched {

// Signals that ask the program to end take effect when this is destroyed. What is started meanwhile
// has them as usual.
class DelayedSignals {
  public:
    DelayedSignals();
    ~DelayedSignals();
    DelayedSignals(const DelayedSignals &) = delete;
    DelayedSignals &operator=(const DelayedSignals &) = delete;

  private:
    std::map<int, struct sigaction> before_;
};

// Everything between its construction and keep() is stored as one: when keep() is not reached, the
// files are as they were, unless another program has changed them since. Its construction fails
// without the rights to change tasks, and when the two task files differ or must not be believed,
// as a change would then lose one of them.
class Change {
  public:
    Change();
    ~Change();
    Change(const Change &) = delete;
    Change &operator=(const Change &) = delete;

    // Each fails with what the task is called.
    void create(TAVI_SCHED_TASK &task);
    // Stores a task of the schedule backend under its id, which must be free.
    void createWithId(TAVI_SCHED_TASK &task);
    // A power schedule gets another id.
    void edit(TAVI_SCHED_TASK &task);
    void remove(const TAVI_SCHED_TASK &task);
    // To be called before several tasks are changed, with the tasks as they are: none of them
    // brings a line into the crontab that cron rejects while the others are changed.
    void defuse(const TaskPointers &tasks);

    // Fails when the crontab does not have the tasks' lines.
    void keep();

  private:
    using Contents = std::map<const char *, std::optional<std::string>>;
    static Contents readContents();
    // To be called after every step: fails when it did.
    void finishStep(bool succeeded, const TAVI_SCHED_TASK &task, const char *what);
    void takeBack();

    Lock lock_{Lock::Kind::Changing};
    DelayedSignals signals_;
    Contents before_;
    Contents lastWritten_;
    bool touched_ = false;
    bool kept_ = false;
};

// No section, be it one that cannot be read, is named by the id, and no other backend takes it for
// one of its own.
bool isFreeForSchedule(int32_t id);

} // namespace tavisched
