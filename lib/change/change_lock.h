// The locks of a change. One lock makes changes follow one another, through whatever process they
// come; another keeps readers away for the moment in which the working copy is overwritten.
//
// Where a lock's file cannot be made (no such folder, no rights, no room) everything goes on
// without it. What the lock files say tells whoever comes next of a change that was cut off: that
// of changes names its holder until it is released, and that of reading is not empty until the
// working copy is whole again.
#pragma once

#include "base/descriptor.h"

#include <ctime>
#include <functional>
#include <optional>
#include <sys/types.h>

namespace sched {

// The lock of changes, held from its construction to its destruction; one within another of the
// same process counts as the same. After half a minute of waiting it is not held.
class ChangeLock {
  public:
    enum class Wait { HalfAMinute, No };
    explicit ChangeLock(Wait wait = Wait::HalfAMinute);
    ~ChangeLock();
    ChangeLock(const ChangeLock &) = delete;
    ChangeLock &operator=(const ChangeLock &) = delete;

    // False when another process holds it. Without Wait::No that has been logged and is an error.
    explicit operator bool() const { return held_; }
    // No other of this process is around it.
    bool isOutermost() const;
    // The lock is there to be taken; false where changes go on without it.
    static bool isUsable();
    // Held by this process already.
    static bool isHeldHere();

    // A holder that ended without releasing it, and when it had taken it.
    struct CutOff {
        pid_t process;
        timespec since;
    };
    // The one before this process, which holds the lock.
    static const std::optional<CutOff> &leftBehind();
    // Some process holds it, or was cut off while it did.
    static bool isMarked();
    // What the holder has begun cannot be ended by itself: when it releases the lock, it is as if
    // it had been cut off.
    static void leaveToNext();

    // While it lives, a program that is started keeps the lock beyond the end of this process: one
    // that overwrites tasks must have ended before anybody looks at them.
    class Inherited {
      public:
        Inherited();
        ~Inherited();
        Inherited(const Inherited &) = delete;
        Inherited &operator=(const Inherited &) = delete;
    };

  private:
    bool held_ = false;
};

// The process that holds the lock of changes, or 0.
pid_t changeLockHolder();

// Held while the working copy is read: it is not overwritten meanwhile but by this process itself.
// One within another of the same process counts as the same.
class ReadingLock {
  public:
    ReadingLock();
    ~ReadingLock();
    ReadingLock(const ReadingLock &) = delete;
    ReadingLock &operator=(const ReadingLock &) = delete;

    void release();
    void acquire();

    // False when the working copy has been in the making for half a minute; that has been logged
    // and is an error.
    explicit operator bool() const { return held_; }
    bool isOutermost() const;
    // The working copy was being overwritten by a process that has ended, or by a copy that failed.
    static bool isUnfinished();
    // Tries until it works: false after half a minute.
    static bool waitUntil(const std::function<bool()> &tryOnce);

  private:
    bool held_ = false;
};

// Held while the working copy is overwritten, also by a program that is started meanwhile. New
// readers wait from the moment on in which this one waits: they cannot starve it.
class WritingLock {
  public:
    WritingLock();
    ~WritingLock();
    WritingLock(const WritingLock &) = delete;
    WritingLock &operator=(const WritingLock &) = delete;

    explicit operator bool() const { return held_; }

  private:
    base::Descriptor file_;
    bool held_ = false;
};

// The working copy is whole. To be called with the lock of changes.
void tellWorkingCopyIsWhole();

} // namespace sched
