// Changes that are cut off, or meet a call that fails: at every system call that changes a file all
// processes, the caller alone or a started program alone are killed, a write is cut short, or the
// call fails. Afterwards the tasks are as they were or as they are to be, in every file.
#include "machine.h"
#include "tracer.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <csignal>
#include <cstdio>
#include <cstring>
#include <fcntl.h>
#include <functional>
#ifdef __SANITIZE_ADDRESS__
#include <sanitizer/lsan_interface.h>
#endif

namespace {

using namespace support;

// ---- Operations ----

// What an operation may fail with; also what the platform's functions set.
bool isDocumented(unsigned int code) {
    constexpr std::array<unsigned int, 12> kCodes = {0x0100, 0x0200, 0x0400, 0x0500,
                                                     0x0900, 0x0B00, 0x0D00, 0x2000,
                                                     0x2700, 0x2800, 0x2A00, 0x4000};
    return std::find(kCodes.begin(), kCodes.end(), code) != kCodes.end();
}

struct Operation {
    const char *name;
    std::function<int()> run;              // 0 or 1
    std::function<void()> prepare = [] {}; // on top of three tasks and a power schedule
    bool isBatch = false;
    bool isPower = false;
};

int editedHere() {
    return edited("a name of quite another length than the one it had");
}

int saved() {
    TAVI_SCHED_TASK task{};
    static std::array<char, 160 << 10> json;
    if (TAVISchedTaskGetByID(3, &task) != 0) {
        return 1;
    }
    task.runMin = 17;
    {
        const OwnAllocations own;
        TAVISchedTaskConvertToJson(&task, json.data(), json.size());
    }
    return TAVISchedTaskSaveFromJson(json.data(), 0) == 3 ? 0 : 1;
}

int batchDone() {
    const bool changed = TAVISchedChangeBegin() == 0 && created("first") == 0 &&
                         editedHere() == 0 && TAVISchedTaskRemove(1) == 0 && powerCreated() == 0 &&
                         saved() == 0 && created("second") == 0;
    return changed && TAVISchedChangeCommit() == 0 ? 0 : 1;
}

int tool(std::vector<const char *> arguments) {
    const int null = open("/dev/null", O_RDWR);
    for (const int stream : {0, 1, 2}) {
        dup2(null, stream);
    }
    arguments.insert(arguments.begin(), TAVISCHED);
    arguments.push_back(nullptr);
    setenv("ASAN_OPTIONS", "detect_leaks=0", 1); // which cannot be had under a tracer
    execv(TAVISCHED, const_cast<char *const *>(arguments.data()));
    return 1;
}

// Those of these names, or all.
std::vector<Operation> operations(const std::vector<std::string> &names = {}) {
    std::vector<Operation> all = {
        {"create", [] { return created("new"); }},
        {"edit", editedHere},
        {"remove", [] { return TAVISchedTaskRemove(2) == 0 ? 0 : 1; }},
        {"save", saved},
        {.name = "batch", .run = batchDone, .isBatch = true},
        {.name = "power", .run = [] { return powerCreated(); }, .isPower = true},
        {"sync", [] { return TAVISchedTaskSync() == 0 ? 0 : 1; }},
        {"first_create", [] { return created("new"); },
         [] { shell("rm -r /tmp/* /usr/tavi/etc/*; sed -i /tavi/d /etc/crontab"); }},
        {"create_with_differing_files", [] { return created("new"); },
         [] { writeFile(kPersistent, readFile(kPersistent) + "[9]\nname=of the file alone\n"); }},
        {"tool_add",
         [] {
             return tool({"add", "--command", "true", "--at", "03:00"});
         }},
        {"tool_disable",
         [] {
             return tool({"disable", "1", "3"});
         }},
    };
    std::erase_if(all, [&](const Operation &operation) {
        return !names.empty() &&
               std::find(names.begin(), names.end(), operation.name) == names.end();
    });
    return all;
}

std::string nameOf(const testing::TestParamInfo<Operation> &operation) {
    return operation.param.name;
}

// ---- The test ----

class Interruption : public SchedTest, public testing::WithParamInterface<Operation> {
  protected:
    void SetUp() override {
        SchedTest::SetUp();
        signal(SIGHUP, SIG_IGN);
        for (const char *const name : {"one", "two", "three"}) {
            ASSERT_EQ(created(name), 0);
        }
        ASSERT_EQ(powerCreated(5), 0);
        writeFile("/run/crond.pid", std::to_string(getpid()));
        GetParam().prepare();
        start_.emplace();
        old_ = stateNow();
        oldList_ = listOfFreshProcess();
    }

    // What an operation that nothing disturbs leaves.
    void learn(const Operation &operation) {
        const auto undisturbed = tracer::run(operation.run, {});
        ASSERT_EQ(undisturbed.status, 0) << lastLog();
        new_ = stateNow();
        newList_ = listOfFreshProcess();
        EXPECT_EQ(stateNow(), new_);
        EXPECT_THAT(leftovers(), IsEmpty());
    }

    static std::optional<int> answerOf(const tracer::Run &run) {
        return WIFEXITED(run.status) ? std::optional(WEXITSTATUS(run.status)) : std::nullopt;
    }

    // What is wrong with the machine after a run; "" when nothing is.
    std::string faults(std::optional<int> answer) const {
        const std::string list = listOfFreshProcess();
        const State now = stateNow();
        const bool isOld = now == old_ && list == oldList_;
        const bool isNew = now == new_ && list == newList_;
        std::string found;
        if (!isOld && !isNew) {
            found += "neither old nor new:" + difference(now, list);
        } else if (answer && !(*answer == 0 ? isNew : isOld)) {
            found += " the answer was " + std::to_string(*answer) + ", the tasks are the " +
                     (isOld ? "old" : "new");
        }
        for (const std::string &path : leftovers()) {
            found += " left: " + path;
        }
        return found;
    }

    std::string faultsOfFailed(const Operation &operation, int answer) const {
        State now = stateNow();
        const std::string list = listOfFreshProcess();
        std::string found = now == stateNow() ? "" : " the list changed something;";
        const std::string crontab = std::exchange(now[kCrontab], "");
        const auto isLike = [&](State wanted) {
            wanted[kCrontab].clear();
            return now == wanted;
        };
        const bool isOld = isLike(old_) && list == oldList_ && crontab == old_.at(kCrontab);
        const bool isStored = isLike(new_) && list == newList_;
        const bool isNew = isStored && crontab == new_.at(kCrontab);
        const bool isHalf = isStored && crontab == old_.at(kCrontab);
        const bool mayBeHalf = answer == 0 ? !operation.isBatch : operation.isPower;
        const bool isRight = answer == 0 ? isNew : answer == 1 && isOld;
        if (!isRight && !(mayBeHalf && (isHalf || isNew))) {
            now[kCrontab] = crontab;
            found += " the answer was " + std::to_string(answer) + ";" + difference(now, list);
        }
        for (const std::string &path : leftovers()) {
            found += " left: " + path;
        }
        return found;
    }

    // Goes through all points of a plan; prints and checks how many held.
    void tryAll(const Operation &operation, const char *what, tracer::Plan plan,
                const std::function<bool(const tracer::Call &)> &concerned) {
        size_t tried = 0;
        size_t held = 0;
        for (const size_t point : pointsOf(operation, plan, concerned)) {
            plan.point = point;
            start_->restore();
            logs();
            const auto run = tracer::run(operation.run, plan);
            if (!run.acted) {
                continue;
            }
            ++tried;
            const std::string found = faults(answerOf(run));
            held += found.empty() ? 1 : 0;
            if (!found.empty() && tried - held <= 5) {
                ADD_FAILURE() << operation.name << ", " << what << " at " << point << ": "
                              << run.call.name << " " << run.call.path << ": " << found << "\n"
                              << testing::PrintToString(logs());
            }
        }
        report(operation, what, tried, held);
    }

    static void report(const Operation &operation, const char *what, size_t tried, size_t held) {
        std::printf("interruption: %s, %s: %zu points tried, %zu held\n", operation.name, what,
                    tried, held);
        EXPECT_EQ(tried, held);
    }

    std::optional<Snapshot> start_;
    State old_, new_;
    std::string oldList_, newList_;

  private:
    std::vector<size_t> pointsOf(const Operation &operation, const tracer::Plan &plan,
                                 const std::function<bool(const tracer::Call &)> &concerned) const {
        std::vector<size_t> points;
        size_t point = 0;
        start_->restore();
        tracer::run(operation.run, {.calls = plan.calls}, [&](const tracer::Call &call) {
            ++point;
            if (concerned(call)) {
                points.push_back(point);
            }
        });
        std::vector<size_t> chosen;
        for (size_t i = 0; i < points.size(); i += kStep) {
            chosen.push_back(points[i]);
        }
        return chosen;
    }

    static std::string cut(const std::string &text) {
        return text.size() < 400 ? text : "..." + text.substr(text.size() - 400);
    }

    std::string difference(const State &now, const std::string &list) const {
        std::string text;
        for (const auto &[path, content] : now) {
            const char *const which = content == old_.at(path) && content == new_.at(path) ? "same"
                                      : content == old_.at(path)                           ? "old"
                                      : content == new_.at(path)                           ? "new"
                                                                 : nullptr;
            text += " " + path + " " + (which ? which : "STRANGE " + cut(content)) + ";";
        }
        const char *const which = list == oldList_ ? "old" : list == newList_ ? "new" : nullptr;
        return text + " list " + (which ? which : "STRANGE " + list);
    }
};

bool always(const tracer::Call &) {
    return true;
}
bool isPrograms(const tracer::Call &call) {
    return call.isPrograms;
}
bool isWrite(const tracer::Call &call) {
    return call.isWrite;
}
// Those of a program's libraries and of its start are not ours.
bool isOurs(const tracer::Call &call) {
    constexpr std::array<const char *, 4> kPlaces = {"/tmp", "/usr/tavi", "/etc/crontab", "/run"};
    return call.path.empty() || call.path == "/etc/" ||
           std::any_of(kPlaces.begin(), kPlaces.end(),
                       [&](const char *place) { return call.path.starts_with(place); });
}

// What a call of this name fails with on a machine in trouble.
std::vector<int> errorsOf(const std::string &name) {
    const auto is = [&](std::initializer_list<const char *> names) {
        return std::find(names.begin(), names.end(), name) != names.end();
    };
    return is({"open", "openat", "creat"})                     ? std::vector{ENOSPC, EMFILE, EACCES}
           : is({"clone", "clone3", "fork", "vfork"})          ? std::vector{ENOMEM}
           : is({"read", "pread", "fstat", "newfstatat"})      ? std::vector{EIO, ENOMEM}
           : is({"fsync", "fdatasync", "flock", "unlink"})     ? std::vector{EIO}
           : is({"fchown", "fchmod", "utimensat", "unlinkat"}) ? std::vector{EIO, EACCES}
                                                               : std::vector{ENOSPC, EIO};
}

TEST_P(Interruption, Killed) {
    using tracer::Act;
    const Operation &operation = GetParam();
    ASSERT_NO_FATAL_FAILURE(learn(operation));
    // With no program there, the caller is all.
    tryAll(operation, "all processes killed", {.act = Act::KillAll}, always);
    tryAll(operation, "caller killed", {.act = Act::KillCaller}, isPrograms);
    tryAll(operation, "program killed", {.act = Act::KillProgram}, isPrograms);
    if (tracer::kCanChangeCalls) {
        tryAll(operation, "half a write", {.act = Act::HalfThenKillAll}, isWrite);
    }
}

class Failing : public Interruption {};

// The same calls fail instead. Outside of a batch a task is stored also when the crontab cannot be
// written, and power schedules when they cannot be applied.
// A JSON text is left out: it is an edit, or, when the stored task cannot be read, a create.
TEST_P(Failing, Calls) {
    const Operation &operation = GetParam();
    if (!tracer::kCanChangeCalls) {
        GTEST_SKIP() << "calls cannot be made to fail on this architecture";
    }
    ASSERT_NO_FATAL_FAILURE(learn(operation));
    const auto run = [&] {
        PLATCErrSetEx(0, "", 0);
        return operation.run() == 0 ? 0 : isDocumented(PLATCErrGet()) ? 1 : 2;
    };
    std::vector<std::pair<size_t, int>> plans;
    size_t point = 0;
    start_->restore();
    tracer::run(run, {.calls = tracer::Calls::Failing}, [&](const tracer::Call &call) {
        ++point;
        if (isOurs(call)) {
            const auto errors = errorsOf(call.name);
            plans.emplace_back(point, errors[plans.size() % errors.size()]);
        }
    });
    size_t tried = 0;
    size_t held = 0;
    for (size_t i = 0; i < plans.size(); i += kStep) {
        start_->restore();
        logs();
        const auto tested = tracer::run(run, {.calls = tracer::Calls::Failing,
                                              .point = plans[i].first,
                                              .act = tracer::Act::Fail,
                                              .error = plans[i].second});
        if (!tested.acted) {
            continue;
        }
        ++tried;
        const auto lines = logs();
        if (tested.call.name == "unlink") {
            unlink(tested.call.path.c_str()); // what cannot be removed stays
        }
        const std::string found = faultsOfFailed(operation, answerOf(tested).value_or(-1));
        held += found.empty() ? 1 : 0;
        if (!found.empty() && tried - held <= 5) {
            ADD_FAILURE() << operation.name << ", " << strerrorname_np(plans[i].second) << " at "
                          << plans[i].first << ": " << tested.call.name << " " << tested.call.path
                          << ": " << found << "\n"
                          << testing::PrintToString(lines);
        }
    }
    report(operation, "a call failed", tried, held);
}

// What the function answers in a process of its own; more than 9 when it crashes there, throws or
// leaks.
int answerInChild(const std::function<int()> &function) {
    const pid_t child = fork();
    if (child == 0) {
        int answer = 10;
        try {
            answer = function();
        } catch (const std::exception &) {
            _exit(answer);
        }
#ifdef __SANITIZE_ADDRESS__
        _exit(__lsan_do_recoverable_leak_check() == 0 ? answer : 10);
#endif
        _exit(answer);
    }
    int status = 0;
    waitpid(child, &status, 0);
    return WIFEXITED(status) ? WEXITSTATUS(status) : 10 + WTERMSIG(status);
}

// The same for memory that is not there: every allocation, or, where nobody asks for all with
// TAVI_TEST_ALL, some of them.
TEST_P(Failing, Allocations) {
    const Operation &operation = GetParam();
    ASSERT_NO_FATAL_FAILURE(learn(operation));
    constexpr int kNotReached = 3;
    const auto run = [&](size_t failing) {
        return answerInChild([&] {
            PLATCErrSetEx(0, "", 0);
            fakes.allocations = 0;
            fakes.failingAllocation = failing;
            const int result = operation.run();
            const bool isReached = fakes.allocations >= failing;
            fakes.failingAllocation = 0;
            const unsigned int code = PLATCErrGet();
            const bool isKnown =
                code == 0 || isDocumented(code); // a text that is no JSON sets none
            return !isReached ? kNotReached : result == 0 ? 0 : isKnown ? 1 : 2;
        });
    };
    size_t tried = 0;
    size_t held = 0;
    const size_t step = std::getenv("TAVI_TEST_ALL") ? 1 : 7 * kStep;
    for (size_t failing = 1;; failing += step) {
        start_->restore();
        logs();
        const int answer = run(failing);
        if (answer == kNotReached) {
            break;
        }
        ++tried;
        const auto lines = logs();
        const std::string found = faultsOfFailed(operation, answer);
        held += found.empty() ? 1 : 0;
        if (!found.empty() && tried - held <= 5) {
            ADD_FAILURE() << operation.name << ", allocation " << failing << ": " << found << "\n"
                          << testing::PrintToString(lines);
        }
    }
    report(operation, "an allocation failed", tried, held);
}

class TakingBack : public Interruption {};

// Taking back what was cut off is cut off itself.
TEST_P(TakingBack, Killed) {
    using tracer::Act;
    const Operation &operation = GetParam();
    ASSERT_NO_FATAL_FAILURE(learn(operation));
    constexpr size_t kCuts = 4;
    const auto takeBack = [] { return listOfFreshProcess() == "failed" ? 1 : 0; };
    start_->restore();
    const size_t points = tracer::run(operation.run, {}).points;
    size_t tried = 0;
    size_t held = 0;
    for (size_t cut = 1; cut <= kCuts; ++cut) {
        bool acted = true;
        for (size_t point = 1; acted; point += kStep) {
            start_->restore();
            tracer::run(operation.run, {.point = cut * points / kCuts, .act = Act::KillAll});
            const auto run = tracer::run(takeBack, {.point = point, .act = Act::KillAll});
            acted = run.acted;
            const std::string found = faults({});
            ++tried;
            held += found.empty() ? 1 : 0;
            if (!found.empty() && tried - held <= 5) {
                ADD_FAILURE() << operation.name << " cut off at " << cut << "/" << kCuts
                              << ", taken back up to " << point << ": " << run.call.name << " "
                              << run.call.path << ": " << found;
            }
        }
    }
    report(operation, "killed, and killed again while taken back", tried, held);
}

INSTANTIATE_TEST_SUITE_P(Operations, Interruption, testing::ValuesIn(operations()), nameOf);
INSTANTIATE_TEST_SUITE_P(Operations, Failing,
                         testing::ValuesIn(operations({"create", "remove", "batch", "power", "sync",
                                                       "first_create"})),
                         nameOf);
INSTANTIATE_TEST_SUITE_P(Operations, TakingBack,
                         testing::ValuesIn(operations({"batch", "sync", "first_create",
                                                       "create_with_differing_files"})),
                         nameOf);

} // namespace
