// The locks of a change.
#include "change_lock.h"
#include "sched_error.h"
#include "sched_paths.h"
#include "tavischeduler.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <ctime>
#include <fcntl.h>
#include <pthread.h>
#include <string>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>
#include <utility>

namespace {

// Of a fixed width: one in another's place leaves nothing of it.
constexpr const char *kHolderFormat = "%10d %20lld.%09ld\n";

constexpr long kPatience = 30;             // seconds
constexpr long kPause = 1'000'000;         // nanoseconds, at first
constexpr long kLongestPause = 16'000'000; // when many wait, each of them looks less often
constexpr long kShortPause = 200'000;

volatile std::sig_atomic_t waitedFor = 0; // a process

base::Descriptor openLockFile(const char *path) {
    return base::Descriptor(open(path, O_RDWR | O_CREAT | O_NOFOLLOW | O_NOCTTY | O_CLOEXEC, 0600));
}

// Whether a lock's file is missing because there is no place for it, which is as good as no lock;
// any other failure of opening it is one.
bool isWithoutPlace(int error) {
    switch (error) {
    case ENOENT:
    case ENOTDIR:
    case EACCES:
    case EPERM:
    case EROFS:
    case ENOSPC:
    case EDQUOT:
        return true;
    default:
        return false;
    }
}

int failToOpen(const char *path) {
    SCHED_LOG("%s cannot be opened: %m", path);
    SCHED_SET_ERROR(sched::kLockFailed);
    return -1;
}

// Tries until it works or patience ends, with longer and longer pauses.
template <typename Try> bool retry(long pause, long longest, Try &&tryOnce) {
    timespec start{};
    clock_gettime(CLOCK_MONOTONIC, &start);
    for (;;) {
        if (tryOnce()) {
            return true;
        }
        timespec now{};
        clock_gettime(CLOCK_MONOTONIC, &now);
        if (now.tv_sec - start.tv_sec >= kPatience) {
            return false;
        }
        const timespec length{.tv_sec = 0, .tv_nsec = pause};
        nanosleep(&length, nullptr);
        pause = std::min(2 * pause, longest);
    }
}

// ---- The lock of changes ----

struct HeldLock {
    base::Descriptor file;
    int depth = 0;
    bool isLeftToNext = false;
    std::optional<sched::ChangeLock::CutOff> leftBehind;
};
HeldLock held;

// What this process reads: a function that is handed a task may read, and change, tasks itself.
struct OwnReading {
    base::Descriptor file;
    int depth = 0;
};
OwnReading own;

// A child does not hold what its parent holds, and must not keep it either.
void forgetLocksInChild() {
    held.file.close();
    held.depth = 0;
    own.file.close();
    own.depth = 0;
}

void forgetLocksInChildren() {
    static const int registered = pthread_atfork(nullptr, nullptr, forgetLocksInChild);
    static_cast<void>(registered);
}

using Holder = sched::ChangeLock::CutOff;

std::optional<Holder> writtenHolder(int fd) {
    std::array<char, 64> text{};
    int process = 0;
    long long seconds = 0;
    long nanoseconds = 0;
    const bool read =
        pread(fd, text.data(), text.size() - 1, 0) > 0 &&
        std::sscanf(text.data(), kHolderFormat, &process, &seconds, &nanoseconds) >= 1;
    return read && process > 0
               ? std::optional(Holder{process, {static_cast<time_t>(seconds), nanoseconds}})
               : std::nullopt;
}

pid_t writtenProcess(int fd) {
    const auto holder = writtenHolder(fd);
    return holder ? holder->process : 0;
}

// For those who wait to tell of, for the processes below, and for whoever comes after one that was
// cut off: in one step, and with the time since when there is something to be taken back.
void writeHolder(int fd, const std::optional<Holder> &leftBehind) {
    timespec now{};
    clock_gettime(CLOCK_REALTIME_COARSE, &now);
    const timespec &since = leftBehind ? leftBehind->since : now;
    std::array<char, 64> text{};
    const int length =
        std::snprintf(text.data(), text.size(), kHolderFormat, static_cast<int>(getpid()),
                      static_cast<long long>(since.tv_sec), since.tv_nsec);
    (void)!pwrite(fd, text.data(), static_cast<size_t>(length), 0);
}

pid_t parentOf(pid_t pid) {
    std::array<char, 64> path{};
    std::array<char, 512> stat{};
    std::snprintf(path.data(), path.size(), "/proc/%d/stat", static_cast<int>(pid));
    const base::Descriptor file(open(path.data(), O_RDONLY | O_CLOEXEC));
    if (read(file.get(), stat.data(), stat.size() - 1) <= 0) {
        return 0;
    }
    // The program's name, in parentheses, may hold any byte.
    const char *const nameEnd = std::strrchr(stat.data(), ')');
    return nameEnd && std::strlen(nameEnd) > 4 ? std::atoi(nameEnd + 4) : 0;
}

// A plug-in handler that a change waits for cannot wait for the change.
bool isBelow(pid_t holder) {
    pid_t ancestor = getppid();
    while (ancestor > 1 && ancestor != holder) {
        ancestor = parentOf(ancestor);
    }
    return holder > 1 && ancestor == holder;
}

// The lock of the last call is somebody else's; otherwise there can be none on this file system,
// and everything goes on without it.
bool isContended() {
    return errno == EWOULDBLOCK || errno == EACCES || errno == EINTR;
}

bool lockChanges(int fd) {
    return flock(fd, LOCK_EX | LOCK_NB) == 0 || !isContended();
}

enum class Outcome { Held, Busy, Below };

Outcome acquire(int fd, sched::ChangeLock::Wait wait) {
    if (lockChanges(fd)) {
        return Outcome::Held;
    }
    if (wait == sched::ChangeLock::Wait::No) {
        return Outcome::Busy;
    }
    bool below = false;
    pid_t known = 0;
    const bool locked = retry(kPause, kLongestPause, [&] {
        const pid_t holder = writtenProcess(fd);
        waitedFor = holder;
        below = holder != std::exchange(known, holder) && isBelow(holder);
        return below || lockChanges(fd);
    });
    waitedFor = below || !locked ? waitedFor : 0;
    return below ? Outcome::Below : locked ? Outcome::Held : Outcome::Busy;
}

// Two bytes of one file: readers pass the gate one by one and then share the room; a writer keeps
// the gate shut while it waits for those inside.
enum Place : off_t { Gate, Room };

struct flock lockOf(Place place, short type) {
    struct flock lock {};
    lock.l_type = type;
    lock.l_whence = SEEK_SET;
    lock.l_start = place;
    lock.l_len = 1;
    return lock;
}

bool setLock(int fd, Place place, short type) {
    struct flock lock = lockOf(place, type);
    return fcntl(fd, F_OFD_SETLK, &lock) == 0 || !isContended();
}

bool isGateOpen(int fd) {
    struct flock lock = lockOf(Gate, F_RDLCK);
    return fcntl(fd, F_OFD_GETLK, &lock) != 0 || lock.l_type == F_UNLCK;
}

// Tries until it works, and notes for which process it waits.
template <typename Try> bool waitToEnter(Try &&tryOnce) {
    waitedFor = 0;
    const bool entered = retry(kShortPause, kShortPause, [&] {
        if (tryOnce()) {
            return true;
        }
        if (waitedFor == 0) {
            const base::Descriptor changes(
                open(sched::kChangeLock, O_RDONLY | O_NOFOLLOW | O_CLOEXEC));
            waitedFor = writtenProcess(changes.get());
        }
        return false;
    });
    waitedFor = 0;
    return entered;
}

bool enterToRead(int fd) {
    return waitToEnter([&] { return isGateOpen(fd) && setLock(fd, Room, F_RDLCK); });
}

bool enterToWrite(int fd) {
    return waitToEnter([&] { return setLock(fd, Gate, F_WRLCK); }) &&
           waitToEnter([&] { return setLock(fd, Room, F_WRLCK); });
}

// While this process waits for others' changes it reads nothing: they may wait for its readers.
class PausedReading {
  public:
    explicit PausedReading(bool waits) : isPaused_(waits && own.file) {
        if (isPaused_) {
            setLock(own.file.get(), Room, F_UNLCK);
        }
    }
    ~PausedReading() {
        if (isPaused_) {
            enterToRead(own.file.get());
        }
    }
    PausedReading(const PausedReading &) = delete;
    PausedReading &operator=(const PausedReading &) = delete;

  private:
    bool isPaused_;
};

} // namespace

sched::ChangeLock::ChangeLock(Wait wait) {
    waitedFor = 0;
    if (held.depth > 0) {
        ++held.depth;
        held_ = true;
        return;
    }
    base::Descriptor file = openLockFile(kChangeLock);
    if (!file && !isWithoutPlace(errno)) {
        if (wait == Wait::HalfAMinute) {
            failToOpen(kChangeLock);
        }
        return;
    }
    const PausedReading paused(wait == Wait::HalfAMinute);
    const Outcome outcome = file ? acquire(file.get(), wait) : Outcome::Held;
    if (outcome != Outcome::Held) {
        if (wait == Wait::HalfAMinute) {
            SCHED_SET_ERROR(kLockFailed);
            SCHED_LOG("%s (process %d)",
                      outcome == Outcome::Below
                          ? "a change waits for this process, which cannot make another one"
                          : "another change has not ended within half a minute",
                      static_cast<int>(writtenProcess(file.get())));
        }
        return;
    }
    forgetLocksInChildren();
    held.leftBehind.reset();
    held.isLeftToNext = false;
    if (file) {
        held.leftBehind = writtenHolder(file.get());
        writeHolder(file.get(), held.leftBehind);
    }
    held.file = std::move(file);
    held.depth = 1;
    held_ = true;
}

sched::ChangeLock::~ChangeLock() {
    if (!held_ || held.depth == 0 || --held.depth > 0) {
        return;
    }
    if (held.file) {
        if (!held.isLeftToNext) {
            (void)!ftruncate(held.file.get(), 0);
        }
        flock(held.file.get(), LOCK_UN);
    }
    held.file.close();
}

bool sched::ChangeLock::isOutermost() const {
    return held_ && held.depth == 1;
}

bool sched::ChangeLock::isUsable() {
    return held.depth > 0 ? static_cast<bool>(held.file)
                          : static_cast<bool>(openLockFile(kChangeLock));
}

bool sched::ChangeLock::isHeldHere() {
    return held.depth > 0;
}

const std::optional<sched::ChangeLock::CutOff> &sched::ChangeLock::leftBehind() {
    return held.leftBehind;
}

void sched::ChangeLock::leaveToNext() {
    held.isLeftToNext = true;
}

bool sched::ChangeLock::isMarked() {
    const base::Descriptor file(open(kChangeLock, O_RDONLY | O_NOFOLLOW | O_NOCTTY | O_CLOEXEC));
    return file && writtenHolder(file.get());
}

sched::ChangeLock::Inherited::Inherited() {
    if (held.file) {
        fcntl(held.file.get(), F_SETFD, 0);
    }
}

sched::ChangeLock::Inherited::~Inherited() {
    if (held.file) {
        fcntl(held.file.get(), F_SETFD, FD_CLOEXEC);
    }
}

pid_t sched::changeLockHolder() {
    const base::Descriptor file(open(kChangeLock, O_RDONLY | O_NOFOLLOW | O_CLOEXEC));
    const bool busy = file && flock(file.get(), LOCK_SH | LOCK_NB) != 0 && errno == EWOULDBLOCK;
    return busy ? writtenProcess(file.get()) : 0;
}

// ---- Reading and writing ----

// Two bytes of one file: readers share the room, and a writer that waits for it shuts the gate, at
// which readers look before they enter. So a writer waits only for those who are inside.
namespace {

bool failToEnter(const char *what) {
    SCHED_SET_ERROR(sched::kLockFailed);
    SCHED_LOG("%s has been %s for half a minute", sched::kWorkingCopy, what);
    return false;
}

} // namespace

sched::ReadingLock::ReadingLock() {
    if (++own.depth > 1) {
        held_ = true;
        return;
    }
    own.file = openLockFile(kReadingLock);
    if (own.file || isWithoutPlace(errno)) {
        acquire();
    } else {
        failToOpen(kReadingLock);
    }
}

sched::ReadingLock::~ReadingLock() {
    if (own.depth == 0 || --own.depth > 0) { // none in a child
        return;
    }
    if (own.file) {
        setLock(own.file.get(), Room, F_UNLCK); // a child may have the same open file
    }
    own.file.close();
}

void sched::ReadingLock::acquire() {
    held_ = !own.file || enterToRead(own.file.get()) || failToEnter("overwritten");
}

void sched::ReadingLock::release() {
    if (own.file) {
        setLock(own.file.get(), Room, F_UNLCK);
    }
    held_ = false;
}

bool sched::ReadingLock::isOutermost() const {
    return own.depth == 1;
}

bool sched::ReadingLock::isUnfinished() {
    struct stat status {};
    return own.file && fstat(own.file.get(), &status) == 0 && status.st_size > 0;
}

bool sched::ReadingLock::waitUntil(const std::function<bool()> &tryOnce) {
    return retry(kShortPause, kShortPause, tryOnce);
}

sched::WritingLock::WritingLock() : file_(openLockFile(kReadingLock)) {
    if (!file_) {
        held_ = isWithoutPlace(errno) || failToOpen(kReadingLock) == 0;
        return;
    }
    if (own.file) {
        setLock(own.file.get(), Room, F_UNLCK);
    }
    held_ = (enterToWrite(file_.get()) || failToEnter("read")) &&
            (ftruncate(file_.get(), 1) == 0 || failToOpen(kReadingLock) == 0);
    if (held_) {
        fcntl(file_.get(), F_SETFD, 0); // a program that overwrites tasks keeps readers away
    }
}

sched::WritingLock::~WritingLock() {
    if (file_) {
        setLock(file_.get(), Room, F_UNLCK);
        setLock(file_.get(), Gate, F_UNLCK);
    }
    if (own.file) {
        setLock(own.file.get(), Room, F_RDLCK);
    }
}

void sched::tellWorkingCopyIsWhole() {
    const base::Descriptor file = openLockFile(kReadingLock);
    struct stat status {};
    if (file && fstat(file.get(), &status) == 0 && status.st_size > 0) {
        (void)!ftruncate(file.get(), 0);
    }
}

int32_t TAVISchedWaitedFor() {
    return waitedFor;
}
