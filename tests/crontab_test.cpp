// The schedule backend's lines of /etc/crontab.
#include "support.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace {

using namespace support;
using namespace std::string_literals;

class Crontab : public SchedTest {
  protected:
    static struct stat statusOf(const char *path) {
        struct stat status {};
        stat(path, &status);
        return status;
    }
};

TEST_F(Crontab, LinesOfTasks) {
    struct Case {
        void (*change)(TAVI_SCHED_TASK &);
        const char *line; // up to the user; nullptr: no line
    };
    const Case cases[] = {
        {[](TAVI_SCHED_TASK &t) { t.runHour = 3, t.runMin = 30; }, "30\t3\t*\t*\t*\t"},
        {[](TAVI_SCHED_TASK &t) { t.state = 0; }, nullptr},
        {[](TAVI_SCHED_TASK &t) { t.type = 2, TAVISchedCTaskSetWeek(&t, "0100010"); },
         "0\t0\t*\t*\t1,5\t"},
        {[](TAVI_SCHED_TASK &t) { t.type = 2, TAVISchedCTaskSetWeek(&t, "1x00001"); },
         "0\t0\t*\t*\t0,1,6\t"},
        {[](TAVI_SCHED_TASK &t) { t.type = 2, TAVISchedCTaskSetWeek(&t, "0000000"); },
         "0\t0\t*\t*\t\t"},
        {[](TAVI_SCHED_TASK &t) {
             t.type = 3, t.startDay = 15, t.runHour = 8, t.repeatHour = 4, t.lastWorkHour = 20;
         },
         "0\t8,12,16,20\t15\t*\t*\t"},
        {[](TAVI_SCHED_TASK &t) { t.type = 4, t.startDay = 31, t.startMonth = 12; },
         "0\t0\t31\t12\t*\t"},
        {[](TAVI_SCHED_TASK &t) { t.type = 0, t.startDay = 1, t.startMonth = 2, t.startYear = 9; },
         "0\t0\t1\t2\t*\t"},
        {[](TAVI_SCHED_TASK &t) { t.runHour = 8, t.repeatHour = 5, t.lastWorkHour = 20; },
         "0\t8,13,18\t*\t*\t*\t"},
        {[](TAVI_SCHED_TASK &t) { t.runHour = 22, t.repeatHour = 3, t.lastWorkHour = 5; },
         "0\t22\t*\t*\t*\t"},
        {[](TAVI_SCHED_TASK &t) { t.repeatHour = 1, t.lastWorkHour = 23; },
         "0\t0,1,2,3,4,5,6,7,8,9,10,11,12,13,14,15,16,17,18,19,20,21,22,23\t*\t*\t*\t"},
        // The list's buffer ends it, in front of the entry that does not fit.
        {[](TAVI_SCHED_TASK &t) { t.repeatHour = 1000000000, t.lastWorkHour = 4294967295; },
         "0\t0,1000000000,2000000000,-1294967296,-294967296\t*\t*\t*\t"},
        {[](TAVI_SCHED_TASK &t) { t.runHour = 100, t.repeatHour = 1, t.lastWorkHour = 4294967295; },
         "0\t100,101,102,103,104,105,106,107,108,109,110,111,112,113,114,115,116,117,118,119,120,"
         "121,122,123,124,125,126,127,128,129,130,131\t*\t*\t*\t"},
    };
    for (const Case &c : cases) {
        Task task = newTask();
        c.change(*task);
        ASSERT_EQ(TAVISchedTaskCreate(task.get()), 0);
        EXPECT_EQ(
            readFile("/etc/crontab"),
            std::string(kForeignCrontab) +
                (c.line ? std::string(c.line) + "root\t/tmp/tavischedtask --run id=1\n" : ""));
        EXPECT_EQ(TAVISchedTaskRemove(1), 0);
    }
}

TEST_F(Crontab, ForeignLinesOwnerAndModeStay) {
    storedTask();
    const std::string foreign = "A=b\n\n\xff bytes \0 here\n# /tmp/other\n@daily root x"s;
    const std::string own = "0\t0\t*\t*\t*\troot\t/tmp/tavischedtask --run id=1\n";
    writeFile("/etc/crontab", "# /tmp/tavischedtask lines go\n9 9 * * * root "
                              "/tmp/tavischedtask --run id=9\n" +
                                  foreign);
    chmod("/etc/crontab", 0640);
    const bool owned = chown("/etc/crontab", 0, 7) == 0;
    EXPECT_EQ(TAVISchedTaskSync(), 0);
    EXPECT_EQ(readFile("/etc/crontab"), foreign + "\n" + own);
    EXPECT_EQ(statusOf("/etc/crontab").st_mode & 07777, 0640U);
    EXPECT_TRUE(!owned || statusOf("/etc/crontab").st_gid == 7);
    // Without a task the last line stays as it is, and again once there is nothing left to drop.
    TAVISchedTaskRemove(1);
    EXPECT_EQ(readFile("/etc/crontab"), foreign + "\n");
    writeFile("/etc/crontab", "last");
    EXPECT_EQ(TAVISchedTaskSync(), 0);
    EXPECT_EQ(readFile("/etc/crontab"), "last");
}

TEST_F(Crontab, EveryRewriteIsLaterByAWholeSecond) {
    const timespec future[] = {{.tv_sec = 0, .tv_nsec = UTIME_NOW},
                               {.tv_sec = 4000000000, .tv_nsec = 999999999}};
    utimensat(AT_FDCWD, "/etc/crontab", future, 0);
    TAVISchedTaskSync();
    EXPECT_EQ(statusOf("/etc/crontab").st_mtim.tv_sec, 4000000001);
    TAVISchedTaskSync();
    EXPECT_EQ(statusOf("/etc/crontab").st_mtim.tv_sec, 4000000002);
}

TEST_F(Crontab, CronIsSignalledWhenItRuns) {
    fakes.systemIsCounted = true;
    TAVISchedTaskSync();
    EXPECT_EQ(systemCalls(), 0);
    writeFile("/var/run/crond.pid", "1\n");
    fakes.systemResult = 256;
    EXPECT_EQ(SchedBackends[0].sync(), 0);
    EXPECT_EQ(systemCalls(), 1);
    EXPECT_THAT(logs(true),
                ElementsAre("backends/backend_tavischedule.cpp:245 Failed to hup crond."));
}

// A failed rewrite answers the number of tasks, and the change counts as done.
TEST_F(Crontab, FailedRewritesKeepTheOldFile) {
    struct Case {
        const char *name;
        void (*arrange)();
        unsigned int code;
        int line;
    };
    const Case cases[] = {
        {"fsync", [] { fakes.fsyncFails = true; }, 0x0B00, 231},
        {"rename", [] { fakes.renameFails = true; }, 0x2800, 240},
        {"folder", [] { shell("rm /etc/crontab; mkdir /etc/crontab"); }, 0x0900, 179},
        {"missing", [] { shell("rmdir /etc/crontab"); }, 0x1234, 7},
    };
    storedTask();
    storedTask();
    const std::string crontab = readFile("/etc/crontab");
    logs();
    for (const Case &c : cases) {
        SCOPED_TRACE(c.name);
        c.arrange();
        PLATCErrSetEx(0x1234, "before.cpp", 7);
        EXPECT_EQ(SchedBackends[0].sync(), 2);
        fakes = {};
        EXPECT_EQ(PLATCErrGet(), c.code);
        EXPECT_EQ(PLATCErrorGetLine(), c.line);
        EXPECT_THAT(logs(true),
                    ElementsAre(HasSubstr("tavischedule.cpp:280 sync task list failed. [0x")));
        EXPECT_EQ(shell("ls /etc/crontab.*"), 2);
        if (c.code == 0x0B00 || c.code == 0x2800) {
            EXPECT_EQ(readFile("/etc/crontab"), crontab);
        }
    }
    // A full disk shows when the lines are flushed.
    writeFile("/etc/crontab", kForeignCrontab);
    ASSERT_EQ(shell("cp /etc/crontab /tmp && mount -n -t tmpfs -o size=16k small /etc && "
                    "cp /tmp/crontab /etc && dd if=/dev/zero of=/etc/filler bs=4k 2>/dev/null"),
              1);
    EXPECT_EQ(SchedBackends[0].sync(), 2);
    EXPECT_EQ(PLATCErrGet(), 0x0B00U);
    EXPECT_EQ(PLATCErrorGetLine(), 225);
    EXPECT_EQ(readFile("/etc/crontab"), kForeignCrontab);
    shell("umount -n /etc");
}

} // namespace
