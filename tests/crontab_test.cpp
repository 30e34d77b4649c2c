// The schedule backend's lines of /etc/crontab, and that Debian's cron starts tasks from them.
#include "support.h"

#include <cstring>

namespace {

using namespace support;
using namespace std::string_literals;
using Crontab = SchedTest;
using Cron = SchedTest;

bool hasCron() {
    return access("/usr/sbin/cron", X_OK) == 0 && seteuid(1) == 0 && seteuid(0) == 0;
}

constexpr const char *kNow = "2024-05-08 09:00";

pid_t startCron() {
    const pid_t cron = start([] { return execl("/usr/sbin/cron", "cron", "-f", nullptr); });
    EXPECT_TRUE(waitFor("[ -e /var/run/crond.pid ]"));
    return cron;
}

TEST_F(Crontab, LinesOfTasks) {
    // The list's buffer ends it, in front of the entry that does not fit.
    constexpr const char *kWrapped = "0\t0,1000000000,2000000000,-1294967296,-294967296\t*\t*\t*\t";
    constexpr const char *kLong =
        "0\t100,101,102,103,104,105,106,107,108,109,110,111,112,113,114,115,116,117,118,119,120,"
        "121,122,123,124,125,126,127,128,129,130,131\t*\t*\t*\t";
    const When cases[] = {
        {kNow, Weekly, {}, {}, 0, 0, "1x00001", "0\t0\t*\t*\t0,1,6\t"},
        {kNow, Weekly, {}, {}, 0, 0, "0000000", "0\t0\t*\t*\t\t"},
        {kNow, Daily, {}, {8, 0}, 5, 20, "", "0\t8,13,18\t*\t*\t*\t"},
        {kNow, Daily, {}, {22, 0}, 3, 5, "", "0\t22\t*\t*\t*\t"},
        {kNow, Daily, {}, {}, 1000000000, kLargest, "", kWrapped},
        {kNow, Daily, {}, {100, 0}, 1, kLargest, "", kLong},
    };
    for (const When &row : cases) {
        Task task = taskOf(row);
        ASSERT_EQ(TAVISchedTaskCreate(task.get()), 0);
        EXPECT_EQ(readFile(kCrontab), std::string(kForeignCrontab) + row.expected +
                                          "root\t/tmp/tavischedtask --run id=1\n");
        TAVISchedCTaskSetState(task.get(), 0);
        EXPECT_EQ(TAVISchedTaskEdit(task.get()), 0);
        EXPECT_EQ(readFile(kCrontab), kForeignCrontab); // a disabled task has none
        EXPECT_EQ(TAVISchedTaskRemove(1), 0);
    }
    // The days behind the end of a short mask are not those of the task before.
    for (const char *const week : {"0000000", "1"}) {
        Task task = newTask();
        TAVISchedCTaskSetWeekly(task.get());
        TAVISchedCTaskSetWeek(task.get(), week);
        ASSERT_EQ(TAVISchedTaskCreate(task.get()), 0);
    }
    EXPECT_THAT(readFile(kCrontab), HasSubstr("0\t0\t*\t*\t0,1,2,3,4,5,6\troot"));
}

// Every rewrite is later by a whole second, which is what cron compares.
TEST_F(Crontab, ForeignLinesOwnerAndModeStay) {
    storedTask();
    const std::string foreign = "A=b\n\n\xff bytes \0 here\n# /tmp/other\n@daily root x"s;
    writeFile(kCrontab, "# /tmp/tavischedtask lines go\n9 9 * * * root "
                        "/tmp/tavischedtask --run id=9\n" +
                            foreign);
    const bool owned = chown(kCrontab, 0, 7) == 0;
    chmod(kCrontab, 07640);
    const time_t before = statusOf(kCrontab).st_mtim.tv_sec;
    EXPECT_EQ(TAVISchedTaskSync(), 0);
    EXPECT_GT(statusOf(kCrontab).st_mtim.tv_sec, before);
    EXPECT_EQ(readFile(kCrontab), foreign + "\n" + kOwnLine);
    EXPECT_EQ(statusOf(kCrontab).st_mode & 07777, 07640U);
    EXPECT_TRUE(!owned || statusOf(kCrontab).st_gid == 7);
    // Without a task the last line stays as it is, and again once there is nothing left to drop.
    TAVISchedTaskRemove(1);
    EXPECT_EQ(readFile(kCrontab), foreign + "\n");
    writeFile(kCrontab, "last");
    EXPECT_EQ(TAVISchedTaskSync(), 0);
    EXPECT_EQ(readFile(kCrontab), "last");
}

TEST_F(Crontab, CronIsSignalledWhenItRuns) {
    const pid_t cron = start([] { return alarm(60) + pause(); });
    writeFile("/var/run/crond.pid", std::to_string(cron) + "\n");
    storedTask();
    int status = 0;
    EXPECT_EQ(waitpid(cron, &status, 0), cron);
    EXPECT_EQ(status, SIGHUP);
    EXPECT_THAT(logs(), IsEmpty());
    EXPECT_EQ(SchedBackends[0].sync(), 0); // it is gone
    EXPECT_THAT(logs(true), ElementsAre(HasSubstr("tavischedule.cpp:245 Failed to hup crond.")));
}

// A failed rewrite answers the number of tasks, and the change counts as done.
TEST_F(Crontab, FailedRewritesKeepTheOldFile) {
    const struct {
        void (*arrange)();
        unsigned int code;
        int line;
        bool keeps; // there is an old file
    } cases[] = {
        {[] {
             shell("cp /etc/crontab /tmp; mount -n -t tmpfs -o size=16k small /etc; "
                   "cp /tmp/crontab /etc; dd if=/dev/zero of=/etc/filler bs=4k 2>/dev/null");
         },
         0x0B00, 225, true},
        {[] { shell("umount -n /etc; rm /etc/crontab; mkdir /etc/crontab"); }, 0x0900, 179, false},
        {[] { shell("rmdir /etc/crontab"); }, 0x1234, 7, false},
    };
    TAVISchedChangeBegin();
    for (int i = 0; i < 200; ++i) {
        storedTask();
    }
    ASSERT_EQ(TAVISchedChangeCommit(), 0);
    const std::string crontab = readFile(kCrontab);
    for (const auto &c : cases) {
        SCOPED_TRACE(c.line);
        c.arrange();
        PLATCErrSetEx(0x1234, "before.cpp", 7);
        EXPECT_EQ(SchedBackends[0].sync(), 200);
        EXPECT_EQ(PLATCErrGet(), c.code);
        EXPECT_EQ(PLATCErrorGetLine(), c.line);
        EXPECT_THAT(logs(true), ElementsAre(HasSubstr("cpp:280 sync task list failed. [0x")));
        EXPECT_EQ(shell("ls /etc/crontab.*"), 2);
        EXPECT_TRUE(!c.keeps || readFile(kCrontab) == crontab);
    }
}

// cron itself is given each line in a file of its own, beside a job that then runs or does not.
TEST_F(Cron, TakesTheLinesThatTheLibraryTakes) {
    std::vector<std::string> cases;
    const auto add = [&](const std::vector<std::string> &lines) {
        cases.insert(cases.end(), lines.begin(), lines.end());
    };
    add({"# any", "", "A=b", " 1 = b c", "\"A B\" = 'c'\t", "A=\"\"", "=b", "1 1 1 1 1 root x",
         "\t1 1\t1 1 1 root x", "5-3,1-5/2 */61 * jan-MAR fri-SUN root x",
         "1~5 *x 1-2-3 * 7 root x", "4294967297 007 * */4294967297 * root x", "@daily root x",
         "*/2147483647 * * * * root x", "1 1 1 1 1 root ", "1 1 1 1 1 daemon x",
         "1 1 1 1 1 root " + std::string(998, 'x')});
    const size_t taken = cases.size(); // and none of the others
    add({"A= ", "A=\v", "A='b", "A='b' c", "\"A=\"=b", "\"A==b", "A B = c"});
    add({"5/10 * * * * root x", "*/0 * * * * root x", "*/2147483648 * * * * root x",
         "60 * * * * root x", "18446744073709551616 * * * * root x", "* 24 * * * root x",
         "* * 0 * * root x", "* * * 13 * root x", "* * * january * root x", "* * * * 8 root x",
         "jan * * * * root x", "1,,2 * * * * root x", "1x * * * * root x", "-1 * * * * root x"});
    add({"* * * * root x", "* * * *\t\troot x", "1 1 1 1 1 root", "@daily root", "@Daily root x",
         "1 1 1 1 1 nosuchuser x", "1 1 1 1 1 root " + std::string(999, 'x')});
    for (size_t i = 0; i < cases.size(); ++i) {
        char reason[512] = "x";
        const int result =
            TAVISchedCrontabLineCheck(cases[i].c_str(), nullptr, reason, sizeof reason);
        EXPECT_EQ(result, i < taken ? 0 : 1) << cases[i];
        EXPECT_EQ(reason[0] == '\0', i < taken) << reason;
    }
    if (!hasCron()) {
        GTEST_SKIP() << "cron's own judgement needs root and cron";
    }
    const auto seenBy = [](size_t i) { return "/tmp/taken." + std::to_string(i); };
    for (size_t i = 0; i < cases.size(); ++i) {
        writeFile("/etc/cron.d/" + std::to_string(i),
                  cases[i] + "\n@reboot root : > " + seenBy(i) + "\n");
    }
    shell("chmod 644 /etc/cron.d/*");
    const pid_t cron = startCron();
    // The folder has no order: only when the jobs of all that are taken were seen, cron is through.
    for (size_t i = 0; i < taken; ++i) {
        EXPECT_TRUE(waitFor("[ -e " + seenBy(i) + " ]")) << cases[i];
    }
    kill(cron, SIGTERM);
    waitForChildren();
    shell("rm /etc/cron.d/*");
    for (size_t i = taken; i < cases.size(); ++i) {
        EXPECT_NE(access(seenBy(i).c_str(), F_OK), 0) << cases[i];
    }
}

TEST_F(Crontab, WhenALineIsDue) {
    const struct {
        const char *line;
        TAVI_SCHED_CRON_TIMES times;
    } kCases[] = {
        {"1-5/2,59 */12 1,31 feb-MAR 5-7 root x",
         {1ULL << 59 | 0x2A, 0x1001, 0x80000002, 0xC, 0x61}},
        {"5-3 23 */30 12 sun root x", {0, 0x800000, 0x80000002, 0x1000, 1}},
        {"0 0 1 jan,mar,may,jul,sep,nov mon,wed,fri root x", {1, 1, 2, 0xAAA, 0x2A}},
        {"@daily root x", {}},
        {"A=b", {}},
        {"60 * * * * root x", {}},
    };
    for (const auto &c : kCases) {
        TAVI_SCHED_CRON_TIMES times{1, 1, 1, 1, 1};
        char reason[64];
        TAVISchedCrontabLineCheck(c.line, &times, reason, sizeof reason);
        EXPECT_EQ(memcmp(&times, &c.times, sizeof times), 0) << c.line;
    }
    char reason[8];
    EXPECT_EQ(TAVISchedCrontabLineCheck("\x1b * * * *", nullptr, reason, sizeof reason), 1);
    EXPECT_STREQ(reason, "the min");
}

// Makes the machine's time zone one in which it is the given second of a minute now.
void setSecondOfMinute(time_t second) {
    const auto offset = static_cast<char>((second - time(nullptr) % 60 + 60) % 60);
    unlink("/etc/localtime");
    writeFile("/etc/localtime",
              "TZif" + std::string(32, '\0') + "\0\0\0\1\0\0\0\4\0\0\0"s + offset + "\0\0TST\0"s);
    unsetenv("TZ");
    tzset();
}

TEST_F(Cron, RunsADueTaskAsItsOwner) {
    if (!hasCron()) {
        GTEST_SKIP() << "needs root and cron";
    }
    chmod(kCrontab, 0644);
    setSecondOfMinute(45);
    const pid_t cron = startCron();
    // Due in the next minute, or the one after when that is about to begin.
    const time_t due = time(nullptr) + 70;
    Task task = newTask("id -un > /tmp/ran; exit 4");
    task->owner = 1;
    task->runHour = static_cast<uint32_t>(localtime(&due)->tm_hour);
    task->runMin = static_cast<uint32_t>(localtime(&due)->tm_min);
    ASSERT_EQ(TAVISchedTaskCreate(task.get()), 0);
    const char *const finished = "SELECT status_code, comment FROM task_status WHERE status_code>2";
    while (time(nullptr) < due + 90 && query(finished).empty()) {
        shell("sleep 0.1");
    }
    kill(cron, SIGTERM);
    waitForChildren();
    EXPECT_EQ(query(finished), "7 4 ");
    EXPECT_EQ(readFile("/tmp/ran"), "daemon\n");
}

} // namespace
