// The days and the hours of a task's schedule, from its line of the crontab and the due test
// together. Where there is none, cron rejects the line: it has a time out of range, or asks for no
// day of the calendar.
#pragma once

#include "sched_calendar.h"
#include "tavischeduler.h"

#include <algorithm>
#include <array>
#include <bitset>
#include <chrono>

namespace sched {

constexpr int64_t kMinute = 60;
constexpr int64_t kHour = 60 * kMinute;
constexpr int64_t kDay = 24 * kHour;
constexpr unsigned int kHours = 24;

using Day = std::chrono::sys_days; // a day of the calendar, wherever it begins

inline bool isPower(const TAVI_SCHED_TASK &task) {
    return task.backend == TAVI_SCHED_BACKEND_AUTOPOWER;
}

class Days {
  public:
    explicit Days(const TAVI_SCHED_TASK &task)
        : task_(task), first_(isPower(task) ? Day() : firstDayOf(task)) {}

    // Outside of these there is none.
    Day first() const { return first_; }
    Day last() const {
        return isPower(task_) || repeats()
                   ? Day(std::chrono::year(9999) / std::chrono::December / 31)
                   : first_;
    }

    bool has(Day day) const {
        if (isPower(task_) ||
            task_.type == TAVI_SCHED_TYPE_WEEKLY) { // a power schedule has no type
            return day >= first_ && runsOnWeekDay(task_, std::chrono::weekday(day).c_encoding());
        }
        if (task_.type == TAVI_SCHED_TYPE_DAILY) {
            return day >= first_;
        }
        return day >= first_ && isOnDate(day);
    }

  private:
    bool repeats() const {
        return task_.type >= TAVI_SCHED_TYPE_DAILY && task_.type <= TAVI_SCHED_TYPE_YEARLY;
    }
    // Whatever the line says, past the start day the due test lets no other type run.
    bool isOnDate(Day day) const {
        const std::chrono::year_month_day date(day);
        return static_cast<unsigned int>(date.day()) == task_.startDay &&
               (task_.type == TAVI_SCHED_TYPE_MONTHLY ||
                static_cast<unsigned int>(date.month()) == task_.startMonth) &&
               (repeats() || static_cast<int>(date.year()) == static_cast<int>(task_.startYear));
    }
    // The first one that is not before the start date, which need not be one of the calendar; as
    // far as dates are made for it.
    static Day firstDayOf(const TAVI_SCHED_TASK &task) {
        constexpr uint32_t kFirstYear = 1970;
        constexpr uint32_t kLastMonth = 12;
        if (task.startYear < kFirstYear) {
            return {};
        }
        const std::chrono::year year(static_cast<int>(std::min(task.startYear, 10000U)));
        if (task.startMonth == 0 || task.startMonth > kLastMonth) {
            return (task.startMonth == 0 ? year : year + std::chrono::years(1)) /
                   std::chrono::January / 1;
        }
        const std::chrono::year_month month = year / std::chrono::month(task.startMonth);
        const auto date = month / std::chrono::day(std::clamp(task.startDay, 1U, 32U));
        return date.ok() ? Day(date) : Day((month + std::chrono::months(1)) / 1);
    }

    const TAVI_SCHED_TASK &task_;
    Day first_;
};

// The hours of a day at whose minute `runMin` it runs; none when one of them is no hour.
inline std::bitset<kHours> hoursOf(const TAVI_SCHED_TASK &task) {
    std::bitset<kHours> hours;
    bool isValid = task.runMin < 60;
    forEachRunHour(task, [&](uint64_t hour) {
        isValid = isValid && hour < kHours;
        if (isValid) {
            hours.set(hour);
        }
        return isValid && !isPower(task); // a power schedule has one
    });
    return isValid ? hours : std::bitset<kHours>();
}

} // namespace sched
