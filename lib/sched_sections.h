// The sections of a section file, one after the other.
#pragma once

#include "platc.h"

#include <functional>

namespace sched {

// Hands each section over, in file order and until the answer is false: its name, and its pairs or
// nullptr when they cannot be read. 0, or -1 when the file cannot be read or memory is out.
int forEachSection(const char *path,
                   const std::function<bool(const char *name, PLATCSZHASH *pairs)> &onSection);

} // namespace sched
