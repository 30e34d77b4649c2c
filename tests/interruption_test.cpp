// Changes that are cut off, or meet a call that fails: at every system call that changes a file all
// processes, the caller alone or a started program alone are killed, a write is cut short, or the
// call fails. Afterwards the tasks are as they were or as they are to be, in every file.
#include "support.h"
#include "tracer.h"

#include <algorithm>
#include <array>
#include <csignal>
#include <cstdio>
#include <cstring>
#include <fcntl.h>
#include <filesystem>
#include <functional>
#include <map>
#include <sstream>

namespace {

using namespace support;
namespace fs = std::filesystem;

#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
constexpr size_t kStep = 9; // a fork costs many times as much
#else
constexpr size_t kStep = 1;
#endif

constexpr const char *kPower = "/usr/tavi/etc/auto_power";

// ---- What a machine keeps ----

std::vector<std::string> entriesOf(const char *folder) {
    std::vector<std::string> paths;
    for (const auto &entry : fs::directory_iterator(folder)) {
        paths.push_back(entry.path());
    }
    return paths;
}

// The crontab's lines may change places.
std::string sortedLines(const std::string &text) {
    std::vector<std::string> lines;
    std::istringstream stream(text);
    for (std::string line; std::getline(stream, line);) {
        lines.push_back(line);
    }
    std::sort(lines.begin(), lines.end());
    std::string sorted;
    for (const std::string &line : lines) {
        sorted += line + "\n";
    }
    return sorted;
}

using State = std::map<std::string, std::string>; // by path

State stateNow() {
    State state;
    for (const char *const path : {kWorking, kPersistent, kPower, kCrontab}) {
        state[path] = fs::exists(path) ? readFile(path) : "(none)";
    }
    state[kCrontab] = sortedLines(state[kCrontab]);
    return state;
}

// What does not belong there.
std::vector<std::string> leftovers() {
    std::vector<std::string> found;
    for (const char *const folder : {"/tmp", "/usr/tavi/etc", "/etc"}) {
        for (const std::string &path : entriesOf(folder)) {
            const bool isKnown = path == kWorking || path == kPersistent || path == kPower ||
                                 path == std::string(kPersistent) + ".lock" ||
                                 path == std::string(kPersistent) + ".reading";
            const bool isMine = folder != std::string("/etc") || path.starts_with("/etc/crontab.");
            if (!isKnown && isMine) {
                found.push_back(path);
            }
        }
    }
    return found;
}

// The files as they are when it is made, to start again from.
class Snapshot {
  public:
    void restore() const {
        for (const std::string &path : leftovers()) {
            fs::remove_all(path);
        }
        for (const auto &[path, content] : contents_) {
            if (content) {
                writeFile(path, *content);
            } else {
                unlink(path.c_str());
            }
        }
    }

  private:
    static std::optional<std::string> contentOf(const char *path) {
        return fs::exists(path) ? std::optional(readFile(path)) : std::nullopt;
    }

    std::map<std::string, std::optional<std::string>> contents_ = {
        {kWorking, contentOf(kWorking)},
        {kPersistent, contentOf(kPersistent)},
        {kPower, contentOf(kPower)},
        {kCrontab, contentOf(kCrontab)}};
};

// What a process that has just started lists: "id name command; ...", or "failed".
std::string listOfFreshProcess() {
    std::array<int, 2> ends{};
    if (pipe(ends.data()) != 0) {
        return "no pipe";
    }
    const pid_t pid = fork();
    if (pid == 0) {
        TAVI_SCHED_TASK *list = nullptr;
        std::vector<std::string> rows;
        const bool listed = TAVISchedTaskListGet(&list, nullptr) >= 0;
        for (const TAVI_SCHED_TASK *task = list; task; task = TAVISchedTaskNext(task)) {
            rows.push_back(std::to_string(task->id) + " " + task->name + " " + task->command);
        }
        std::sort(rows.begin(), rows.end());
        std::string text = listed ? "" : "failed";
        for (const std::string &row : rows) {
            text += row + "; ";
        }
        _exit(write(ends[1], text.data(), text.size()) == static_cast<ssize_t>(text.size()) ? 0
                                                                                            : 1);
    }
    close(ends[1]);
    std::string text;
    std::array<char, 4096> buffer{};
    for (ssize_t count = 0; (count = read(ends[0], buffer.data(), buffer.size())) > 0;) {
        text.append(buffer.data(), static_cast<size_t>(count));
    }
    close(ends[0]);
    int status = -1;
    waitpid(pid, &status, 0);
    return status == 0 ? text : text + " (list: wait status " + std::to_string(status) + ")";
}

// ---- Operations ----

struct Operation {
    const char *name;
    std::function<int()> run;              // 0 or 1
    std::function<void()> prepare = [] {}; // on top of three tasks and a power schedule
};

int created(const char *name) {
    const Task task = newTask("true");
    TAVISchedCTaskSetName(task.get(), name);
    return TAVISchedTaskCreate(task.get()) == 0 ? 0 : 1;
}

int edited() {
    TAVI_SCHED_TASK task{};
    if (TAVISchedTaskGetByID(2, &task) != 0) {
        return 1;
    }
    TAVISchedCTaskSetName(&task, "a name of quite another length than the one it had");
    task.runHour = 7;
    return TAVISchedTaskEdit(&task) == 0 ? 0 : 1;
}

int saved() {
    TAVI_SCHED_TASK task{};
    std::vector<char> json(160 << 10);
    const bool read = TAVISchedTaskGetByID(3, &task) == 0;
    task.runMin = 17;
    return read && TAVISchedTaskConvertToJson(&task, json.data(), json.size()) >= 0 &&
                   TAVISchedTaskSaveFromJson(json.data(), 0) == 3
               ? 0
               : 1;
}

int powerCreated(uint32_t hour = 22) {
    const Task task = newTask();
    task->backend = TAVI_SCHED_BACKEND_AUTOPOWER;
    TAVISchedTaskGetDefault(task.get());
    TAVISchedCTaskSetAppArgs(task.get(), "poweroff");
    task->runHour = hour;
    return TAVISchedTaskCreate(task.get()) == 0 ? 0 : 1;
}

int batchDone() {
    const bool changed = TAVISchedChangeBegin() == 0 && created("first") == 0 && edited() == 0 &&
                         TAVISchedTaskRemove(1) == 0 && powerCreated() == 0 && saved() == 0 &&
                         created("second") == 0;
    return changed && TAVISchedChangeCommit() == 0 ? 0 : 1;
}

int tool(std::vector<const char *> arguments) {
    const int null = open("/dev/null", O_RDWR);
    for (const int stream : {0, 1, 2}) {
        dup2(null, stream);
    }
    arguments.insert(arguments.begin(), TAVISCHED);
    arguments.push_back(nullptr);
    execv(TAVISCHED, const_cast<char *const *>(arguments.data()));
    return 1;
}

// Those of these names, or all.
std::vector<Operation> operations(const std::vector<std::string> &names = {}) {
    std::vector<Operation> all = {
        {"create", [] { return created("new"); }},
        {"edit", edited},
        {"remove", [] { return TAVISchedTaskRemove(2) == 0 ? 0 : 1; }},
        {"save", saved},
        {"batch", batchDone},
        {"power", [] { return powerCreated(); }},
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
             return tool({"disable", "3"});
         }},
    };
    std::erase_if(all, [&](const Operation &operation) {
        return !names.empty() &&
               std::find(names.begin(), names.end(), operation.name) == names.end();
    });
    return all;
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

    // What is wrong with the machine after a run; "" when nothing is.
    std::string faults(const tracer::Run &run) const {
        const std::string list = listOfFreshProcess();
        const State now = stateNow();
        const bool isOld = now == old_ && list == oldList_;
        const bool isNew = now == new_ && list == newList_;
        const bool ended = WIFEXITED(run.status);
        std::string found;
        if (!isOld && !isNew) {
            found += "neither old nor new:" + difference(now, list);
        } else if (ended && !(WEXITSTATUS(run.status) == 0 ? isNew : isOld)) {
            found += " the answer was " + std::to_string(WEXITSTATUS(run.status)) +
                     ", the tasks are the " + (isOld ? "old" : "new");
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
                continue; // a crontab of the second before needs a call less
            }
            ++tried;
            const std::string found = faults(run);
            held += found.empty() ? 1 : 0;
            if (!found.empty() && tried - held <= 3) {
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

    std::string difference(const State &now, const std::string &list) const {
        std::string text;
        for (const auto &[path, content] : now) {
            const char *const which = content == old_.at(path) && content == new_.at(path) ? "same"
                                      : content == old_.at(path)                           ? "old"
                                      : content == new_.at(path)                           ? "new"
                                                                 : nullptr;
            text += " " + path + " " + (which ? which : "STRANGE " + content) + ";";
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

class TakingBack : public Interruption {};

// Taking back what was cut off is cut off itself.
TEST_P(TakingBack, Killed) {
    using tracer::Act;
    const Operation &operation = GetParam();
    ASSERT_NO_FATAL_FAILURE(learn(operation));
    constexpr size_t kCuts = 7;
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
            const std::string found = faults(run);
            ++tried;
            held += found.empty() ? 1 : 0;
            if (!found.empty() && tried - held <= 3) {
                ADD_FAILURE() << operation.name << " cut off at " << cut << "/" << kCuts
                              << ", taken back up to " << point << ": " << run.call.name << " "
                              << run.call.path << ": " << found;
            }
        }
    }
    report(operation, "killed, and killed again while taken back", tried, held);
}

INSTANTIATE_TEST_SUITE_P(Operations, TakingBack,
                         testing::ValuesIn(operations({"batch", "sync", "first_create",
                                                       "create_with_differing_files"})),
                         [](const auto &operation) { return operation.param.name; });
INSTANTIATE_TEST_SUITE_P(Operations, Interruption, testing::ValuesIn(operations()),
                         [](const auto &operation) { return operation.param.name; });

} // namespace
