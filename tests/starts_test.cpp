// The minutes at which tasks will really be started.
#include "machine.h"

namespace {

using namespace support;

constexpr const char *kNow = "2024-05-08 09:00"; // a Wednesday

void setZone(const char *zone) {
    setenv("TZ", zone, 1);
    tzset();
}

class Starts : public SchedTest {
  protected:
    // The starts of a task from a moment on, for so many days: "03-28 02:30, ...", with an "s" in
    // daylight saving time.
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
            text += (i == 0 ? "" : ", ") + std::string(moment) + (local.tm_isdst > 0 ? "s" : "");
        }
        return count < 0 ? "failed" : text;
    }
};

// Each row's moment is where the search begins.
TEST_F(Starts, AreWhenCronTakesTheLineAndTheTaskIsDue) {
    const struct {
        When when;
        int days;
    } cases[] = {
        // The minute itself counts, the one at the end does not.
        {{kNow, Daily, {}, {9, 0}, 0, 0, "", "05-08 09:00, 05-09 09:00"}, 2},
        // A start date that lies ahead.
        {{kNow, Daily, {2024, 5, 10}, {9, 0}, 0, 0, "", "05-10 09:00"}, 3},
        {{kNow, Weekly, {2024, 5, 9}, {9, 0}, 0, 0, "0111110", "05-09 09:00, 05-10 09:00"}, 4},
        // cron does not take the line of a weekly task on a start date that is not its day.
        {{kNow, Weekly, {2024, 5, 9}, {9, 0}, 0, 0, "0000010", "05-10 09:00"}, 4},
        {{kNow, Weekly, {2024, 5, 1}, {9, 0}, 0, 0, "0000000", ""}, 20},
        // Months without the day, and years.
        {{"2024-04-01 00:00", Monthly, {2024, 1, 31}, {1, 5}, 0, 0, "", "05-31 01:05"}, 80},
        {{"2025-01-01 00:00", Yearly, {2024, 2, 29}, {1, 5}, 0, 0, "", ""}, 365},
        {{"2028-01-01 00:00", Yearly, {2024, 2, 29}, {1, 5}, 0, 0, "", "02-29 01:05"}, 365},
        {{kNow, Once, {2024, 5, 9}, {1, 5}, 0, 0, "", "05-09 01:05"}, 370},
        // Several a day; the last hour counts.
        {{kNow, Daily, {}, {8, 30}, 4, 16, "", "05-08 12:30, 05-08 16:30, 05-09 08:30"}, 1},
        // What cron rejects never runs.
        {{kNow, Daily, {}, {20, 0}, 3, 26, "", ""}, 2},
        {{kNow, Daily, {}, {8, 60}, 0, 0, "", ""}, 2},
    };
    for (const auto &[when, days] : cases) {
        EXPECT_EQ(of(*taskOf(when), when.now, days), when.expected) << when.now;
    }
}

// An hour that is skipped, and one that is there twice; of tasks of every day.
TEST_F(Starts, WhereTheClockIsChanged) {
    const struct {
        const char *zone, *from;
        uint32_t run[2], every, last;
        int days;
        const char *starts;
    } cases[] = {
        {"Europe/Berlin", "2024-03-30 00:00", {2, 30}, 0, 0, 3, "03-30 02:30, 04-01 02:30s"},
        {"Europe/Berlin", "2024-10-26 12:00", {2, 30}, 1, 3, 1, "10-27 02:30s, 10-27 03:30"},
        {"America/Sao_Paulo", "2018-11-03 12:00", {0, 0}, 1, 1, 1, "11-04 01:00s"},
        {"Australia/Lord_Howe", "2024-10-05 12:00", {2, 15}, 1, 3, 1, "10-06 03:15s"},
        // Back over midnight, at 00:01.
        {"America/St_Johns", "2010-11-06 12:00", {0, 0}, 23, 23, 1, "11-06 23:00s, 11-07 00:00s"},
        {"Pacific/Apia", "2011-12-29 00:00", {5, 0}, 0, 0, 2, "12-29 05:00s, 12-31 05:00s"},
    };
    for (const auto &row : cases) {
        setZone(row.zone);
        const When when{row.from, Daily, {}, {row.run[0], row.run[1]}, row.every, row.last, ""};
        EXPECT_EQ(of(*taskOf(when), row.from, row.days), row.starts) << row.zone;
    }
    // Nothing asks a power-off whether it is due; the wake alarm is set by the clock before.
    setZone("Europe/Berlin");
    EXPECT_EQ(of(*powerTask("poweroff", 2, 30), "2024-03-31 00:00", 1), "03-31 03:00s");
    EXPECT_EQ(of(*powerTask("poweron", 2, 30), "2024-03-31 00:00", 1), "03-31 03:30s");
}

// The caller's time zone may have changed; nothing else has asked for it here.
TEST_F(Starts, AreInTheZoneOfTheMoment) {
    const Task task = taskOf({"1970-01-03 00:00", Daily, {}, {9, 0}, 0, 0, ""});
    for (const int hour : {1, 2}) {
        int64_t next = 0, first = 0;
        setenv("TZ", ("AAA-" + std::to_string(hour)).c_str(), 1);
        EXPECT_EQ(TAVISchedTaskNextStart(task.get(), 86400, &next), 1);
        setenv("TZ", "BBB-3", 1);
        EXPECT_EQ(TAVISchedTaskStarts(task.get(), 86400, 3 * 86400, &first, 1), 1);
        EXPECT_EQ(next, 86400 + (9 - hour) * 3600);
        EXPECT_EQ(first, 86400 + 6 * 3600);
    }
}

TEST_F(Starts, OfPowerSchedulesDisabledTasksAndInPieces) {
    Task task = newTask();
    task->startYear = 2030;
    task->startMonth = task->startDay = 1;
    EXPECT_EQ(of(*task, "2024-05-08 00:00", 3), "");
    task->backend = TAVI_SCHED_BACKEND_AUTOPOWER; // has no start date, and its days alone count
    TAVISchedCTaskSetWeek(task.get(), "0001000");
    task->repeatHour = task->lastWorkHour = 12; // nor has it more than one hour
    EXPECT_EQ(of(*task, "2024-05-07 00:00", 3), "05-08 00:00");
    TAVISchedCTaskSetWeek(task.get(), "1111111");
    EXPECT_EQ(of(*task, "2024-05-08 00:00", 2), "05-08 00:00, 05-09 00:00");
    task->state = TAVI_SCHED_STATE_DISABLED;
    EXPECT_EQ(of(*task, "2024-05-08 00:00", 3), "");
    task->state = TAVI_SCHED_STATE_ENABLED;
    int64_t starts[2];
    const int64_t begin = at("2024-05-08 00:01");
    EXPECT_EQ(TAVISchedTaskStarts(task.get(), begin, begin + 365 * 86400, starts, 2), 2);
    EXPECT_EQ(starts[1], at("2024-05-10 00:00"));
}

TEST_F(Starts, NextOneIsFoundHoweverFarAway) {
    const When cases[] = {
        {"2024-05-08 09:01", Daily, {}, {9, 0}, 0, 0, "", "2024-05-09 09:00"},
        {kNow, Weekly, {9990, 1, 1}, {9, 0}, 0, 0, "1000000", "9990-01-07 09:00"},
        {"2097-01-01 00:00", Yearly, {2000, 2, 29}, {9, 0}, 0, 0, "", "2104-02-29 09:00"},
        {kNow, Yearly, {2024, 2, 30}, {9, 0}, 0, 0, "", "never"},
        {kNow, Once, {2024, 5, 7}, {9, 0}, 0, 0, "", "never"},
        {kNow, Daily, {kLargest, 5, 7}, {9, 0}, 0, 0, "", "never"},
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

// The machine is off from 23:30 to 01:00; task 7 of the same application starts on Sundays at 5.
TEST_F(Starts, RemarksOnSchedules) {
    const struct {
        When when;
        const char *zone = "UTC";
    } cases[] = {
        {{kNow, Daily, {}, {9, 0}, 0, 0, "", ""}},
        {{kNow, Weekly, {}, {9, 0}, 0, 0, "0000000", "will never run"}},
        {{kNow, Once, {2024, 5, 7}, {9, 0}, 0, 0, "", ""}},
        {{kNow, Once, {2024, 6, 31}, {9, 0}, 0, 0, "", "will never run"}},
        {{kNow, Daily, {}, {22, 0}, 4, 23, "", "hours later is after hour 23"}},
        {{kNow, Daily, {}, {22, 0}, 1, 23, "", ""}},
        {{kNow, Monthly, {0, 0, 28}, {9, 0}, 0, 0, "", ""}},
        {{kNow, Monthly, {0, 0, 29}, {9, 0}, 0, 0, "", "but in leap years"}},
        {{kNow, Monthly, {0, 0, 31}, {9, 0}, 0, 0, "", "31 are passed over"}},
        {{kNow, Yearly, {0, 2, 29}, {9, 0}, 0, 0, "", "in leap years alone"}},
        {{kNow, Daily, {}, {2, 59}, 0, 0, "", "time skips 02:00 to 03:00"}, "Europe/Berlin"},
        {{kNow, Daily, {}, {3, 0}, 0, 0, "", ""}, "Europe/Berlin"},
        {{kNow, Weekly, {}, {2, 30}, 0, 0, "0111111", ""}, "Europe/Berlin"},
        {{kNow, Daily, {}, {1, 0}, 0, 0, "", "[|]its runs .* 01:00$"}},
        {{kNow, Daily, {}, {1, 1}, 0, 0, "", ""}},
        {{kNow, Monthly, {0, 0, 9}, {11, 30}, 12, 23, "", "some of its .* 23:30$"}},
        {{kNow, Weekly, {}, {5, 0}, 0, 0, "0111111", ""}},
        {{kNow, Monthly, {2099, 5, 12}, {5, 0}, 0, 0, "", ""}},
        {{kNow, Once, {2023, 5, 12}, {5, 0}, 0, 0, "", ""}},
        {{"2024-05-12 05:01", Daily, {}, {4, 0}, 1, 6, "", "first on 2024-05-19 05:00"}},
    };
    const auto tell = [](void *text, const TAVI_SCHED_REMARK *remark) {
        *static_cast<std::string *>(text) += "|" + std::string(remark->text);
        return 0;
    };
    for (const auto &c : cases) {
        setZone(c.zone);
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
        EXPECT_THAT(said, testing::ContainsRegex(c.when.expected)) << c.when.now << " " << c.zone;
        EXPECT_EQ(said.find('|'), *c.when.expected == '\0' ? std::string::npos : 0) << said;
        EXPECT_EQ(said.rfind('|'), said.find('|')) << said;
        // It is not in its own way, nor does one of another application meet it.
        seventh->runHour = task->runHour = 5;
        seventh->type = task->type = Daily;
        for (const char *const app : {"a", "b", ""}) {
            said.clear();
            TAVISchedCTaskSetApp(task.get(), app);
            TAVISchedCTaskSetApp(seventh.get(), *app == '\0' ? "" : "a");
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
        TAVISchedCTaskSetApp(tasks.back().get(), i < 48 ? "a" : "");
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
    EXPECT_EQ(TAVISchedTaskRemarks(all.data(), all.size(), nullptr, 0, tell, &said), 47);
    EXPECT_EQ(said[0], "0 1");
    EXPECT_EQ(said[6], "7 0 waits");
    EXPECT_EQ(said[46], "47 0");
}

// From the first power-off to the next power-on, over the ends of what is asked for.
TEST_F(Starts, OffHours) {
    const Task tasks[] = {powerTask("poweroff", 22, 0), powerTask("poweroff", 23, 30),
                          powerTask("poweron", 7, 0)};
    tasks[2]->week[3] = '0'; // not on Wednesdays
    const TAVI_SCHED_TASK *const all[] = {tasks[0].get(), tasks[1].get(), tasks[2].get()};
    TAVI_SCHED_SPAN spans[4];
    const int64_t begin = at("2024-05-07 06:00");
    const int64_t end = at("2024-05-08 12:00");
    ASSERT_EQ(TAVISchedOffHours(all, 3, begin, end, spans, 4), 2);
    EXPECT_EQ(spans[0].from, begin);
    EXPECT_EQ(spans[0].until, at("2024-05-07 07:00"));
    EXPECT_EQ(spans[1].from, at("2024-05-07 22:00"));
    EXPECT_EQ(spans[1].until, end);
    // Nobody knows for how long.
    EXPECT_EQ(TAVISchedOffHours(all, 2, begin, end, spans, 4), 0);
}

} // namespace
