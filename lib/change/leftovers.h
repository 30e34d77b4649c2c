// What changes that were cut off leave beside the files that they were about to replace.
#pragma once

namespace sched {

// Removes scratch files of dead processes in /tmp, and temporary crontabs that are not older than
// the record of the change that was cut off.
void removeLeftovers();

} // namespace sched
