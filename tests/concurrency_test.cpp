// Several processes at once: writers, readers, plug-in handlers, and another user in /tmp.
#include "machine.h"

#include <atomic>
#include <chrono>
#include <functional>
#include <grp.h>
#include <set>
#include <sstream>
#include <sys/mman.h>
#include <thread>

namespace {

using namespace support;
using std::chrono::steady_clock;

constexpr int kWriters = kStep == 1 ? 50 : 10;
constexpr int kReaders = 8;
constexpr uid_t kStranger = 4242;

// What processes count together.
struct Shared {
    std::atomic<bool> stop;
    std::atomic<long> looks, wrong;
};

Shared &shared() {
    static auto *const memory = static_cast<Shared *>(
        mmap(nullptr, sizeof(Shared), PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0));
    return *memory;
}

int addByTool() {
    return shell("'" TAVISCHED "' add --name \"root's\" --command x --at 3:00 >> /run/output 2>&1");
}

size_t linesWith(const char *text, const char *path) {
    std::istringstream content(readFile(path));
    size_t count = 0;
    for (std::string line; std::getline(content, line);) {
        count += line.find(text) != std::string::npos ? 1 : 0;
    }
    return count;
}

using Concurrency = SchedTest;

// Lists, which is never less than before, and looks the first task up, until it is told to stop.
int readInALoop() {
    int known = 0;
    while (!shared().stop) {
        TAVI_SCHED_TASK *list = nullptr;
        const int count = TAVISchedTaskListGet(&list, nullptr);
        TAVISchedTaskListFree(&list);
        TAVI_SCHED_TASK task{};
        shared().wrong += count < known || TAVISchedTaskGetByID(1, &task) != 0 ? 1 : 0;
        known = std::max(known, count);
        ++shared().looks;
    }
    return 0;
}

// It is not due: the runner reads it and ends with 0.
int runInALoop() {
    while (!shared().stop) {
        shared().wrong += shell("'" RUNNER "' --run id=1 >> /run/output 2>&1") != 0 ? 1 : 0;
        ++shared().looks;
    }
    return 0;
}

TEST_F(Concurrency, WritersReadersAndRunners) {
    new (&shared()) Shared{};
    Task first = newTask();
    first->runHour = static_cast<uint32_t>((::time(nullptr) / 3600 + 12) % 24);
    ASSERT_EQ(TAVISchedTaskCreate(first.get()), 0);
    std::vector<pid_t> watchers = {start(runInALoop)};
    for (int i = 0; i < kReaders; ++i) {
        watchers.push_back(start(readInALoop));
    }
    std::vector<pid_t> writers;
    for (int i = 0; i < kWriters; ++i) {
        writers.push_back(start([] { return created("by the library"); }));
        writers.push_back(start(addByTool));
    }
    const auto areDone = [](const std::vector<pid_t> &processes) {
        return std::count_if(processes.begin(), processes.end(),
                             [](pid_t process) { return exitOf(process) == 0; });
    };
    EXPECT_EQ(areDone(writers), 2 * kWriters)
        << testing::PrintToString(logs()) << readFile("/run/output");
    shared().stop = true;
    EXPECT_EQ(areDone(watchers), kReaders + 1);
    const auto ids = listedIds();
    EXPECT_EQ(linesWith("name=by the library", kPersistent), kWriters);
    EXPECT_EQ(linesWith("name=root's", kPersistent), kWriters);
    EXPECT_EQ(std::set<int>(ids.begin(), ids.end()).size(), 2 * kWriters + 1);
    EXPECT_EQ(readFile(kWorking), readFile(kPersistent));
    EXPECT_EQ(linesWith("--run id=", kCrontab), ids.size());
    EXPECT_GT(shared().looks, kReaders);
    EXPECT_EQ(shared().wrong, 0) << "of " << shared().looks;
}

// Filters of two processes change what both of them read: each waits for the other's change, and
// none for what the other reads. What one goes on reading stays as it is.
TEST_F(Concurrency, FiltersChangeWhatOthersRead) {
    new (&shared()) Shared{};
    storedTask();
    const auto changeWhileListing = [] {
        TAVI_SCHED_TASK *list = nullptr;
        const int count = TAVISchedTaskListGet(&list, [](TAVI_SCHED_TASK *) {
            for (++shared().looks; shared().looks < 2;) {
                std::this_thread::yield();
            }
            shared().wrong += created("by a filter");
            return shell("i=$(stat -c %i /usr/tavi/etc/scheduled_tasks.reading);"
                         "! grep -q \"READ .*:$i 1 1\" /proc/locks");
        });
        TAVISchedTaskListFree(&list);
        return count >= 1 ? 0 : 1;
    };
    const auto begin = steady_clock::now();
    const pid_t others[] = {start(changeWhileListing), start(changeWhileListing)};
    EXPECT_EQ(exitOf(others[0]) + exitOf(others[1]), 0) << testing::PrintToString(logs());
    EXPECT_EQ(changeWhileListing(), 0); // alone
    EXPECT_LT(steady_clock::now() - begin, std::chrono::seconds(15));
    EXPECT_EQ(shared().wrong, 0);
    EXPECT_EQ(listedIds().size(), 6U);
}

// ---- Plug-in handlers ----

// In a batch, which has the lock, a handler's change would wait for the process that waits for it.
TEST_F(Concurrency, HandlersReadAndChangeTasksButInABatch) {
    const Task task = storedTask();
    addHandler("handler", "t='" TAVISCHED "'; \"$t\" list > /run/$2.list && \"$t\" add --command "
                          "true --at 03:00 > /run/$2.add 2>&1; echo $? >> /run/$2");
    EXPECT_EQ(TAVISchedTaskEdit(task.get()), 0);
    EXPECT_EQ(readFile("/run/pre") + readFile("/run/post"), "0\n0\n") << readFile("/run/pre.add");
    EXPECT_THAT(readFile("/run/post.list"), HasSubstr("Task 2"));
    EXPECT_THAT(listedIds(), ElementsAre(1, 2, 3));
    const auto begin = steady_clock::now();
    ASSERT_EQ(TAVISchedChangeBegin(), 0);
    EXPECT_EQ(TAVISchedTaskEdit(task.get()), 0);
    EXPECT_LT(steady_clock::now() - begin, std::chrono::seconds(15));
    EXPECT_EQ(readFile("/run/pre") + readFile("/run/post"), "0\n1\n0\n")
        << readFile("/run/pre.add");
    EXPECT_THAT(readFile("/run/pre.list"), HasSubstr("Task 3"));
    ASSERT_EQ(TAVISchedChangeCommit(), 0);
    EXPECT_EQ(readFile("/run/post"), "0\n0\n") << readFile("/run/post.add");
    EXPECT_THAT(listedIds(), ElementsAre(1, 2, 3, 4));
}

// ---- Another user ----

// What somebody would like root to run.
constexpr const char *kPlanted =
    "[7]\nid=7\nrun hour=1\nrun min=2\nname=planted\napp=\napp name=\n"
    "action=\ncmd=dG91Y2ggL2V2aWw=\nowner=0\nstate=enabled\ntype=daily\n";

void plantTask() {
    writeFile(kWorking, kPlanted);
    unlink(kWorking);
    writeFile("/tmp/mine", kPlanted);
    rename("/tmp/mine", kWorking);
    unlink(kWorking);
}

void plantRunner() {
    writeFile(kRunner, "#!/bin/sh\ntouch /evil\n");
    chmod(kRunner, 0755);
}

// The user's own file may be there for a moment; in the place of root's there comes no other.
bool isRootsAndPlanted(const char *path) {
    const struct stat status = statusOf(path);
    return S_ISREG(status.st_mode) && status.st_uid == 0 &&
           readFile(path).find("planted") != std::string::npos;
}

int becomeStranger() {
    return setgroups(0, nullptr) == 0 && setresgid(kStranger, kStranger, kStranger) == 0 &&
                   setresuid(kStranger, kStranger, kStranger) == 0
               ? 0
               : 1;
}

class LocalUser : public SchedTest {
  protected:
    void SetUp() override {
        SchedTest::SetUp();
        if (inChild(becomeStranger) != 0) {
            GTEST_SKIP() << "there is only one user in here";
        }
    }
    // Goes on for a second while the user attacks.
    static void tryOften(void (*attack)(), const std::function<bool(long)> &holds) {
        shared().looks = 0;
        const pid_t stranger = start([&] {
            umask(022);
            while (geteuid() == kStranger || becomeStranger() == 0) {
                attack();
                ++shared().looks;
            }
            return 1;
        });
        const auto end = steady_clock::now() + std::chrono::seconds(1);
        for (long tried = 0; shared().looks == 0 || steady_clock::now() < end; ++tried) {
            EXPECT_TRUE(holds(tried)) << testing::PrintToString(logs());
            logs();
        }
        kill(stranger, SIGKILL);
        exitOf(stranger);
    }
};

// Root stores a machine's first task while the user is at it.
TEST_F(LocalUser, NeverGivesRootATask) {
    tryOften(plantTask, [](long number) {
        unlink(kWorking);
        unlink(kPersistent);
        writeFile(kCrontab, kForeignCrontab);
        const bool done = (number % 4 == 3 ? addByTool() : created("root's")) == 0;
        return linesWith("id=7", kCrontab) == 0 && !isRootsAndPlanted(kWorking) &&
               !isRootsAndPlanted(kPersistent) &&
               (!done ||
                (linesWith("name=root's", kPersistent) == 1 && linesWith("id=1", kCrontab) == 1));
    });
}

TEST_F(LocalUser, PlantsARunner) {
    tryOften(plantRunner, [&](long) {
        unlink(kRunner);
        logs();
        const bool stored = created("root's") == 0;
        const bool isRoots = statusOf(kRunner).st_uid == 0;
        const bool isTold = testing::PrintToString(logs()).find(kRunner) != std::string::npos;
        TAVISchedTaskRemove(1);
        return stored && (isRoots || isTold);
    });
}

} // namespace
