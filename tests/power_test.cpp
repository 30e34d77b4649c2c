// Power-on and power-off schedules as tasks, next to ordinary tasks.
#include "support.h"
#include "tavisdk.h"

#include <sys/stat.h>

namespace {

using namespace support;

constexpr const char *kCheck = "/usr/tavi/bin/tavi_poweroff_feasible_check";

class Power : public SchedTest {
  protected:
    void SetUp() override {
        SchedTest::SetUp();
        ASSERT_EQ(TAVISchedBackendInit(), 0);
        fakes.now = localTime(2024, 5, 8, 9, 0); // a Wednesday
        ASSERT_EQ(shell("mountpoint -q /sys/class || { mount -n -t tmpfs class /sys/class && "
                        "mkdir -p /sys/class/rtc/rtc0; }; : > /sys/class/rtc/rtc0/wakealarm"),
                  0);
    }
    static Task powerTask(const char *what, const char *week, uint32_t hour, uint32_t minute,
                          int enabled = 1) {
        Task task = newTask();
        task->backend = TAVI_SCHED_BACKEND_AUTOPOWER;
        TAVISchedTaskGetDefault(task.get());
        TAVISchedCTaskSetAppArgs(task.get(), what);
        TAVISchedCTaskSetWeek(task.get(), week);
        task->runHour = hour;
        task->runMin = minute;
        TAVISchedCTaskSetState(task.get(), enabled);
        return task;
    }
    // Stores one; its id, or -1.
    static int32_t store(const char *what, const char *week, uint32_t hour, uint32_t minute,
                         int enabled = 1) {
        Task task = powerTask(what, week, hour, minute, enabled);
        return TAVISchedTaskCreate(task.get()) == 0 ? task->id : -1;
    }
    static std::string line(const char *times) {
        return std::string(times) + "\troot\t" + kCheck + "\n";
    }
    static std::string alarm() { return readFile("/sys/class/rtc/rtc0/wakealarm"); }
};

TEST_F(Power, BothKindsLiveNextToOrdinaryTasks) {
    storedTask();
    EXPECT_EQ(store("poweron", "0111110", 7, 30), 70620730);
    EXPECT_EQ(alarm(), "0\n" + std::to_string(localTime(2024, 5, 9, 7, 30)) + "\n");
    EXPECT_EQ(store("poweroff", "1111111", 23, 5), 91272305);
    EXPECT_EQ(store("poweroff", "1000001", 1, 0, 0), 80650100);
    EXPECT_EQ(store("poweroff", "0000000", 2, 0), 90000200);
    EXPECT_EQ(store("poweroff", "1000001", 3, 4), 90650304);
    EXPECT_EQ(store("poweron", "0111110", 7, 30), 70620730); // replaces an equal entry
    const std::string own = "0\t0\t*\t*\t*\troot\t/tmp/tavischedtask --run id=1\n";
    const std::string off = line("5\t23\t*\t*\t*") + line("4\t3\t*\t*\t0,6");
    EXPECT_EQ(readFile("/etc/crontab"), kForeignCrontab + own + off);

    TAVI_SCHED_TASK *list = nullptr;
    ASSERT_EQ(TAVISchedTaskListGet(&list, nullptr), 6);
    std::string seen;
    for (const TAVI_SCHED_TASK *task = list->next; task; task = TAVISchedTaskNext(task)) {
        seen += std::to_string(task->id) + " " + task->name + " " + task->nextTriggerTime + "; ";
    }
    EXPECT_EQ(list->id, 1);
    EXPECT_EQ(seen, "90650304 PowerOff task 3 2024-05-11 03:04; "
                    "90000200 PowerOff task 2 2024-05-16 02:00; "
                    "80650100 PowerOff task 1 2024-05-11 01:00; "
                    "91272305 PowerOff task 0 2024-05-08 23:05; "
                    "70620730 PowerOn task 0 2024-05-09 07:30; ");
    TAVISchedTaskListFree(&list);

    // A sync of either backend keeps the other's lines, in both orders.
    EXPECT_EQ(SchedBackends[0].sync(), 0);
    EXPECT_EQ(readFile("/etc/crontab"), kForeignCrontab + off + own);
    EXPECT_EQ(SchedBackends[1].sync(), 0);
    EXPECT_EQ(readFile("/etc/crontab"), kForeignCrontab + own + off);

    TAVI_SCHED_TASK task{};
    ASSERT_EQ(TAVISchedTaskGetByID(91272305, &task), 0);
    EXPECT_STREQ(task.name, "Poweroff 0");
    EXPECT_EQ(task.backend, -3);
    EXPECT_EQ(task.type, TAVI_SCHED_TYPE_DAILY);
    EXPECT_EQ(task.canRunFromUI * 10 + task.canEditName, 10);
    EXPECT_STREQ(task.action, "#schedule:power_off#");
    std::string json(163840, '\0');
    ASSERT_EQ(TAVISchedTaskConvertToJson(&task, json.data(), json.size()), 0);
    json.replace(json.find("23", json.find("run hour")), 2, "22");
    EXPECT_EQ(TAVISchedTaskSaveFromJson(json.c_str(), 0), 91272305); // edits, under a new id
    EXPECT_EQ(TAVISchedTaskGetByID(91272305, &task), -1);
    ASSERT_EQ(TAVISchedTaskGetByID(91272205, &task), 0);
    EXPECT_THAT(readFile("/etc/crontab"), HasSubstr(line("5\t22\t*\t*\t*")));
    EXPECT_EQ(TAVISchedTaskRemove(91272205), 0);
    EXPECT_EQ(SchedBackends[1].remove(91272205), 0);
    EXPECT_EQ(readFile("/etc/crontab"), kForeignCrontab + own + line("4\t3\t*\t*\t0,6"));
    EXPECT_THAT(listedIds(), ElementsAre(1, 70620730, 80650100, 90000200, 90650304));
}

TEST_F(Power, IdsAtTheEdges) {
    const std::pair<int32_t, int> cases[] = {{123, 0},       {59999999, 0},  {60000000, 1},
                                             {99999999, 1},  {100000000, 0}, {512345678, 0},
                                             {-70620730, 0}, {-1, 0}};
    TAVI_SCHED_TASK task{};
    for (const auto &[id, owned] : cases) {
        EXPECT_EQ(SchedBackends[1].owns_id(id), owned) << id;
        EXPECT_EQ(SchedBackends[1].get_by_id(id, &task), 0) << id;
        EXPECT_EQ(SchedBackends[1].remove(id), 0) << id;
    }
    // No power id: nothing changes, and the configuration is applied all the same.
    task.id = 5;
    EXPECT_EQ(SchedBackends[1].edit(&task), 0);
    EXPECT_EQ(alarm(), "0\n");
    EXPECT_THAT(listedIds(), IsEmpty());
}

TEST_F(Power, WhatDoesNotFitIsRefused) {
    EXPECT_EQ(store("PowerOn", "1111111", 1, 1), -1);
    auto lines = logs();
    EXPECT_EQ(lines[lines.size() - 2],
              "backends/backend_taviautopower.cpp:* Invalid app args for power [PowerOn]");
    EXPECT_EQ(store("poweron", "1111111", 300, 1), -1);
    EXPECT_EQ(store("poweron", "1111111", 1, 60), -1);
    lines = logs();
    EXPECT_THAT(lines[lines.size() - 2],
                HasSubstr("convert task from power schedule failed. [0x0D00"));
    EXPECT_THAT(listedIds(), IsEmpty());
    // Entries that something else wrote wrongly.
    const TAVIAUTOPOWER bad[] = {{1, 128, 1, 1}, {1, 1, 2, 3}};
    EXPECT_EQ(TAVIAutoPowerConfSet(TAVI_AUTOPOWER_KIND_OFF, 2, bad), 0);
    TAVI_SCHED_TASK *list = nullptr;
    EXPECT_EQ(SchedBackends[1].list_get(&list, nullptr), -1);
    EXPECT_EQ(logs().back(),
              "backends/backend_taviautopower.cpp:* taviautopower_get_from_psched failed.");
    EXPECT_EQ(SchedBackends[1].sync(), -1);
    EXPECT_EQ(readFile("/etc/crontab"), kForeignCrontab); // cron would ignore all of it
    EXPECT_EQ(SchedBackends[1].remove(90010203), -1);     // removed, but not applied
    EXPECT_EQ(logs().front(), "backends/backend_taviautopower.cpp:* TAVIScheduleSet Error 3328");
    writeFile("/usr/tavi/etc/auto_power", "[power off]\n000=1 2 3\n");
    EXPECT_EQ(SchedBackends[1].list_get(&list, nullptr), -1);
    EXPECT_EQ(PLATCErrGet(), 0x4000U);
}

TEST_F(Power, AFullKindKeepsWhatItHas) {
    std::vector<TAVIAUTOPOWER> entries(100, {0, 1, 2, 3});
    TAVIAutoPowerConfSet(TAVI_AUTOPOWER_KIND_ON, 100, entries.data());
    EXPECT_EQ(store("poweron", "1000000", 5, 5), 70010505);
    EXPECT_THAT(readFile("/usr/tavi/etc/auto_power"), HasSubstr("\n100=1 1 5 5\n"));
    EXPECT_EQ(TAVIAutoPowerConfGet(TAVI_AUTOPOWER_KIND_ON, 1000, entries.data()), 100);
    EXPECT_EQ(listedIds().size(), 100U);
}

TEST_F(Power, WithoutAClockOnlyArmingFails) {
    shell("rm -r /sys/class/rtc/rtc0");
    EXPECT_EQ(store("poweroff", "1000000", 5, 5), 90010505);
    EXPECT_EQ(store("poweron", "1000000", 5, 5, 0), 60010505);
    EXPECT_THAT(logs(), IsEmpty());
    EXPECT_EQ(store("poweron", "1000000", 5, 5), -1);
    EXPECT_THAT(logs(), testing::Contains(HasSubstr("power-on cannot be armed: ")));
    shell("mkdir /sys/class/rtc/rtc0");
}

TEST_F(Power, RunningAsksTheCheckProgram) {
    const std::pair<const char *, const char *> cases[] = {
        {"exit 0", "3:"}, {"echo inhibited; exit 5", "7:5"}, {"kill -9 $PPID", "6:9"}};
    Task task = powerTask("poweroff", "1111111", 1, 1);
    int code = 0;
    char comment[1024] = "";
    for (const auto &[body, result] : cases) {
        writeFile(kCheck, std::string("#!/bin/sh\necho ran >> /tmp/check\n") + body + "\n");
        chmod(kCheck, 0755);
        EXPECT_EQ(SchedBackends[1].run(task.get(), &code, comment, sizeof comment), 0);
        EXPECT_EQ(std::to_string(code) + ":" + comment, result);
    }
    TAVISchedCTaskSetAppArgs(task.get(), "poweron");
    EXPECT_EQ(SchedBackends[1].run(task.get(), &code, comment, sizeof comment), 0);
    EXPECT_EQ(std::to_string(code) + ":" + comment, "3:");
    EXPECT_EQ(readFile("/tmp/check"), "ran\nran\nran\n");
    EXPECT_EQ(SchedBackends[1].run(task.get(), &code, comment, 0), -1);
    shell(std::string("rm ") + kCheck);
}

} // namespace
