// The lock by which changes through this program follow one another. The lock file holds the
// process id of the change that holds it.
#include "lock.h"
#include "failure.h"
#include "paths.h"
#include "process.h"

#include <array>
#include <cstdlib>
#include <fcntl.h>
#include <iostream>
#include <string>
#include <sys/file.h>
#include <unistd.h>

namespace tavisched {

namespace {

constexpr useconds_t kPause = 20000; // microseconds
constexpr int kQuietTries = 50;      // a second

} // namespace

Lock::Lock(Kind kind)
    : kind_(kind), fd_(open(kChangeLock, O_RDWR | O_CREAT | O_NOFOLLOW | O_CLOEXEC, 0600)) {
    // Who has not the rights for the lock has none to read tasks either, and is told so then.
    if (fd_ == -1 && kind == Kind::Changing) {
        throw Failure(std::string(kChangeLock) + " cannot be opened: " + systemReason());
    }
    if (fd_ == -1) {
        return;
    }
    try {
        acquire();
    } catch (...) {
        close(fd_);
        throw;
    }
}

bool Lock::isBelowHolder() const {
    std::array<char, 16> text{};
    return pread(fd_, text.data(), text.size() - 1, 0) > 0 && isAncestor(std::atoi(text.data()));
}

void Lock::acquire() {
    const int operation = kind_ == Kind::Changing ? LOCK_EX : LOCK_SH;
    for (int tries = 0; flock(fd_, operation | LOCK_NB) != 0; ++tries) {
        if (isBelowHolder() && kind_ == Kind::Reading) {
            return;
        }
        if (isBelowHolder()) {
            throw Failure("a change is going on, and what it starts, such as a plug-in handler, "
                          "cannot make another one");
        }
        if (tries == kQuietTries) {
            std::cerr << "tavisched: waiting for another change to end\n";
        }
        usleep(kPause);
    }
    if (kind_ == Kind::Changing) {
        const std::string holder = std::to_string(getpid());
        if (ftruncate(fd_, 0) != 0 || pwrite(fd_, holder.data(), holder.size(), 0) == -1) {
            throw Failure(std::string(kChangeLock) + " cannot be written: " + systemReason());
        }
    }
}

Lock::~Lock() {
    if (fd_ == -1) {
        return;
    }
    if (kind_ == Kind::Changing) {
        // What stays in the file otherwise counts for nothing while nobody holds the lock.
        [[maybe_unused]] const int cleared = ftruncate(fd_, 0);
    }
    close(fd_);
}

} // namespace tavisched
