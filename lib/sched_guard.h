// The wall that keeps C++ exceptions behind the exported functions.
#pragma once

#include "sched_error.h"

#include <exception>

namespace sched {

// Runs the body of an exported function, in which nothing but the allocation of memory throws:
// its result, or -1 with error 0x0200, which is logged for the site.
template <typename Body> int guarded(const Site &site, Body &&body) noexcept {
    try {
        return body();
    } catch (const std::exception &) {
        SCHED_LOG_FOR(site, "Out of memory");
        PLATCErrSetEx(kTaskOutOfMemory, site.file, site.line);
        return -1;
    }
}

} // namespace sched
