// The hours in which the power schedules have the machine off.
#pragma once

#include "tavischeduler.h"

#include <span>
#include <vector>

namespace sched {

using TaskSpan = std::span<const TAVI_SCHED_TASK *const>;

class OffHours {
  public:
    OffHours(TaskSpan tasks, int64_t from, int64_t until);

    const std::vector<TAVI_SCHED_SPAN> &all() const { return spans_; }
    // Whether cron starts nothing at that moment. It comes too late for the minute in which the
    // machine goes on.
    bool has(int64_t moment) const;

  private:
    std::vector<TAVI_SCHED_SPAN> spans_;
};

} // namespace sched
