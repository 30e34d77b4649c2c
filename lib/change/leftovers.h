// What changes that were cut off leave beside the files that they were about to replace.
#pragma once

#include <string>
#include <vector>

namespace sched {

// The scratch files of dead processes in /tmp.
std::vector<std::string> findScratchFiles();

// Removes scratch files of dead processes in /tmp, and temporary crontabs that are not older than
// the record of the change that was cut off.
void removeLeftovers();

} // namespace sched
