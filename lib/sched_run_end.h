// When runs ended, beside the status database's rows.
#pragma once

#include <cstdint>

struct sqlite3;

namespace sched {

// The run of the row has ended now. 0 or -1.
int recordEnd(sqlite3 *db, int32_t statusId);

} // namespace sched
