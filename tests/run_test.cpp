// Running tasks, with real processes.
#include "machine.h"

#include <array>
#include <fcntl.h>
#include <grp.h>
#include <sys/file.h>
#include <sys/socket.h>

namespace {

using namespace support;

class Run : public SchedTest {
  protected:
    // Runs to the end of the detached child.
    static int run(int32_t id, int32_t mode = 0, int32_t enabledOnly = 0) {
        const int result = TAVISchedTaskRun(id, mode, enabledOnly);
        waitForChildren();
        return result;
    }
    // All rows as "task:code:comment", in the order in which they were added.
    static std::string rows() {
        return query("SELECT task_id || ':' || status_code || ':' || ifnull(comment, '') "
                     "FROM task_status ORDER BY status_id");
    }
    // A set of signals as the kernel tells it: "SigBlk", "SigIgn".
    static unsigned long long signals(const std::string &process, const std::string &set) {
        const std::string status = readFile("/proc/" + process + "/status");
        return std::stoull(status.substr(status.find(set + ":") + set.size() + 1), nullptr, 16);
    }
};

TEST_F(Run, CommandHasItsOwnersIdentityAndNothingElse) {
    if (seteuid(4242) != 0 || seteuid(0) != 0) {
        GTEST_SKIP() << "needs several users";
    }
    // A user that belongs to a second group.
    shell("grep -q ^tavitest: /etc/passwd || { "
          "echo 'tavitest:x:4242:4242::/tmp/home:/bin/false' >> /etc/passwd; "
          "echo 'tavitest:x:4242:\ntaviextra:x:4343:tavitest' >> /etc/group; }; "
          "mkdir /tmp/home; chown 4242 /tmp/home");
    clearenv();
    for (const char *name : {"SECRET", "LANG", "LC_TIME"}) {
        setenv(name, "C", 1);
    }
    setenv("TZ", "UTC", 1);
    // What takes the shell's place has its mask; what the shell starts has a cleared one. Of ours
    // it has the pipe that is its output, and nothing else.
    Task task = newTask("{ (exec grep -E '^(Uid|Gid|Groups|CapPrm|SigBlk|SigIgn):' "
                        "/proc/self/status); readlink /proc/$$/exe; pwd; "
                        "env | grep -v ^_= | sort; } > /tmp/home/seen; readlink /proc/$$/fd/*; "
                        "echo named > /dev/stderr; ! ls /var/lib/tavischeduler");
    task->owner = 4242;
    ASSERT_EQ(TAVISchedTaskCreate(task.get()), 0);
    std::array<char, 32> ignored{}; // by this program, so by the command too
    snprintf(ignored.data(), ignored.size(), "%016llx", signals("self", "SigIgn"));
    signal(SIGCHLD, SIG_IGN);
    EXPECT_EQ(run(1), 0);
    signal(SIGCHLD, SIG_DFL);
    EXPECT_EQ(readFile("/tmp/home/seen"),
              "Uid:\t4242\t4242\t4242\t4242\nGid:\t4242\t4242\t4242\t4242\n"
              "Groups:\t4242 4343 \nSigBlk:\t0000000000000000\nSigIgn:\t" +
                  std::string(ignored.data()) +
                  "\nCapPrm:\t0000000000000000\n/usr/bin/dash\n/tmp/home\n"
                  "HOME=/tmp/home\nLANG=C\nLC_TIME=C\nLOGNAME=tavitest\n"
                  "PATH=/usr/local/bin:/usr/bin:/bin\nPWD=/tmp/home\nSHELL=/bin/false\n"
                  "TAVI_RUN_ID=1\nTAVI_TASK_ID=1\nTAVI_TASK_NAME=Task 1\nTZ=UTC\nUSER=tavitest\n");
    EXPECT_THAT(readFile("/var/lib/tavischeduler/output/1"),
                testing::MatchesRegex("/dev/null\n(pipe:.[0-9]+.)\n(pipe:.[0-9]+.)\nnamed\n"
                                      "ls: cannot open directory .*"));
    EXPECT_EQ(shell("find /var/lib/tavischeduler ! -user root -o ! -group root -o -perm /077 ! "
                    "-name 'runs.sqlite*' | grep ."),
              1);
    EXPECT_EQ(rows(), "1:3: ");
    EXPECT_EQ(statusOf("/tmp/sched_status.sqlite").st_uid, 0U);
    EXPECT_THAT(logs(), IsEmpty());

    // Root's own groups too, whatever the caller had.
    const gid_t strange = 33;
    setgroups(1, &strange);
    task->owner = 0;
    TAVISchedTaskEdit(task.get());
    EXPECT_EQ(run(1), 0);
    EXPECT_THAT(readFile("/tmp/home/seen"), HasSubstr("Gid:\t0\t0\t0\t0\nGroups:\t0 \n"));
    setgroups(0, nullptr);
}

TEST_F(Run, ResultsOfCommands) {
    const Texts cases = {
        {"exit 255", "7:255"}, {"kill -9 $$", "6:9"}, {"! ls -l /proc/$$/fd | grep passwd", "3:"}};
    const int leaked = open("/etc/passwd", O_RDONLY); // not close-on-exec
    const int high = fcntl(leaked, F_DUPFD, 1000);
    for (const auto &[command, result] : cases) {
        EXPECT_EQ(resultOf(0, newTask(command)), result) << command;
    }
    close(leaked);
    close(high);
    EXPECT_EQ(resultOf(0, newTask("exit 123"), 2), "7:1");
    EXPECT_EQ(resultOf(0, newTask("exit 123"), 0), "failed");
}

TEST_F(Run, SkipsAndFailures) {
    Task task = storedTask("echo ran >> /tmp/out");
    const auto change = [&](int32_t state) {
        task->state = state;
        TAVISchedTaskEdit(task.get());
    };
    EXPECT_EQ(run(9), -1);
    EXPECT_THAT(lastLog(), HasSubstr("get task failed. [9] [0x2000 sched_task_get.cpp:*]"));
    change(TAVI_SCHED_STATE_NOT_EXISTED);
    EXPECT_EQ(failure(run(1)), 0x2000U);
    EXPECT_EQ(lastLog(), "sched_task_run.cpp:* task [1] does not exist. ");
    change(TAVI_SCHED_STATE_DISABLED); // but not for people
    EXPECT_EQ(run(1), 0);
    // A backend that cannot run its tasks leaves code 0.
    auto *const operation = std::exchange(SchedBackends[0].run, nullptr);
    EXPECT_EQ(run(1), 0);
    SchedBackends[0].run = operation;
    EXPECT_EQ(readFile("/tmp/out"), "ran\n");
    EXPECT_EQ(rows(), "1:3: 1:0: ");
}

TEST_F(Run, DueInThisMinute) {
    const When cases[] = {
        {"2024-05-08 08:30", Once, {2024, 5, 8}, {8, 30}, 0, 0, "", "due"},
        {"2024-05-09 08:30", Once, {2024, 5, 8}, {8, 30}, 0, 0, "", ""},  // never after its day
        {"2024-05-08 08:30", Daily, {2024, 5, 9}, {8, 30}, 0, 0, "", ""}, // before its start
        {"2024-05-09 08:30", Daily, {}, {8, 30}, 0, 0, "", "due"},
        {"2024-05-09 08:30", Daily, {2024, 5, 9}, {8, 30}, 0, 0, "", "due"},
        {"2024-05-09 08:31", Daily, {}, {8, 30}, 0, 0, "", ""},     // another minute
        {"2024-05-09 09:30", Daily, {}, {8, 30}, 0, 20, "", ""},    // another hour
        {"2024-05-09 17:30", Daily, {}, {8, 30}, 3, 17, "", "due"}, // 8, 11, 14, 17
        {"2024-05-09 16:30", Daily, {}, {8, 30}, 3, 17, "", ""},
        {"2024-05-11 08:30", Weekly, {}, {8, 30}, 0, 0, "1000001", "due"}, // a Saturday
        {"2024-05-10 08:30", Weekly, {}, {8, 30}, 0, 0, "1000001", ""},
        {"2024-05-10 08:30", Weekly, {2024, 5, 10}, {8, 30}, 0, 0, "1000001", "due"}, // its start
        {"2024-05-15 08:30", Monthly, {2024, 1, 15}, {8, 30}, 0, 0, "", "due"},
        {"2024-05-16 08:30", Monthly, {2024, 1, 15}, {8, 30}, 0, 0, "", ""},
        {"2024-05-15 08:30", Yearly, {2023, 5, 15}, {8, 30}, 0, 0, "", "due"},
        {"2024-06-15 08:30", Yearly, {2023, 5, 15}, {8, 30}, 0, 0, "", ""},
    };
    for (const When &row : cases) {
        Task task = taskOf(row);
        TAVISchedCTaskSetCommand(task.get(), "printf due > /tmp/out");
        ASSERT_EQ(TAVISchedTaskCreate(task.get()), 0);
        unlink("/tmp/out");
        EXPECT_EQ(run(task->id, 1, 1), 0);
        EXPECT_EQ(readFile("/tmp/out"), row.expected) << row.now;
    }
}

// Neither what is not due nor, when it is, what is disabled.
TEST_F(Run, RunnerLooksAtStateAndTime) {
    const auto minute = static_cast<uint32_t>(time(nullptr) / 60);
    storedTask();
    Task task = storedTask(); // the only one in the end, so that no other id will do
    TAVISchedTaskRemove(1);
    task->repeatHour = 1;
    task->lastWorkHour = 23;
    for (const uint32_t minutesFromNow : {30, 0}) {
        task->runMin = (minute + minutesFromNow) % 60;
        task->state = minutesFromNow > 0 ? TAVI_SCHED_STATE_ENABLED : TAVI_SCHED_STATE_DISABLED;
        TAVISchedTaskEdit(task.get());
        EXPECT_EQ(shell("'" RUNNER "' --run id=2"), 0);
        waitForChildren();
        EXPECT_EQ(rows(), "");
    }
}

// Two runners of one task, and two tasks of one application, never have live commands at once.
TEST_F(Run, ConflictingRunsFollowEachOther) {
    for (int i = 0; i < 2; ++i) {
        Task task = newTask("echo [ >> /tmp/out; sleep 0.2; echo ] >> /tmp/out");
        TAVISchedCTaskSetApp(task.get(), "it's");
        TAVISchedCTaskSetCanRunAppSameTime(task.get(), 0);
        ASSERT_EQ(TAVISchedTaskCreate(task.get()), 0);
    }
    fakes.pauseMicroseconds = 400000; // twenty are enough also for runs that are slow to start
    for (const int id : {1, 1, 2, 1}) {
        EXPECT_EQ(TAVISchedTaskRun(id, 0, 0), 0);
    }
    waitForChildren();
    EXPECT_EQ(readFile("/tmp/out"), "[\n]\n[\n]\n[\n]\n[\n]\n");
    EXPECT_EQ(rows().size(), 4 * 5U);
    EXPECT_EQ(statusOf("/tmp/lock").st_mode, S_IFDIR | 0755U);
    EXPECT_THAT(logs(), testing::Each(HasSubstr(" (running), retry = ")));
}

TEST_F(Run, WaitsForTheLockOfAnotherRunner) {
    storedTask();
    shell("mkdir -m 1777 /tmp/lock"); // root's own, but anybody's to write: it is set right
    const int other = open("/tmp/lock/lock_sched_run", O_CREAT | O_RDWR, 0600);
    flock(other, LOCK_SH);
    EXPECT_EQ(TAVISchedTaskRun(1, 0, 0), 0);
    EXPECT_TRUE(
        waitFor("grep -q -- \"-> .*:$(stat -c %i /tmp/lock/lock_sched_run) \" /proc/locks"));
    EXPECT_EQ(rows(), "");
    flock(other, LOCK_UN);
    waitForChildren();
    EXPECT_EQ(rows(), "1:3: ");
    EXPECT_EQ(statusOf("/tmp/lock").st_mode, S_IFDIR | 0755U);
    close(other);
}

TEST_F(Run, FollowedToItsEnd) {
    Task task = storedTask("read line < /tmp/fifo");
    mkfifo("/tmp/fifo", 0600);
    int32_t pid = 0;
    int end = 0;
    EXPECT_EQ(TAVISchedTaskRunFollowed(1, 2, 0, &pid, &end), 0); // skipped
    EXPECT_EQ(pid * 10 + end, -11);
    // A caller without standard input whose output is captured: nothing that it has open is the
    // run's, and what it has not written yet is written once.
    const std::array<int, 2> standard = {dup(STDIN_FILENO), dup(STDOUT_FILENO)};
    std::array<int, 2> callers{};
    ASSERT_EQ(pipe2(callers.data(), O_NONBLOCK), 0);
    fflush(stdout);
    close(STDIN_FILENO);
    dup2(callers[1], STDOUT_FILENO);
    printf("once");
    signal(SIGUSR1, [](int) {});
    EXPECT_EQ(TAVISchedTaskRunFollowed(1, 0, 0, &pid, &end), 0);
    signal(SIGUSR1, SIG_DFL);
    fflush(stdout);
    EXPECT_EQ(dup2(standard[0], STDIN_FILENO) + dup2(standard[1], STDOUT_FILENO), 1);
    const int fifo = open("/tmp/fifo", O_WRONLY); // the command runs
    for (const int own : {standard[0], standard[1], callers[1]}) {
        close(own);
    }
    std::array<char, 16> text{};
    EXPECT_EQ(read(callers[0], text.data(), text.size()), 4);
    EXPECT_EQ(read(callers[0], text.data(), text.size()), 0);
    close(callers[0]);
    EXPECT_EQ(signals(std::to_string(pid), "SigCgt") & 1ULL << (SIGUSR1 - 1), 0U);
    EXPECT_NE(getsid(pid), getsid(0));
    const std::string streams = "/proc/" + std::to_string(pid) + "/fd/[012]";
    EXPECT_EQ(shell("test \"$(readlink " + streams + " | sort -u)\" = /dev/null"), 0);
    EXPECT_EQ(query("SELECT pid, status_code FROM task_status"), std::to_string(pid) + " 2 ");
    char byte = 0;
    EXPECT_EQ(recv(end, &byte, 1, MSG_DONTWAIT), -1);
    // While it waits: the lock is free, SIGCHLD is held back, SIGINT and SIGQUIT are the command's.
    EXPECT_EQ(shell("flock -n /tmp/lock/lock_sched_run true"), 0);
    EXPECT_EQ(signals(std::to_string(pid), "SigBlk"), 1ULL << (SIGCHLD - 1));
    EXPECT_EQ(signals(std::to_string(pid), "SigIgn"),
              signals("self", "SigIgn") | 1ULL << (SIGINT - 1) | 1ULL << (SIGQUIT - 1));
    close(fifo);
    EXPECT_EQ(read(end, &byte, 1), 0);
    EXPECT_EQ(rows(), "1:7:1 ");
    close(end);
    waitForChildren();
}

TEST_F(Run, GivesUpSilentlyAfterTwentyWaits) {
    storedTask();
    addRunning();
    EXPECT_EQ(run(1), 0);
    auto waits = pauses();
    const auto lines = logs();
    ASSERT_EQ(waits.size(), 20U);
    ASSERT_EQ(lines.size(), 20U);
    for (size_t i = 0; i < waits.size(); ++i) {
        const long seconds = waits[i] / 1000000;
        EXPECT_TRUE(seconds >= 3 && seconds <= 30 && waits[i] % 3000000 == 0);
        EXPECT_THAT(lines[i], HasSubstr("Task 1 conflict with task 1 (running), retry = " +
                                        std::to_string(i + 1) + ", wait " +
                                        std::to_string(seconds) + " secs."));
    }
    EXPECT_EQ(rows(), "1:2: ");
    query("DELETE FROM task_status; CREATE TRIGGER kept BEFORE UPDATE ON task_status "
          "BEGIN SELECT RAISE(ABORT, ''); END");
    EXPECT_EQ(run(1), 0);
    EXPECT_THAT(lastLog(), HasSubstr("Update status record failed. id:[1][0x"));

    // The same for a lock that cannot be had; a folder of another user's is never used.
    for (const char *plant : {"ln -s /etc /tmp/lock", "mkdir /tmp/lock; chown 4242 /tmp/lock"}) {
        if (shell(std::string("rm -r /tmp/lock /tmp/sched_status.sqlite; ") + plant) == 0) {
            EXPECT_EQ(run(1), 0);
            const auto others = pauses();
            EXPECT_EQ(others.size(), 20U);
            EXPECT_NE(others, waits); // runs that wait together do not try together
            waits = others;
            EXPECT_THAT(lastLog(), HasSubstr("Lock failed (retry=20), sleep "));
            EXPECT_EQ(shell("ls /etc/lock_sched_run /tmp/sched_status.sqlite"), 2);
        }
    }
}

} // namespace
