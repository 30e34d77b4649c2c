// The minutes at which a task will really be started: those at which cron takes its line and the
// due test then lets it run. The next trigger time is for display and can differ.
#include "sched_error.h"
#include "sched_guard.h"
#include "schedule/starts.h"
#include "tavischeduler.h"

#include <algorithm>

// Leap days are eight years apart at most, and clocks do not skip the same time every year.
std::optional<int64_t> sched::findNextStart(const TAVI_SCHED_TASK &task, int64_t from) {
    constexpr int64_t kFarthest = 10 * 366 * kDay;
    tzset();
    from = sched::inTime(from);
    const int64_t begin = std::max(from, secondsOf(Days(task).first()));
    std::optional<int64_t> next;
    forEachStart(task, from, sched::inTime(begin + kFarthest), [&](int64_t moment) {
        next = moment;
        return false;
    });
    return next;
}

int TAVISchedTaskStarts(const TAVI_SCHED_TASK *pTask, int64_t from, int64_t until,
                        int64_t *rgStarts, size_t cMax) {
    SCHED_REQUIRE(pTask, "((void *)0) != pTask", -1);
    SCHED_REQUIRE(rgStarts, "((void *)0) != rgStarts", -1);
    SCHED_REQUIRE(cMax > 0, "0 < cMax", -1);
    tzset();
    size_t count = 0;
    sched::forEachStart(*pTask, sched::inTime(from), sched::inTime(until), [&](int64_t moment) {
        rgStarts[count++] = moment;
        return count < cMax;
    });
    return static_cast<int>(count);
}

int TAVISchedTaskNextStart(const TAVI_SCHED_TASK *pTask, int64_t from, int64_t *pStart) {
    SCHED_REQUIRE(pTask, "((void *)0) != pTask", -1);
    SCHED_REQUIRE(pStart, "((void *)0) != pStart", -1);
    const auto next = sched::findNextStart(*pTask, from);
    *pStart = next.value_or(0);
    return next ? 1 : 0;
}
