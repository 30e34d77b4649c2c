// What runs leave behind, with real processes: records, outputs, and what happens beside a command.
#include "support.h"

#include <array>
#include <fcntl.h>
#include <functional>
#include <poll.h>
#include <sqlite3.h>
#include <sstream>
#include <sys/mount.h>
#include <sys/prctl.h>

namespace {

using namespace support;
using testing::AllOf;
using testing::MatchesRegex;
using testing::StartsWith;

constexpr const char *kFolder = "/var/lib/tavischeduler";
constexpr const char *kDatabase = "/var/lib/tavischeduler/runs.sqlite";
constexpr size_t kPart = TAVI_SCHED_OUTPUT_PART;

std::vector<TAVI_SCHED_RUN> runs(TAVI_SCHED_RUN_FILTER filter) {
    std::vector<TAVI_SCHED_RUN> found;
    const auto add = [](void *context, const TAVI_SCHED_RUN *run) {
        static_cast<std::vector<TAVI_SCHED_RUN> *>(context)->push_back(*run);
        return 0;
    };
    const int count = TAVISchedRunList(&filter, add, &found);
    EXPECT_EQ(count, static_cast<int>(found.size()));
    return found;
}

TAVI_SCHED_RUN_FILTER ofTask(int32_t id) {
    return {.taskId = id, .failedOnly = 0, .newestOnly = 0, .limit = 0, .since = 0};
}

// The newest run of a task.
TAVI_SCHED_RUN newest(int32_t id = 1) {
    const auto found = runs(ofTask(id));
    return found.empty() ? TAVI_SCHED_RUN{} : found.front();
}

// "result:number", the newest first.
[[maybe_unused]] std::string results(TAVI_SCHED_RUN_FILTER filter = ofTask(1)) {
    std::string text;
    for (const TAVI_SCHED_RUN &run : runs(filter)) {
        text += std::to_string(run.result) + ":" + std::to_string(run.number) + " ";
    }
    return text;
}

// What is kept of an output, with "<N cut>" where N bytes were left out.
std::string outputOf(int64_t run, size_t room = 10000) {
    std::string text;
    std::vector<char> buffer(room);
    int64_t offset = 0;
    int64_t cut = 0;
    int64_t length = 0;
    while ((length = TAVISchedRunOutputRead(run, &offset, buffer.data(), room, &cut)) > 0) {
        text += cut > 0 ? "<" + std::to_string(cut) + " cut>" : "";
        text.append(buffer.data(), static_cast<size_t>(length));
    }
    EXPECT_EQ(length, 0);
    return text;
}

void awaitThat(const std::function<bool()> &holds) {
    for (int tries = 0; !holds(); ++tries) {
        ASSERT_LT(tries, 6000) << "waited a minute in vain";
        poll(nullptr, 0, 10);
    }
}

class Records : public SchedTest {
  protected:
    // Runs to its result; what is left behind may go on.
    static void run(int32_t id = 1) {
        int32_t pid = 0;
        int end = -1;
        char byte = 0;
        ASSERT_EQ(TAVISchedTaskRunFollowed(id, 0, 0, &pid, &end), 0);
        EXPECT_EQ(read(end, &byte, 1), 0);
        close(end);
    }
    static TAVI_SCHED_RUN runNew(const char *command) {
        const Task task = storedTask(command);
        run(task->id);
        return newest(task->id);
    }
};

TEST_F(Records, OfWhatCommandsDo) {
    const struct {
        const char *command;
        int result, number;
        std::string output;
    } cases[] = {
        {"echo out; echo err >&2; echo more", 3, 0, "out\nerr\nmore\n"},
        {"printf '\\377\\000x'; exit 3", 7, 3, std::string("\377\000x", 3)},
        {"echo before; kill -9 $$", 6, 9, "before\n"},
        {"echo before; kill -TERM 0", 6, 15, "before\n"}, // its process group, but not the watch
        {"exec >&- 2>&-; exit 4", 7, 4, ""},
        {"echo named > /dev/stdout", 3, 0, "named\n"},
        {"test $TAVI_TASK_ID = 7 && echo $TAVI_RUN_ID,$TAVI_TASK_NAME", 3, 0, "7,Task 7\n"},
        {"true", 3, 0, ""},
    };
    for (const auto &row : cases) {
        const TAVI_SCHED_RUN seen = runNew(row.command);
        EXPECT_EQ(seen.result, row.result) << row.command;
        EXPECT_EQ(seen.number, row.number) << row.command;
        EXPECT_EQ(outputOf(seen.run), row.output) << row.command;
        EXPECT_EQ(seen.outputSize, static_cast<int64_t>(row.output.size())) << row.command;
        EXPECT_TRUE(seen.mode == 0 && seen.due == 0 && seen.waitingSince == 0);
        EXPECT_TRUE(seen.asked <= seen.began && seen.began <= seen.ended && seen.began > 0);
    }
    EXPECT_THAT(logs(), IsEmpty());
    waitForChildren();
    EXPECT_EQ(statusOf(kFolder).st_mode, S_IFDIR | 0700U);
    EXPECT_EQ(shell("find /var/lib/tavischeduler -type f ! -user root -o -type f -perm /077 "
                    "! -name 'runs.sqlite*' | grep ."),
              1);
    const auto lines = notices();
    ASSERT_GE(lines.size(), 4U);
    EXPECT_EQ(lines[2], "task 2 [Task 2] of user 0 begins, run 2");
    EXPECT_THAT(lines[3],
                MatchesRegex("task 2 .Task 2. of user 0 ends after [0-9.]+ s: exit 3, run 2"));
}

// The command has the pipe as its output and nothing else of ours, in any owner's name.
TEST_F(Records, OwnersNeverTouchThem) {
    if (seteuid(4545) != 0 || seteuid(0) != 0) {
        GTEST_SKIP() << "needs several users";
    }
    shell("grep -q ^tavirecorded: /etc/passwd || echo 'tavirecorded:x:4545:4545::/:/bin/sh' >> "
          "/etc/passwd");
    Task task = newTask("readlink /proc/$$/fd/*; echo named > /dev/stderr; "
                        "ls /var/lib/tavischeduler || grep Groups: /proc/self/status");
    task->owner = 4545;
    ASSERT_EQ(TAVISchedTaskCreate(task.get()), 0);
    run();
    EXPECT_THAT(outputOf(newest().run),
                MatchesRegex("/dev/null\n(pipe:.[0-9]+.)\n(pipe:.[0-9]+.)\nnamed\nls: cannot "
                             "open directory .*\nGroups:.[0-9 ]*4545 \n"));
    EXPECT_EQ(newest().owner, 4545U);
    EXPECT_EQ(shell("find /var/lib/tavischeduler ! -user root -o ! -group root | grep ."), 1);
}

TEST_F(Records, LongOutputsKeepTheirEnds) {
    // A line is 16 bytes, so that every place tells what belongs there.
    const auto line = [](size_t number) {
        std::array<char, 17> text{};
        snprintf(text.data(), text.size(), "%015zu\n", number);
        return std::string(text.data());
    };
    const auto lines = [&](size_t from, size_t until) {
        std::string text;
        for (size_t number = from; number < until; ++number) {
            text += line(number);
        }
        return text;
    };
    constexpr size_t kLines = kPart / 16;
    for (const size_t count : {2 * kLines, 2 * kLines + 1, 3 * kLines + 7, size_t{655360}}) {
        const std::string command = "seq -f %015.0f 0 " + std::to_string(count - 1);
        const TAVI_SCHED_RUN seen = runNew(command.c_str());
        const size_t cut = (count - 2 * kLines) * 16;
        EXPECT_EQ(seen.outputSize, static_cast<int64_t>(count * 16));
        EXPECT_EQ(seen.outputKept, static_cast<int64_t>(2 * kPart));
        const std::string expected = lines(0, kLines) +
                                     (cut > 0 ? "<" + std::to_string(cut) + " cut>" : "") +
                                     lines(count - kLines, count);
        EXPECT_TRUE(outputOf(seen.run) == expected) << count;
        EXPECT_TRUE(outputOf(seen.run, 100000) == expected) << count;
        // As the file is, it can be read too.
        const std::string path = kFolder + ("/output/" + std::to_string(seen.run));
        EXPECT_TRUE(readFile(path).starts_with(lines(0, kLines) + lines(count - kLines, count)));
        EXPECT_LT(readFile(path).size(), 2 * kPart + 200);
    }
}

// An endless printer is followed while it prints, fills no disk, and its result is not waited for
// by those whom it does not concern.
TEST_F(Records, EndlessOutputIsFollowedAndStopped) {
    storedTask("seq -f %015.0f 0 inf");
    ASSERT_EQ(TAVISchedTaskRun(1, 0, 0), 0);
    awaitThat([] { return newest().outputSize > 10'000'000; });
    const TAVI_SCHED_RUN seen = newest();
    EXPECT_EQ(seen.result, TAVI_SCHED_RUN_RUNNING);
    std::array<char, 4096> buffer{};
    int64_t offset = 0;
    for (int64_t cut = 0; offset < 20'000'000;) {
        ASSERT_EQ(TAVISchedRunFollow(seen.run, offset, 60000), 1);
        const int64_t length =
            TAVISchedRunOutputRead(seen.run, &offset, buffer.data(), buffer.size(), &cut);
        ASSERT_GT(length, 0);
        // The bytes are those of their place.
        const int64_t from = offset - length;
        std::array<char, 17> expected{};
        snprintf(expected.data(), expected.size(), "%015lld\n",
                 static_cast<long long>((from + 15) / 16));
        const int64_t next = (16 - from % 16) % 16;
        ASSERT_EQ(std::string(buffer.data() + next, 16), std::string(expected.data(), 16));
    }
    EXPECT_LT(statusOf((kFolder + ("/output/" + std::to_string(seen.run))).c_str()).st_size,
              static_cast<off_t>(2 * kPart + 200));
    EXPECT_EQ(TAVISchedRunStop(seen.run, 30), 0);
    waitForChildren();
    EXPECT_EQ(newest().result, TAVI_SCHED_RUN_STOPPED_BY_USER);
    EXPECT_EQ(query("SELECT status_code, comment FROM task_status"), "6 15 ");
    EXPECT_EQ(failure(TAVISchedRunStop(seen.run, 30)), 0x2000U);
}

// What a command leaves behind neither holds its result back nor is ended.
TEST_F(Records, WhatIsLeftBehindPrintsOn) {
    mkfifo("/tmp/fifo", 0600);
    const TAVI_SCHED_RUN seen =
        runNew("(read line < /tmp/fifo; head -c 200000 /dev/zero; echo $line; echo done > "
               "/tmp/left) & echo now");
    EXPECT_EQ(seen.result, TAVI_SCHED_RUN_SUCCESS);
    EXPECT_EQ(outputOf(seen.run), "now\n");
    EXPECT_EQ(access("/tmp/left", F_OK), -1);
    writeFile("/tmp/fifo", "later\n");
    waitForChildren();
    EXPECT_EQ(readFile("/tmp/left"), "done\n");
    EXPECT_THAT(outputOf(seen.run), testing::EndsWith("later\n"));
    EXPECT_EQ(newest().outputSize, 200010);
}

// While it waits for a command, the process is asleep and small.
TEST_F(Records, WaitingIsCheap) {
    storedTask("exec >&- 2>&-; read line < /tmp/fifo");
    mkfifo("/tmp/fifo", 0600);
    int32_t pid = 0;
    int end = -1;
    ASSERT_EQ(TAVISchedTaskRunFollowed(1, 0, 0, &pid, &end), 0);
    const int fifo = open("/tmp/fifo", O_WRONLY); // the command runs, its output closed
    awaitThat([] { return newest().result == TAVI_SCHED_RUN_RUNNING; });
    const auto switches = [&] {
        const std::string status = readFile("/proc/" + std::to_string(pid) + "/status");
        return status.substr(status.find("voluntary_ctxt_switches"));
    };
    awaitThat([&] { // settled
        const std::string before = switches();
        poll(nullptr, 0, 300);
        return switches() == before;
    });
    long kilobytes = 0;
    std::istringstream map(readFile("/proc/" + std::to_string(pid) + "/smaps_rollup"));
    for (std::string key; map >> key;) {
        long value = 0;
        kilobytes +=
            (key == "Private_Dirty:" || key == "Private_Clean:") && map >> value ? value : 0;
    }
#ifndef __SANITIZE_ADDRESS__
    EXPECT_TRUE(kilobytes > 0 && kilobytes < 2048) << kilobytes;
#endif
    close(fifo);
    close(end);
    waitForChildren();
}

} // namespace
