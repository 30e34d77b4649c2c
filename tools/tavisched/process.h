// What /proc tells of processes.
#pragma once

#include <sys/types.h>

namespace tavisched {

// Whether this process descends from the other one.
bool isAncestor(pid_t pid);

} // namespace tavisched
