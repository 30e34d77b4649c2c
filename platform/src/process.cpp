// Programs started without a shell, detached forks and process checks.
#include "process.h"
#include "file.h"
#include "platform.h"

#include <array>
#include <cerrno>
#include <climits>
#include <cstdio>
#include <fcntl.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>
#include <vector>

namespace platform {

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

int runProgram(const char *path, const char *const *argv, const char *const *envp) {
    const ChildSignals signals;
    posix_spawnattr_t attributes;
    posix_spawnattr_init(&attributes);
    posix_spawnattr_setsigmask(&attributes, &signals.callersMask());
    posix_spawnattr_setflags(&attributes, POSIX_SPAWN_SETSIGMASK);
    pid_t pid = -1;
    const int error = posix_spawn(&pid, path, nullptr, &attributes, const_cast<char *const *>(argv),
                                  const_cast<char *const *>(envp));
    posix_spawnattr_destroy(&attributes);
    errno = error;
    return error == 0 ? waitForChild(pid) : -1;
}

} // namespace platform

int PLATCExec(const char *szProgram, const char *const *rgszArgs) {
    if (!szProgram || !rgszArgs) {
        return PLATFORM_FAIL(platform::kInvalidArgument);
    }
    return platform::guarded(
        [&] {
            std::vector<const char *> argv{szProgram};
            for (const char *const *arg = rgszArgs; *arg; ++arg) {
                argv.push_back(*arg);
            }
            argv.push_back(nullptr);
            const int status = platform::runProgram(szProgram, argv.data(), environ);
            if (status == 0) {
                return 0;
            }
            PLATFORM_FAIL(platform::kSystemCallFailed);
            return status != -1 && WIFEXITED(status) ? WEXITSTATUS(status) : -1;
        },
        -1);
}

namespace {

bool processExists(pid_t pid) {
    return kill(pid, 0) == 0 || errno == EPERM;
}

} // namespace

int PLATCProcAlive(pid_t pid) {
    if (pid <= 0 || !processExists(pid)) {
        return 0;
    }
    // The state stands behind the program's name, which is in parentheses and may hold any byte.
    std::array<char, 64> path{};
    std::array<char, 512> stat{};
    std::snprintf(path.data(), path.size(), "/proc/%d/stat", static_cast<int>(pid));
    const platform::UniqueFd fd(open(path.data(), O_RDONLY | O_CLOEXEC));
    const ssize_t length = read(fd.get(), stat.data(), stat.size() - 1);
    if (length <= 0) {
        return processExists(pid); // it has ended since, or /proc does not show it
    }
    const char *nameEnd = std::strrchr(stat.data(), ')');
    return !(nameEnd && nameEnd[1] == ' ' && std::strchr("ZX", nameEnd[2]));
}

namespace {

bool detachStandardStreams() {
    const int null = open("/dev/null", O_RDWR);
    if (null == -1 || dup2(null, 0) == -1 || dup2(null, 1) == -1 || dup2(null, 2) == -1) {
        return false;
    }
    if (null > 2) {
        close(null);
    }
    return true;
}

} // namespace

int PLATCProcForkChildNoWait() {
    const platform::ChildSignals signals;
    const pid_t middle = fork();
    if (middle == -1) {
        return PLATFORM_FAIL(platform::kSystemCallFailed);
    }
    if (middle == 0) {
        if (setsid() == -1 || !detachStandardStreams()) {
            _exit(1);
        }
        const pid_t child = fork();
        if (child == 0) {
            return 0;
        }
        _exit(child == -1 ? 1 : 0);
    }
    return platform::waitForChild(middle) == 0 ? 1 : PLATFORM_FAIL(platform::kSystemCallFailed);
}
