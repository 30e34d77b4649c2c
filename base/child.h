// Children, in a process whose own handling of SIGCHLD is not ours to know, and other processes.
#pragma once

#include <csignal>
#include <sys/types.h>

namespace base {

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

// Whether the process exists and is no zombie.
bool isAlive(pid_t pid);

} // namespace base
