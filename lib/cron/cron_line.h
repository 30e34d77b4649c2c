// The line of /etc/crontab that stands for a task of the schedule backend.
#pragma once

#include "tavischeduler.h"

#include <array>
#include <cstddef>

namespace sched {

// Fields as they are stored, separated by tabs, without a line feed; cron may reject them.
class CronLine {
  public:
    explicit CronLine(const TAVI_SCHED_TASK &task);
    const char *c_str() const { return text_.data(); }
    size_t size() const { return length_; }

  private:
    [[gnu::format(printf, 2, 3)]] void add(const char *format, ...);
    void addTime(const TAVI_SCHED_TASK &task);
    void addDate(const TAVI_SCHED_TASK &task);

    std::array<char, 8192> text_;
    size_t length_ = 0;
};

} // namespace sched
