// What the tests share: a clean machine for each test, the log lines of the library, and control
// over time, pauses and failing calls. The test program defines those functions itself, so that the
// shared library binds to them.
#pragma once

#include "platc.h"
#include "tavischeduler.h"

#include <ctime>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <memory>
#include <optional>
#include <string>
#include <vector>

namespace support {

using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;

// What the functions that this program defines do; copied into forked children.
struct Fakes {
    std::optional<time_t> now; // what time() answers
    bool localtimeFails = false;
    size_t callocFails = 0; // a calloc of at least that many bytes fails; 0 = none
    bool renameFails = false;
    bool fsyncFails = false;
    bool systemIsCounted = false; // system() runs nothing and is counted
    int systemResult = 0;
    long pauseMicroseconds = 0; // how long sleep() and usleep() really last
};
extern Fakes fakes;

// Log lines since the last call, of this process and its children. A line's number stands only
// where it is a stable one: `stable` keeps the numbers, else they are shown as "*".
std::vector<std::string> logs(bool stable = false);
// The arguments of all calls of sleep() and usleep() since the last call, in microseconds.
std::vector<long> pauses();
int systemCalls();

std::string readFile(const std::string &path);
void writeFile(const std::string &path, const std::string &content);
// Runs a shell command outside of the library; its exit status.
int shell(const std::string &command);
// Waits until all detached children of this process have ended.
void waitForChildren();
time_t localTime(int year, int month, int day, int hour, int minute);

using Task = std::unique_ptr<TAVI_SCHED_TASK, int (*)(TAVI_SCHED_TASK *)>;
// A new task with defaults and a command.
Task newTask(const char *command = "true");
// The same, stored; the id is in the task.
Task storedTask(const char *command = "true");
std::vector<int> listedIds();

class SchedTest : public testing::Test {
  protected:
    void SetUp() override;
    void TearDown() override { fakes = {}; }
};

constexpr const char *kForeignCrontab = "SHELL=/bin/sh\n17 *\t* * *\troot\ttrue\n";

} // namespace support
