// The tasks of a JSON array, of either form, and of single objects.
#pragma once

#include "json/plain.h"

namespace tavisched {

// Refused with what is wrong: element, member, what is accepted.
std::vector<Imported> parseImport(const std::string &text);

// What is to be exchanged of a task must be UTF-8, or it would not come back; fails when it is not.
void requireExchangeable(const TAVI_SCHED_TASK &task);

} // namespace tavisched
