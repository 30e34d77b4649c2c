// Children, in a process whose own handling of SIGCHLD is not ours to know, and other processes.
#pragma once

#include <csignal>
#include <cstdint>
#include <optional>
#include <sys/types.h>
#include <vector>

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

// A process that no other one is taken for: ids are given again, with another start.
struct Process {
    pid_t pid = -1;
    pid_t parent = -1;
    int64_t start = 0; // clock ticks since the machine's start
};

// Nothing when there is no such process, or it is a zombie.
std::optional<Process> findProcess(pid_t pid);
// Everything below the process but zombies, parents before their children.
std::vector<Process> descendantsOf(pid_t pid);
// Sends it a signal, with a value that tells it from anybody else's. False when it is gone, or with
// errno set.
bool sendSignal(const Process &process, int signal, int value = 0);

} // namespace base
