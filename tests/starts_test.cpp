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
    // On all days.
    static Task powerTask(const char *kind, uint32_t hour, uint32_t minute) {
        Task task = newTask();
        task->backend = TAVI_SCHED_BACKEND_AUTOPOWER;
        TAVISchedCTaskSetAppArgs(task.get(), kind);
        task->runHour = hour;
        task->runMin = minute;
        return task;
    }
};

// Each row's moment is where the search begins.
TEST_F(Starts, AreWhenCronTakesTheLineAndTheTaskIsDue) {
    const struct {
        When when;
        int days;
        const char *expected, *zone = "UTC";
    } cases[] = {
        // The minute itself counts, the one at the end does not.
        {{"2024-05-08 09:00", Daily, {2024, 1, 1}, {9, 0}, 0, 0, ""},
         2,
         "05-08 09:00, 05-09 09:00"},
        // A start date that lies ahead.
        {{"2024-05-08 00:00", Daily, {2024, 5, 10}, {9, 0}, 0, 0, ""}, 3, "05-10 09:00"},
        {{"2024-05-06 00:00", Weekly, {2024, 5, 8}, {9, 0}, 0, 0, "0111110"},
         4,
         "05-08 09:00, 05-09 09:00"},
        // cron does not take the line of a weekly task on a start date that is not its day.
        {{"2024-05-05 00:00", Weekly, {2024, 5, 5}, {9, 0}, 0, 0, "0100000"}, 3, "05-06 09:00"},
        {{"2024-05-05 00:00", Weekly, {2024, 5, 1}, {9, 0}, 0, 0, "0000000"}, 20, ""},
        // Months without the day, and years.
        {{"2024-04-01 00:00", Monthly, {2024, 1, 31}, {1, 5}, 0, 0, ""}, 80, "05-31 01:05"},
        {{"2025-01-01 00:00", Yearly, {2024, 2, 29}, {1, 5}, 0, 0, ""}, 365, ""},
        {{"2028-01-01 00:00", Yearly, {2024, 2, 29}, {1, 5}, 0, 0, ""}, 365, "02-29 01:05"},
        {{"2024-05-01 00:00", Once, {2024, 5, 3}, {1, 5}, 0, 0, ""}, 370, "05-03 01:05"},
        // Several a day; the last hour counts.
        {{"2024-05-08 09:00", Daily, {2024, 1, 1}, {8, 30}, 4, 16, ""},
         1,
         "05-08 12:30, 05-08 16:30, 05-09 08:30"},
        {{"2024-05-08 00:00", Daily, {2024, 1, 1}, {22, 0}, 3, 5, ""}, 1, "05-08 22:00"},
        // What cron rejects never runs.
        {{"2024-05-08 00:00", Daily, {2024, 1, 1}, {20, 0}, 3, 26, ""}, 2, ""},
        {{"2024-05-08 00:00", Daily, {2024, 1, 1}, {8, 60}, 0, 0, ""}, 2, ""},
        // An hour that is skipped, and one that is there twice.
        {{"2024-03-30 00:00", Daily, {2024, 1, 1}, {2, 30}, 0, 0, ""},
         3,
         "03-30 02:30, 04-01 02:30",
         "Europe/Berlin"},
        {{"2024-10-26 12:00", Daily, {2024, 1, 1}, {2, 30}, 1, 3, ""},
         1,
         "10-27 02:30, 10-27 03:30",
         "Europe/Berlin"},
        {{"2018-11-03 12:00", Daily, {2018, 1, 1}, {0, 0}, 1, 1, ""},
         1,
         "11-04 01:00",
         "America/Sao_Paulo"},
        {{"2024-10-05 12:00", Daily, {2024, 1, 1}, {2, 15}, 1, 3, ""},
         1,
         "10-06 03:15",
         "Australia/Lord_Howe"},
        // back over midnight, at 00:01
        {{"2010-11-06 00:00", Daily, {2010, 1, 1}, {0, 0}, 23, 23, ""},
         2,
         "11-06 00:00, 11-06 23:00, 11-07 00:00",
         "America/St_Johns"},
        {{"2011-12-29 00:00", Daily, {2011, 1, 1}, {5, 0}, 0, 0, ""},
         2,
         "12-29 05:00, 12-31 05:00",
         "Pacific/Apia"},
    };
    for (const auto &c : cases) {
        setenv("TZ", c.zone, 1);
        tzset();
        const Task task = taskOf(c.when);
        EXPECT_EQ(of(*task, c.when.now, c.days), c.expected) << c.when.now << " " << c.zone;
    }
}

TEST_F(Starts, OfPowerSchedulesDisabledTasksAndInPieces) {
    Task task = newTask();
    task->startYear = 2030;
    task->startMonth = task->startDay = 1;
    EXPECT_EQ(of(*task, "2024-05-08 00:00", 3), "");
    task->backend = TAVI_SCHED_BACKEND_AUTOPOWER; // has no start date, and its days alone count
    TAVISchedCTaskSetWeek(task.get(), "0001000");
    EXPECT_EQ(of(*task, "2024-05-07 00:00", 3), "05-08 00:00");
    TAVISchedCTaskSetWeek(task.get(), "1111111");
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

// What cron catches up after a skipped hour is not due any more, but nothing asks a power-off for
// that.
TEST_F(Starts, OfPowerSchedulesInASkippedHour) {
    setenv("TZ", "Europe/Berlin", 1);
    tzset();
    Task task = powerTask("poweroff", 2, 30);
    EXPECT_EQ(of(*task, "2024-03-31 00:00", 1), "03-31 03:00");
    TAVISchedCTaskSetAppArgs(task.get(), "poweron");
    EXPECT_EQ(of(*task, "2024-03-31 00:00", 1), "");
}

TEST_F(Starts, NextOneIsFoundHoweverFarAway) {
    const When cases[] = {
        {"2024-05-08 09:01", Daily, {}, {9, 0}, 0, 0, "", "2024-05-09 09:00"},
        {"2024-05-08 09:00", Weekly, {9990, 1, 1}, {9, 0}, 0, 0, "1000000", "9990-01-07 09:00"},
        {"2097-01-01 00:00", Yearly, {2000, 2, 29}, {9, 0}, 0, 0, "", "2104-02-29 09:00"},
        {"2024-05-08 09:00", Yearly, {2024, 2, 30}, {9, 0}, 0, 0, "", "never"},
        {"2024-05-08 09:00", Once, {2024, 5, 7}, {9, 0}, 0, 0, "", "never"},
        {"2024-05-08 09:00", Daily, {kLargest, 5, 7}, {9, 0}, 0, 0, "", "never"},
    };
    for (const When &c : cases) {
        const Task task = taskOf(c);
        int64_t start = 0;
        const int found = TAVISchedTaskNextStart(task.get(), at(c.now), &start);
        char text[64];
        const auto time = static_cast<time_t>(start);
        strftime(text, sizeof text, "%Y-%m-%d %H:%M", localtime(&time));
        EXPECT_STREQ(found == 1 ? text : found == 0 ? "never" : "failed", c.expected) << c.now;
    }
}

// The machine is off from 23:30 to 01:00; task 7 of the same application starts on Sundays at
// 05:00.
// Each is to make the one remark that ends so.
TEST_F(Starts, RemarksOnSchedules) {
    const struct {
        const char *zone;
        When when;
    } cases[] = {
        {"UTC", {"2024-05-08 09:00", Daily, {}, {9, 0}, 0, 0, "", ""}},
        {"UTC", {"2024-05-08 09:00", Weekly, {}, {9, 0}, 0, 0, "0000000", "will never run"}},
        {"UTC", {"2024-05-08 09:00", Once, {2024, 5, 7}, {9, 0}, 0, 0, "", ""}},
        {"UTC", {"2024-05-08 09:00", Once, {2024, 6, 31}, {9, 0}, 0, 0, "", "will never run"}},
        {"UTC",
         {"2024-05-08 09:00", Daily, {}, {22, 0}, 4, 23, "", "hours later is after hour 23"}},
        {"UTC", {"2024-05-08 09:00", Daily, {}, {22, 0}, 1, 23, "", ""}},
        {"UTC", {"2024-05-08 09:00", Monthly, {0, 0, 28}, {9, 0}, 0, 0, "", ""}},
        {"UTC", {"2024-05-08 09:00", Monthly, {0, 0, 29}, {9, 0}, 0, 0, "", "but in leap years"}},
        {"UTC", {"2024-05-08 09:00", Monthly, {0, 0, 31}, {9, 0}, 0, 0, "", "31 are passed over"}},
        {"UTC", {"2024-05-08 09:00", Yearly, {0, 2, 29}, {9, 0}, 0, 0, "", "in leap years alone"}},
        {"Europe/Berlin",
         {"2024-05-08 09:00", Daily, {}, {2, 59}, 0, 0, "", "time skips 02:00 to 03:00"}},
        {"Europe/Berlin", {"2024-05-08 09:00", Daily, {}, {3, 0}, 0, 0, "", ""}},
        {"Europe/Berlin", {"2024-05-08 09:00", Weekly, {}, {2, 30}, 0, 0, "0111111", ""}},
        {"UTC",
         {"2024-05-08 09:00", Daily, {}, {1, 0}, 0, 0, "", "off, first on 2024-05-09 01:00"}},
        {"UTC", {"2024-05-08 09:00", Daily, {}, {1, 1}, 0, 0, "", ""}},
        {"UTC", {"2024-05-08 09:00", Monthly, {0, 0, 9}, {11, 30}, 12, 23, "", "2024-05-09 23:30"}},
        {"UTC", {"2024-05-08 09:00", Weekly, {}, {5, 0}, 0, 0, "0111111", ""}},
        {"UTC", {"2024-05-12 05:01", Daily, {}, {4, 0}, 1, 6, "", "first on 2024-05-19 05:00"}},
    };
    const auto tell = [](void *text, const TAVI_SCHED_REMARK *remark) {
        *static_cast<std::string *>(text) += "|" + std::string(remark->text);
        return 0;
    };
    for (const auto &c : cases) {
        setenv("TZ", c.zone, 1);
        tzset();
        const Task off = powerTask("poweroff", 23, 30);
        const Task on = powerTask("poweron", 1, 0);
        Task seventh = taskOf({c.when.now, Weekly, {}, {5, 0}, 0, 0, "1000000", ""});
        Task task = taskOf(c.when);
        seventh->id = 7;
        TAVISchedCTaskSetApp(seventh.get(), "a");
        TAVISchedCTaskSetApp(task.get(), "a");
        const TAVI_SCHED_TASK *const all[] = {off.get(), seventh.get(), on.get()};
        std::string said;
        TAVISchedTaskRemarks(all, 3, task.get(), at(c.when.now), tell, &said);
        EXPECT_THAT(said, testing::EndsWith(c.when.expected)) << c.when.now << " " << c.zone;
        EXPECT_EQ(said.find('|'), *c.when.expected == '\0' ? std::string::npos : 0) << said;
        EXPECT_EQ(said.rfind('|'), said.find('|')) << said;
        // It is not in its own way, nor does one of another application meet it.
        seventh->runHour = task->runHour = 5;
        seventh->type = task->type = Daily;
        for (const char *const app : {"a", "b", ""}) {
            said.clear();
            TAVISchedCTaskSetApp(task.get(), app);
            TAVISchedTaskRemarks(all, 3, app[0] == 'a' ? seventh.get() : task.get(), at(c.when.now),
                                 tell, &said);
            EXPECT_THAT(said, testing::Not(HasSubstr("same"))) << app;
        }
    }
}

// Each of many is told of one that it meets, without a look at every pair.
TEST_F(Starts, RemarksOnManyTasksOfAnApplication) {
    std::vector<Task> tasks;
    std::vector<const TAVI_SCHED_TASK *> all;
    for (int i = 0; i < 50; ++i) {
        tasks.push_back(newTask());
        tasks.back()->id = i;
        TAVISchedCTaskSetApp(tasks.back().get(), "a");
        TAVISchedCTaskSetCanRunAppSameTime(tasks.back().get(), i != 7);
        all.push_back(tasks.back().get());
    }
    tasks[3]->state = TAVI_SCHED_STATE_DISABLED;
    std::vector<std::string> said;
    const auto tell = [](void *texts, const TAVI_SCHED_REMARK *remark) {
        static_cast<std::vector<std::string> *>(texts)->push_back(
            std::to_string(remark->task->id) + " " + std::to_string(remark->other->id) +
            (strstr(remark->text, "waits") ? " waits" : ""));
        return 0;
    };
    EXPECT_EQ(TAVISchedTaskRemarks(all.data(), all.size(), nullptr, 0, tell, &said), 49);
    EXPECT_EQ(said[0], "0 1");
    EXPECT_EQ(said[6], "7 0 waits");
    EXPECT_EQ(said[48], "49 0");
}

// From the first power-off to the next power-on, over the ends of what is asked for.
TEST_F(Starts, OffHours) {
    const Task tasks[] = {powerTask("poweroff", 22, 0), powerTask("poweroff", 23, 30),
                          powerTask("poweron", 7, 0)};
    tasks[2]->week[3] = '0'; // not on Wednesdays
    const TAVI_SCHED_TASK *const all[] = {tasks[0].get(), tasks[1].get(), tasks[2].get()};
    TAVI_SCHED_SPAN spans[4];
    ASSERT_EQ(TAVISchedOffHours(all, 3, at("2024-05-07 06:00"), at("2024-05-08 12:00"), spans, 4),
              2);
    EXPECT_EQ(spans[0].from, at("2024-05-07 06:00"));
    EXPECT_EQ(spans[0].until, at("2024-05-07 07:00"));
    EXPECT_EQ(spans[1].from, at("2024-05-07 22:00"));
    EXPECT_EQ(spans[1].until, at("2024-05-08 12:00"));
    // Nobody knows for how long.
    EXPECT_EQ(TAVISchedOffHours(all, 2, at("2024-05-07 06:00"), at("2024-05-08 12:00"), spans, 4),
              0);
}

} // namespace
