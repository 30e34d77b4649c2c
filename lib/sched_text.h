// Bounded text copies into the fixed arrays of records.
#pragma once

#include <algorithm>
#include <cstddef>
#include <cstring>

namespace sched {

// Copies the text into `size` bytes, cut to size - 1 characters and terminated; size is above 0.
inline void copyText(char *target, size_t size, const char *text) {
    const size_t length = strnlen(text, size - 1);
    std::memmove(target, text, length);
    target[length] = '\0';
}

} // namespace sched
