// Normalisation of dates, and the next time at which a task will run.
#include "sched_calendar.h"
#include "sched_error.h"
#include "sched_text.h"
#include "tavischeduler.h"

#include <algorithm>
#include <array>
#include <ctime>
#include <optional>

namespace {

using Date = TAVI_SCHED_DATE;

enum class Today { BeforeStart, Runs, DoesNotRun };

// Daily and weekly tasks never consult the start date: front ends fill it in for them with zeros.
Today lookAtToday(const TAVI_SCHED_TASK &task, const Date &now, const Date &start) {
    if (task.type == TAVI_SCHED_TYPE_DAILY) {
        return Today::Runs;
    }
    if (task.type == TAVI_SCHED_TYPE_WEEKLY) {
        return sched::runsOnWeekDay(task, now.wday) ? Today::Runs : Today::DoesNotRun;
    }
    const int order = TAVISchedDateComp(&now, &start);
    if (order <= 0) {
        return order < 0 ? Today::BeforeStart : Today::Runs;
    }
    const bool sameDay = now.day == start.day;
    const bool runs = (task.type == TAVI_SCHED_TYPE_MONTHLY && sameDay) ||
                      (task.type == TAVI_SCHED_TYPE_YEARLY && sameDay && now.month == start.month);
    return runs ? Today::Runs : Today::DoesNotRun;
}

// The first of today's runs that lies after the current minute. Runs are ordered by hour * 100 +
// minute, and there are at most 25 up to the first one past 23:59.
std::optional<Date> nextRunToday(const TAVI_SCHED_TASK &task, const Date &now) {
    const uint64_t current = now.hour * uint64_t{100} + now.minute;
    std::optional<Date> next;
    sched::forEachRunHour(task, [&](uint64_t hour) {
        const uint64_t run = hour * 100 + task.runMin;
        if (run > current) {
            next = now;
            next->hour = static_cast<uint32_t>(run / 100);
            next->minute = static_cast<uint32_t>(run % 100);
        }
        return !next;
    });
    return next;
}

// Days to the next week day of the mask; 8 for an empty mask, which shows as eight days ahead.
uint32_t daysToNextWeekDay(const TAVI_SCHED_TASK &task, const Date &now) {
    uint32_t days = 1;
    while (days <= TAVI_SCHED_WEEK_DAYS &&
           !sched::runsOnWeekDay(task, (now.wday + days) % TAVI_SCHED_WEEK_DAYS)) {
        ++days;
    }
    return days;
}

// A later day than today. Month ends and leap days are left to normalisation: the 31st of a month
// with 30 days is the 1st of the next.
Date advance(const TAVI_SCHED_TASK &task, const Date &now, const Date &start) {
    Date next = now;
    switch (task.type) {
    case TAVI_SCHED_TYPE_WEEKLY:
        next.day += daysToNextWeekDay(task, now);
        break;
    case TAVI_SCHED_TYPE_MONTHLY:
        next.month += now.day >= start.day ? 1 : 0;
        next.day = start.day;
        break;
    case TAVI_SCHED_TYPE_YEARLY:
        if (start.month < now.month || (start.month == now.month && start.day <= now.day)) {
            next.year += 1;
        }
        next.month = start.month;
        next.day = start.day;
        break;
    default:
        next.day += 1;
        break;
    }
    return next;
}

// The next run, or none when there will be no more.
int findNextRun(const TAVI_SCHED_TASK &task, std::optional<Date> &next) {
    Date now{};
    if (TAVISchedDateGet(&now) != 0) {
        SCHED_LOG("get date failed. [0x%04X %s:%d]", SCHED_LAST_ERROR);
        return -1;
    }
    Date start{};
    start.year = task.startYear;
    start.month = task.startMonth;
    start.day = task.startDay;

    const Today today = lookAtToday(task, now, start);
    if (today == Today::BeforeStart) {
        next = start;
    } else {
        if (today == Today::Runs && (next = nextRunToday(task, now))) {
            return 0;
        }
        // A type that is none of the five is due on its start day alone, like once.
        if (task.type < TAVI_SCHED_TYPE_DAILY || task.type > TAVI_SCHED_TYPE_YEARLY) {
            return 0;
        }
        next = advance(task, now, start);
        if (TAVISchedDateNormalize(&*next) != 0) {
            SCHED_LOG("date normalization failed. [0x%04X %s:%d]", SCHED_LAST_ERROR);
            return -1;
        }
    }
    next->hour = task.runHour;
    next->minute = task.runMin;
    return 0;
}

// Writes the number, with zeros in front of it up to that many digits, and what separates it from
// the next. A list formats a date for each of its tasks: printf would be half of the time of a next
// run.
template <int digits> char *writeNumber(char *to, uint32_t number, char separator) {
    char *end = to + digits;
    for (uint32_t beyond = number / (digits == 4 ? 10000 : 100); beyond > 0; beyond /= 10) {
        ++end;
    }
    *end = separator;
    for (char *digit = end; digit != to; number /= 10) {
        *--digit = static_cast<char>('0' + number % 10);
    }
    return end + 1;
}

// "YYYY-MM-DD hh:mm"
void writeDate(const Date &date, char *to) {
    to = writeNumber<4>(to, date.year, '-');
    to = writeNumber<2>(to, date.month, '-');
    to = writeNumber<2>(to, date.day, ' ');
    to = writeNumber<2>(to, date.hour, ':');
    writeNumber<2>(to, date.minute, '\0');
}

} // namespace

int TAVISchedDateNormalize(TAVI_SCHED_DATE *pDate) {
    SCHED_REQUIRE(pDate, "((void *)0) != pDate", -1);
    // The daylight-saving flag stays 0, so that a time in a daylight-saving period comes back an
    // hour later. The web back end expects its next trigger times so.
    tm broken{};
    broken.tm_year = static_cast<int>(pDate->year - 1900);
    broken.tm_mon = static_cast<int>(pDate->month - 1);
    broken.tm_mday = static_cast<int>(pDate->day);
    broken.tm_hour = static_cast<int>(pDate->hour);
    broken.tm_min = static_cast<int>(pDate->minute);
    constexpr int kNoDay = -1; // set only when it fails, unlike the time
    broken.tm_wday = kNoDay;
    const time_t time = std::mktime(&broken);
    if (broken.tm_wday == kNoDay) {
        SCHED_LOG("mktime failed. %m");
        SCHED_SET_ERROR(sched::kSystemCallFailed);
        return -1;
    }
    return sched::toLocalDate(time, *pDate, SCHED_SITE);
}

int TAVISchedNextTriggerTime(TAVI_SCHED_TASK *pTask) {
    SCHED_REQUIRE(pTask, "((void *)0) != pTask", -1);
    std::optional<Date> next;
    if (findNextRun(*pTask, next) != 0) {
        SCHED_LOG("get trigger date failed. [%ld] [0x%04X %s:%d]", static_cast<long>(pTask->id),
                  SCHED_LAST_ERROR);
        return -1;
    }
    if (next) {
        writeDate(*next, pTask->nextTriggerTime);
    } else {
        sched::copyText(pTask->nextTriggerTime, sizeof pTask->nextTriggerTime, "N/A");
    }
    return 0;
}
