// From a saved task to its run: Debian's cron starts the runner from the line that the library
// wrote.
#include "support.h"

#include <csignal>
#include <sqlite3.h>
#include <sys/wait.h>
#include <unistd.h>

namespace {

using namespace support;
using Cron = SchedTest;

TEST_F(Cron, RunsADueTaskAsItsOwner) {
    if (geteuid() != 0 || access("/usr/sbin/cron", X_OK) != 0 || seteuid(1) != 0 ||
        seteuid(0) != 0) {
        GTEST_SKIP() << "needs root and cron";
    }
    ASSERT_EQ(symlink(RUNNER, "/tmp/tavischedtask"), 0);
    chmod("/etc/crontab", 0644);
    const pid_t cron = fork();
    if (cron == 0) {
        execl("/usr/sbin/cron", "cron", "-f", nullptr);
        _exit(127);
    }
    while (access("/var/run/crond.pid", F_OK) != 0) {
        nanosleep(std::array<timespec, 1>{{{0, 10000000}}}.data(), nullptr);
    }
    // Due in the next minute, or the one after when that is about to begin.
    const time_t due = time(nullptr) + 65;
    Task task = newTask("id -un > /tmp/ran; exit 4");
    task->owner = 1;
    task->runHour = static_cast<uint32_t>(localtime(&due)->tm_hour);
    task->runMin = static_cast<uint32_t>(localtime(&due)->tm_min);
    ASSERT_EQ(TAVISchedTaskCreate(task.get()), 0);
    sqlite3 *db = TAVISchedDBInit();
    int32_t code = 0;
    char comment[16] = "";
    for (const time_t end = due + 60; time(nullptr) < end && code < SCHED_STATUS_CODE_SUCCESS;) {
        nanosleep(std::array<timespec, 1>{{{0, 100000000}}}.data(), nullptr);
        TAVISchedDBGetStatusByTaskID(db, task->id, nullptr, &code, comment, sizeof comment);
    }
    sqlite3_close(db);
    kill(cron, SIGTERM);
    waitForChildren();
    EXPECT_EQ(code, SCHED_STATUS_CODE_EXIT_FAILED);
    EXPECT_STREQ(comment, "4");
    EXPECT_EQ(readFile("/tmp/ran"), "daemon\n");
}

} // namespace
