// What changes that were cut off leave beside the files that they were about to replace.
#pragma once

#include <ctime>
#include <string>
#include <vector>

namespace sched {

// The scratch files of dead processes in /tmp.
std::vector<std::string> findScratchFiles();

// Removes scratch files of dead processes in /tmp, temporary crontabs that are not older than the
// beginning of the change that was cut off, and what is left of records that have gone.
void removeLeftovers(const timespec &since);

} // namespace sched
