// What the tests share: a clean machine for each test, the log lines of the library, and control
// over pauses and calls on files, which the test program defines itself.
#pragma once

#include "faults.h"
#include "platc.h"
#include "tavischeduler.h"

#include <csignal>
#include <ctime>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <memory>
#include <optional>
#include <string>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>
#include <vector>

namespace support {

using testing::Contains;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;

constexpr const char *kWorking = "/tmp/scheduled_tasks";
constexpr const char *kPersistent = "/usr/tavi/etc/scheduled_tasks";
constexpr const char *kRunner = "/tmp/tavischedtask";
constexpr const char *kCrontab = "/etc/crontab";
constexpr const char *kForeignCrontab = "SHELL=/bin/sh\n17 *\t* * *\troot\ttrue\n";
// The line of a task with id 1 that has the default schedule.
constexpr const char *kOwnLine = "0\t0\t*\t*\t*\troot\t/tmp/tavischedtask --run id=1\n";

// What the functions that this program defines do; copied into forked children.
struct Fakes {
    bool renameFails = false;
    bool fsyncFails = false;
    bool folderFsyncFails = false;
    long pauseMicroseconds = 0; // how long sleep() and usleep() really last
    long clockTicks = 0;        // how many a second has; 0 = as many as there are
};
extern Fakes fakes;

// Log lines since the last call, of this process and its children. A line's number stands only
// where it is a stable one: `stable` keeps the numbers, else they are shown as "*".
std::vector<std::string> logs(bool stable = false);
// The last of them, or "".
std::string lastLog(bool stable = false);
// The same for lines at LOG_INFO, which tell of no failure.
std::vector<std::string> notices();
// The arguments of all calls of sleep() and usleep() since the last call, in microseconds.
std::vector<long> pauses();

// This process's flushes and renames since the last call: "fsync /etc/f", "rename /etc/f.1 /etc/f".
std::vector<std::string> fileCalls();

// The error code of a call that failed; 0 for one that did not.
inline unsigned int failure(int result) {
    return result == -1 ? PLATCErrGet() : 0;
}
std::string readFile(const std::string &path);
void writeFile(const std::string &path, const std::string &content);
struct stat statusOf(const char *path);
// Runs a shell command outside of the library; its exit status.
int shell(const std::string &command);
// Starts a process of a function that gives its exit status.
template <typename Function> pid_t start(Function &&function) {
    const pid_t pid = fork();
    if (pid == 0) {
        _exit(function());
    }
    return pid;
}
// Waits for a process; its exit status, or -1.
int exitOf(pid_t pid);
// Waits until a shell command succeeds, for two minutes at most.
bool waitFor(const std::string &condition);
// Executes on the status database; all values, each followed by a blank.
std::string query(const std::string &sql);
// Executes on the records of runs; makes /tmp/held and keeps the database open, if so.
void recorded(const std::string &sql, bool untilKilled = false);
// Waits until all detached children of this process have ended.
void waitForChildren();
// "2024-05-08 09:00" in local time.
time_t at(const char *moment);

using Texts = std::vector<std::pair<const char *, const char *>>;
using Task = std::unique_ptr<TAVI_SCHED_TASK, int (*)(TAVI_SCHED_TASK *)>;
// A new task with defaults and a command.
Task newTask(const char *command = "true");
// The same, stored; the id is in the task.
Task storedTask(const char *command = "true");
std::vector<int> listedIds();
// Runs the task's command in a backend's way, with so much room: "code:comment", or "failed".
std::string resultOf(unsigned int backend, const Task &task, size_t room = 1024);

constexpr uint32_t kLargest = 4294967295;
enum { Once, Daily, Weekly, Monthly, Yearly };

// A row of a table of dates: a moment, a task's start date, run hour and minute, repeat hour, last
// work hour and week, and what comes of them.
struct When {
    const char *now;
    int type;
    uint32_t start[3], run[2], every, last;
    const char *week, *expected = "";
};
// The row's task, new; the row's moment becomes the present.
Task taskOf(const When &row);

class SchedTest : public testing::Test {
  protected:
    void SetUp() override;
    void TearDown() override {
        fakes = {};
        faults().now = 0;
        signal(SIGHUP, SIG_DFL);
        fail(Fault::None);
    }
};

} // namespace support
