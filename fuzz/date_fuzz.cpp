// Texts of dates, times and days, and dates that have run past their ranges.
#include "fuzz.h"

#include <array>
#include <chrono>
#include <cstdlib>
#include <regex>

namespace {

// Two digits at most are a well-formed number.
void requireDate(const std::string &text) {
    TAVI_SCHED_DATE date{.year = 7, .month = 77, .day = 777, .wday = 0, .hour = 0, .minute = 0};
    static const std::regex whole("[0-9]{4}/[0-9]{1,2}/[0-9]{1,2}");
    const bool isWhole = std::regex_match(text, whole);
    const int parsed = TAVISchedDateParse(text.c_str(), &date);
    REQUIRE(parsed == 0 ||
            (parsed == -1 && !isWhole && PLATCErrGet() == TAVI_SCHED_ERR_BAD_FORMAT));
    REQUIRE(parsed == 0 || (date.month == 77 && date.day == 777));
    if (isWhole) {
        const size_t second = text.find('/', 5);
        REQUIRE(date.year == std::stoul(text) && date.month == std::stoul(text.substr(5)) &&
                date.day == std::stoul(text.substr(second + 1)));
    }
    REQUIRE(text.find_first_not_of("0123456789/") == std::string::npos || parsed == -1);
}

void requireTime(const std::string &text) {
    TAVI_SCHED_DATE date{.year = 0, .month = 0, .day = 0, .wday = 0, .hour = 77, .minute = 777};
    static const std::regex whole("[0-9]{1,2}:[0-9]{1,2}");
    const bool isWhole = std::regex_match(text, whole);
    const int parsed = TAVISchedTimeParse(text.c_str(), &date);
    REQUIRE(parsed == 0 ||
            (parsed == -1 && !isWhole && PLATCErrGet() == TAVI_SCHED_ERR_BAD_FORMAT));
    REQUIRE(parsed == 0 || (date.hour == 77 && date.minute == 777));
    if (isWhole) {
        REQUIRE(date.hour == std::stoul(text) &&
                date.minute == std::stoul(text.substr(text.find(':') + 1)));
    }
    REQUIRE(text.find_first_not_of("0123456789:") == std::string::npos || parsed == -1);
}

// Days and minutes since 1970, where that is a number of the calendar.
void requireNormal(TAVI_SCHED_DATE date) {
    namespace chrono = std::chrono;
    const TAVI_SCHED_DATE given = date;
    if (TAVISchedDateNormalize(&date) != 0) {
        REQUIRE(PLATCErrGet() == TAVI_SCHED_ERR_SYSTEM_CALL);
        return;
    }
    REQUIRE(date.month >= 1 && date.month <= 12 && date.day >= 1 && date.day <= 31 &&
            date.wday <= 6 && date.hour <= 23 && date.minute <= 59);
    TAVI_SCHED_DATE again = date;
    REQUIRE(TAVISchedDateNormalize(&again) == 0 && TAVISchedDateComp(&date, &again) == 0);
    REQUIRE(again.wday == date.wday && again.hour == date.hour && again.minute == date.minute);
    if (given.year > 3000 || given.month > 1000 || given.month < 1 || given.day > 100'000 ||
        given.hour > 100'000 || given.minute > 100'000) {
        return;
    }
    const auto begin = chrono::sys_days(chrono::year(static_cast<int>(given.year)) / 1 / 1 +
                                        chrono::months(given.month - 1));
    const auto moment = begin + chrono::days(given.day) - chrono::days(1) +
                        chrono::hours(given.hour) + chrono::minutes(given.minute);
    const auto day = chrono::floor<chrono::days>(moment);
    const chrono::year_month_day calendar(day);
    REQUIRE(date.year == static_cast<uint32_t>(static_cast<int>(calendar.year())) &&
            date.month == static_cast<unsigned int>(calendar.month()) &&
            date.day == static_cast<unsigned int>(calendar.day()) &&
            date.wday == chrono::weekday(day).c_encoding());
    REQUIRE(chrono::hours(date.hour) + chrono::minutes(date.minute) == moment - day);
}

void requireDays(const std::string &text) {
    constexpr size_t kDays = TAVI_SCHED_WEEK_DAYS;
    const char *const mask =
        TAVISchedMultiSelectFromText(text.c_str(), TAVISchedWeekDayNames, kDays);
    if (!mask) {
        return;
    }
    const std::string days = mask;
    REQUIRE(days.size() == kDays && days.find_first_not_of("01") == std::string::npos);
    const char *const names =
        TAVISchedMultiSelectToText(days.c_str(), TAVISchedWeekDayNames, kDays);
    REQUIRE(names);
    const char *const again = TAVISchedMultiSelectFromText(names, TAVISchedWeekDayNames, kDays);
    REQUIRE(again ? days == again : days.find('1') == std::string::npos);
}

} // namespace

void fuzz::test(Input input) {
    const std::string text = input.text();
    requireDate(text);
    requireTime(text);
    requireDays(text);
    TAVI_SCHED_DATE date{};
    for (uint32_t *const field : {&date.year, &date.month, &date.day, &date.hour, &date.minute}) {
        const size_t bytes = input.number(1) % 5;
        *field = input.number(bytes);
    }
    requireNormal(date);
    TAVI_SCHED_DATE other{};
    other.year = input.number(1) % 2 == 0 ? date.year : input.number(4);
    other.month = input.number(1) % 2 == 0 ? date.month : input.number(4);
    other.day = input.number(4);
    REQUIRE(TAVISchedDateComp(&date, &other) == -TAVISchedDateComp(&other, &date));
}
