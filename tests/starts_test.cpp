// The minutes at which tasks will really be started.
#include "support.h"

namespace {

using namespace support;

class Starts : public SchedTest {
  protected:
    // The starts of a task from a moment on, for so many days: "03-28 02:30, ...".
    static std::string of(const TAVI_SCHED_TASK &task, const char *from, int days) {
        int64_t starts[400];
        const int64_t begin = at(from);
        const int count =
            TAVISchedTaskStarts(&task, begin, begin + int64_t{days} * 86400, starts, 400);
        std::string text;
        for (int i = 0; i < count; ++i) {
            char moment[64];
            const auto start = static_cast<time_t>(starts[i]);
            tm local{};
            strftime(moment, sizeof moment, "%m-%d %R", localtime_r(&start, &local));
            text += (i == 0 ? "" : ", ") + std::string(moment);
        }
        return count < 0 ? "failed" : text;
    }
};

// Each row's moment is where the search begins.
TEST_F(Starts, AreWhenCronTakesTheLineAndTheTaskIsDue) {
    const struct {
        const char *zone;
        When when;
        int days;
    } cases[] = {
        // The minute itself counts, the one at the end does not.
        {"UTC",
         {"2024-05-08 09:00", Daily, {2024, 1, 1}, {9, 0}, 0, 0, "", "05-08 09:00, 05-09 09:00"},
         2},
        // A start date that lies ahead.
        {"UTC", {"2024-05-08 00:00", Daily, {2024, 5, 10}, {9, 0}, 0, 0, "", "05-10 09:00"}, 3},
        {"UTC",
         {"2024-05-06 00:00",
          Weekly,
          {2024, 5, 8},
          {9, 0},
          0,
          0,
          "0111110",
          "05-08 09:00, 05-09 09:00"},
         4},
        // cron does not take the line of a weekly task on a start date that is not its day.
        {"UTC",
         {"2024-05-05 00:00", Weekly, {2024, 5, 5}, {9, 0}, 0, 0, "0100000", "05-06 09:00"},
         3},
        {"UTC", {"2024-05-05 00:00", Weekly, {2024, 5, 1}, {9, 0}, 0, 0, "0000000", ""}, 20},
        // Months without the day, and years.
        {"UTC", {"2024-04-01 00:00", Monthly, {2024, 1, 31}, {1, 5}, 0, 0, "", "05-31 01:05"}, 80},
        {"UTC", {"2025-01-01 00:00", Yearly, {2024, 2, 29}, {1, 5}, 0, 0, "", ""}, 365},
        {"UTC", {"2028-01-01 00:00", Yearly, {2024, 2, 29}, {1, 5}, 0, 0, "", "02-29 01:05"}, 365},
        {"UTC", {"2024-05-01 00:00", Once, {2024, 5, 3}, {1, 5}, 0, 0, "", "05-03 01:05"}, 370},
        // Several a day; the last hour counts.
        {"UTC",
         {"2024-05-08 09:00",
          Daily,
          {2024, 1, 1},
          {8, 30},
          4,
          16,
          "",
          "05-08 12:30, 05-08 16:30, 05-09 08:30"},
         1},
        {"UTC", {"2024-05-08 00:00", Daily, {2024, 1, 1}, {22, 0}, 3, 5, "", "05-08 22:00"}, 1},
        // What cron rejects never runs.
        {"UTC", {"2024-05-08 00:00", Daily, {2024, 1, 1}, {20, 0}, 3, 26, "", ""}, 2},
        {"UTC", {"2024-05-08 00:00", Daily, {2024, 1, 1}, {8, 60}, 0, 0, "", ""}, 2},
        // An hour that is skipped, and one that is there twice.
        {"Europe/Berlin",
         {"2024-03-30 00:00", Daily, {2024, 1, 1}, {2, 30}, 0, 0, "", "03-30 02:30, 04-01 02:30"},
         3},
        {"Europe/Berlin",
         {"2024-10-26 12:00", Daily, {2024, 1, 1}, {2, 30}, 1, 3, "", "10-27 02:30, 10-27 03:30"},
         1},
        {"America/Sao_Paulo",
         {"2018-11-03 12:00", Daily, {2018, 1, 1}, {0, 0}, 1, 1, "", "11-04 01:00"},
         1},
        {"Australia/Lord_Howe",
         {"2024-10-05 12:00", Daily, {2024, 1, 1}, {2, 15}, 1, 3, "", "10-06 03:15"},
         1},
        {"Pacific/Apia",
         {"2011-12-29 00:00", Daily, {2011, 1, 1}, {5, 0}, 0, 0, "", "12-29 05:00, 12-31 05:00"},
         2},
    };
    for (const auto &c : cases) {
        setenv("TZ", c.zone, 1);
        tzset();
        const Task task = taskOf(c.when);
        EXPECT_EQ(of(*task, c.when.now, c.days), c.when.expected) << c.when.now << " " << c.zone;
    }
}

TEST_F(Starts, OfPowerSchedulesDisabledTasksAndInPieces) {
    Task task = newTask();
    TAVISchedCTaskSetWeek(task.get(), "1111111");
    task->startYear = 2030;
    task->startMonth = task->startDay = 1;
    EXPECT_EQ(of(*task, "2024-05-08 00:00", 3), "");
    task->backend = TAVI_SCHED_BACKEND_AUTOPOWER; // has no start date
    EXPECT_EQ(of(*task, "2024-05-08 00:00", 2), "05-08 00:00, 05-09 00:00");
    task->state = TAVI_SCHED_STATE_DISABLED;
    EXPECT_EQ(of(*task, "2024-05-08 00:00", 3), "");
    task->state = TAVI_SCHED_STATE_ENABLED;
    int64_t starts[2];
    EXPECT_EQ(
        TAVISchedTaskStarts(task.get(), at("2024-05-08 00:01"), at("2025-05-08 00:01"), starts, 2),
        2);
    EXPECT_EQ(starts[1], at("2024-05-10 00:00"));
    EXPECT_EQ(failure(TAVISchedTaskStarts(nullptr, 0, 1, starts, 2)), 0x0D00U);
    EXPECT_EQ(failure(TAVISchedTaskStarts(task.get(), 0, 1, nullptr, 2)), 0x0D00U);
    EXPECT_EQ(failure(TAVISchedTaskStarts(task.get(), 0, 1, starts, 0)), 0x0D00U);
}

} // namespace
