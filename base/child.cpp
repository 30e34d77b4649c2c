// Waiting for children, and looking at processes.
#include "child.h"
#include "descriptor.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <dirent.h>
#include <fcntl.h>
#include <iterator>
#include <memory>
#include <string>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

namespace base {

ChildSignals::ChildSignals() {
    struct sigaction standard {};
    standard.sa_handler = SIG_DFL;
    sigset_t child;
    sigemptyset(&child);
    sigaddset(&child, SIGCHLD);
    pthread_sigmask(SIG_BLOCK, &child, &callersMask_);
    sigaction(SIGCHLD, &standard, &callersAction_);
}

ChildSignals::~ChildSignals() {
    const int savedErrno = errno;
    sigaction(SIGCHLD, &callersAction_, nullptr);
    pthread_sigmask(SIG_SETMASK, &callersMask_, nullptr);
    errno = savedErrno;
}

int waitForChild(pid_t pid) {
    int status = 0;
    while (waitpid(pid, &status, 0) == -1) {
        if (errno != EINTR) {
            return -1;
        }
    }
    return status;
}

namespace {

bool exists(pid_t pid) {
    return kill(pid, 0) == 0 || errno == EPERM;
}

// What /proc tells of a process behind its program's name, which is in parentheses and may hold any
// byte: " S 1 ...". Nothing when that cannot be read.
std::optional<std::string> readState(pid_t pid) {
    std::array<char, 64> path{};
    std::array<char, 512> stat{};
    std::snprintf(path.data(), path.size(), "/proc/%d/stat", static_cast<int>(pid));
    const Descriptor file(open(path.data(), O_RDONLY | O_CLOEXEC));
    if (!file || read(file.get(), stat.data(), stat.size() - 1) <= 0) {
        return std::nullopt;
    }
    const char *const nameEnd = std::strrchr(stat.data(), ')');
    return nameEnd ? std::optional<std::string>(nameEnd + 1) : std::nullopt;
}

bool isDead(const std::string &state) {
    return state.starts_with(" Z") || state.starts_with(" X");
}

// Linux has had them longer than the C library.
int openProcess(pid_t pid) {
    return static_cast<int>(syscall(SYS_pidfd_open, pid, 0));
}
int signalProcess(int process, int signal, siginfo_t *info) {
    return static_cast<int>(syscall(SYS_pidfd_send_signal, process, signal, info, 0));
}

} // namespace

bool isAlive(pid_t pid) {
    if (pid <= 0 || !exists(pid)) {
        return false;
    }
    const auto state = readState(pid);
    return state ? !isDead(*state) : exists(pid); // it has ended since, or /proc does not show it
}

std::optional<Process> findProcess(pid_t pid) {
    const auto state = readState(pid);
    Process found{.pid = pid};
    long long start = 0;
    if (!state || isDead(*state) ||
        std::sscanf(state->c_str(),
                    " %*c %d %*d %*d %*d %*d %*u %*u %*u %*u %*u %*u %*u %*d %*d %*d %*d %*d %*d "
                    "%lld",
                    &found.parent, &start) != 2) {
        return std::nullopt;
    }
    found.start = start;
    return found;
}

std::vector<Process> descendantsOf(pid_t pid) {
    std::vector<Process> all;
    const std::unique_ptr<DIR, int (*)(DIR *)> folder(opendir("/proc"), closedir);
    while (const dirent *const entry = folder ? readdir(folder.get()) : nullptr) {
        const auto process = findProcess(std::atoi(entry->d_name));
        if (process) {
            all.push_back(*process);
        }
    }
    std::vector<Process> found{{.pid = pid}};
    for (size_t next = 0; next < found.size(); ++next) {
        const pid_t parent = found[next].pid;
        std::copy_if(all.begin(), all.end(), std::back_inserter(found),
                     [&](const Process &process) { return process.parent == parent; });
    }
    found.erase(found.begin());
    return found;
}

// What is opened stays the same process, whoever is given its id later.
bool sendSignal(const Process &process, int signal, int value) {
    const Descriptor handle(openProcess(process.pid));
    const auto present = findProcess(process.pid);
    if (!present || present->start != process.start) {
        errno = ESRCH;
        return false;
    }
    if (!handle) {
        return errno == ENOSYS && sigqueue(process.pid, signal, {.sival_int = value}) == 0;
    }
    siginfo_t info{};
    info.si_signo = signal;
    info.si_code = SI_QUEUE;
    info.si_pid = getpid();
    info.si_uid = getuid();
    info.si_value.sival_int = value;
    return signalProcess(handle.get(), signal, &info) == 0;
}

} // namespace base
