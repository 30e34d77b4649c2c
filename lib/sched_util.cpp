// Dates as callers exchange them: the current date, comparison, parsing; and the seeding of the
// random generator.
#include "sched_calendar.h"
#include "sched_error.h"
#include "tavischeduler.h"

#include <cstdlib>
#include <cstring>
#include <ctime>
#include <unistd.h>

namespace {

// The numbers of a text that holds nothing but digits and its separator are small: ten characters
// at most.
uint32_t parseNumber(const char *text) {
    return static_cast<uint32_t>(std::strtoul(text, nullptr, 10));
}

bool consistsOf(const char *text, const char *characters) {
    return text[std::strspn(text, characters)] == '\0';
}

// Year, month and day of "YYYY/M/D". The year is stored as soon as it is known, also when the rest
// of the text is then rejected: callers have come to see it.
bool parseDate(const char *text, TAVI_SCHED_DATE &date) {
    const size_t length = std::strlen(text);
    if (length < 8 || length > 10 || !consistsOf(text, "0123456789/") ||
        std::strcspn(text, "/") != 4) {
        return false;
    }
    date.year = parseNumber(text);
    const char *const month = text + 5;
    const size_t digits = std::strcspn(month, "/");
    if (digits < 1 || digits > 2 || month[digits] == '\0') {
        return false;
    }
    date.month = parseNumber(month);
    date.day = parseNumber(month + digits + 1);
    return true;
}

bool parseTime(const char *text, TAVI_SCHED_DATE &date) {
    const size_t length = std::strlen(text);
    const size_t digits = std::strcspn(text, ":");
    if (length < 3 || length > 5 || !consistsOf(text, "0123456789:") || digits < 1 || digits > 2) {
        return false;
    }
    date.hour = parseNumber(text);
    date.minute = parseNumber(text + digits + 1);
    return true;
}

} // namespace

int TAVISchedDateGet(TAVI_SCHED_DATE *pDate) {
    SCHED_REQUIRE(pDate, "((void *)0) != pDate", -1);
    return sched::toLocalDate(std::time(nullptr), *pDate, SCHED_SITE);
}

int TAVISchedDateComp(const TAVI_SCHED_DATE *pDate1, const TAVI_SCHED_DATE *pDate2) {
    SCHED_REQUIRE(pDate1, "((void *)0) != pDate1", -1);
    SCHED_REQUIRE(pDate2, "NULL != pDate2", -1);
    if (pDate1->year != pDate2->year) {
        return pDate1->year < pDate2->year ? -1 : 1;
    }
    if (pDate1->month != pDate2->month) {
        return pDate1->month < pDate2->month ? -1 : 1;
    }
    if (pDate1->day != pDate2->day) {
        return pDate1->day < pDate2->day ? -1 : 1;
    }
    return 0;
}

int TAVISchedDateParse(const char *szDateOrg, TAVI_SCHED_DATE *pDate) {
    SCHED_REQUIRE(szDateOrg, "((void *)0) != szDateOrg", -1);
    SCHED_REQUIRE(pDate, "NULL != pDate", -1);
    if (!parseDate(szDateOrg, *pDate)) {
        SCHED_LOG("Bad date format: [%s]", sched::LogText(szDateOrg).c_str());
        SCHED_SET_ERROR(sched::kBadFormat);
        return -1;
    }
    return 0;
}

int TAVISchedTimeParse(const char *szTimeOrg, TAVI_SCHED_DATE *pDate) {
    SCHED_REQUIRE(szTimeOrg, "((void *)0) != szTimeOrg", -1);
    SCHED_REQUIRE(pDate, "NULL != pDate", -1);
    if (!parseTime(szTimeOrg, *pDate)) {
        SCHED_LOG("Bad time format: [%s]", sched::LogText(szTimeOrg).c_str());
        SCHED_SET_ERROR(sched::kBadFormat);
        return -1;
    }
    return 0;
}

// A forked child is another process: with its parent's sequence, runs that one caller starts would
// draw the same pauses and meet again and again.
int TAVISchedRandInit() {
    static pid_t seeded = 0;
    const pid_t process = getpid();
    if (seeded != process) {
        std::srand(static_cast<unsigned int>(std::time(nullptr) + process));
        seeded = process;
    }
    return 0;
}
