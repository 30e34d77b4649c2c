// What the checks share: filling in a fault, and the words for what is accepted.
#pragma once

#include "sched_field.h"
#include "sched_text.h"
#include "tavischeduler.h"

#include <cstddef>
#include <string>

namespace sched {

inline void setFault(TAVI_SCHED_FAULT &fault, int kind, const char *key,
                     const std::string &reason) {
    fault.kind = kind;
    copyText(fault.key, sizeof fault.key, key);
    copyText(fault.reason, sizeof fault.reason, reason.c_str());
}

inline bool isCommand(const Field &field) {
    return field.offset == offsetof(TAVI_SCHED_TASK, command);
}

// The names of an enumeration that a task may have: "disabled, enabled".
std::string acceptedNames(const Field &field);

inline constexpr const char *kHoldsLineBreak =
    "it holds a line break, which would be stored as a blank; accepted: one line of UTF-8";

} // namespace sched
