// The starts of a task in a year, in a time zone with daylight saving time.
#include "bench_support.h"

namespace {

constexpr int kDays = 366;
constexpr time_t kDay = 86400;
constexpr time_t kFrom = 1704067200; // 2024-01-01

// The reference is one localtime a day; not the search for the days and hours.
void startsOfAYear(benchmark::State &state) {
    setenv("TZ", "Europe/Berlin", 1);
    TAVI_SCHED_TASK task{};
    task.state = TAVI_SCHED_STATE_ENABLED;
    task.type = TAVI_SCHED_TYPE_DAILY;
    int64_t starts[kDays];
    bench::Comparison comparison;
    for (auto _ : state) {
        comparison.product([&] {
            bench::require(TAVISchedTaskStarts(&task, kFrom, kFrom + kDays * kDay, starts, kDays) ==
                               kDays,
                           "TAVISchedTaskStarts");
        });
        comparison.reference([] {
            for (int day = 0; day < kDays; ++day) {
                const time_t moment = kFrom + day * kDay;
                tm local{};
                benchmark::DoNotOptimize(localtime_r(&moment, &local));
            }
        });
    }
    comparison.reportTo(state, "starts of a year, to one localtime a day", 2.0);
}

BENCHMARK(startsOfAYear)->Iterations(50);

} // namespace
