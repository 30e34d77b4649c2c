// Running a task's command.
#pragma once

namespace sched {

// Runs the command through /bin/sh as the effective user and nobody else, and waits for it. Returns
// what system() does: the wait status, 127 as the exit status when there is no shell, -1 when the
// command was not started.
int runCommand(const char *command);

} // namespace sched
