// The schedule backend's files all report as its own source: support scripts match that name.
#pragma once

#include "sched_error.h"

// What has no stable number of its own reports as the file that it stands in.
#define SCHED_OWN_SITE                                                                             \
    sched::Site {                                                                                  \
        sched::sourceName(__FILE__), __LINE__                                                      \
    }

#undef SCHED_SOURCE
#define SCHED_SOURCE "backends/backend_tavischedule.cpp"
