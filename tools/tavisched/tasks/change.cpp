// A change of tasks.
#include "tasks/change.h"
#include "failure.h"
#include "tasks/findings.h"
#include "text/utf8.h"

#include <algorithm>
#include <array>
#include <ctime>
#include <utility>

namespace tavisched {

namespace {

bool anyIsStored = false;

constexpr size_t kMaxPowerSchedules = 100; // of a kind; the library reads no more

void requireClock(const TAVI_SCHED_TASK &task) {
    std::array<char, 256> reason{};
    if (isEnabled(task) && task.appArgs == kPowerOn &&
        TAVISchedPowerOnCheck(reason.data(), reason.size()) == 1) {
        throw Failure("this machine has no clock that can switch it on: " +
                      printable(reason.data()) + "; --disabled keeps the schedule without that");
    }
}

void requireRoom(const TaskPointers &power, const TAVI_SCHED_TASK &task) {
    const std::string_view kind = task.appArgs;
    const auto count = std::count_if(power.begin(), power.end(),
                                     [&](const auto *other) { return other->appArgs == kind; });
    if (static_cast<size_t>(count) >= kMaxPowerSchedules) {
        throw Refusal("there are " + std::to_string(count) +
                      " power schedules of this kind already; accepted: at most " +
                      std::to_string(kMaxPowerSchedules));
    }
}

[[noreturn]] void fail(const TAVI_SCHED_TASK &task, const char *what) {
    throw Failure(called(task) + " could not be " + what + ": " + libraryError() +
                  "; \"tavisched check\" looks for the cause; everything is as it was before");
}

// The process has not waited when it is one that the other change waits for.
[[noreturn]] void failToBegin(time_t begun) {
    constexpr time_t kSoon = 5; // seconds
    if (PLATCErrGet() != TAVI_SCHED_ERR_LOCK) {
        throw Failure("tasks cannot be changed: " + libraryError() +
                      "; \"tavisched check\" looks for the cause");
    }
    const std::string who = "process " + std::to_string(TAVISchedWaitedFor());
    throw Failure(time(nullptr) - begun < kSoon
                      ? "a change is going on in " + who +
                            ", and what it starts, such as a plug-in handler, cannot make another "
                            "one"
                      : "a change is going on in " + who +
                            " and has not ended within half a minute; nothing is changed");
}

// A change would make them worse.
void requireGoodFiles() {
    if (const Findings findings = Findings::of({"task files"}); findings.any()) {
        throw Failure("tasks cannot be changed: " + inWords(*findings.first()));
    }
}

// A task that can be read, but could not be when the change began, would be stored twice.
void requireUnknown(int32_t id, const Tasks &tasks) {
    const auto present = std::make_unique<TAVI_SCHED_TASK>();
    if (!tasks.find(id) && TAVISchedTaskGetByID(id, present.get()) == 0 && present->id == id) {
        throw Failure(called(*present) + " could not be read at first; nothing is changed");
    }
}

std::string idsOf(const TaskPointers &tasks) {
    std::vector<std::string> ids;
    for (const TAVI_SCHED_TASK *const task : tasks) {
        ids.push_back(std::to_string(task->id));
    }
    return join(ids, " ");
}

TaskPointers rejected(const TaskPointers &tasks) {
    TaskPointers result;
    std::copy_if(tasks.begin(), tasks.end(), std::back_inserter(result),
                 [](const auto *task) { return whyCronRejects(*task).has_value(); });
    return result;
}

[[noreturn]] void refuseLine(const TAVI_SCHED_TASK &task, const std::string &advice) {
    throw Refusal("cron would ignore all of /etc/crontab for the line of " + called(task) + ": " +
                  printable(*whyCronRejects(task)) + "; " + advice);
}

} // namespace

void requirePower(const Tasks &power) {
    if (power.lacksPower()) {
        throw Failure("power schedules cannot be changed while they cannot be read; \"tavisched "
                      "check\" tells more");
    }
}

void requirePossible(const Tasks &power, const TAVI_SCHED_TASK &task,
                     const TAVI_SCHED_TASK *replaced) {
    if (!isPower(task)) {
        return;
    }
    requirePower(power);
    requireClock(task);
    const TAVI_SCHED_TASK *const same = findSameSchedule(power.all(), task);
    if (same && !(replaced && isSameSchedule(*same, *replaced))) {
        throw Refusal("there is such a schedule already: " + called(*same));
    }
    if (!replaced) {
        requireRoom(power.all(), task);
    }
}

void requireGoodLines(const TaskPointers &unchanged, const TaskPointers &changed) {
    if (const TaskPointers bad = rejected(changed); !bad.empty()) {
        refuseLine(*bad.front(), "mend its schedule with \"tavisched edit\"");
    }
    const TaskPointers bad = rejected(unchanged);
    if (!bad.empty() && !Findings::of({"crontab"}).any()) {
        refuseLine(*bad.front(),
                   "first \"tavisched disable " + idsOf(bad) + "\", or mend the schedule");
    }
}

Change::Batch::Batch() {
    const time_t begun = time(nullptr);
    if (TAVISchedChangeBegin() != 0) {
        failToBegin(begun);
    }
}

Change::Batch::~Batch() {
    if (isOpen) {
        TAVISchedChangeRollback();
    }
}

Change::Change() : tasks_((requireGoodFiles(), Tasks::read())), power_(Tasks::readPower()) {}

void Change::stored(const TAVI_SCHED_TASK &task) {
    changed_.push_back(copyOf(task));
    if (isPower(task)) {
        power_ = Tasks::readPower();
    }
}

void Change::create(TAVI_SCHED_TASK &task) {
    requirePossible(power_, task, nullptr);
    if (TAVISchedTaskCreate(&task) != 0) {
        fail(task, "stored");
    }
    stored(task);
}

bool Change::createWithId(TAVI_SCHED_TASK &task) {
    if (TAVISchedTaskCreateWithId(&task) == 0) {
        stored(task);
        return true;
    }
    if (PLATCErrGet() != TAVI_SCHED_ERR_INVALID_ARGUMENT) {
        fail(task, "stored");
    }
    requireUnknown(task.id, tasks_);
    return false;
}

void Change::edit(TAVI_SCHED_TASK &task, const TAVI_SCHED_TASK &before) {
    requirePossible(power_, task, &before);
    if (TAVISchedTaskEdit(&task) != 0) {
        fail(task, "changed");
    }
    gone_.insert(&before);
    stored(task);
    if (const TAVI_SCHED_TASK *const same = findSameSchedule(power_.all(), task)) {
        task = *copyOf(*same);
    }
}

void Change::remove(const TAVI_SCHED_TASK &task) {
    if (TAVISchedTaskRemove(task.id) != 0) {
        fail(task, "removed");
    }
    gone_.insert(&task);
}

void Change::sync() {
    TAVISchedTaskSync();
}

void Change::commit() {
    TaskPointers unchanged;
    std::copy_if(tasks_.all().begin(), tasks_.all().end(), std::back_inserter(unchanged),
                 [&](const auto *task) { return !gone_.contains(task); });
    TaskPointers changed;
    for (const Task &task : changed_) {
        changed.push_back(task.get());
    }
    requireGoodLines(unchanged, changed);
    batch_.isOpen = false; // it ends, whatever comes of it
    if (TAVISchedChangeCommit() != 0) {
        throw Failure("nothing could be stored: " + libraryError() +
                      "; \"tavisched check\" looks for the cause; everything is as it was before");
    }
    anyIsStored = true;
}

bool Change::isStored() {
    return anyIsStored;
}

} // namespace tavisched
