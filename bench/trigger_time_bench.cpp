// The next trigger time of one task of each type; scripts/bench takes the worst. TZ is set: without
// it libc looks at the zone file in every call, and hides all other work.
#include "bench_support.h"

#include <cstdlib>

namespace {

constexpr int kCalls = 1000;

// An hourly task from midnight to this hour of this very day and week day: all of its runs have
// passed, so that the search goes on to a later day.
TAVI_SCHED_TASK taskOf(int type) {
    TAVI_SCHED_DATE now{};
    bench::require(TAVISchedDateGet(&now) == 0, "TAVISchedDateGet");
    TAVI_SCHED_TASK task{};
    task.type = type;
    task.startYear = now.year;
    task.startMonth = now.month;
    task.startDay = now.day;
    task.repeatHour = 1;
    task.lastWorkHour = now.hour;
    TAVISchedCTaskSetWeek(&task, "0000000");
    task.week[now.wday] = '1';
    return task;
}

// The reference is time, two localtime and one mktime; not the search for the day nor the writing
// of the text.
void nextTriggerTime(benchmark::State &state) {
    setenv("TZ", "UTC", 1);
    TAVI_SCHED_TASK task = taskOf(static_cast<int>(state.range(0)));
    bench::Comparison comparison;
    for (auto _ : state) {
        comparison.product([&] {
            for (int i = 0; i < kCalls; ++i) {
                bench::require(TAVISchedNextTriggerTime(&task) == 0, "TAVISchedNextTriggerTime");
            }
        });
        comparison.reference([] {
            for (int i = 0; i < kCalls; ++i) {
                bench::callLibcDates();
            }
        });
    }
    comparison.reportTo(state, "next trigger time, worst type, to its libc calls", 1.5);
}

BENCHMARK(nextTriggerTime)
    ->DenseRange(TAVI_SCHED_TYPE_ONCE, TAVI_SCHED_TYPE_YEARLY)
    ->Iterations(50);

} // namespace
