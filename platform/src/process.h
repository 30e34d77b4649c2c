// Children that the platform itself starts and waits for.
#pragma once

namespace platform {

// Starts a program with arguments and environment (argv and envp forms), with /dev/null as its
// standard input, and waits for it. Its wait status, or -1 when it could not be started.
int runProgram(const char *path, const char *const *argv, const char *const *envp);

} // namespace platform
