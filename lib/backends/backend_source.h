// The schedule backend's files all report as its own source: support scripts match that name.
#pragma once

#include "sched_error.h"

#undef SCHED_SOURCE
#define SCHED_SOURCE "backends/backend_tavischedule.cpp"
