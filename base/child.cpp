// Waiting for children, and looking at processes.
#include "child.h"
#include "descriptor.h"

#include <array>
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <fcntl.h>
#include <sys/wait.h>

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

} // namespace

bool isAlive(pid_t pid) {
    if (pid <= 0 || !exists(pid)) {
        return false;
    }
    // The state stands behind the program's name, which is in parentheses and may hold any byte.
    std::array<char, 64> path{};
    std::array<char, 512> stat{};
    std::snprintf(path.data(), path.size(), "/proc/%d/stat", static_cast<int>(pid));
    const Descriptor file(open(path.data(), O_RDONLY | O_CLOEXEC));
    const ssize_t length = read(file.get(), stat.data(), stat.size() - 1);
    if (length <= 0) {
        return exists(pid); // it has ended since, or /proc does not show it
    }
    const char *nameEnd = std::strrchr(stat.data(), ')');
    return !(nameEnd && nameEnd[1] == ' ' && std::strchr("ZX", nameEnd[2]));
}

} // namespace base
