// What /proc tells of processes.
#pragma once

#include <string>
#include <sys/types.h>

namespace tavisched {

struct Process {
    std::string name; // in parentheses; empty when there is no such process
    pid_t parent = 0;
    unsigned long long startTime = 0; // clock ticks since the machine's start
};

// Of a process id, or "self".
Process describe(const std::string &pid);
// Whether this process descends from the other one.
bool isAncestor(pid_t pid);

} // namespace tavisched
