// Running a task's command.
#pragma once

#include "base/descriptor.h"

#include <string>
#include <sys/types.h>
#include <vector>

namespace sched {

// What goes on beside a command while it is waited for.
class CommandWatch {
  public:
    virtual ~CommandWatch() = default;
    // "NAME=value" each, for the command's environment beside its other variables.
    virtual std::vector<std::string> variables() const = 0;
    virtual bool wantsOutput() const = 0;
    // The command's process has been forked. What it prints comes out of `output`, if anything.
    virtual void begun(pid_t process, base::Descriptor output) = 0;
    // Waits for it: its wait status, or -1.
    virtual int wait(pid_t process) = 0;
};

// From here on this process's commands are watched; nullptr: no more.
void watchCommands(CommandWatch *watch);

// Runs the command through /bin/sh as the effective user and nobody else, and waits for it. Returns
// what system() does: the wait status, 127 as the exit status when there is no shell, -1 when the
// command was not started.
int runCommand(const char *command);

} // namespace sched
