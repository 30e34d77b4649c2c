// The moments at which a task is started.
//
// Its line of the crontab has no asterisk for the minute or the hour. cron starts such lines once
// in an hour that the end of daylight saving time repeats, the first time; what the beginning of it
// skips cron catches up at once, and the due test, which looks at the time there is then, lets
// nothing run that is not due there anyway: a task that is due in the skipped hour's minute and in
// the one after it is started twice in that one. Power-off lines have no due test, and the wake
// alarm rings as if the clock had not been changed.
#pragma once

#include "schedule/clock.h"

#include <cstring>

namespace sched {

inline bool isPowerOff(const TAVI_SCHED_TASK &task) {
    return isPower(task) && std::strcmp(task.appArgs, "poweroff") == 0;
}

// Hands over the starts of an enabled task from one moment until before another, in rising order,
// until the function answers false.
template <typename Function>
void forEachStart(const TAVI_SCHED_TASK &task, int64_t from, int64_t until, Function &&function) {
    const auto hours = hoursOf(task);
    if (task.state != TAVI_SCHED_STATE_ENABLED || hours.none() || from >= until) {
        return;
    }
    const Days days(task);
    Clock clock;
    // A day more at both ends, as clocks can go back over midnight.
    const Day last = std::min(dayOf(until) + std::chrono::days(1), days.last());
    for (Day day = std::max(dayOf(from) - std::chrono::days(1), days.first()); day <= last;
         day += std::chrono::days(1)) {
        if (!days.has(day)) {
            continue;
        }
        clock.moveTo(day);
        for (unsigned int hour = 0; hour < kHours; ++hour) {
            if (!hours.test(hour)) {
                continue;
            }
            auto moment = clock.at(hour, task.runMin);
            if (!moment && isPower(task)) {
                moment = isPowerOff(task) ? clock.changeAt(hour, task.runMin)
                                          : clock.asIfUnchanged(hour, task.runMin);
            }
            if (moment && *moment >= from && *moment < until && !function(*moment)) {
                return;
            }
        }
    }
}

// The first start from a moment on; nothing when there is none, however long one waits.
std::optional<int64_t> findNextStart(const TAVI_SCHED_TASK &task, int64_t from);

// Years of four digits, which is what dates are made for.
inline int64_t inTime(int64_t moment) {
    constexpr int64_t kEndOfTime = 253402300800;
    return std::clamp<int64_t>(moment, 0, kEndOfTime);
}

} // namespace sched
