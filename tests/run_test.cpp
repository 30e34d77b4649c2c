// Running tasks, with real processes.
#include "support.h"

#include <csignal>
#include <fcntl.h>
#include <grp.h>
#include <sqlite3.h>
#include <sys/stat.h>
#include <unistd.h>

namespace {

using namespace support;

class Run : public SchedTest {
  protected:
    // All rows as "task:code:comment", in the order in which they were added.
    static std::string rows() {
        std::string result;
        sqlite3 *db = TAVISchedDBInit();
        const auto append = [](void *text, int, char **values, char **) {
            *static_cast<std::string *>(text) +=
                std::string(values[0]) + ":" + values[1] + ":" + (values[2] ? values[2] : "") + " ";
            return 0;
        };
        sqlite3_exec(db, "SELECT task_id, status_code, comment FROM task_status ORDER BY status_id",
                     append, &result, nullptr);
        sqlite3_close(db);
        return result;
    }
    static void insertRunning(int task, const char *app, int pid) {
        sqlite3 *db = TAVISchedDBInit();
        sqlite3_exec(
            db,
            ("INSERT INTO task_status (pid, timestamp, app, task_id, status_code) VALUES (" +
             std::to_string(pid) + ", 1, '" + app + "', " + std::to_string(task) + ", 2)")
                .c_str(),
            nullptr, nullptr, nullptr);
        sqlite3_close(db);
    }
    // Makes a user that belongs to a second group; false without the right to become another user.
    static bool addUser() {
        if (seteuid(4242) != 0 || seteuid(0) != 0) {
            return false;
        }
        shell("grep -q ^tavitest: /etc/passwd || { "
              "echo 'tavitest:x:4242:4242::/tmp/home:/bin/false' >> /etc/passwd; "
              "echo 'tavitest:x:4242:' >> /etc/group; "
              "echo 'taviextra:x:4343:tavitest' >> /etc/group; }");
        return true;
    }
};

TEST_F(Run, CommandHasItsOwnersIdentityAndNothingElse) {
    if (!addUser()) {
        GTEST_SKIP() << "needs several users";
    }
    shell("mkdir /tmp/home && chown 4242 /tmp/home");
    clearenv();
    for (const char *name : {"SECRET", "LANG", "LC_TIME"}) {
        setenv(name, "C", 1);
    }
    setenv("TZ", "UTC", 1);
    Task task = newTask("{ grep -E '^(Uid|Gid|Groups|CapPrm):' /proc/self/status; "
                        "readlink /proc/$$/exe; pwd; ls -l /proc/$$/fd | grep -c passwd; "
                        "env | grep -v ^_= | sort; } > /tmp/home/seen");
    task->owner = 4242;
    ASSERT_EQ(TAVISchedTaskCreate(task.get()), 0);
    const int leaked = open("/etc/passwd", O_RDONLY); // not close-on-exec
    signal(SIGCHLD, SIG_IGN);
    EXPECT_EQ(TAVISchedTaskRun(1, 0, 0), 0);
    signal(SIGCHLD, SIG_DFL);
    close(leaked);
    waitForChildren();
    EXPECT_EQ(readFile("/tmp/home/seen"),
              "Uid:\t4242\t4242\t4242\t4242\nGid:\t4242\t4242\t4242\t4242\n"
              "Groups:\t4242 4343 \nCapPrm:\t0000000000000000\n/usr/bin/dash\n/tmp/home\n0\n"
              "HOME=/tmp/home\nLANG=C\nLC_TIME=C\nLOGNAME=tavitest\n"
              "PATH=/usr/local/bin:/usr/bin:/bin\nPWD=/tmp/home\nSHELL=/bin/false\nTZ=UTC\n"
              "USER=tavitest\n");
    EXPECT_EQ(rows(), "1:3: ");
    struct stat status {};
    EXPECT_EQ(stat("/tmp/sched_status.sqlite", &status), 0);
    EXPECT_EQ(status.st_uid, 0U);
    EXPECT_THAT(logs(), IsEmpty());

    // Root's own groups too, whatever the caller had.
    const gid_t strange[] = {33, 44};
    setgroups(2, strange);
    task->owner = 0;
    TAVISchedTaskEdit(task.get());
    EXPECT_EQ(TAVISchedTaskRun(1, 0, 0), 0);
    waitForChildren();
    EXPECT_THAT(readFile("/tmp/home/seen"), HasSubstr("Gid:\t0\t0\t0\t0\nGroups:\t0 \n"));
    setgroups(0, nullptr);

    // An owner that nobody knows: no command, and the row stays that of a runner that is gone.
    task->owner = 4999;
    TAVISchedTaskEdit(task.get());
    unlink("/tmp/home/seen");
    EXPECT_EQ(TAVISchedTaskRun(1, 0, 0), 0);
    waitForChildren();
    EXPECT_EQ(readFile("/tmp/home/seen"), "");
    EXPECT_EQ(rows(), "1:3: 1:3: 1:2: ");
    EXPECT_THAT(logs(), ElementsAre("sched_task_run.cpp:* Get uid [4999] failed. "
                                    "[0x0B00 user.cpp:*]",
                                    "sched_task_run.cpp:* Failed to set user context. uid:[4999] "
                                    "[0x2A00 sched_task_run.cpp:*]"));
}

TEST_F(Run, ResultsOfCommands) {
    const std::pair<const char *, const char *> cases[] = {{"exit 0", "3:"},
                                                           {"exit 2", "7:2"},
                                                           {"exit 255", "7:255"},
                                                           {"kill -9 $$", "6:9"},
                                                           {"no-such-command", "7:127"}};
    int code = 0;
    char comment[1024] = "";
    for (const auto &[command, result] : cases) {
        Task task = newTask(command);
        EXPECT_EQ(SchedBackends[0].run(task.get(), &code, comment, sizeof comment), 0);
        EXPECT_EQ(std::to_string(code) + ":" + comment, result) << command;
    }
    Task task = newTask("exit 123");
    EXPECT_EQ(SchedBackends[0].run(task.get(), &code, comment, 2), 0);
    EXPECT_STREQ(comment, "1");
    EXPECT_EQ(SchedBackends[0].run(task.get(), &code, comment, 0), -1);
    EXPECT_EQ(logs(true).back(),
              "backends/backend_tavischedule.cpp:614 Invaild Argument (0 < cbComment)=[0]\n");
}

TEST_F(Run, SkipsAndFailures) {
    Task task = storedTask("echo ran >> /tmp/out");
    EXPECT_EQ(TAVISchedTaskRun(9, 0, 0), -1);
    EXPECT_EQ(logs().back(), "sched_task_run.cpp:* get task failed. [9] "
                             "[0x2000 sched_task_get.cpp:*]");
    EXPECT_EQ(TAVISchedTaskRun(1, 2, 0), 0);
    TAVISchedCTaskSetState(task.get(), 0);
    TAVISchedTaskEdit(task.get());
    EXPECT_EQ(TAVISchedTaskRun(1, 0, 1), 0);
    waitForChildren();
    EXPECT_EQ(readFile("/tmp/out"), "");
    EXPECT_EQ(TAVISchedTaskRun(1, 0, 0), 0);
    waitForChildren();
    EXPECT_EQ(readFile("/tmp/out"), "ran\n");
    EXPECT_EQ(rows(), "1:3: ");
    task->state = TAVI_SCHED_STATE_NOT_EXISTED;
    TAVISchedTaskEdit(task.get());
    EXPECT_EQ(TAVISchedTaskRun(1, 0, 0), -1);
    EXPECT_EQ(PLATCErrGet(), 0x2000U);
    EXPECT_EQ(logs().back(), "sched_task_run.cpp:* task [1] does not exist. ");
    // A backend that cannot run its tasks leaves code 0.
    TAVISchedCTaskSetState(task.get(), 1);
    TAVISchedTaskEdit(task.get());
    auto *const operation = SchedBackends[0].run;
    SchedBackends[0].run = nullptr;
    EXPECT_EQ(TAVISchedTaskRun(1, 0, 0), 0);
    waitForChildren();
    SchedBackends[0].run = operation;
    EXPECT_EQ(rows(), "1:3: 1:0: ");
}

TEST_F(Run, DueInThisMinute) {
    struct Case {
        int now[5];
        int type;
        uint32_t start[3];
        uint32_t hour, minute, every, last;
        bool due;
    };
    const Case cases[] = {
        {{2024, 5, 8, 8, 30}, 0, {2024, 5, 8}, 8, 30, 0, 0, true},  // once, on its day
        {{2024, 5, 9, 8, 30}, 0, {2024, 5, 8}, 8, 30, 0, 0, false}, // and never after
        {{2024, 5, 8, 8, 30}, 1, {2024, 5, 9}, 8, 30, 0, 0, false}, // daily, before its start
        {{2024, 5, 9, 8, 30}, 1, {0, 0, 0}, 8, 30, 0, 0, true},     // daily
        {{2024, 5, 9, 8, 31}, 1, {0, 0, 0}, 8, 30, 0, 0, false},    // another minute
        {{2024, 5, 9, 9, 30}, 1, {0, 0, 0}, 8, 30, 0, 20, false},   // another hour
        {{2024, 5, 9, 17, 30}, 1, {0, 0, 0}, 8, 30, 3, 17, true},   // 8, 11, 14, 17
        {{2024, 5, 9, 16, 30}, 1, {0, 0, 0}, 8, 30, 3, 17, false},
        {{2024, 5, 9, 20, 30}, 1, {0, 0, 0}, 8, 30, 3, 17, false},
        {{2024, 5, 9, 11, 30}, 1, {0, 0, 0}, 8, 30, 3, 5, false}, // last before run hour
        {{2024, 5, 9, 23, 30}, 1, {0, 0, 0}, 0, 30, 1, 4294967295, true},
        {{2024, 5, 11, 8, 30}, 2, {0, 0, 0}, 8, 30, 0, 0, true},     // weekly, a Saturday
        {{2024, 5, 10, 8, 30}, 2, {0, 0, 0}, 8, 30, 0, 0, false},    // a Friday
        {{2024, 5, 10, 8, 30}, 2, {2024, 5, 10}, 8, 30, 0, 0, true}, // but its start day
        {{2024, 5, 15, 8, 30}, 3, {2024, 1, 15}, 8, 30, 0, 0, true}, // monthly
        {{2024, 5, 16, 8, 30}, 3, {2024, 1, 15}, 8, 30, 0, 0, false},
        {{2024, 5, 15, 8, 30}, 4, {2023, 5, 15}, 8, 30, 0, 0, true}, // yearly
        {{2024, 6, 15, 8, 30}, 4, {2023, 5, 15}, 8, 30, 0, 0, false},
    };
    int row = 0;
    std::string expected;
    for (const Case &c : cases) {
        fakes.now = localTime(c.now[0], c.now[1], c.now[2], c.now[3], c.now[4]);
        Task task = newTask();
        task->type = c.type;
        task->startYear = c.start[0];
        task->startMonth = c.start[1];
        task->startDay = c.start[2];
        task->runHour = c.hour;
        task->runMin = c.minute;
        task->repeatHour = c.every;
        task->lastWorkHour = c.last;
        TAVISchedCTaskSetWeek(task.get(), "1000001");
        ASSERT_EQ(TAVISchedTaskCreate(task.get()), 0);
        EXPECT_EQ(TAVISchedTaskRun(task->id, 1, 1), 0);
        waitForChildren();
        ++row;
        expected += c.due ? std::to_string(row) + ":3: " : "";
    }
    EXPECT_EQ(rows(), expected);
}

// Two runners of one task, and two tasks of one application, never have live commands at once.
TEST_F(Run, ConflictingRunsFollowEachOther) {
    const char *const command = "echo [ >> /tmp/out; sleep 0.2; echo ] >> /tmp/out";
    Task first = newTask(command);
    Task second = newTask(command);
    for (Task *task : {&first, &second}) {
        TAVISchedCTaskSetApp(task->get(), "it's");
        TAVISchedCTaskSetCanRunAppSameTime(task->get(), 0);
        ASSERT_EQ(TAVISchedTaskCreate(task->get()), 0);
    }
    fakes.pauseMicroseconds = 60000;
    for (const int id : {1, 1, 2, 1}) {
        EXPECT_EQ(TAVISchedTaskRun(id, 0, 0), 0);
    }
    waitForChildren();
    EXPECT_EQ(readFile("/tmp/out"), "[\n]\n[\n]\n[\n]\n[\n]\n");
    EXPECT_EQ(rows().size(), 4 * 5U);
    struct stat status {};
    EXPECT_EQ(stat("/tmp/lock", &status), 0);
    EXPECT_EQ(status.st_mode, S_IFDIR | 0755U);
    for (const std::string &line : logs()) {
        EXPECT_THAT(line,
                    testing::MatchesRegex("sched_task_run.cpp:. Task [12] conflict with task "
                                          "[12] .running., retry = [0-9]+, wait [0-9]+ secs."));
    }
}

TEST_F(Run, GivesUpSilentlyAfterTwentyWaits) {
    Task task = storedTask("echo ran > /tmp/out");
    insertRunning(1, "", getpid());
    EXPECT_EQ(TAVISchedTaskRun(1, 0, 0), 0);
    waitForChildren();
    const auto waits = pauses();
    const auto lines = logs();
    ASSERT_EQ(waits.size(), 20U);
    ASSERT_EQ(lines.size(), 20U);
    for (size_t i = 0; i < waits.size(); ++i) {
        EXPECT_TRUE(waits[i] >= 3000000 && waits[i] <= 30000000 && waits[i] % 3000000 == 0);
        EXPECT_EQ(lines[i], "sched_task_run.cpp:* Task 1 conflict with task 1 (running), retry = " +
                                std::to_string(i + 1) + ", wait " +
                                std::to_string(waits[i] / 1000000) + " secs.");
    }
    EXPECT_EQ(readFile("/tmp/out"), "");
    EXPECT_EQ(rows(), "1:2: ");

    // The same for a lock that cannot be had; a folder of another user's is never used.
    shell("rm -r /tmp/lock /tmp/sched_status.sqlite; ln -s /etc /tmp/lock");
    EXPECT_EQ(TAVISchedTaskRun(1, 0, 0), 0);
    waitForChildren();
    EXPECT_EQ(pauses().size(), 20U);
    EXPECT_THAT(
        logs().back(),
        testing::MatchesRegex("sched_task_run.cpp:. Lock failed .retry=20., sleep [0-9]+ secs."));
    EXPECT_EQ(shell("ls /etc/lock_sched_run /tmp/sched_status.sqlite"), 2);
    shell("rm /tmp/lock; mkdir /tmp/lock");
    if (chown("/tmp/lock", 4242, 4242) == 0) {
        EXPECT_EQ(TAVISchedTaskRun(1, 0, 0), 0);
        waitForChildren();
        EXPECT_EQ(pauses().size(), 20U);
        EXPECT_EQ(rows(), "");
    }
}

TEST_F(Run, OverlappingTasksNeedNoLock) {
    Task task = newTask("exit 1");
    TAVISchedCTaskSetCanRunTaskSameTime(task.get(), 1);
    ASSERT_EQ(TAVISchedTaskCreate(task.get()), 0);
    insertRunning(1, "", getpid());
    EXPECT_EQ(TAVISchedTaskRun(1, 0, 0), 0);
    waitForChildren();
    EXPECT_EQ(rows(), "1:2: 1:7:1 ");
    EXPECT_NE(access("/tmp/lock", F_OK), 0);
}

} // namespace
