// Local time: where days begin, and what daylight saving time skips and repeats, in the process's
// time zone.
#pragma once

#include "schedule/days.h"

#include <ctime>
#include <optional>
#include <vector>

namespace sched {

// Seconds east of Greenwich.
inline int64_t offsetAt(int64_t moment) {
    const auto time = static_cast<time_t>(moment);
    tm local{};
    localtime_r(&time, &local);
    return local.tm_gmtoff;
}

// What clocks show at a moment, in seconds as if it were at Greenwich.
inline int64_t localOf(int64_t moment) {
    return moment + offsetAt(moment);
}

inline Day dayOf(int64_t moment) {
    return std::chrono::floor<std::chrono::days>(
        std::chrono::sys_seconds(std::chrono::seconds(localOf(moment))));
}
inline int64_t secondsOf(Day day) {
    return day.time_since_epoch().count() * kDay;
}

// When the offset changes between two moments at which it differs.
int64_t findChange(int64_t before, int64_t after);

// The clock of one local day after the other.
class Clock {
  public:
    // Days that follow one another cost one look at the time zone each.
    void moveTo(Day day);

    // The first moment at which clocks show the time on this day; nothing when they skip it.
    std::optional<int64_t> at(unsigned int hour, unsigned int minute) const;
    // For a time that they skip: when they skip it, and when it would have come otherwise.
    int64_t changeAt(unsigned int hour, unsigned int minute) const;
    int64_t asIfUnchanged(unsigned int hour, unsigned int minute) const;

  private:
    int64_t utcOf(unsigned int hour, unsigned int minute, int64_t offset) const {
        return secondsOf(day_) + hour * kHour + minute * kMinute - offset;
    }
    void findOffset();

    Day day_;
    int64_t offset_ = 0;
    bool hasOffset_ = false; // it is the same all day
};

// Local times that clocks skip, in seconds as if they were at Greenwich.
struct Gap {
    int64_t begin;
    int64_t end;
};
std::vector<Gap> findGaps(int64_t from, int64_t until);

} // namespace sched
