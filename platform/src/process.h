// Children that the platform itself starts and waits for.
#pragma once

#include <csignal>
#include <sys/types.h>

namespace platform {

// While it lives, SIGCHLD has its default action and is blocked: a caller that ignores SIGCHLD, or
// reaps in a handler, does not take our child's status away.
class ChildSignals {
  public:
    ChildSignals();
    ~ChildSignals();
    ChildSignals(const ChildSignals &) = delete;
    ChildSignals &operator=(const ChildSignals &) = delete;

    const sigset_t &callersMask() const { return callersMask_; }

  private:
    struct sigaction callersAction_ {};
    sigset_t callersMask_{};
};

// Waits for the child to end. Its wait status, or -1.
int waitForChild(pid_t pid);

// Starts a program with arguments and environment (argv and envp forms), without the caller's
// standard input, and waits for it. Its wait status, or -1 when it could not be started.
int runProgram(const char *path, const char *const *argv, const char *const *envp);

} // namespace platform
