// Power-on and power-off schedules as tasks, next to ordinary tasks.
#include "machine.h"
#include "tavisdk.h"

namespace {

using namespace support;

constexpr const char *kCheck = "/usr/tavi/bin/tavi_poweroff_feasible_check";
constexpr unsigned int kBackend = 1; // its row

class Power : public SchedTest {
  protected:
    void SetUp() override {
        SchedTest::SetUp();
        ASSERT_EQ(TAVISchedBackendInit(), 0);
        faults().now = at("2024-05-08 09:00"); // a Wednesday
        ASSERT_EQ(shell("mountpoint -q /sys/class || { mount -n -t tmpfs class /sys/class && "
                        "mkdir -p /sys/class/rtc/rtc0; }; : > /sys/class/rtc/rtc0/wakealarm"),
                  0);
    }
    // Stores one; its id, or -1.
    static int32_t store(const char *what, const char *week, int hour, int minute,
                         int enabled = 1) {
        const Task task = powerTask(what, hour, minute);
        TAVISchedCTaskSetWeek(task.get(), week);
        TAVISchedCTaskSetState(task.get(), enabled);
        return TAVISchedTaskCreate(task.get()) == 0 ? task->id : -1;
    }
    static std::string line(const char *times) {
        return std::string(times) + "\troot\t" + kCheck + "\n";
    }
    static std::string alarm() { return readFile("/sys/class/rtc/rtc0/wakealarm"); }

    TAVI_SCHED_BACKEND_RECORD &row_ = SchedBackends[kBackend];
};

TEST_F(Power, BothKindsLiveNextToOrdinaryTasks) {
    storedTask();
    EXPECT_EQ(store("poweron", "0111110", 7, 30), 70620730);
    EXPECT_EQ(alarm(), "0\n" + std::to_string(at("2024-05-09 07:30")) + "\n");
    EXPECT_EQ(store("poweroff", "1111111", 23, 5), 91272305);
    EXPECT_EQ(store("poweroff", "1000001", 1, 0, 0), 80650100);
    EXPECT_EQ(store("poweroff", "0000000", 2, 0), 90000200);
    EXPECT_EQ(store("poweroff", "1000001", 3, 4), 90650304);
    EXPECT_EQ(store("poweron", "0111110", 7, 30), 70620730); // replaces an equal entry
    const std::string foreign = kForeignCrontab;
    const std::string off = line("5\t23\t*\t*\t*") + line("4\t3\t*\t*\t0,6");
    EXPECT_EQ(readFile(kCrontab), foreign + kOwnLine + off);

    TAVI_SCHED_TASK *list = nullptr;
    ASSERT_EQ(TAVISchedTaskListGet(&list, nullptr), 6);
    std::string seen;
    for (const TAVI_SCHED_TASK *task = list; task; task = TAVISchedTaskNext(task)) {
        seen += std::to_string(task->id) + " " + task->name + " " + task->nextTriggerTime + "; ";
    }
    EXPECT_EQ(seen, "1 Task 1 2024-05-09 00:00; "
                    "90650304 PowerOff task 3 2024-05-11 03:04; "
                    "90000200 PowerOff task 2 2024-05-16 02:00; "
                    "80650100 PowerOff task 1 2024-05-11 01:00; "
                    "91272305 PowerOff task 0 2024-05-08 23:05; "
                    "70620730 PowerOn task 0 2024-05-09 07:30; ");
    TAVISchedTaskListFree(&list);

    // A sync of either backend keeps the other's lines, in both orders.
    EXPECT_EQ(SchedBackends[0].sync(), 0);
    EXPECT_EQ(readFile(kCrontab), foreign + off + kOwnLine);
    EXPECT_EQ(row_.sync(), 0);
    EXPECT_EQ(readFile(kCrontab), foreign + kOwnLine + off);

    TAVI_SCHED_TASK task{};
    ASSERT_EQ(TAVISchedTaskGetByID(91272305, &task), 0);
    EXPECT_STREQ(task.name, "Poweroff 0");
    EXPECT_EQ(task.backend, -3);
    EXPECT_EQ(task.type, Daily);
    EXPECT_EQ(task.canRunFromUI * 10 + task.canEditName, 10);
    EXPECT_STREQ(task.action, "#schedule:power_off#");
    std::string json(163840, '\0');
    ASSERT_EQ(TAVISchedTaskConvertToJson(&task, json.data(), json.size()), 0);
    json.replace(json.find("23", json.find("run hour")), 2, "22");
    EXPECT_EQ(TAVISchedTaskSaveFromJson(json.c_str(), 0), 91272305); // edits, under a new id
    EXPECT_THAT(readFile(kCrontab), HasSubstr(line("5\t22\t*\t*\t*")));
    EXPECT_EQ(TAVISchedTaskRemove(91272205), 0);
    EXPECT_EQ(row_.remove(91272205), 0);
    EXPECT_EQ(readFile(kCrontab), foreign + kOwnLine + line("4\t3\t*\t*\t0,6"));
    EXPECT_THAT(listedIds(), ElementsAre(1, 70620730, 80650100, 90000200, 90650304));
}

TEST_F(Power, IdsAtTheEdges) {
    const std::pair<int32_t, int> cases[] = {{123, 0},       {59999999, 0},  {60000000, 1},
                                             {99999999, 1},  {100000000, 0}, {512345678, 0},
                                             {-70620730, 0}, {-1, 0}};
    TAVI_SCHED_TASK task{};
    for (const auto &[id, owned] : cases) {
        EXPECT_EQ(row_.owns_id(id), owned) << id;
        EXPECT_EQ(row_.get_by_id(id, &task), 0) << id;
        EXPECT_EQ(row_.remove(id), 0) << id;
    }
    // No power id: nothing changes, and the configuration is applied all the same.
    task.id = 5;
    EXPECT_EQ(row_.edit(&task), 0);
    EXPECT_EQ(alarm(), "0\n");
    EXPECT_THAT(listedIds(), IsEmpty());
}

TEST_F(Power, WhatDoesNotFitIsRefused) {
    EXPECT_EQ(store("PowerOn", "1111111", 1, 1), -1);
    EXPECT_THAT(logs(), Contains(HasSubstr("Invalid app args for power [PowerOn]")));
    for (const auto &[hour, minute] : {std::pair{300, 1}, std::pair{1, 60}}) {
        EXPECT_EQ(failure(store("poweron", "1111111", hour, minute)), 0x0D00U);
    }
    EXPECT_THAT(listedIds(), IsEmpty());
    // Entries that something else wrote wrongly.
    const TAVIAUTOPOWER bad[] = {{1, 128, 1, 1}, {1, 1, 2, 3}};
    EXPECT_EQ(TAVIAutoPowerConfSet(TAVI_AUTOPOWER_KIND_OFF, 2, bad), 0);
    TAVI_SCHED_TASK *list = nullptr;
    EXPECT_EQ(row_.list_get(&list, nullptr), -1);
    EXPECT_THAT(lastLog(), HasSubstr("taviautopower_get_from_psched failed."));
    EXPECT_EQ(row_.sync(), -1);
    EXPECT_EQ(readFile(kCrontab), kForeignCrontab); // cron would ignore all of it
    EXPECT_EQ(row_.remove(90010203), -1);           // removed, but not applied
    const auto lines = logs();
    EXPECT_THAT(lines.front(), HasSubstr("TAVIScheduleSet Error 3328"));
    EXPECT_THAT(lines, Contains(HasSubstr("Set Power Off Schedule ERROR! [0x0D00 ")));
    // 263 must not become 7, a gap must not hide what is behind it.
    for (const std::string entry : {"000=1 2 3", "000=1 127 263 30", "000=-1 127 7 30",
                                    "000=1  2 3 4", "000=1 2 3 4 ", "001=1 2 3 4"}) {
        writeFile(kPower, "[power off]\n000=1 1 1 1\n[power on]\n" + entry + "\n");
        EXPECT_EQ(failure(row_.list_get(&list, nullptr)), 0x4000U) << entry;
    }
}

// Entries of every kind of writer: the time for which the clock is armed, and the times of the
// crontab's line; with none for it, "" where that is no failure.
TEST_F(Power, EntriesAsTheyAreApplied) {
    const struct {
        TAVIAUTOPOWER entry;
        const char *alarm, *times;
    } cases[] = {
        {{1, 64, 9, 1}, "2024-03-30 09:01", "1\t9\t*\t*\t6"},
        {{1, 64, 9, 0}, "2024-04-06 09:00", "0\t9\t*\t*\t6"},
        {{1, 65, 9, 0}, "2024-03-31 09:00", "0\t9\t*\t*\t0,6"},
        {{1, 127, 23, 59}, "2024-03-30 23:59", "59\t23\t*\t*\t*"},
        {{1, 127, 24, 0}, nullptr, nullptr},
        {{1, 127, 23, 60}, nullptr, nullptr},
        {{1, 0, 7, 30}, nullptr, ""},
        {{0, 127, 7, 30}, nullptr, ""},
        {{2, 127, 7, 30}, nullptr, "30\t7\t*\t*\t*"},
    };
    setenv("TZ", "CET-1CEST,M3.5.0,M10.5.0/3", 1); // summer begins on Sunday, 31 March
    tzset();
    faults().now = at("2024-03-30 09:00");
    for (const auto &c : cases) {
        writeFile(kCrontab, kForeignCrontab);
        writeFile("/sys/class/rtc/rtc0/wakealarm", "");
        for (const int kind : {TAVI_AUTOPOWER_KIND_ON, TAVI_AUTOPOWER_KIND_OFF}) {
            EXPECT_EQ(TAVIAutoPowerConfSet(kind, 1, &c.entry), 0);
        }
        EXPECT_EQ(row_.sync(), c.times ? 0 : -1);
        EXPECT_EQ(alarm(), c.alarm ? "0\n" + std::to_string(at(c.alarm)) + "\n" : "0\n");
        EXPECT_EQ(readFile(kCrontab), kForeignCrontab + (c.times && *c.times ? line(c.times) : ""));
    }
}

// No configuration and no cron is one thing; not being able to tell is another.
TEST_F(Power, WhatCannotBeLookedAtIsNotTakenForMissing) {
    TAVIAUTOPOWER entry{1, 127, 7, 30};
    for (const int kind : {TAVI_AUTOPOWER_KIND_ON, TAVI_AUTOPOWER_KIND_OFF}) {
        EXPECT_EQ(TAVIAutoPowerConfGet(kind, 1, &entry), 0);
    }
    EXPECT_EQ(TAVIUpdateCrontab("true", 1, 1), 0);
    for (const char *const path : {kPower, "/var/run/crond.pid"}) {
        EXPECT_EQ(symlink(path, path), 0); // a loop
    }
    EXPECT_EQ(failure(TAVIAutoPowerConfGet(TAVI_AUTOPOWER_KIND_ON, 1, &entry)), 0x2700U);
    EXPECT_EQ(failure(TAVIAutoPowerConfSet(TAVI_AUTOPOWER_KIND_ON, 1, &entry)), 0x2700U);
    EXPECT_EQ(failure(TAVIAutoPoweronSet()), 0x2700U);
    EXPECT_TRUE(S_ISLNK(statusOf(kPower).st_mode));
    EXPECT_EQ(failure(TAVIUpdateCrontab("true", 0, 1)), 0x2700U);
    EXPECT_THAT(lastLog(), HasSubstr("cron cannot be told: /var/run/crond.pid cannot be read"));
    EXPECT_EQ(readFile(kCrontab), kForeignCrontab);
}

TEST_F(Power, SchedulesAreWholeLinesThatCronTakes) {
    TAVISCHEDULE schedule{};
    schedule.weekBits = 127;
    schedule.minute = 15;
    const std::string longest(998, 'x');
    (longest + "x").copy(schedule.szCommand, 999);
    EXPECT_EQ(failure(TAVIScheduleSet(&schedule, 1)), 0x0D00U);
    schedule.szCommand[998] = '\0';
    EXPECT_EQ(TAVIScheduleSet(&schedule, 1), 0);
    schedule.szCommand[1] = '\0';
    schedule.minute = 5;
    EXPECT_EQ(TAVIScheduleSet(&schedule, 1), 0);
    EXPECT_EQ(TAVIScheduleSet(&schedule, 0), 0); // not the one that only ends like it
    EXPECT_EQ(readFile(kCrontab), kForeignCrontab + ("15\t0\t*\t*\t*\troot\t" + longest + "\n"));
}

TEST_F(Power, WithoutAClockOnlyArmingFails) {
    shell("rm -r /sys/class/rtc/rtc0");
    EXPECT_EQ(store("poweroff", "1000000", 5, 5), 90010505);
    EXPECT_EQ(store("poweron", "1000000", 5, 5, 0), 60010505);
    EXPECT_THAT(logs(), IsEmpty());
    EXPECT_EQ(store("poweron", "1000000", 5, 5), -1);
    EXPECT_THAT(logs(), Contains(HasSubstr("power-on cannot be armed: ")));
    TAVI_SCHED_TASK task{};
    EXPECT_EQ(TAVISchedTaskGetByID(60010505, &task), 0);
    EXPECT_EQ(TAVISchedTaskEdit(&task), -1);
    EXPECT_THAT(logs(), Contains(HasSubstr("sync hw autopower failed. [0x0900")));
    shell("mkdir /sys/class/rtc/rtc0");
}

TEST_F(Power, RunningAsksTheCheckProgram) {
    Task task = newTask();
    const Texts cases = {
        {"exit 0", "3:"}, {"echo inhibited; exit 5", "7:5"}, {"kill -9 $PPID", "6:9"}};
    for (const auto &[body, result] : cases) {
        TAVISchedCTaskSetAppArgs(task.get(), "poweroff");
        writeFile(kCheck, std::string("#!/bin/sh\necho ran >> /tmp/check\n") + body);
        chmod(kCheck, 0755);
        EXPECT_EQ(resultOf(kBackend, task), result);
        TAVISchedCTaskSetAppArgs(task.get(), "poweron"); // asks nobody
        EXPECT_EQ(resultOf(kBackend, task), "3:");
    }
    EXPECT_EQ(readFile("/tmp/check"), "ran\nran\nran\n");
    EXPECT_EQ(resultOf(kBackend, task, 0), "failed");
    shell(std::string("rm ") + kCheck);
}

} // namespace
