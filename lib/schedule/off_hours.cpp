// The hours in which the power schedules have the machine off.
#include "schedule/off_hours.h"
#include "sched_error.h"
#include "sched_guard.h"
#include "schedule/starts.h"

#include <algorithm>

namespace {

using sched::kDay;

constexpr int64_t kMoreThanAWeek = 8 * kDay; // in which every power schedule comes once

struct Switch {
    int64_t moment;
    bool isOn; // off goes before on

    auto operator<=>(const Switch &) const = default;
};

std::vector<Switch> switchesOf(sched::TaskSpan tasks, int64_t from, int64_t until) {
    std::vector<Switch> switches;
    for (const TAVI_SCHED_TASK *const task : tasks) {
        if (sched::isPower(*task)) {
            sched::forEachStart(*task, from, until, [&](int64_t moment) {
                switches.push_back({moment, !sched::isPowerOff(*task)});
                return true;
            });
        }
    }
    std::sort(switches.begin(), switches.end());
    return switches;
}

} // namespace

sched::OffHours::OffHours(TaskSpan tasks, int64_t from, int64_t until) {
    const Switch *off = nullptr;
    const auto switches = switchesOf(tasks, from - kMoreThanAWeek, until + kMoreThanAWeek);
    for (const Switch &each : switches) {
        if (!each.isOn) {
            off = off ? off : &each;
        } else if (off) {
            if (off->moment < until && each.moment >= from) {
                spans_.push_back({.from = off->moment, .until = each.moment});
            }
            off = nullptr;
        }
    }
}

bool sched::OffHours::has(int64_t moment) const {
    const auto next =
        std::upper_bound(spans_.begin(), spans_.end(), moment,
                         [](int64_t one, const auto &span) { return one < span.from; });
    return next != spans_.begin() && moment < (next - 1)->until + kMinute;
}

int TAVISchedOffHours(const TAVI_SCHED_TASK *const *rgTasks, size_t cTasks, int64_t from,
                      int64_t until, TAVI_SCHED_SPAN *rgSpans, size_t cMax) {
    SCHED_REQUIRE(rgTasks || cTasks == 0, "((void *)0) != rgTasks", -1);
    SCHED_REQUIRE(rgSpans, "((void *)0) != rgSpans", -1);
    SCHED_REQUIRE(cMax > 0, "0 < cMax", -1);
    tzset();
    from = sched::inTime(from);
    until = sched::inTime(until);
    return sched::guarded(SCHED_SITE, [&] {
        size_t count = 0;
        const sched::OffHours hours({rgTasks, cTasks}, from, until);
        for (const TAVI_SCHED_SPAN &span : hours.all()) {
            const TAVI_SCHED_SPAN cut{.from = std::max(span.from, from),
                                      .until = std::min(span.until, until)};
            if (cut.from < cut.until && count < cMax) {
                rgSpans[count++] = cut;
            }
        }
        return static_cast<int>(count);
    });
}
