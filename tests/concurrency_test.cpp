// Several processes at once: writers and readers through the library, the tool and the runner,
// plug-in handlers that use the library themselves, and another user who interferes in /tmp.
#include "machine.h"

#include <array>
#include <atomic>
#include <chrono>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fcntl.h>
#include <filesystem>
#include <functional>
#include <grp.h>
#include <set>
#include <sys/mman.h>

namespace {

using namespace support;
namespace fs = std::filesystem;

#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
constexpr int kWriters = 10; // each is a fork of a large process
#else
constexpr int kWriters = 50;
#endif
constexpr int kReaders = 8;
constexpr uid_t kStranger = 4242;

// What processes count together.
struct Shared {
    std::atomic<bool> stop;
    std::atomic<long> looks, fewer, errors, missing;
};

Shared &shared() {
    static auto *const memory = static_cast<Shared *>(
        mmap(nullptr, sizeof(Shared), PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0));
    return *memory;
}

template <typename Function> pid_t start(Function &&function) {
    const pid_t pid = fork();
    if (pid == 0) {
        _exit(function());
    }
    return pid;
}

int resultOf(pid_t pid) {
    int status = -1;
    waitpid(pid, &status, 0);
    return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

int runProgram(std::vector<const char *> arguments) {
    arguments.push_back(nullptr);
    const int output = open("/run/output", O_WRONLY | O_CREAT | O_APPEND, 0600);
    dup2(output, 1);
    dup2(output, 2);
    execv(arguments[0], const_cast<char *const *>(arguments.data()));
    return 127;
}

int addByTool() {
    return runProgram({TAVISCHED, "add", "--name", "root's", "--command", "true", "--at", "03:00"});
}

std::vector<std::string> linesOf(const std::string &path, const char *text) {
    std::vector<std::string> lines;
    const std::string content = readFile(path);
    for (size_t begin = 0; begin < content.size();) {
        const size_t end = std::min(content.find('\n', begin), content.size());
        if (content.substr(begin, end - begin).find(text) != std::string::npos) {
            lines.push_back(content.substr(begin, end - begin));
        }
        begin = end + 1;
    }
    return lines;
}

class Concurrency : public SchedTest {
  protected:
    void SetUp() override {
        SchedTest::SetUp();
        new (&shared()) Shared{};
    }
};

// Lists, and looks the first task up, until it is told to stop.
int readInALoop() {
    int known = 0;
    while (!shared().stop) {
        TAVI_SCHED_TASK *list = nullptr;
        const int count = TAVISchedTaskListGet(&list, nullptr);
        TAVISchedTaskListFree(&list);
        shared().errors += count < 0 ? 1 : 0;
        shared().fewer += count < known ? 1 : 0;
        known = std::max(known, count);
        TAVI_SCHED_TASK task{};
        shared().missing += TAVISchedTaskGetByID(1, &task) != 0 ? 1 : 0;
        ++shared().looks;
    }
    return 0;
}

// It is not due: the runner reads it and ends with 0.
int runInALoop() {
    while (!shared().stop) {
        const pid_t runner = start([] { return runProgram({RUNNER, "--run", "id=1"}); });
        shared().missing += resultOf(runner) != 0 ? 1 : 0;
        ++shared().looks;
    }
    return 0;
}

TEST_F(Concurrency, WritersReadersAndRunners) {
    fakes.now.reset();
    Task first = newTask();
    first->runHour = static_cast<uint32_t>((::time(nullptr) / 3600 + 12) % 24);
    ASSERT_EQ(TAVISchedTaskCreate(first.get()), 0);
    std::vector<pid_t> watchers = {start(runInALoop)};
    for (int i = 0; i < kReaders; ++i) {
        watchers.push_back(start(readInALoop));
    }
    std::vector<pid_t> writers;
    std::vector<pid_t> toolWriters;
    for (int i = 0; i < kWriters; ++i) {
        writers.push_back(start([] { return created("by the library"); }));
        toolWriters.push_back(start(addByTool));
    }
    int failed = 0;
    for (const pid_t writer : writers) {
        failed += resultOf(writer) != 0 ? 1 : 0;
    }
    size_t added = 0;
    for (const pid_t tool : toolWriters) {
        added += resultOf(tool) == 0 ? 1 : 0;
    }
    shared().stop = true;
    for (const pid_t watcher : watchers) {
        EXPECT_EQ(resultOf(watcher), 0);
    }
    const auto ids = listedIds();
    const auto ours = linesOf(kPersistent, "name=by the library").size();
    const auto tools = linesOf(kPersistent, "name=root's").size();
    std::printf(
        "concurrency: %d writers of each kind: %zu tasks by the library (%d failed), %zu by "
        "the tool (it told of %zu); %ld looks by readers and runners: %ld saw fewer, %ld "
        "errors, %ld missed a task\n",
        kWriters, ours, failed, tools, added, shared().looks.load(), shared().fewer.load(),
        shared().errors.load(), shared().missing.load());
    EXPECT_EQ(failed, 0) << testing::PrintToString(logs());
    EXPECT_EQ(ours, kWriters);
    EXPECT_EQ(tools, kWriters) << readFile("/run/output");
    EXPECT_EQ(tools, added);
    EXPECT_EQ(std::set<int>(ids.begin(), ids.end()).size(), ours + tools + 1);
    EXPECT_EQ(readFile(kWorking), readFile(kPersistent));
    EXPECT_EQ(linesOf(kCrontab, "--run id=").size(), ids.size());
    EXPECT_GT(shared().looks, kReaders);
    EXPECT_EQ(shared().fewer + shared().errors + shared().missing, 0);
}

// ---- Plug-in handlers ----

class Handlers : public Concurrency {
  protected:
    void SetUp() override {
        Concurrency::SetUp();
        storedTask();
        const std::string folder = "/usr/tavi/etc/plugins/task_scheduler";
        fs::create_directories(folder);
        writeFile(folder + "/handler",
                  std::string("#!/bin/sh\n'") + TAVISCHED + "' list > /run/$2.list && '" +
                      TAVISCHED +
                      "' add --command true --at 03:00 > /run/$2.add 2>&1; echo $? > /run/$2\n");
        chmod((folder + "/handler").c_str(), 0755);
    }
    static int edit() {
        TAVI_SCHED_TASK task{};
        return TAVISchedTaskGetByID(1, &task) == 0 && TAVISchedTaskEdit(&task) == 0 ? 0 : 1;
    }
};

TEST_F(Handlers, ReadAndChangeTasksAroundAChange) {
    EXPECT_EQ(edit(), 0);
    EXPECT_EQ(readFile("/run/pre") + readFile("/run/post"), "0\n0\n") << readFile("/run/pre.add");
    EXPECT_THAT(listedIds(), ElementsAre(1, 2, 3));
    EXPECT_THAT(readFile("/run/post.list"), HasSubstr("Task 2"));
}

// The batch has the lock: a change of the handler would wait for the process that waits for it.
TEST_F(Handlers, AreRefusedAtOnceInABatch) {
    const auto begin = std::chrono::steady_clock::now();
    ASSERT_EQ(TAVISchedChangeBegin(), 0);
    EXPECT_EQ(edit(), 0);
    EXPECT_LT(std::chrono::steady_clock::now() - begin, std::chrono::seconds(15));
    EXPECT_EQ(readFile("/run/pre"), "1\n") << readFile("/run/pre.add");
    EXPECT_THAT(readFile("/run/pre.list"), HasSubstr("Task 1"));
    EXPECT_FALSE(fs::exists("/run/post"));
    ASSERT_EQ(TAVISchedChangeCommit(), 0);
    EXPECT_EQ(readFile("/run/post"), "0\n") << readFile("/run/post.add");
    EXPECT_THAT(listedIds(), ElementsAre(1, 2));
}

// ---- Another user ----

// What somebody would like root to run.
std::string plantedTask() {
    return "[7]\nid=7\nrun hour=1\nrun min=2\nname=planted\napp=\napp name=\naction=\n"
           "cmd=dG91Y2ggL2V2aWw=\nowner=0\nstate=enabled\ntype=daily\n";
}

void putAndTakeAway() {
    writeFile(kWorking, plantedTask());
    unlink(kWorking);
}

void moveIn() {
    const std::string mine = "/tmp/mine";
    writeFile(mine, plantedTask());
    rename(mine.c_str(), kWorking);
    unlink(kWorking);
}

// Also at the name that a change's scratch file will have, for as long as it knows none better.
void fillAndFree() {
    const std::string filler = "/tmp/filler";
    const int file = open(filler.c_str(), O_WRONLY | O_CREAT, 0600);
    const std::string block(16384, 'x');
    while (write(file, block.data(), block.size()) > 0) {
    }
    close(file);
    unlink(filler.c_str());
}

void plantRunner() {
    writeFile("/tmp/tavischedtask", "#!/bin/sh\ntouch /evil\n");
    chmod("/tmp/tavischedtask", 0755);
}

// The user's own file may be there for a moment: what was opened is looked at.
bool isRootsAndPlanted(const char *path) {
    const int file = open(path, O_RDONLY | O_CLOEXEC);
    struct stat status {};
    std::array<char, 65536> text{};
    const bool isRoots = fstat(file, &status) == 0 && status.st_uid == 0 &&
                         read(file, text.data(), text.size() - 1) >= 0;
    close(file);
    return isRoots && std::strstr(text.data(), "planted");
}

int becomeStranger() {
    return setgroups(0, nullptr) == 0 && setresgid(kStranger, kStranger, kStranger) == 0 &&
                   setresuid(kStranger, kStranger, kStranger) == 0
               ? 0
               : 1;
}

class LocalUser : public Concurrency {
  protected:
    void SetUp() override {
        Concurrency::SetUp();
        if (inChild(becomeStranger) != 0) {
            GTEST_SKIP() << "there is only one user in here";
        }
    }
    void TearDown() override {
        if (stranger_ > 0) {
            kill(stranger_, SIGKILL);
            resultOf(stranger_);
        }
        Concurrency::TearDown();
    }
    void attackInALoop(void (*attack)()) {
        stranger_ = start([&]() -> int {
            umask(022);
            if (becomeStranger() != 0) {
                return 1;
            }
            while (true) {
                attack();
                ++shared().looks;
            }
        });
    }
    // Goes on for some seconds, or for as many tries as TAVI_TEST_TRIES says.
    static void tryOften(const char *what, const std::function<bool(long)> &holds) {
        const char *const wanted = std::getenv("TAVI_TEST_TRIES");
        const long most = wanted ? std::atol(wanted) : 1000;
        const auto end = std::chrono::steady_clock::now() + std::chrono::seconds(3);
        long tried = 0;
        long held = 0;
        while (tried < most && (wanted || std::chrono::steady_clock::now() < end)) {
            held += holds(tried) ? 1 : 0;
            ++tried;
        }
        std::printf("local user: %s: %ld tries of root, %ld of the user, %ld held\n", what, tried,
                    shared().looks.load(), held);
        EXPECT_EQ(tried, held);
        EXPECT_GT(shared().looks, 0);
    }

    // Root stores a machine's first task while the user is at it.
    void storeFirstTasks(const char *what) {
        long stored = 0;
        tryOften(what, [&](long number) {
            for (const char *const path : {kWorking, kPersistent}) {
                unlink(path);
            }
            writeFile(kCrontab, kForeignCrontab);
            const bool byTool = number % 4 == 3;
            const int result = byTool ? resultOf(start(addByTool)) : created("root's");
            const bool done = result == 0;
            stored += done ? 1 : 0;
            bool isRight = linesOf(kCrontab, "id=7").empty();
            isRight = isRight && !isRootsAndPlanted(kWorking) && !isRootsAndPlanted(kPersistent);
            isRight = isRight && (!done || (linesOf(kPersistent, "name=root's").size() == 1 &&
                                            linesOf(kCrontab, "id=1").size() == 1));
            EXPECT_TRUE(isRight) << done << readFile(kPersistent) << readFile(kCrontab)
                                 << testing::PrintToString(logs());
            logs();
            return isRight;
        });
        std::printf("local user: %s: %ld of root's tasks were stored\n", what, stored);
    }

    pid_t stranger_ = 0;
};

TEST_F(LocalUser, PutsTaskFileAndTakesItAway) {
    attackInALoop(putAndTakeAway);
    storeFirstTasks("a task file put and taken away");
}

TEST_F(LocalUser, MovesTaskFileIn) {
    attackInALoop(moveIn);
    storeFirstTasks("a task file moved in");
}

TEST_F(LocalUser, FillsAndFreesTmp) {
    ASSERT_EQ(shell("mount -n -t tmpfs -o size=256k,mode=1777 small /tmp"), 0);
    for (const char *const name : {"one", "two", "three"}) {
        ASSERT_EQ(created(name, std::string(3000, 'x').c_str()), 0);
    }
    attackInALoop(fillAndFree);
    std::set<std::string> wanted = {"one", "two", "three"};
    long changes = 0;
    tryOften("/tmp filled and freed", [&](long number) {
        const std::string name = "task " + std::to_string(number);
        if (created(name.c_str()) == 0) {
            wanted.insert(name);
            ++changes;
        }
        TAVI_SCHED_TASK *list = nullptr;
        const int count = TAVISchedTaskListGet(&list, nullptr);
        std::set<std::string> listed;
        int32_t toRemove = 0;
        std::string removed;
        for (const TAVI_SCHED_TASK *task = list; task; task = TAVISchedTaskNext(task)) {
            listed.insert(task->name);
            if (std::strncmp(task->name, "task ", 5) == 0 && count > 6) {
                toRemove = task->id;
                removed = task->name;
            }
        }
        TAVISchedTaskListFree(&list);
        const bool isRight = count >= 0 && listed == wanted;
        EXPECT_TRUE(isRight) << count << " " << testing::PrintToString(listed) << " for "
                             << testing::PrintToString(wanted) << testing::PrintToString(logs());
        logs();
        if (toRemove > 0 && TAVISchedTaskRemove(toRemove) == 0) {
            wanted.erase(removed);
            ++changes;
        }
        return isRight;
    });
    std::printf("local user: /tmp filled and freed: %ld changes of root's were stored\n", changes);
    kill(stranger_, SIGKILL);
    resultOf(std::exchange(stranger_, 0));
    unlink("/tmp/filler");
    EXPECT_EQ(listedIds().size(), wanted.size());
    EXPECT_EQ(readFile(kWorking), readFile(kPersistent));
    EXPECT_THAT(leftovers(), IsEmpty());
    shell("umount -n -l /tmp");
}

TEST_F(LocalUser, PlantsARunner) {
    attackInALoop(plantRunner);
    tryOften("a runner planted", [&](long) {
        fs::remove("/tmp/tavischedtask");
        logs();
        const bool stored = created("root's") == 0;
        const bool isRoots = statusOf("/tmp/tavischedtask").st_uid == 0;
        const auto lines = logs();
        const bool isTold = std::any_of(lines.begin(), lines.end(), [](const std::string &line) {
            return line.find("/tmp/tavischedtask") != std::string::npos;
        });
        EXPECT_TRUE(stored && (isRoots || isTold)) << testing::PrintToString(lines);
        TAVISchedTaskRemove(1);
        return stored && (isRoots || isTold);
    });
}

} // namespace
