// A change of stored tasks, of whatever backend: one after the other, whole or not at all.
#pragma once

#include "change_lock.h"
#include "change_record.h"

#include <optional>

namespace sched {

// One change, from before the allocation of an id to after the signal to cron. What an earlier one
// left when it was cut off is taken back first. One within another belongs to it.
class Change {
  public:
    Change();
    // Takes back what was recorded and is not finished.
    ~Change();
    Change(const Change &) = delete;
    Change &operator=(const Change &) = delete;

    // False when it must not go on; that has been logged and is an error.
    explicit operator bool() const { return ready_; }

    // To be called before anything is overwritten. 0, or -1 with nothing touched.
    static int record(const Before &before);
    // Everything is stored. 0, or -1 when that cannot be made durable, and then it is taken back.
    int finish();
    // Takes back what was recorded, the crontab too.
    void rollBack();

  private:
    ChangeLock lock_;
    bool ready_ = false;
    bool isOutermost_ = false;
};

// Finishes with what a cut-off change left: 0 when all is whole, or -1. The lock is held.
int takeBackCutOffChange();

// Where tasks are to be read, for as long as this lives: the working copy, whole, or, when it
// cannot be made whole for now, what it was before the change that was cut off.
class Reading {
  public:
    Reading();

    // False after half a minute of waiting; that has been logged and is an error.
    explicit operator bool() const { return static_cast<bool>(lock_); }
    const char *path() const { return path_; }

  private:
    enum class Turn { Done, Others, Failed };

    static bool isWhole();
    void settle();
    Turn takeBack();

    ReadingLock lock_;
    std::optional<ChangeLock> changeLock_; // while the record is read: nobody else removes it
    const char *path_;
};

} // namespace sched
