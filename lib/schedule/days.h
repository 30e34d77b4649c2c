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
    explicit Days(const TAVI_SCHED_TASK &task) : task_(task) {}

    // Outside of these there is none.
    Day first() const { return isPower(task_) ? Day() : Day(year() / std::chrono::January / 1); }
    Day last() const {
        return isPower(task_) || repeats()
                   ? Day(std::chrono::year(9999) / std::chrono::December / 31)
                   : Day(year() / std::chrono::December / 31);
    }

    bool has(Day day) const {
        const unsigned int weekDay = std::chrono::weekday(day).c_encoding();
        if (isPower(task_)) { // its days alone count
            return runsOnWeekDay(task_, weekDay);
        }
        const std::chrono::year_month_day date(day);
        const bool isSameDay = static_cast<unsigned int>(date.day()) == task_.startDay;
        const bool isSameMonth = static_cast<unsigned int>(date.month()) == task_.startMonth;
        switch (task_.type) {
        case TAVI_SCHED_TYPE_DAILY:
            return hasBegun(date);
        case TAVI_SCHED_TYPE_WEEKLY:
            return runsOnWeekDay(task_, weekDay) && hasBegun(date);
        case TAVI_SCHED_TYPE_MONTHLY:
            return isSameDay && hasBegun(date);
        case TAVI_SCHED_TYPE_YEARLY:
            return isSameDay && isSameMonth && hasBegun(date);
        default:
            // Past the start day the due test lets no other type run, whatever its line says.
            return isSameDay && isSameMonth && yearOf(date) == task_.startYear;
        }
    }

  private:
    bool repeats() const {
        return task_.type >= TAVI_SCHED_TYPE_DAILY && task_.type <= TAVI_SCHED_TYPE_YEARLY;
    }
    // Of the first day, as far as dates are made for it.
    std::chrono::year year() const {
        return std::chrono::year(static_cast<int>(std::clamp(task_.startYear, 1970U, 10000U)));
    }
    static uint32_t yearOf(const std::chrono::year_month_day &date) {
        return static_cast<uint32_t>(static_cast<int>(date.year()));
    }
    bool hasBegun(const std::chrono::year_month_day &date) const {
        const std::array day{yearOf(date), static_cast<unsigned int>(date.month()),
                             static_cast<unsigned int>(date.day())};
        return day >= std::array{task_.startYear, task_.startMonth, task_.startDay};
    }

    const TAVI_SCHED_TASK &task_;
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
