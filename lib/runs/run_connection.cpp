// Between a run and the process that asked for it.
#include "run_connection.h"

#include <array>
#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <dirent.h>
#include <fcntl.h>
#include <memory>
#include <sys/socket.h>
#include <unistd.h>
#include <utility>
#include <vector>

namespace {

constexpr int kFirst = 3; // the run's own standard streams come before it

// A caller without standard streams gets low numbers, which are the null device's in the run.
base::Descriptor awayFromStandardStreams(base::Descriptor end) {
    return end.get() >= kFirst ? std::move(end)
                               : base::Descriptor(fcntl(end.get(), F_DUPFD_CLOEXEC, kFirst));
}

// The C library keeps a connection to the system log, and would use its number later on, whatever
// that is by then.
bool maySystemLogBe(int fd) {
    int family = 0;
    int kind = 0;
    socklen_t size = sizeof family;
    return getsockopt(fd, SOL_SOCKET, SO_DOMAIN, &family, &size) == 0 && family == AF_UNIX &&
           getsockopt(fd, SOL_SOCKET, SO_TYPE, &kind, &size) == 0 && kind == SOCK_DGRAM;
}

// Nothing where /proc does not tell.
std::vector<int> openDescriptors() {
    std::vector<int> numbers;
    const std::unique_ptr<DIR, int (*)(DIR *)> folder(opendir("/proc/self/fd"), closedir);
    while (const dirent *const entry = folder ? readdir(folder.get()) : nullptr) {
        const int fd = std::atoi(entry->d_name);
        if (fd >= kFirst && fd != dirfd(folder.get())) {
            numbers.push_back(fd);
        }
    }
    return numbers;
}

// What is ignored stays ignored, also by the command.
void forgetHandlers() {
    for (int signal = 1; signal < NSIG; ++signal) {
        struct sigaction action {};
        if (sigaction(signal, nullptr, &action) == 0 && action.sa_handler != SIG_IGN &&
            action.sa_handler != SIG_DFL) {
            action = {};
            action.sa_handler = SIG_DFL;
            sigaction(signal, &action, nullptr);
        }
    }
}

} // namespace

bool sched::RunConnection::make() {
    std::array<int, 2> ends{};
    if (socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends.data()) != 0) {
        return false;
    }
    callers_ = awayFromStandardStreams(base::Descriptor(ends[0]));
    runs_ = awayFromStandardStreams(base::Descriptor(ends[1]));
    return callers_ && runs_;
}

base::Descriptor sched::RunConnection::tellPid() {
    const int32_t pid = getpid();
    send(runs_.get(), &pid, sizeof pid, MSG_NOSIGNAL);
    callers_.close();
    return std::move(runs_);
}

base::Descriptor sched::RunConnection::takePid(int32_t &pid) {
    runs_.close();
    ssize_t received = -1;
    do {
        received = recv(callers_.get(), &pid, sizeof pid, MSG_WAITALL);
    } while (received == -1 && errno == EINTR);
    if (received != sizeof pid) {
        pid = -1;
    }
    return std::move(callers_);
}

void sched::leaveCaller(const base::Descriptor &kept) {
    forgetHandlers();
    for (const int fd : openDescriptors()) {
        if (fd != kept.get() && !maySystemLogBe(fd)) {
            close(fd);
        }
    }
}
