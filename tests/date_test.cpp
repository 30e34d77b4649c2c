// Dates and next trigger times.
#include "support.h"

#include <cstdlib>

namespace {

using namespace support;
using Dates = SchedTest;

std::string text(const TAVI_SCHED_DATE &date) {
    char buffer[96];
    snprintf(buffer, sizeof buffer, "%u-%u-%u %u:%u w%u", date.year, date.month, date.day,
             date.hour, date.minute, date.wday);
    return buffer;
}

TEST_F(Dates, ParseTakesTheFormAndNoRange) {
    struct Case {
        const char *text;
        const char *expected; // nullptr: rejected
    };
    const Case dates[] = {
        {"2024/3/5", "2024-3-5"}, {"2024/13/45", "2024-13-45"}, {"2024/10/", "2024-10-0"},
        {"24/3/5", nullptr},      {"202/03/05", nullptr},       {"2024-03-05", nullptr},
        {"2024/003/5", nullptr},  {"2024/3/5 ", nullptr},       {"2024//5/5", nullptr},
        {"2024/12/311", nullptr}, {"20241231", nullptr}};
    for (const Case &c : dates) {
        TAVI_SCHED_DATE date{1, 2, 3, 4, 5, 6};
        EXPECT_EQ(TAVISchedDateParse(c.text, &date), c.expected ? 0 : -1) << c.text;
        if (c.expected) {
            EXPECT_EQ(text(date), std::string(c.expected) + " 5:6 w4");
        }
    }
    EXPECT_EQ(PLATCErrGet(), 0x4000U);
    EXPECT_EQ(logs().back(), "sched_util.cpp:* Bad date format: [20241231]");
    TAVI_SCHED_DATE date{};
    EXPECT_EQ(TAVISchedDateParse("2024/003/5", &date), -1);
    EXPECT_EQ(text(date), "2024-0-0 0:0 w0"); // the year is stored before the rest is looked at

    const Case times[] = {{"7:5", "7:5"},      {"25:99", "25:99"}, {"075", nullptr},
                          {"07:005", nullptr}, {"123:4", nullptr}, {":12", nullptr},
                          {"7:", nullptr},     {"7.5", nullptr}};
    for (const Case &c : times) {
        date = {};
        EXPECT_EQ(TAVISchedTimeParse(c.text, &date), c.expected ? 0 : -1) << c.text;
        EXPECT_EQ(text(date), "0-0-0 " + std::string(c.expected ? c.expected : "0:0") + " w0");
    }
    EXPECT_EQ(logs().back(), "sched_util.cpp:* Bad time format: [7.5]");
}

TEST_F(Dates, CompareLooksAtTheDayAlone) {
    const TAVI_SCHED_DATE early{2023, 12, 31, 1, 9, 0};
    TAVI_SCHED_DATE late{2024, 2, 1, 0, 0, 0};
    EXPECT_EQ(TAVISchedDateComp(&early, &late), -1);
    EXPECT_EQ(TAVISchedDateComp(&late, &early), 1);
    late = {2023, 12, 31, 5, 1, 7};
    EXPECT_EQ(TAVISchedDateComp(&early, &late), 0);
    EXPECT_EQ(TAVISchedDateComp(nullptr, nullptr), -1);
    EXPECT_EQ(TAVISchedDateComp(&early, nullptr), -1);
    EXPECT_THAT(logs(),
                ElementsAre("sched_util.cpp:* Invaild Argument (((void *)0) != pDate1)=[0]\n",
                            "sched_util.cpp:* Invaild Argument (NULL != pDate2)=[0]\n"));
}

TEST_F(Dates, NormalizeCarries) {
    setenv("TZ", "UTC", 1);
    TAVI_SCHED_DATE date{2024, 2, 30, 0, 23, 60};
    EXPECT_EQ(TAVISchedDateNormalize(&date), 0);
    EXPECT_EQ(text(date), "2024-3-2 0:0 w6");
    date = {2024, 13, 0, 0, 0, 0};
    EXPECT_EQ(TAVISchedDateNormalize(&date), 0);
    EXPECT_EQ(text(date), "2024-12-31 0:0 w2");
    date = {2147485547, 12, 31, 0, 0, 0}; // the largest year that there is, and past it
    EXPECT_EQ(TAVISchedDateNormalize(&date), 0);
    EXPECT_EQ(text(date), "2147485547-12-31 0:0 w3");
    // Standard time: in summer the result is an hour later.
    setenv("TZ", "CET-1CEST,M3.5.0,M10.5.0/3", 1);
    date = {2024, 7, 1, 0, 23, 30};
    EXPECT_EQ(TAVISchedDateNormalize(&date), 0);
    EXPECT_EQ(text(date), "2024-7-2 0:30 w2");
    fakes.localtimeFails = true;
    EXPECT_EQ(TAVISchedDateNormalize(&date), -1);
    EXPECT_EQ(text(date), "2024-7-2 0:30 w2");
    EXPECT_EQ(PLATCErrGet(), 0x2A00U);
    EXPECT_THAT(logs(), ElementsAre("sched_date.cpp:* localtime failed. Value too large for "
                                    "defined data type"));
    setenv("TZ", "UTC", 1);
}

TEST_F(Dates, RandomSeedIsTakenOnce) {
    TAVISchedRandInit();
    srand(1);
    const int first = rand();
    srand(1);
    EXPECT_EQ(TAVISchedRandInit(), 0);
    EXPECT_EQ(rand(), first);
}

// `start` is the start date, `run` "hour:minute", `every` and `last` repeat and last work hour.
TEST_F(Dates, NextTriggerTime) {
    enum Type { Once, Daily, Weekly, Monthly, Yearly };
    struct Case {
        int now[5];
        Type type;
        uint32_t start[3];
        uint32_t run[2];
        uint32_t every, last;
        const char *week;
        const char *expected;
    };
    constexpr uint32_t kLargest = 4294967295;
    const Case cases[] = {
        {{2024, 5, 8, 8, 0}, Daily, {}, {8, 0}, 0, 0, "", "2024-05-09 08:00"},
        {{2024, 5, 8, 7, 59}, Daily, {}, {8, 0}, 0, 0, "", "2024-05-08 08:00"},
        {{2024, 5, 8, 7, 59}, Daily, {2030, 1, 1}, {8, 0}, 0, 0, "", "2024-05-08 08:00"},
        {{2024, 5, 8, 13, 0}, Daily, {}, {8, 30}, 4, 20, "", "2024-05-08 16:30"},
        {{2024, 5, 8, 20, 29}, Daily, {}, {8, 30}, 4, 20, "", "2024-05-08 20:30"},
        {{2024, 5, 8, 20, 30}, Daily, {}, {8, 30}, 4, 20, "", "2024-05-09 08:30"},
        {{2024, 5, 8, 18, 0}, Daily, {}, {8, 0}, 5, 20, "", "2024-05-09 08:00"},
        {{2024, 5, 8, 9, 0}, Daily, {}, {8, 0}, 3, 5, "", "2024-05-09 08:00"},
        {{2024, 5, 8, 23, 59}, Daily, {}, {0, 30}, 1, kLargest, "", "2024-05-08 24:30"},
        {{2024, 5, 8, 9, 0}, Daily, {}, {8, 0}, kLargest, kLargest, "", "2024-05-09 08:00"},
        {{2024, 12, 31, 9, 0}, Daily, {}, {8, 0}, 0, 0, "", "2025-01-01 08:00"},
        {{2024, 5, 8, 9, 0}, Once, {2024, 5, 9}, {8, 0}, 0, 0, "", "2024-05-09 08:00"},
        {{2024, 5, 8, 9, 0}, Once, {2024, 5, 8}, {8, 0}, 0, 0, "", "N/A"},
        {{2024, 5, 8, 9, 0}, Once, {2024, 5, 8}, {8, 0}, 2, 12, "", "2024-05-08 10:00"},
        {{2024, 5, 8, 9, 0}, Once, {2024, 5, 7}, {10, 0}, 0, 0, "", "N/A"},
        {{2024, 5, 8, 9, 0}, Weekly, {}, {8, 0}, 0, 0, "0100010", "2024-05-10 08:00"},
        {{2024, 5, 6, 9, 0}, Weekly, {}, {8, 0}, 0, 0, "0100010", "2024-05-10 08:00"},
        {{2024, 5, 6, 7, 0}, Weekly, {}, {8, 0}, 0, 0, "0100010", "2024-05-06 08:00"},
        {{2024, 5, 8, 9, 0}, Weekly, {}, {8, 0}, 0, 0, "0001000", "2024-05-15 08:00"},
        {{2024, 5, 8, 9, 0}, Weekly, {}, {8, 0}, 0, 0, "0000000", "2024-05-16 08:00"},
        {{2024, 5, 10, 9, 0}, Monthly, {2020, 1, 15}, {8, 0}, 0, 0, "", "2024-05-15 08:00"},
        {{2024, 5, 20, 9, 0}, Monthly, {2020, 1, 15}, {8, 0}, 0, 0, "", "2024-06-15 08:00"},
        {{2024, 5, 15, 9, 0}, Monthly, {2020, 1, 15}, {8, 0}, 0, 0, "", "2024-06-15 08:00"},
        {{2024, 5, 15, 7, 0}, Monthly, {2020, 1, 15}, {8, 0}, 0, 0, "", "2024-05-15 08:00"},
        {{2024, 5, 15, 7, 0}, Monthly, {2024, 7, 15}, {8, 0}, 0, 0, "", "2024-07-15 08:00"},
        {{2024, 4, 10, 9, 0}, Monthly, {2020, 1, 31}, {8, 0}, 0, 0, "", "2024-05-01 08:00"},
        {{2024, 1, 31, 9, 0}, Monthly, {2020, 1, 31}, {8, 0}, 0, 0, "", "2024-03-02 08:00"},
        {{2024, 12, 20, 9, 0}, Monthly, {2020, 1, 15}, {8, 0}, 0, 0, "", "2025-01-15 08:00"},
        {{2025, 3, 10, 9, 0}, Yearly, {2024, 2, 29}, {8, 0}, 0, 0, "", "2026-03-01 08:00"},
        {{2025, 2, 10, 9, 0}, Yearly, {2024, 2, 20}, {8, 0}, 0, 0, "", "2025-02-20 08:00"},
        {{2025, 2, 20, 7, 0}, Yearly, {2024, 2, 20}, {8, 0}, 0, 0, "", "2025-02-20 08:00"},
    };
    setenv("TZ", "UTC", 1);
    for (const Case &c : cases) {
        SCOPED_TRACE(c.expected);
        fakes.now = localTime(c.now[0], c.now[1], c.now[2], c.now[3], c.now[4]);
        TAVI_SCHED_TASK task{};
        task.type = c.type;
        task.startYear = c.start[0];
        task.startMonth = c.start[1];
        task.startDay = c.start[2];
        task.runHour = c.run[0];
        task.runMin = c.run[1];
        task.repeatHour = c.every;
        task.lastWorkHour = c.last;
        TAVISchedCTaskSetWeek(&task, c.week);
        EXPECT_EQ(TAVISchedNextTriggerTime(&task), 0);
        EXPECT_STREQ(task.nextTriggerTime, c.expected);
    }
    EXPECT_THAT(logs(), IsEmpty());
    // In a daylight-saving period, late in the evening, a day later than the calendar says.
    setenv("TZ", "CET-1CEST,M3.5.0,M10.5.0/3", 1);
    fakes.now = localTime(2024, 7, 1, 23, 30);
    TAVI_SCHED_TASK task{};
    task.type = TAVI_SCHED_TYPE_DAILY;
    task.id = 7;
    EXPECT_EQ(TAVISchedNextTriggerTime(&task), 0);
    EXPECT_STREQ(task.nextTriggerTime, "2024-07-03 00:00");
    fakes.localtimeFails = true;
    EXPECT_EQ(TAVISchedNextTriggerTime(&task), -1);
    EXPECT_STREQ(task.nextTriggerTime, "2024-07-03 00:00");
    EXPECT_THAT(logs(), ElementsAre(HasSubstr("sched_util.cpp:* localtime failed. "),
                                    "sched_date.cpp:* get date failed. [0x2A00 sched_util.cpp:*]",
                                    "sched_date.cpp:* get trigger date failed. [7] "
                                    "[0x2A00 sched_util.cpp:*]"));
    setenv("TZ", "UTC", 1);
}

} // namespace
