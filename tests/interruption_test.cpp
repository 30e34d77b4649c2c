// Operations that are cut off, or meet calls that fail: at every system call that changes a file
// all processes, the caller alone or a started program alone are killed; or a call of some kind
// fails. Afterwards the tasks are as they were or as they are to be, in every file, and runs are
// told of as they were.
#include "machine.h"
#include "tracer.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstring>
#include <fcntl.h>
#include <fstream>
#include <functional>
#include <regex>
#include <set>
#include <sstream>
#include <syslog.h>
#ifdef __SANITIZE_ADDRESS__
#include <sanitizer/lsan_interface.h>
#endif

namespace {

using namespace support;
using tracer::Act;
using tracer::Call;

// ---- Operations ----

constexpr int kInstead = 4;

struct Operation {
    const char *name;
    const char *suites;                               // 'k'illed, 't'aken back, 'f'ailing, 'l'og
    std::function<int()> run;                         // 0, 1, or kInstead
    std::function<void()> prepare = [] {};            // on top of three tasks and a power schedule
    std::function<std::string(int)> faults = nullptr; // what else is wrong after an answer
    std::function<int()> instead = nullptr;           // does what it may do instead
    bool isBatch = false;
    bool isPower = false;
};

void PrintTo(const Operation &operation, std::ostream *out) {
    *out << operation.name;
}

int editedName() {
    return edited("a name of quite another length than the one it had");
}

std::array<char, 160 << 10> jsonOf3; // of task 3, changed

// What is no JSON sets no code. Where the stored task cannot be read, a new one is made.
int saved(int create = 0) {
    const int id = TAVISchedTaskSaveFromJson(jsonOf3.data(), create);
    if (id == -1 && PLATCErrGet() == 0) {
        PLATCErrSetEx(TAVI_SCHED_ERR_BAD_FORMAT, "", 0);
    }
    return id == -1 ? 1 : id == 3 ? 0 : kInstead;
}

int batchDone() {
    const bool changed = TAVISchedChangeBegin() == 0 && created("first") == 0 &&
                         editedName() == 0 && TAVISchedTaskRemove(1) == 0 && powerCreated() == 0 &&
                         saved() == 0 && created("second") == 0;
    return changed && TAVISchedChangeCommit() == 0 ? 0 : 1;
}

bool isWhole(const TAVI_SCHED_TASK &task) {
    return task.name[0] != '\0' && task.nextTriggerTime[0] == '2';
}

// What is missing in a list has been logged.
int listed() {
    TAVI_SCHED_TASK *list = nullptr;
    int whole = 0;
    const int count = TAVISchedTaskListGet(&list, nullptr);
    for (const TAVI_SCHED_TASK *task = list; task; task = TAVISchedTaskNext(task)) {
        whole += isWhole(*task) ? 1 : 0;
    }
    TAVISchedTaskListFree(&list);
    const OwnAllocations own;
    return whole == 4 ? 0 : count <= whole && !logs().empty() ? 1 : 2;
}

int readById() {
    TAVI_SCHED_TASK task{};
    const int result = TAVISchedTaskGetByID(2, &task);
    return result != 0 ? 1 : isWhole(task) ? 0 : 2;
}

int readJson() {
    static std::array<char, jsonOf3.size()> read;
    const int result = TAVISchedTaskConvertToJsonById(3, read.data(), read.size());
    if (result != 0 && PLATCErrGet() == 0) {
        PLATCErrSetEx(TAVI_SCHED_ERR_MEMORY, "", 0);
    }
    return result != 0 ? 1 : std::strcmp(read.data(), jsonOf3.data()) == 0 ? 0 : 2;
}

// ---- Programs ----

constexpr const char *kSaid = "/home/said"; // not among the files whose calls fail

template <typename... Arguments> int tool(Arguments... arguments) {
    const int null = open("/dev/null", O_RDWR);
    dup2(null, 0);
    dup2(null, 1);
    dup2(open(kSaid, O_WRONLY | O_CREAT | O_TRUNC, 0600), 2);
    if (faults().kind != Fault::None) {
        shareWithProgram(FAULTS);
    }
    return execl(TAVISCHED, TAVISCHED, arguments..., nullptr);
}

// Two tasks with another command, one as a new one.
void exportTasks() {
    shell("'" TAVISCHED "' export | sed 's/\"true\"/\"false\"/; s/\"one\"/\"uno\"/' "
          "> /run/tasks.json");
}

std::string faultsOfTool(int answer) {
    return answer == 0 || readFile(kSaid).find("tavisched: ") != std::string::npos
               ? ""
               : " it said nothing";
}

// ---- Runs ----

constexpr const char *kRan = "/home/ran";

int ran(int32_t id) {
    return -TAVISchedTaskRun(id, 0, 0);
}

void runOther() {
    ran(1);
    waitForChildren();
}

std::string recordsOf(int32_t id) {
    std::string text;
    for (const TAVI_SCHED_RUN &run : runs(ofTask(id))) {
        text += std::to_string(run.taskId) + ":" + std::to_string(run.due) + ":" +
                std::to_string(run.result) + " ";
    }
    return text;
}

// What row and record tell, if there are any, is what became of the command; the lock is free. A
// command whose result is lost counts as not started, as system() has it.
std::string faultsOfRun(int answer) {
    const std::string row = query("SELECT status_code FROM task_status WHERE task_id=3");
    const std::string marks = readFile(kRan);
    const std::string record = recordsOf(3);
    const bool isRight =
        marks.empty()
            ? row.empty() || (answer == 0 && (row == "2 " || row == "4 ") && record != "3:0:3 ")
            : answer == 0 && marks == "x" && (row == "2 " || row == "3 " || row == "4 ") &&
                  (record.empty() || record == "3:0:1 " ||
                   record == (row == "4 " ? "3:0:4 " : "3:0:3 "));
    const bool isLocked = shell("cd /tmp/lock && ! flock -n lock_sched_run true") == 0;
    return isRight && !isLocked ? "" : row + "| " + marks + "| " + record + (isLocked ? "|" : "");
}

std::string missedRuns; // as they are to be found

std::string findMissed() {
    TAVISchedMissedRunsFind();
    return recordsOf(-1);
}

// Two days later, and one of the runs is known.
void missRuns() {
    faults().now += 2 * 86400;
    query("INSERT INTO task_status (pid, timestamp, task_id, status_code) VALUES (1, " +
          std::to_string(faults().now / 86400 * 86400 - 86400) + ", 2, 3)");
    const Snapshot before;
    missedRuns = findMissed();
    before.restore();
}

// What could not be found is found next time.
std::string faultsOfMissed(int) {
    const std::string found = findMissed();
    return found == missedRuns ? "" : " not " + missedRuns + "but " + found;
}

std::vector<Operation> operations(char suite) {
    std::vector<Operation> all = {
        {"create", "kfl", [] { return created("new"); }},
        {"edit", "kf", editedName},
        {"remove", "kfl", [] { return -TAVISchedTaskRemove(2); }},
        {"save", "kfl", [] { return saved(); }, [] {}, nullptr, [] { return saved(1); }},
        {.name = "batch", .suites = "ktf", .run = batchDone, .isBatch = true},
        {.name = "power", .suites = "kfl", .run = [] { return powerCreated(); }, .isPower = true},
        {"sync", "ktfl", [] { return -TAVISchedTaskSync(); }},
        {"first_create", "ktf", [] { return created("new"); },
         [] { shell("rm -r /tmp/* /usr/tavi/etc/*; sed -i /tavi/d /etc/crontab"); }},
        {"create_with_differing_files", "kt", [] { return created("new"); },
         [] { writeFile(kPersistent, readFile(kPersistent) + "[9]\nname=of the file alone\n"); }},
        {"tool_add", "k", [] { return tool("add", "--command", "true", "--at", "03:00"); }},
        {"tool_disable", "k", [] { return tool("disable", "1", "3"); }},
        {"tool_import", "f", [] { return tool("import", "--replace", "/run/tasks.json"); },
         exportTasks, faultsOfTool, nullptr, true},
        {"list", "f", listed},
        {"get", "f", readById},
        {"get_json", "fl", readJson,
         [] { TAVISchedTaskConvertToJsonById(3, jsonOf3.data(), jsonOf3.size()); }},
        {"first_run", "f", [] { return ran(3); }, [] {}, faultsOfRun},
        {"run", "f", [] { return ran(3); }, runOther, faultsOfRun},
        {"missed", "f", [] { return -TAVISchedMissedRunsFind(); }, missRuns, faultsOfMissed}};
    std::erase_if(
        all, [&](const Operation &operation) { return !std::strchr(operation.suites, suite); });
    return all;
}

std::string nameOf(const testing::TestParamInfo<Operation> &operation) {
    return operation.param.name;
}

// ---- The test ----

// How an operation meets its end, and so what may be found afterwards. Outside of a batch a task is
// stored also when the crontab cannot be written, and power schedules when they cannot be applied.
// Without memory nothing can be taken back: whoever comes next does that, as after a cut.
enum class End { Cut, Failure, Exhaustion };

// What became of an operation: what it answered, unless it was killed.
struct Try {
    bool acted = true;
    std::string where;
    std::optional<int> answer;
};

Try tryOf(const tracer::Run &run) {
    Try tried{run.acted, run.call.name + " " + run.call.path, std::nullopt};
    if (run.crashed || WIFEXITED(run.status)) {
        tried.answer = run.crashed ? 99 : WEXITSTATUS(run.status);
    }
    return tried;
}

class Interruption : public SchedTest, public testing::WithParamInterface<Operation> {
  protected:
    void SetUp() override {
        SchedTest::SetUp();
        signal(SIGHUP, SIG_IGN);
        // Of programs; leaks cannot be looked for under a tracer.
        setenv("ASAN_OPTIONS",
               "abort_on_error=1:detect_leaks=0:verify_asan_link_order=0:alloc_dealloc_mismatch=0",
               1);
        faults().now = time(nullptr);
        ASSERT_EQ(created("one"), 0);
        ASSERT_EQ(created("two"), 0);
        ASSERT_EQ(created("three", "printf x >> /home/ran"), 0);
        ASSERT_EQ(powerCreated(5), 0);
        TAVI_SCHED_TASK task{};
        TAVISchedTaskGetByID(3, &task);
        task.runMin = 17;
        ASSERT_EQ(TAVISchedTaskConvertToJson(&task, jsonOf3.data(), jsonOf3.size()), 0);
        writeFile("/run/crond.pid", std::to_string(getpid()));
        GetParam().prepare();
        start_.emplace();
        old_ = stateNow(listOfFreshProcess());
        new_ = half_ = learn(GetParam().run);
        half_[kCrontab] = old_[kCrontab];
        instead_ = GetParam().instead ? learn(GetParam().instead) : State();
    }

    // Goes through points, each time from the start.
    void tryAll(const std::string &what, const std::vector<size_t> &points, End end,
                const std::function<Try(size_t)> &tryAt) {
        for (const size_t point : points) {
            start_->restore();
            unlink(kRan);
            unlink(kSaid);
            logs();
            Try tried = tryAt(point);
            const std::string said = readFile(kSaid);
            if (said.find("what was asked for was done") != std::string::npos) {
                tried.answer = 0;
            }
            if (tried.acted) {
                expectNone(faultsAfter(tried.answer, end),
                           what + std::to_string(point) + " " + tried.where + " " + said);
            }
        }
    }

    // Of the calls that matter those with these properties.
    std::vector<size_t> pointsOf(tracer::Calls calls, size_t most,
                                 const std::function<bool(const Call &)> &concerned) const {
        std::vector<size_t> points;
        const auto note = [&](const Call &call, size_t point) {
            if (concerned(call)) {
                points.push_back(point);
            }
            return false;
        };
        start_->restore();
        tracer::run(GetParam().run, {.calls = calls, .isPoint = note});
        return chosen(points, most);
    }

    std::optional<Snapshot> start_;

  private:
    // What an operation that nothing disturbs leaves.
    State learn(const std::function<int()> &operation) const {
        start_->restore();
        const auto answer = tryOf(tracer::run(operation)).answer;
        EXPECT_TRUE(answer == 0 || answer == kInstead) << lastLog();
        EXPECT_THAT(leftovers(), IsEmpty());
        return stateNow(listOfFreshProcess());
    }

    std::string faultsAfter(std::optional<int> answer, End end) const {
        const bool mayBeHalf = end != End::Cut;
        const State before = stateNow();
        State now = stateNow(listOfFreshProcess());
        const bool isOld = now == old_;
        const bool isNew = now == new_ || (mayBeHalf && !GetParam().isBatch && now == half_);
        const bool isRight = !answer               ? isOld || now == new_
                             : *answer == 0        ? isNew
                             : *answer == kInstead ? now == instead_
                             : *answer == 1 ? isOld || (mayBeHalf && GetParam().isPower && isNew)
                                            : false;
        std::string faults;
        if (!isRight) {
            faults = " the answer was " + std::to_string(answer.value_or(-1)) + ";";
            for (const auto &[path, content] : now) {
                faults += " " + path +
                          (content == old_.at(path)   ? " old"
                           : content == new_.at(path) ? " new"
                                                      : " STRANGE " + content);
            }
        }
        now["list"] = "";
        faults += end == End::Failure && before != now ? " the list changed something;" : "";
        return faults + (GetParam().faults && answer ? GetParam().faults(*answer) : "");
    }

    State old_, new_, half_, instead_;
};

// ---- Killing ----

constexpr size_t kMostKills = kStep == 1 ? 99 : 3;

TEST_P(Interruption, Killed) {
    const std::pair<const char *, Act> rows[] = {
        {"all processes killed", Act::KillAll},
        {"caller killed", Act::KillCaller}, // with no program there, the caller is all
        {"program killed", Act::KillProgram}};
    for (const auto &[what, act] : rows) {
        const auto isConcerned = [act = act](const Call &call) {
            return act == Act::KillAll || call.isPrograms;
        };
        tryAll(what, pointsOf(tracer::Calls::Changing, kMostKills, isConcerned), End::Cut,
               [act = act](size_t point) {
                   return tryOf(
                       tracer::run(GetParam().run, {.act = act, .isPoint = tracer::at(point)}));
               });
    }
}

class TakingBack : public Interruption {};

// Taking back what was cut off is cut off itself.
TEST_P(TakingBack, Killed) {
    constexpr size_t kCuts = 4;
    const auto takeBack = [] { return listOfFreshProcess() == "failed" ? 1 : 0; };
    start_->restore();
    const size_t points = tracer::run(GetParam().run).points;
    for (size_t cut = 1; cut <= kCuts; ++cut) {
        const auto cutOff = [&] {
            start_->restore();
            tracer::run(GetParam().run,
                        {.act = Act::KillAll, .isPoint = tracer::at(cut * points / kCuts)});
        };
        cutOff();
        const auto all = upTo(tracer::run(takeBack).points);
        tryAll("killed, and killed again while taken back", chosen(all, kMostKills), End::Cut,
               [&](size_t point) {
                   cutOff();
                   Try tried = tryOf(
                       tracer::run(takeBack, {.act = Act::KillAll, .isPoint = tracer::at(point)}));
                   tried.answer.reset();
                   return tried;
               });
    }
}

// ---- What is told of failures ----

using Lines = std::set<std::string>;

// A line of the log without what differs from try to try, and the code that it ends with. Numbers
// of lines stay where they are stable ones, that of what set the code behind it.
std::string toldBy(std::string line) {
    static const std::pair<std::regex, const char *> kParts[] = {
        {std::regex("\n$"), ""},
        {std::regex("(tmp\\.|process )\\d+"), "$1*"},
        {std::regex("tavischedtask .*;"), "tavischedtask *;"}, // who may replace it
        {std::regex("^(?!backends/backend_tavischedule)([^:]*):\\d+ "), "$1:* "},
        {std::regex(" ?\\[0x([0-9A-F]+) backends/backend_tavischedule.cpp(:\\d+)\\]$"), " | $1$2"},
        {std::regex(" ?\\[0x([0-9A-F]+) [^ ]*\\]$"), " | $1"}};
    for (const auto &[part, instead] : kParts) {
        line = std::regex_replace(line, part, instead);
    }
    return line;
}

// A line of the operation's file stands for one with each of its codes.
Lines expectedOf(const std::string &operation) {
    std::ifstream file(FAILURES + operation);
    Lines lines;
    for (std::string line; std::getline(file, line);) {
        const size_t end = line.find(" | ");
        std::istringstream codes(end == std::string::npos ? "" : line.substr(end + 2));
        for (std::string code; codes >> code;) {
            lines.insert(line.substr(0, end + 3) + code);
        }
        if (end == std::string::npos && !line.starts_with("#")) {
            lines.insert(line);
        }
    }
    return lines;
}

std::string onlyIn(const Lines &some, const Lines &others) {
    std::string text;
    for (const std::string &line : some) {
        text += others.contains(line) ? "" : line + "\n";
    }
    return text;
}

// ---- Failing ----

// Those of a program's libraries and of its start are not ours.
bool isOurs(const Call &call) {
    constexpr std::array<const char *, 5> kPlaces = {"/tmp", "/usr/tavi", "/etc/crontab", "/run",
                                                     "/var/lib/tavischeduler"};
    return call.path.empty() || call.path == "/etc/" ||
           std::any_of(kPlaces.begin(), kPlaces.end(),
                       [&](const char *place) { return call.path.starts_with(place); });
}

int answer() {
    // What an operation may fail with; also what the platform's functions set.
    constexpr std::array<unsigned int, 12> kCodes = {0x0100, 0x0200, 0x0400, 0x0500,
                                                     0x0900, 0x0B00, 0x0D00, 0x2000,
                                                     0x2700, 0x2800, 0x2A00, 0x4000};
    PLATCErrSetEx(0, "", 0);
    const int answer = testing::WithParamInterface<Operation>::GetParam().run();
    const bool isKnown = std::find(kCodes.begin(), kCodes.end(), PLATCErrGet()) != kCodes.end();
    if (answer != 0) {
        syslog(LOG_ERR, "answers %d [0x%04X ]", answer, PLATCErrGet());
    }
    return answer == 1 && !isKnown ? 3 : answer;
}

// The same in a process of its own, when all that this has started has ended; more than 9 when one
// of them crashes, or it throws or leaks.
int answerInChild() {
    const pid_t child = start([]() noexcept {
        int answered = answer();
#ifdef __SANITIZE_ADDRESS__
        answered = __lsan_do_recoverable_leak_check() == 0 ? answered : 10;
#endif
        return answered;
    });
    int answered = 0;
    int status = 0;
    for (pid_t ended = 0; (ended = wait(&status)) > 0;) {
        const int result = WIFSIGNALED(status) ? 10 + WTERMSIG(status) : WEXITSTATUS(status);
        answered = ended == child || result > 10 ? std::max(answered, result) : answered;
    }
    return answered;
}

Try failSystemCallWith(size_t point, const std::function<int(const Call &)> &errorAt) {
    tracer::Plan plan{.calls = tracer::Calls::Failing, .act = Act::Fail};
    plan.isPoint = [&](const Call &call, size_t number) {
        plan.error = errorAt(call);
        return number == point;
    };
    const auto run = tracer::run(answer, plan);
    if (run.call.name == "unlink") {
        unlink(run.call.path.c_str()); // what cannot be removed stays
    }
    Try tried = tryOf(run);
    tried.acted = tried.acted && isOurs(run.call); // a minute may have passed
    return tried;
}

Try failSystemCall(size_t point) {
    return failSystemCallWith(point, [point](const Call &call) {
        constexpr std::array<int, 3> kOpening = {ENOSPC, EMFILE, EACCES};
        constexpr std::array<int, 3> kOthers = {EIO, ENOMEM, ENOSPC};
        return (call.name.starts_with("open") ? kOpening : kOthers)[point % 3];
    });
}

class Failing : public Interruption {};

TEST_P(Failing, Calls) {
    constexpr size_t kMost = kStep == 1 ? 20 : 1;
    const struct {
        const char *what;
        Fault fault; // none: system calls
        bool isLasting = false;
    } rows[] = {{"a system call failed", Fault::None},
                {"an allocation failed", Fault::Memory},
                {"no more memory", Fault::Memory, true},
                {"a wait failed", Fault::Wait},
                {"a start of a program failed", Fault::Spawn},
                {"local time failed", Fault::Time},
                {"opening a database failed", Fault::DatabaseOpen},
                {"a step in a database failed", Fault::DatabaseStep},
                {"a commit in a database failed", Fault::DatabaseCommit}};
    start_->restore();
    fail(Fault::All);
    answerInChild();
    std::vector<size_t> counts(faults().calls.begin(), faults().calls.end());
    fail(Fault::None);
    const auto isFork = [](const Call &call) {
        return !call.isPrograms && (call.name.ends_with("fork") || call.name == "clone");
    };
    tryAll("a fork failed", pointsOf(tracer::Calls::Failing, 99, isFork), End::Failure,
           failSystemCall);
    for (const auto &row : rows) {
        if (row.fault == Fault::None) {
            // Of those that "Telling" takes all of, half as many.
            const size_t most = std::strchr(GetParam().suites, 'l') ? kMost : 2 * kMost;
            tryAll(row.what, pointsOf(tracer::Calls::Failing, most, isOurs), End::Failure,
                   failSystemCall);
            continue;
        }
        tryAll(row.what, chosen(upTo(counts.at(static_cast<size_t>(row.fault))), kMost),
               row.isLasting ? End::Exhaustion : End::Failure, [&](size_t point) {
                   fail(row.fault, point, row.isLasting);
                   const int answered = answerInChild();
                   fail(Fault::None);
                   return Try{.acted = true, .where = "", .answer = answered};
               });
    }
}

class Telling : public Interruption {};

// What is logged and answered when any of the system calls fails: nothing else, and all of it.
// Not of operations of several processes, whose calls have no order.
TEST_P(Telling, Failures) {
    constexpr size_t kMost = kStep == 1 ? 9999 : 2;
    Lines told;
    const auto points = pointsOf(tracer::Calls::Failing, kMost, isOurs);
    tryAll("a system call failed", points, End::Failure, [&](size_t point) {
        Try tried = failSystemCallWith(point, [](const Call &) { return EIO; });
        for (const std::string &line : logs(true)) {
            told.insert(toldBy(line));
            tried.where += "\n" + line;
        }
        return tried;
    });
    const Lines expected = expectedOf(GetParam().name);
    EXPECT_EQ(onlyIn(told, expected), "") << "is not in " << FAILURES << GetParam().name;
    EXPECT_EQ(kStep == 1 ? onlyIn(expected, told) : "", "") << "is missing";
}

INSTANTIATE_TEST_SUITE_P(Operations, Interruption, testing::ValuesIn(operations('k')), nameOf);
INSTANTIATE_TEST_SUITE_P(Operations, TakingBack, testing::ValuesIn(operations('t')), nameOf);
INSTANTIATE_TEST_SUITE_P(Operations, Failing, testing::ValuesIn(operations('f')), nameOf);
INSTANTIATE_TEST_SUITE_P(Operations, Telling, testing::ValuesIn(operations('l')), nameOf);

} // namespace
