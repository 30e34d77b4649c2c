// What runs leave behind, with real processes: records, outputs, and what happens beside a command.
#include "machine.h"

#include <array>
#include <fcntl.h>
#include <functional>
#include <poll.h>
#include <sys/mount.h>

namespace {

using namespace support;
using testing::AllOf;
using testing::EndsWith;
using testing::MatchesRegex;
using testing::StartsWith;

constexpr const char *kFolder = "/var/lib/tavischeduler";
constexpr const char *kLimits = "/usr/tavi/etc/run_records";
constexpr size_t kPart = TAVI_SCHED_OUTPUT_PART;

// The newest run of a task.
TAVI_SCHED_RUN newest(int32_t id = 1) {
    const auto found = runs(ofTask(id));
    return found.empty() ? TAVI_SCHED_RUN{} : found.front();
}

// "result:number", the newest first.
std::string results(TAVI_SCHED_RUN_FILTER filter = ofTask(1)) {
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

std::string fileOf(int64_t run) {
    return kFolder + ("/output/" + std::to_string(run));
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
    static TAVI_SCHED_RUN runNew(const std::string &command) {
        const Task task = storedTask(command.c_str());
        run(task->id);
        return newest(task->id);
    }
    // One that goes on, or waits.
    static TAVI_SCHED_RUN started(int32_t id, int result = TAVI_SCHED_RUN_RUNNING) {
        EXPECT_EQ(TAVISchedTaskRun(id, 0, 0), 0);
        awaitThat([&] { return newest(id).result == result; });
        return newest(id);
    }
};

// A process that has begun something in the database of records and ends when it is killed. This
// one cannot: SQLite takes what it holds itself for held in its children too.
pid_t startHolder(const char *sql) {
    const pid_t holder = start([&] {
        recorded(sql, true);
        return 0;
    });
    EXPECT_TRUE(waitFor("[ -e /tmp/held ]"));
    return holder;
}

TEST_F(Records, OfWhatCommandsDo) {
    const struct {
        const char *command;
        int result, number;
        std::string output;
    } cases[] = {
        {"echo out; echo err >&2; sleep 0.3; echo more", 3, 0, "out\nerr\nmore\n"},
        {"printf '\\377\\000x'; exit 3", 7, 3, std::string("\377\000x", 3)},
        {"echo before; kill -9 $$", 6, 9, "before\n"},
        {"echo before; kill -TERM 0", 6, 15, "before\n"}, // its process group, but not the watch
        {"exec >&- 2>&-; exit 4", 7, 4, ""},
        {"echo named > /dev/stdout", 3, 0, "named\n"},
        {"test $TAVI_TASK_ID = 7 && echo $TAVI_RUN_ID,$TAVI_TASK_NAME", 3, 0, "7,Task 7\n"},
    };
    setenv("SUDO_UID", "4321", 1);
    for (const auto &row : cases) {
        SCOPED_TRACE(row.command);
        const TAVI_SCHED_RUN seen = runNew(row.command);
        EXPECT_EQ(seen.result, row.result);
        EXPECT_EQ(seen.number, row.number);
        EXPECT_EQ(outputOf(seen.run), row.output);
        EXPECT_EQ(seen.outputSize, static_cast<int64_t>(row.output.size()));
        EXPECT_TRUE(seen.mode == 0 && seen.due == 0 && seen.waitingSince == 0);
        EXPECT_EQ(seen.startedBy, 4321U);
        EXPECT_NEAR(seen.duration, seen.ended - seen.began, 250);
        EXPECT_TRUE(seen.asked <= seen.began && seen.began <= seen.ended && seen.began > 0);
    }
    unsetenv("SUDO_UID");
    EXPECT_THAT(logs(), IsEmpty());
    waitForChildren();
    EXPECT_EQ(statusOf(kFolder).st_mode, S_IFDIR | 0700U);
    const auto lines = notices();
    ASSERT_GE(lines.size(), 4U);
    EXPECT_EQ(lines[2], "task 2 [Task 2] of user 0 begins, run 2");
    EXPECT_THAT(lines[3], MatchesRegex("task 2 .Task 2. of user 0 ends after .* s: exit 3, run 2"));
}

// Lines of 16 bytes, so that every place tells what belongs there.
std::string lines(size_t from, size_t until) {
    std::string text;
    for (size_t number = from; number < until; ++number) {
        std::array<char, 17> line{};
        snprintf(line.data(), line.size(), "%015zu\n", number);
        text += line.data();
    }
    return text;
}

TEST_F(Records, LongOutputsKeepTheirEnds) {
    constexpr size_t kLines = kPart / 16;
    for (const size_t count : {2 * kLines, 2 * kLines + 1, 3 * kLines + 7, size_t{655360}}) {
        const TAVI_SCHED_RUN seen = runNew("seq -f %015.0f 0 " + std::to_string(count - 1));
        EXPECT_EQ(seen.outputSize, static_cast<int64_t>(count * 16));
        EXPECT_EQ(seen.outputKept, static_cast<int64_t>(2 * kPart));
        // What is kept when so many lines more are lost.
        const auto kept = [&](size_t more) {
            const size_t cut = (count - 2 * kLines + more) * 16;
            return lines(0, kLines) + (cut > 0 ? "<" + std::to_string(cut) + " cut>" : "") +
                   lines(count - kLines + more, count);
        };
        EXPECT_TRUE(outputOf(seen.run) == kept(0)) << count;
        // As the file is, it can be read too.
        const std::string file = readFile(fileOf(seen.run));
        EXPECT_TRUE(file.starts_with(lines(0, kLines) + lines(count - kLines, count)));
        EXPECT_LT(file.size(), 2 * kPart + 200);
        // A run that was killed while it replaced the oldest ten lines of the last part.
        shell("sed -i 's/replacing 00000/replacing 00160/' " + fileOf(seen.run));
        EXPECT_TRUE(count == 2 * kLines || outputOf(seen.run) == kept(10)) << count;
    }
}

// An endless printer is followed while it prints, and fills no disk.
TEST_F(Records, EndlessOutputIsFollowedAndStopped) {
    storedTask("seq -f %015.0f 0 inf");
    const int64_t run = started(1).run;
    awaitThat([] { return newest().outputSize > 10'000'000; });
    std::array<char, 4096> buffer{};
    int64_t offset = 0;
    for (int64_t cut = 0; offset < 20'000'000;) {
        ASSERT_EQ(TAVISchedRunFollow(run, offset, 60000), 1);
        const int64_t length =
            TAVISchedRunOutputRead(run, &offset, buffer.data(), buffer.size(), &cut);
        ASSERT_GT(length, 0);
        // The bytes are those of their place.
        const int64_t from = offset - length;
        const int64_t next = (16 - from % 16) % 16;
        const auto line = static_cast<size_t>((from + 15) / 16);
        ASSERT_EQ(std::string(buffer.data() + next, 16), lines(line, line + 1));
    }
    EXPECT_LT(statusOf(fileOf(run).c_str()).st_size, static_cast<off_t>(2 * kPart + 200));
    EXPECT_EQ(TAVISchedRunStop(run, 30), 0);
    waitForChildren();
    EXPECT_EQ(newest().result, TAVI_SCHED_RUN_STOPPED_BY_USER);
    EXPECT_EQ(query("SELECT status_code, comment FROM task_status"), "6 15 ");
    EXPECT_EQ(failure(TAVISchedRunStop(run, 30)), 0x2000U);
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
    EXPECT_THAT(outputOf(seen.run), EndsWith("later\n"));
    EXPECT_EQ(newest().outputSize, 200010);
}

// While it waits for a command, the process is asleep and small.
TEST_F(Records, WaitingIsCheap) {
    storedTask("exec >&- 2>&-; read line < /tmp/fifo");
    mkfifo("/tmp/fifo", 0600);
    const std::string process = "/proc/" + std::to_string(started(1).pid);
    const int fifo = open("/tmp/fifo", O_WRONLY); // the command runs, its output closed
    const std::string switches = "$(grep ctxt " + process + "/status)";
    EXPECT_TRUE(waitFor("a=\"" + switches + "\"; sleep 0.3; test \"$a\" = \"" + switches + "\""));
#ifndef __SANITIZE_ADDRESS__
    const std::string sum = "awk '/^Private_[CD]/ { k += $2 } END { exit k >= 2048 }' ";
    EXPECT_EQ(shell(sum + process + "/smaps_rollup"), 0);
#endif
    close(fifo);
    waitForChildren();
}

TEST_F(Records, StopEndsWhatTheRunStarted) {
    const struct {
        const char *command;
        int grace;
    } cases[] = {
        {"sh -c 'echo $$ > /tmp/deep; exec sleep 600' & wait", 60},
        // Out of its session and deaf, and deaf as a whole.
        {"setsid sh -c 'trap \"\" TERM; echo $$ > /tmp/deep; sleep 600; sleep 600' & wait", 0},
        {"trap '' TERM; echo $$ > /tmp/deep; sleep 600; sleep 600", 0},
    };
    for (const auto &row : cases) {
        unlink("/tmp/deep");
        const Task task = storedTask(row.command);
        const int64_t run = started(task->id).run;
        awaitThat([] { return readFile("/tmp/deep").ends_with('\n'); });
        const pid_t deep = std::stoi(readFile("/tmp/deep"));
        EXPECT_EQ(TAVISchedRunStop(run, row.grace), 0);
        waitForChildren();
        EXPECT_EQ(PLATCProcAlive(deep), 0) << row.command;
        EXPECT_EQ(newest(task->id).result, TAVI_SCHED_RUN_STOPPED_BY_USER) << row.command;
    }
}

TEST_F(Records, StopMeetsOnlyItsOwnRun) {
    storedTask("exec sleep 600");
    const TAVI_SCHED_RUN seen = started(1);
    for (const char *change : {"process_start=process_start-1", "boot='another'"}) {
        recorded(std::string("UPDATE runs SET ") + change);
        EXPECT_EQ(failure(TAVISchedRunStop(seen.run, 0)), 0x2000U) << change;
        EXPECT_EQ(newest().result, TAVI_SCHED_RUN_INTERRUPTED) << change;
    }
    EXPECT_EQ(failure(TAVISchedRunStop(seen.run, -1)), 0x0D00U);
    EXPECT_EQ(failure(TAVISchedRunStop(99, 0)), 0x2000U);
    // A signal of anybody else's is no request.
    EXPECT_EQ(sigqueue(seen.pid, SIGRTMIN + 1, {.sival_int = 3}), 0);
    EXPECT_EQ(PLATCProcAlive(seen.pid), 1);
    // A run whose process dies is interrupted.
    kill(seen.pid, SIGKILL);
    // Its command is given to this process then, and may not have begun yet.
    EXPECT_TRUE(waitFor("pkill -x -P 1," + std::to_string(getpid()) + " sleep"));
    waitForChildren();
    EXPECT_EQ(newest().result, TAVI_SCHED_RUN_INTERRUPTED);
}

TEST_F(Records, WhileARunWaits) {
    const struct {
        const char *meanwhile;
        int result;
    } cases[] = {
        {"true", TAVI_SCHED_RUN_SUCCESS},
        {"people remove 1 --yes", TAVI_SCHED_RUN_TASK_REMOVED},
        {"people remove 1 --yes; people add --command 'echo wrong >> /tmp/out'",
         TAVI_SCHED_RUN_TASK_REMOVED},
        {"people disable 1", TAVI_SCHED_RUN_TASK_DISABLED},
        {"people edit 1 --command 'exit 5'", TAVI_SCHED_RUN_EXIT_FAILED},
        {"people stop 1", TAVI_SCHED_RUN_STOPPED_BY_USER},
    };
    fakes.pauseMicroseconds = 600000;
    for (const auto &row : cases) {
        SCOPED_TRACE(row.meanwhile);
        ASSERT_EQ(storedTask()->id, 1);
        addRunning();
        const TAVI_SCHED_RUN waiting = started(1, TAVI_SCHED_RUN_WAITING);
        EXPECT_TRUE(waiting.waitedFor == 1 && waiting.waitingSince >= waiting.asked);
        EXPECT_EQ(waiting.began, 0);
        const std::string people = "people() { '" TAVISCHED "' \"$@\" > /tmp/said 2>&1; }; ";
        EXPECT_EQ(shell(people + row.meanwhile), 0);
        query("DELETE FROM task_status");
        waitForChildren();
        TAVI_SCHED_RUN ended{};
        EXPECT_EQ(TAVISchedRunGet(waiting.run, &ended), 0);
        EXPECT_EQ(ended.result, row.result);
        const bool ran = row.result < TAVI_SCHED_RUN_WAITING;
        EXPECT_EQ(ended.began != 0, ran);
        EXPECT_TRUE(ran || ended.duration == 0);
        const int64_t until = ran ? ended.began : ended.ended;
        EXPECT_NEAR(ended.waited * 1000, until - ended.waitingSince, 550);
        EXPECT_EQ(query("SELECT count(*) FROM task_status"), ran ? "1 " : "0 ");
        TAVISchedTaskRemove(1);
    }
    EXPECT_EQ(readFile("/tmp/out"), "");
}

TEST_F(Records, WhyATaskDidNotRun) {
    Task task = storedTask("true");
    task->owner = 4999;
    TAVISchedTaskEdit(task.get());
    run();
    EXPECT_THAT(notices(), Contains(HasSubstr(" s: owner-unknown, run 1")));
    EXPECT_THAT(logs(), ElementsAre(HasSubstr("Get uid [4999] failed. [0x0B00 user.cpp:*]"),
                                    HasSubstr("Failed to set user context. uid:[4999] [0x2A00 ")));
    EXPECT_EQ(query("SELECT status_code FROM task_status"), "2 "); // that of a runner that is gone
    EXPECT_EQ(newest().owner, 4999U);
    task->owner = 0;
    TAVISchedTaskEdit(task.get());
    addRunning();
    run();
    EXPECT_EQ(newest().waitedFor, 1);
    shell("rm -r /tmp/lock; ln -s /etc /tmp/lock");
    run();
    shell("rm /tmp/lock; echo no database, no database, no database > /tmp/sched_status.sqlite");
    run();
    EXPECT_EQ(results(), "36:0 35:0 34:0 37:0 ");
}

TEST_F(Records, AnIdThatIsGivenAgain) {
    storedTask("exit 1");
    storedTask("exit 2");
    run(1);
    run(2);
    // Taken back, a batch changes nothing.
    ASSERT_EQ(TAVISchedChangeBegin(), 0);
    TAVISchedTaskRemove(1);
    EXPECT_EQ(storedTask()->id, 1);
    EXPECT_EQ(TAVISchedChangeRollback(), 0);
    EXPECT_EQ(results(), "7:1 ");
    ASSERT_EQ(TAVISchedChangeBegin(), 0);
    TAVISchedTaskRemove(1);
    EXPECT_EQ(TAVISchedChangeCommit(), 0);
    EXPECT_EQ(results(), "");
    storedTask("exit 3");
    run(1);
    EXPECT_EQ(results(), "7:3 ");
    // The file was changed by hand, which nobody told us.
    shell(": > /tmp/scheduled_tasks; : > /usr/tavi/etc/scheduled_tasks");
    EXPECT_EQ(storedTask("exit 4")->id, 1);
    EXPECT_EQ(results(), "");
    // All runs of all tasks, and whose they were.
    EXPECT_EQ(results(ofTask(-1)), "7:3 7:2 7:1 ");
    auto present = ofTask(-1);
    present.newestOnly = 1;
    run(1);
    run(1);
    EXPECT_EQ(results(present), "7:4 7:2 ");
}

TEST_F(Records, MissedTimes) {
    faults().now = at("2024-05-08 07:00");
    Task task = newTask("true");
    task->type = TAVI_SCHED_TYPE_DAILY;
    task->runHour = 8;
    task->repeatHour = 2;
    task->lastWorkHour = 12;
    ASSERT_EQ(TAVISchedTaskCreate(task.get()), 0);
    // What is known to be missed after a look at that moment, which starts and changes take too.
    const auto missed = [](const char *moment, int (*look)() = TAVISchedMissedRunsFind) {
        faults().now = at(moment);
        EXPECT_EQ(look(), 0);
        std::string times;
        for (const TAVI_SCHED_RUN &run : runs(ofTask(1))) {
            EXPECT_TRUE(run.result != TAVI_SCHED_RUN_MISSED || run.ended <= faults().now * 1000);
            const time_t due = run.due / 1000;
            std::array<char, 32> text{};
            strftime(text.data(), text.size(), "%d %H:%M ", localtime(&due));
            times += run.result == TAVI_SCHED_RUN_MISSED ? text.data() : run.result < 0 ? "?" : "";
        }
        return times;
    };
    const auto change = [&](const char *moment) {
        faults().now = at(moment);
        EXPECT_EQ(TAVISchedTaskEdit(task.get()), 0);
    };
    EXPECT_EQ(missed("2024-05-08 07:00", TAVISchedStart), "");
    // cron starts it at 8, and not at 10.
    faults().now = at("2024-05-08 08:00");
    ASSERT_EQ(TAVISchedTaskRun(1, 1, 1), 0);
    waitForChildren();
    EXPECT_EQ(missed("2024-05-08 10:02"), ""); // it may be on its way
    EXPECT_EQ(missed("2024-05-08 10:10", TAVISchedStart), "08 10:00 ");
    EXPECT_EQ(missed("2024-05-08 10:10"), "08 10:00 "); // once
    // Found by the next change, which makes it another schedule from then on.
    task->runHour = 7;
    change("2024-05-08 12:30");
    EXPECT_EQ(missed("2024-05-08 12:40"), "08 12:00 08 10:00 ");
    // The machine was off for weeks: the latest ten times. Nothing of a disabled task.
    EXPECT_THAT(missed("2024-07-01 08:00"),
                AllOf(StartsWith("01 07:00 30 11:00 30 09:00 30 07:00 29 11:00 "),
                      EndsWith("28 09:00 28 07:00 08 12:00 08 10:00 ")));
    task->state = TAVI_SCHED_STATE_DISABLED;
    change("2024-07-01 08:00");
    EXPECT_THAT(missed("2024-07-03 08:00"), StartsWith("01 07:00 "));
    // Due right before a change: not started, started late, started and not recorded.
    task->state = TAVI_SCHED_STATE_ENABLED;
    task->repeatHour = 0;
    change("2024-07-03 08:00");
    change("2024-07-04 07:01");
    EXPECT_THAT(missed("2024-07-04 07:02"), StartsWith("01 07:00 "));
    EXPECT_THAT(missed("2024-07-04 07:05"), StartsWith("04 07:00 01 07:00 "));
    faults().now = at("2024-07-05 07:00") + 30;
    EXPECT_EQ(TAVISchedTaskEdit(task.get()) + TAVISchedTaskRun(1, 1, 1), 0);
    waitForChildren();
    EXPECT_TRUE(newest().due == at("2024-07-05 07:00") * 1000 && newest().mode == 1);
    EXPECT_THAT(missed("2024-07-05 07:05"), StartsWith("04 07:00 "));
    change("2024-07-06 07:01");
    query("UPDATE task_status SET timestamp=timestamp+86400");
    EXPECT_THAT(missed("2024-07-06 07:05"), StartsWith("04 07:00 "));
    recorded("UPDATE runs SET result=40 WHERE result=-1"); // none is awaited any more
    EXPECT_THAT(missed("2024-07-06 07:05"), StartsWith("04 07:00 "));
    // A removal looks, too.
    const int32_t midnight = storedTask()->id;
    faults().now = at("2024-07-07 00:05");
    EXPECT_EQ(TAVISchedTaskRemove(midnight), 0);
    const auto all = runs(ofTask(-1));
    EXPECT_TRUE(std::any_of(all.begin(), all.end(), [](const TAVI_SCHED_RUN &run) {
        return run.isOfRemovedTask == 1 && run.due == at("2024-07-07 00:00") * 1000;
    }));
    // Records that went were no missed times.
    writeFile(kLimits, "[limits]\nruns_per_task=1\n");
    for (const char *const moment : {"2024-07-07 07:00", "2024-07-08 07:00"}) {
        faults().now = at(moment);
        EXPECT_EQ(TAVISchedTaskRun(1, 1, 1), 0);
        waitForChildren();
    }
    query("DELETE FROM task_status");
    EXPECT_EQ(missed("2024-07-08 07:05"), "");
    EXPECT_THAT(logs(), IsEmpty());
}

TEST_F(Records, LimitsAndPruning) {
    writeFile(kLimits, "[limits]\nruns_per_task=2\nruns=5\n");
    TAVI_SCHED_RUN_LIMITS limits{};
    EXPECT_TRUE(TAVISchedRunLimitsGet(&limits) == 0 && limits.runsPerTask == 2 && limits.runs == 5);
    for (int id = 1; id <= 4; ++id) {
        storedTask(("exit " + std::to_string(id)).c_str());
    }
    for (const int id : {2, 1, 1, 1, 2, 3}) {
        run(id);
    }
    waitForChildren();
    EXPECT_EQ(results(ofTask(-1)), "7:3 7:2 7:1 7:1 7:2 ");
    EXPECT_EQ(shell("cd /var/lib/tavischeduler/output; test \"$(echo *)\" = '1 3 4 5 6'"), 0);
    EXPECT_EQ(
        shell("cd /var/lib/tavischeduler; test -e runs.sqlite-wal -a $(stat -c %a output) = 700"),
        0); // the log is left to whoever writes enough
    recorded("CREATE TRIGGER kept BEFORE DELETE ON runs BEGIN SELECT RAISE(ABORT, ''); END");
    run(4);
    EXPECT_THAT(logs(), Contains(HasSubstr("old records are not removed")));
    recorded("DROP TRIGGER kept; DELETE FROM runs WHERE task_id=4");
    run(4);
    EXPECT_EQ(results(ofTask(-1)), "7:4 7:3 7:2 7:1 7:1 ");
    // Numbers go on, whatever a loss of power took: their file, records, or the last of its bytes.
    shell("cd /var/lib/tavischeduler; rm run_number; touch output/9; touch -d @0 output/99");
    run(4);
    EXPECT_EQ(newest(4).run, 10);
    writeFile("/var/lib/tavischeduler/run_number", "3\n");
    ASSERT_EQ(TAVISchedStart(), 0);
    run(4);
    EXPECT_EQ(newest(4).run, 11);
    EXPECT_EQ(access(fileOf(99).c_str(), F_OK), -1); // nobody's
    const auto readFrom = [](int64_t run, int64_t offset) {
        char byte = 0;
        return failure(static_cast<int>(TAVISchedRunOutputRead(run, &offset, &byte, 1, nullptr)));
    };
    EXPECT_EQ(readFrom(1, 0), 0x2000U);
    TAVI_SCHED_RUN gone{};
    EXPECT_EQ(failure(TAVISchedRunGet(1, &gone)), 0x2000U);
    EXPECT_EQ(readFrom(5, -1), 0x0D00U);
    logs();
    writeFile(kLimits, "[limits]\nruns_per_task=-2\nruns=x\nskipped=2\n");
    EXPECT_TRUE(TAVISchedRunLimitsGet(&limits) == 0 && limits.runsPerTask == 50 &&
                limits.runs == 10000 && limits.skipped == 0);
    EXPECT_EQ(logs().size(), 3U);
}

// What cron asks for in vain has records where that is asked for.
TEST_F(Records, OfWhatIsSkipped) {
    faults().now = at("2024-05-15 08:31"); // it is due at midnight
    Task task = storedTask();
    for (const char *const skipped : {"0", "1"}) {
        writeFile(kLimits, std::string("[limits]\nskipped=") + skipped + "\n");
        for (const int state : {1, 0}) {
            task->state = state;
            TAVISchedTaskEdit(task.get());
            EXPECT_EQ(TAVISchedTaskRun(1, 1, 1), 0);
            EXPECT_EQ(TAVISchedTaskRun(1, 2, 1), 0); // nobody's request
        }
    }
    EXPECT_EQ(results(ofTask(1)), "39:0 41:0 ");
    EXPECT_EQ(shell("test -s /tmp/sched_status.sqlite"), 1);
}

// Whatever is wrong with the records, the command runs and its result is stored.
TEST_F(Records, NothingKeepsARunFromRunning) {
    const Task task = storedTask("echo ran >> /tmp/out; head -c 300000 /dev/zero");
    const struct {
        const char *what, *before, *after;
        int recorded; // how many records there are then
        const char *log;
    } cases[] = {
        {"newer",
         "cp runs.sqlite /run/old; printf '\\143' | dd bs=1 seek=63 conv=notrunc of=runs.sqlite "
         "2> /dev/null; cp runs.sqlite /run/new",
         "cmp runs.sqlite /run/new && cp /run/old runs.sqlite", -1, "cannot be opened"},
        {"damaged",
         "head -c 4096 /dev/zero | dd bs=4096 seek=1 conv=notrunc of=runs.sqlite 2> /dev/null",
         "test -s runs.sqlite.damaged && rm runs.sqlite*", 1, "is damaged and put aside"},
        {"full", "head -c 100M /dev/zero > fill 2>/dev/null", "rm fill", 0, kFolder},
        {"no place for outputs", "rm -r output; touch output", "rm output", 1, "cannot be made"},
    };
    const auto inFolder = [](const char *does) {
        return shell(std::string("cd /var/lib/tavischeduler; ") + does);
    };
    ASSERT_EQ(mount("small", kFolder, "tmpfs", 0, "size=512k,mode=700"), 0);
    run();
    waitForChildren();
    recorded("PRAGMA wal_checkpoint(truncate)");
    for (const auto &row : cases) {
        SCOPED_TRACE(row.what);
        unlink("/tmp/out");
        query("DELETE FROM task_status");
        inFolder(row.before);
        logs();
        run();
        waitForChildren();
        EXPECT_EQ(readFile("/tmp/out"), "ran\n");
        EXPECT_EQ(query("SELECT status_code FROM task_status"), "3 ");
        EXPECT_THAT(logs(), Contains(HasSubstr(row.log)));
        PLATCErrSetEx(0, "", 0);
        const auto none = [](auto...) { return 0; };
        EXPECT_EQ(TAVISchedRunList(nullptr, none, nullptr), row.recorded);
        EXPECT_EQ(PLATCErrGet(), row.recorded < 0 ? 0x0900U : 0U);
        EXPECT_EQ(inFolder(row.after), 0);
    }
    EXPECT_EQ(umount(kFolder), 0);
}

TEST_F(Records, ALockedDatabaseIsNotWaitedForLong) {
    runNew("true");
    waitForChildren();
    const pid_t other = startHolder("BEGIN IMMEDIATE; CREATE TABLE other(value)");
    // More than a pipe holds is printed while the record is waited for.
    storedTask("head -c 300000 /dev/zero; touch /tmp/printed");
    ASSERT_EQ(TAVISchedTaskRun(2, 0, 0), 0);
    awaitThat([] { return access("/tmp/printed", F_OK) == 0; });
    EXPECT_THAT(logs(), IsEmpty());
    awaitThat([] { return !lastLog().empty(); });
    EXPECT_EQ(query("SELECT task_id, status_code FROM task_status"), "1 3 2 3 ");
    kill(other, SIGKILL);
    waitForChildren();
    EXPECT_EQ(results(ofTask(-1)), "3:0 ");
}

// One that is let go in time is waited for.
TEST_F(Records, ANewDatabaseIsMadeBesideOthers) {
    storedTask("sleep 0.2"); // it is recorded when it begins, too
    const pid_t other = startHolder("BEGIN IMMEDIATE");
    ASSERT_EQ(TAVISchedTaskRun(1, 0, 0), 0);
    awaitThat([] { return query("SELECT status_code FROM task_status") == "3 "; });
    kill(other, SIGKILL);
    waitForChildren();
    EXPECT_THAT(logs(), IsEmpty());
    EXPECT_EQ(results(ofTask(-1)), "3:0 ");
}

TEST_F(Records, ManyAtOnce) {
    constexpr int kMany = kStep == 1 ? 200 : 30;
    fakes.pauseMicroseconds = 3000; // a locked status database is waited for
    Task task = newTask("echo $TAVI_RUN_ID");
    TAVISchedCTaskSetCanRunTaskSameTime(task.get(), 1);
    writeFile(kLimits, "[limits]\nruns_per_task=1000\n");
    ASSERT_EQ(TAVISchedTaskCreate(task.get()), 0);
    for (int i = 0; i < kMany; ++i) {
        ASSERT_EQ(TAVISchedTaskRun(1, 0, 0), 0);
    }
    waitForChildren();
    const auto found = runs(ofTask(1));
    EXPECT_EQ(found.size(), static_cast<size_t>(kMany));
    for (const TAVI_SCHED_RUN &run : found) {
        EXPECT_EQ(run.result, TAVI_SCHED_RUN_SUCCESS);
        EXPECT_EQ(outputOf(run.run), std::to_string(run.run) + "\n");
    }
    EXPECT_THAT(logs(), IsEmpty());
    EXPECT_EQ(notices().size(), static_cast<size_t>(2 * kMany));
    EXPECT_NE(access("/tmp/lock", F_OK), 0); // those that may overlap need none
}

// The examples, with stand-ins for the programs that they call; nothing in a name is obeyed.
TEST_F(Records, HandlersThatAreShipped) {
    const std::string folder = "/usr/tavi/etc/plugins/task_scheduler_run";
    shell("mkdir -p /tmp/bin " + folder + "; cp '" EXAMPLES "'/* " + folder);
    writeFile("/tmp/bin/sendmail", "#!/bin/sh\ncat > /tmp/mail\n");
    writeFile("/tmp/bin/curl", "#!/bin/sh\nfor word; do echo \"$word\"; done > /tmp/post\n");
    shell("chmod 755 /tmp/bin/*");
    const std::string path = std::getenv("PATH");
    setenv("PATH", ("/tmp/bin:" + path).c_str(), 1);
    setenv("TAVI_POST_URL", "http://localhost/", 1);
    setenv("TAVI_METRICS_FOLDER", "/tmp", 1);
    Task task = newTask("echo printed; exit 3");
    TAVISchedCTaskSetName(task.get(), "a \"b\" $(c) \\ &d=\xc3\xa9");
    ASSERT_EQ(TAVISchedTaskCreate(task.get()), 0);
    run();
    waitForChildren();
    setenv("PATH", path.c_str(), 1);
    EXPECT_THAT(readFile("/tmp/mail"),
                StartsWith("To: root\nSubject: task 1 (a \"b\" $(c) \\ &d=\xc3\xa9): exit 3\n"));
    EXPECT_EQ(shell("sed '1,/^$/d' /tmp/mail | base64 -d | grep -qx printed"), 0);
    EXPECT_THAT(readFile("/tmp/post"),
                AllOf(HasSubstr("name=a \"b\" $(c) \\ &d=\xc3\xa9\n"), HasSubstr("result=exit\n"),
                      EndsWith("\n--\nhttp://localhost/\n")));
    EXPECT_THAT(
        readFile("/tmp/tavischeduler_task_1.prom"),
        HasSubstr("last_run_success{task=\"1\",name=\"a \\\"b\\\" $(c) \\\\ &d=\xc3\xa9\"} 0\n"));
    EXPECT_THAT(logs(), IsEmpty());
}

// The clock is taken to tick so fast that every process is old.
TEST_F(Records, HandlersAreToldAndEndedWhenTheyHang) {
    addHandler("a", "sleep 600 & echo $! > /tmp/hangs; wait", 0755, "task_scheduler_run");
    addHandler("b",
               "{ echo $1 $2 $TASK_ID $TASK_NAME $RUN_ID $RUN_RESULT $RUN_NUMBER; head -n 1 "
               "$RUN_OUTPUT; echo $RUN_BEGAN; grep SigBlk: /proc/self/status; } > /tmp/told",
               0755, "task_scheduler_run");
    fakes.clockTicks = 1000000;
    const TAVI_SCHED_RUN seen =
        runNew("(sleep 1; head -c 200000 /dev/zero; echo on > /tmp/on) & echo printed; exit 3");
    EXPECT_EQ(seen.number, 3); // nobody waited
    waitForChildren();
    EXPECT_THAT(readFile("/tmp/told"),
                MatchesRegex("task_run post 1 Task 1 1 exit 3\nprinted\n"
                             "20..-..-..T..:..:..\\+00:00\nSigBlk:.0000000000000000\n"));
    EXPECT_EQ(readFile("/tmp/on"), "on\n");
    EXPECT_EQ(PLATCProcAlive(std::stoi(readFile("/tmp/hangs"))), 0);
    std::string started = readFile("/tmp/hangs"); // goes with it, and is not what is ended
    started.pop_back();
    EXPECT_THAT(logs(), AllOf(Contains(HasSubstr("a handler of runs is ended after 60 s")),
                              Not(Contains(EndsWith("process " + started)))));
}

} // namespace
