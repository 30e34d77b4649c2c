// Programs started without a shell, detached forks and process checks.
#include "process.h"
#include "base/child.h"
#include "platform.h"

#include <cerrno>
#include <fcntl.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>
#include <vector>

namespace platform {

// What a program would read from the caller's standard input is not meant for it: a line that
// somebody types, or what a web server sends to the process that it started.
int runProgram(const char *path, const char *const *argv, const char *const *envp) {
    const base::ChildSignals signals;
    posix_spawnattr_t attributes;
    posix_spawn_file_actions_t actions;
    posix_spawnattr_init(&attributes);
    posix_spawn_file_actions_init(&actions);
    posix_spawnattr_setsigmask(&attributes, &signals.callersMask());
    posix_spawnattr_setflags(&attributes, POSIX_SPAWN_SETSIGMASK);
    pid_t pid = -1;
    int error = posix_spawn_file_actions_addopen(&actions, STDIN_FILENO, "/dev/null", O_RDONLY, 0);
    if (error == 0) {
        error = posix_spawn(&pid, path, &actions, &attributes, const_cast<char *const *>(argv),
                            const_cast<char *const *>(envp));
    }
    posix_spawn_file_actions_destroy(&actions);
    posix_spawnattr_destroy(&attributes);
    errno = error;
    return error == 0 ? base::waitForChild(pid) : -1;
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

int PLATCProcAlive(pid_t pid) {
    return base::isAlive(pid) ? 1 : 0;
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
    const base::ChildSignals signals;
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
    // A result that is lost is taken for a good one: told of a failure, callers try once more, and
    // what they start must not be started twice.
    const int status = base::waitForChild(middle);
    return status == 0 || status == -1 ? 1 : PLATFORM_FAIL(platform::kSystemCallFailed);
}
