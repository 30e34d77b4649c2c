// Dates and next trigger times.
#include "support.h"

#include <cstdlib>

namespace {

using namespace support;

using Dates = SchedTest;

constexpr const char *kWednesday = "2024-05-08 09:00";
constexpr const char *kSummerTime = "CET-1CEST,M3.5.0,M10.5.0/3";

std::string text(const TAVI_SCHED_DATE &date) {
    char buffer[96];
    snprintf(buffer, sizeof buffer, "%u-%u-%u %u:%u w%u", date.year, date.month, date.day,
             date.hour, date.minute, date.wday);
    return buffer;
}

TEST_F(Dates, ParseTakesTheFormAndNoRange) {
    const Texts dates = {
        // to nullptr: rejected
        {"2024/3/5", "2024-3-5"}, {"2024/13/45", "2024-13-45"}, {"2024/10/", "2024-10-0"},
        {"24/3/5", nullptr},      {"202/03/05", nullptr},       {"2024-03-05", nullptr},
        {"2024/003/5", nullptr},  {"2024/3/5 ", nullptr},       {"2024//5/5", nullptr},
        {"2024/12/311", nullptr}, {"20241231", nullptr}};
    for (const auto &[given, expected] : dates) {
        TAVI_SCHED_DATE date{1, 2, 3, 4, 5, 6};
        EXPECT_EQ(TAVISchedDateParse(given, &date), expected ? 0 : -1) << given;
        EXPECT_TRUE(!expected || text(date) == std::string(expected) + " 5:6 w4") << text(date);
    }
    EXPECT_EQ(PLATCErrGet(), 0x4000U);
    EXPECT_EQ(lastLog(), "sched_util.cpp:* Bad date format: [20241231]");
    TAVI_SCHED_DATE date{};
    EXPECT_EQ(TAVISchedDateParse("2024/003/5", &date), -1);
    EXPECT_EQ(text(date), "2024-0-0 0:0 w0"); // the year is stored before the rest is looked at

    const Texts times = {{"7:5", "7:5"},      {"25:99", "25:99"}, {"075", nullptr},
                         {"07:005", nullptr}, {"123:4", nullptr}, {":12", nullptr},
                         {"7:", nullptr},     {"7.5", nullptr}};
    for (const auto &[given, expected] : times) {
        date = {};
        EXPECT_EQ(TAVISchedTimeParse(given, &date), expected ? 0 : -1) << given;
        EXPECT_EQ(text(date), "0-0-0 " + std::string(expected ? expected : "0:0") + " w0");
    }
    EXPECT_EQ(lastLog(), "sched_util.cpp:* Bad time format: [7.5]");
}

TEST_F(Dates, NormalizeCarries) {
    const auto normalized = [](TAVI_SCHED_DATE date) {
        return TAVISchedDateNormalize(&date) == 0 ? text(date) : "failed, " + text(date);
    };
    EXPECT_EQ(normalized({2024, 2, 30, 0, 23, 60}), "2024-3-2 0:0 w6");
    EXPECT_EQ(normalized({2024, 13, 0, 0, 0, 0}), "2024-12-31 0:0 w2");
    // The largest year that there is.
    EXPECT_EQ(normalized({2147485547, 12, 31, 0, 0, 0}), "2147485547-12-31 0:0 w3");
    // Standard time: in summer the result is an hour later.
    setenv("TZ", kSummerTime, 1);
    EXPECT_EQ(normalized({2024, 7, 1, 0, 23, 30}), "2024-7-2 0:30 w2");
    fail(Fault::Time, 2);
    EXPECT_EQ(normalized({2024, 7, 2, 3, 4, 5}), "failed, 2024-7-2 4:5 w3");
    EXPECT_EQ(PLATCErrGet(), 0x2A00U);
    EXPECT_THAT(logs(), ElementsAre(HasSubstr("sched_date.cpp:* localtime failed. Value too ")));
}

TEST_F(Dates, NextTriggerTime) {
    const When cases[] = {
        {"2024-05-08 08:00", Daily, {}, {8, 0}, 0, 0, "", "2024-05-09 08:00"},
        {"2024-05-08 07:59", Daily, {2030, 1, 1}, {8, 0}, 0, 0, "", "2024-05-08 08:00"},
        {"2024-05-08 13:00", Daily, {}, {8, 30}, 4, 20, "", "2024-05-08 16:30"},
        {"2024-05-08 20:29", Daily, {}, {8, 30}, 4, 20, "", "2024-05-08 20:30"},
        {"2024-05-08 20:30", Daily, {}, {8, 30}, 4, 20, "", "2024-05-09 08:30"},
        {kWednesday, Daily, {}, {8, 0}, 3, 5, "", "2024-05-09 08:00"},
        {"2024-05-08 23:59", Daily, {}, {0, 30}, 1, kLargest, "", "2024-05-08 24:30"},
        {kWednesday, Daily, {}, {8, 0}, kLargest, kLargest, "", "2024-05-09 08:00"},
        {"2024-12-31 09:00", Daily, {}, {8, 0}, 0, 0, "", "2025-01-01 08:00"},
        {kWednesday, Once, {2024, 5, 9}, {8, 0}, 0, 0, "", "2024-05-09 08:00"},
        {kWednesday, Once, {20240, 100, 9}, {kLargest, 7}, 0, 0, "", "20240-100-09 4294967295:07"},
        {kWednesday, Once, {2024, 5, 8}, {8, 0}, 0, 0, "", "N/A"},
        {kWednesday, Once, {2024, 5, 8}, {8, 0}, 2, 12, "", "2024-05-08 10:00"},
        {kWednesday, Once, {2024, 5, 7}, {10, 0}, 0, 0, "", "N/A"},
        {kWednesday, Weekly, {}, {8, 0}, 0, 0, "0100010", "2024-05-10 08:00"},
        {"2024-05-06 09:00", Weekly, {}, {8, 0}, 0, 0, "0100010", "2024-05-10 08:00"},
        {"2024-05-06 07:00", Weekly, {}, {8, 0}, 0, 0, "0100010", "2024-05-06 08:00"},
        {kWednesday, Weekly, {}, {8, 0}, 0, 0, "0001000", "2024-05-15 08:00"},
        {kWednesday, Weekly, {}, {8, 0}, 0, 0, "0000000", "2024-05-16 08:00"},
        {"2024-05-10 09:00", Monthly, {2020, 1, 15}, {8, 0}, 0, 0, "", "2024-05-15 08:00"},
        {"2024-05-20 09:00", Monthly, {2020, 1, 15}, {8, 0}, 0, 0, "", "2024-06-15 08:00"},
        {"2024-05-15 09:00", Monthly, {2020, 1, 15}, {8, 0}, 0, 0, "", "2024-06-15 08:00"},
        {"2024-05-15 07:00", Monthly, {2020, 1, 15}, {8, 0}, 0, 0, "", "2024-05-15 08:00"},
        {"2024-05-15 07:00", Monthly, {2024, 7, 15}, {8, 0}, 0, 0, "", "2024-07-15 08:00"},
        {"2024-04-10 09:00", Monthly, {2020, 1, 31}, {8, 0}, 0, 0, "", "2024-05-01 08:00"},
        {"2024-01-31 09:00", Monthly, {2020, 1, 31}, {8, 0}, 0, 0, "", "2024-03-02 08:00"},
        {"2024-12-20 09:00", Monthly, {2020, 1, 15}, {8, 0}, 0, 0, "", "2025-01-15 08:00"},
        {"2025-03-10 09:00", Yearly, {2024, 2, 29}, {8, 0}, 0, 0, "", "2026-03-01 08:00"},
        {"2025-02-10 09:00", Yearly, {2024, 2, 20}, {8, 0}, 0, 0, "", "2025-02-20 08:00"},
        {"2025-02-20 07:00", Yearly, {2024, 2, 20}, {8, 0}, 0, 0, "", "2025-02-20 08:00"},
        {"2025-02-20 09:00", Yearly, {2024, 2, 20}, {8, 0}, 0, 0, "", "2026-02-20 08:00"},
    };
    for (const When &row : cases) {
        Task task = taskOf(row);
        EXPECT_EQ(TAVISchedNextTriggerTime(task.get()), 0);
        EXPECT_STREQ(task->nextTriggerTime, row.expected) << row.now;
    }
    EXPECT_THAT(logs(), IsEmpty());
    // In a daylight-saving period, late in the evening, a day later than the calendar says.
    setenv("TZ", kSummerTime, 1);
    Task task = taskOf({"2024-07-01 23:30", Daily, {}, {}, 0, 0, "", "2024-07-03 00:00"});
    task->id = 7;
    for (const size_t failing : {0, 1, 2}) {
        fail(failing > 0 ? Fault::Time : Fault::None, failing);
        EXPECT_EQ(TAVISchedNextTriggerTime(task.get()), failing > 0 ? -1 : 0);
        EXPECT_STREQ(task->nextTriggerTime, "2024-07-03 00:00");
    }
    EXPECT_THAT(logs(),
                ElementsAre(HasSubstr("sched_util.cpp:* localtime failed. "),
                            "sched_date.cpp:* get date failed. [0x2A00 sched_util.cpp:*]",
                            HasSubstr("get trigger date failed. [7] [0x2A00 sched_util.cpp:*]"),
                            HasSubstr("sched_date.cpp:* mktime failed. "),
                            HasSubstr("date normalization failed. [0x2A00 sched_date.cpp:*]"),
                            HasSubstr("get trigger date failed. [7] [0x2A00 sched_date.cpp:*]")));
}

} // namespace
