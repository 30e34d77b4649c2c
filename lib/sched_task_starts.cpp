// The minutes at which a task will really be started: those at which cron takes its line and the
// due test then lets it run. The next trigger time is for display and can differ.
//
// cron starts a line of fixed times once in an hour that the end of daylight saving time repeats,
// the first time; in an hour that its beginning skips it catches up afterwards, and the due test,
// which looks at the time there is then, lets nothing run.
#include "sched_calendar.h"
#include "sched_error.h"
#include "sched_guard.h"
#include "tavischeduler.h"

#include <algorithm>
#include <array>
#include <bitset>
#include <chrono>
#include <ctime>
#include <optional>

namespace {

namespace chrono = std::chrono;

constexpr int64_t kMinute = 60;
constexpr int64_t kHour = 60 * kMinute;
constexpr int64_t kDay = 24 * kHour;
constexpr unsigned int kHours = 24;

bool isPower(const TAVI_SCHED_TASK &task) {
    return task.backend == TAVI_SCHED_BACKEND_AUTOPOWER;
}

// The days on which a task is started, from its line and the due test together.
class Days {
  public:
    explicit Days(const TAVI_SCHED_TASK &task) : task_(task) {}

    bool has(const chrono::year_month_day &day, unsigned int weekDay) const {
        if (!isPower(task_) && order(day) < 0) {
            return false;
        }
        const bool isSameDay = static_cast<unsigned int>(day.day()) == task_.startDay;
        const bool isSameMonth = static_cast<unsigned int>(day.month()) == task_.startMonth;
        switch (task_.type) {
        case TAVI_SCHED_TYPE_ONCE:
            return order(day) == 0;
        case TAVI_SCHED_TYPE_DAILY:
            return true;
        case TAVI_SCHED_TYPE_WEEKLY:
            return sched::runsOnWeekDay(task_, weekDay);
        case TAVI_SCHED_TYPE_MONTHLY:
            return isSameDay;
        case TAVI_SCHED_TYPE_YEARLY:
            return isSameDay && isSameMonth;
        default:
            // The line is that of every day, but past the start day the due test knows no such
            // type.
            return order(day) == 0;
        }
    }

  private:
    // The day against the start day: below 0 before it, above 0 after it.
    int order(const chrono::year_month_day &day) const {
        const std::array date{static_cast<uint32_t>(static_cast<int>(day.year())),
                              static_cast<uint32_t>(static_cast<unsigned int>(day.month())),
                              static_cast<uint32_t>(static_cast<unsigned int>(day.day()))};
        const std::array start{task_.startYear, task_.startMonth, task_.startDay};
        return date < start ? -1 : date > start ? 1 : 0;
    }

    const TAVI_SCHED_TASK &task_;
};

// A local calendar day, and where it begins when it is an ordinary one.
class LocalDay {
  public:
    explicit LocalDay(int64_t moment) {
        const auto time = static_cast<time_t>(moment);
        tm local{};
        localtime_r(&time, &local);
        day_ = chrono::sys_days(chrono::year(local.tm_year + 1900) /
                                chrono::month(static_cast<unsigned int>(local.tm_mon) + 1) /
                                chrono::day(static_cast<unsigned int>(local.tm_mday)));
        findOffset();
    }

    void advance() {
        day_ += chrono::days(1);
        if (hasOffset_ && offsetAt(utcOf(kHours, 0, offset_)) == offset_) {
            return;
        }
        findOffset();
    }

    chrono::year_month_day date() const { return day_; }
    unsigned int weekDay() const { return chrono::weekday(day_).c_encoding(); }
    int64_t begin() const { return utcOf(0, 0, offset_); }

    // The first moment at which clocks show the time on this day; nothing when they skip it.
    std::optional<int64_t> at(unsigned int hour, unsigned int minute) const {
        const int64_t ordinary = utcOf(hour, minute, offset_);
        if (hasOffset_) {
            return ordinary;
        }
        // The offset before a change of it is that of the first time.
        for (const long offset : {offsetAt(ordinary - kDay), offsetAt(ordinary + kDay)}) {
            const int64_t moment = utcOf(hour, minute, offset);
            if (offsetAt(moment) == offset) {
                return moment;
            }
        }
        return std::nullopt;
    }

  private:
    static long offsetAt(int64_t moment) {
        const auto time = static_cast<time_t>(moment);
        tm local{};
        localtime_r(&time, &local);
        return local.tm_gmtoff;
    }

    int64_t utcOf(unsigned int hour, unsigned int minute, long offset) const {
        return day_.time_since_epoch().count() * kDay + hour * kHour + minute * kMinute - offset;
    }

    void findOffset() {
        offset_ = offsetAt(utcOf(0, 0, offsetAt(utcOf(0, 0, 0))));
        hasOffset_ = offsetAt(utcOf(0, 0, offset_)) == offset_ &&
                     offsetAt(utcOf(kHours, 0, offset_)) == offset_;
    }

    chrono::sys_days day_;
    long offset_ = 0;        // seconds east of Greenwich
    bool hasOffset_ = false; // it is the same all day
};

// The hours of a day; nothing when cron rejects the line for them.
std::optional<std::bitset<kHours>> hoursOf(const TAVI_SCHED_TASK &task) {
    std::bitset<kHours> hours;
    bool isValid = task.runMin < 60;
    sched::forEachRunHour(task, [&](uint64_t hour) {
        isValid = isValid && hour < kHours;
        if (isValid) {
            hours.set(hour);
        }
        return isValid;
    });
    return isValid ? std::optional(hours) : std::nullopt;
}

// Whether there is a line, and cron takes it.
bool hasLine(const TAVI_SCHED_TASK &task) {
    if (task.state != TAVI_SCHED_STATE_ENABLED) {
        return false;
    }
    std::array<char, 8192> line{};
    std::array<char, 512> reason{};
    return isPower(task) ||
           (TAVISchedCrontabLine(&task, line.data(), line.size()) == 0 &&
            TAVISchedCrontabLineCheck(line.data(), nullptr, reason.data(), reason.size()) == 0);
}

} // namespace

int TAVISchedTaskStarts(const TAVI_SCHED_TASK *pTask, int64_t from, int64_t until,
                        int64_t *rgStarts, size_t cMax) {
    SCHED_REQUIRE(pTask, "((void *)0) != pTask", -1);
    SCHED_REQUIRE(rgStarts, "((void *)0) != rgStarts", -1);
    SCHED_REQUIRE(cMax > 0, "0 < cMax", -1);
    // Years of four digits, which is what dates are made for.
    from = std::max<int64_t>(from, 0);
    until = std::min<int64_t>(until, 253402300800);
    const auto hours = hoursOf(*pTask);
    if (!hours || !hasLine(*pTask)) {
        return 0;
    }
    tzset();
    size_t count = 0;
    const Days days(*pTask);
    // A day earlier, as a day can begin before the one that the moment is on by another offset.
    for (LocalDay day(from - kDay); day.begin() - kDay < until; day.advance()) {
        if (!days.has(day.date(), day.weekDay())) {
            continue;
        }
        for (unsigned int hour = 0; hour < kHours; ++hour) {
            const auto moment = hours->test(hour) ? day.at(hour, pTask->runMin) : std::nullopt;
            if (!moment || *moment < from || *moment >= until) {
                continue;
            }
            rgStarts[count++] = *moment;
            if (count == cMax) {
                return static_cast<int>(count);
            }
        }
    }
    return static_cast<int>(count);
}
