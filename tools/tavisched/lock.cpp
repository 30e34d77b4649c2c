// The lock by which changes through this program follow one another.
#include "lock.h"
#include "failure.h"
#include "paths.h"

#include <cstdlib>
#include <fcntl.h>
#include <iostream>
#include <sys/file.h>
#include <unistd.h>

namespace tavisched {

namespace {

// In the environment of what a change starts.
constexpr const char *kChanging = "TAVISCHED_CHANGING";
constexpr useconds_t kPause = 20000; // microseconds
constexpr int kQuietTries = 50;      // a second

} // namespace

Lock::Lock(Kind kind) : fd_(open(kChangeLock, O_RDWR | O_CREAT | O_NOFOLLOW | O_CLOEXEC, 0600)) {
    // Who has not the rights for the lock has none to read tasks either, and is told so then.
    if (fd_ == -1 && kind == Kind::Changing) {
        throw Failure(std::string(kChangeLock) + " cannot be opened: " + systemReason());
    }
    if (fd_ == -1) {
        return;
    }
    try {
        acquire(kind);
    } catch (...) {
        close(fd_);
        throw;
    }
}

void Lock::acquire(Kind kind) {
    const int operation = kind == Kind::Changing ? LOCK_EX : LOCK_SH;
    const bool nested = std::getenv(kChanging) != nullptr;
    for (int tries = 0; flock(fd_, operation | LOCK_NB) != 0; ++tries) {
        if (nested && kind == Kind::Reading) {
            return;
        }
        if (nested) {
            throw Failure("a change is going on, and what it starts, such as a plug-in handler, "
                          "cannot make another one");
        }
        if (tries == kQuietTries) {
            std::cerr << "tavisched: waiting for another change to end\n";
            flock(fd_, operation);
            break;
        }
        usleep(kPause);
    }
    if (kind == Kind::Changing) {
        setenv(kChanging, "1", 1);
    }
}

Lock::~Lock() {
    if (fd_ != -1) {
        close(fd_);
        unsetenv(kChanging);
    }
}

} // namespace tavisched
