// What options make of a task.
#pragma once

#include "tasks/options.h"

#include <optional>
#include <string>

namespace fuzz {

// The number that a text of digits alone is, at most so many; nothing when it is out of the range.
std::optional<uint32_t> numberIn(const std::string &text, size_t digits, uint32_t low,
                                 uint32_t high);

// Applies the options to a copy of the task: refused as they must be, or the task is then what they
// say, and sound, and the same task in words and for cron.
void requireChange(const TAVI_SCHED_TASK &before, const tavisched::TaskOptions &options);

} // namespace fuzz
