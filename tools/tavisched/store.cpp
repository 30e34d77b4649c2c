// Tasks as commands work with them: reading, locking and storing.
#include "store.h"
#include "crontab.h"
#include "paths.h"
#include "text.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <csignal>
#include <fcntl.h>
#include <filesystem>
#include <fstream>
#include <iostream>
#include <span>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

namespace tavisched {

namespace {

constexpr useconds_t kLockPause = 20000; // microseconds
constexpr int kLockTries = 3000;         // a minute

off_t sizeOf(const char *path) {
    struct stat status {};
    return stat(path, &status) == 0 ? status.st_size : 0;
}

void requireReadable() {
    if (access(kWorkingCopy, R_OK) == 0) {
        return;
    }
    if (errno != ENOENT) {
        throw Failure(std::string("cannot read the tasks: ") + kWorkingCopy + ": " +
                      systemReason());
    }
    if (sizeOf(kPersistent) > 0) {
        std::cerr << "tavisched: warning: " << kWorkingCopy
                  << " is missing, so that no tasks are found; \"tavisched check --repair\" makes "
                     "it from "
                  << kPersistent << "\n";
    }
}

void requireWritable() {
    for (const char *const folder : {kFolder, "/tmp", "/etc"}) {
        if (access(folder, W_OK) != 0) {
            throw Failure(std::string("cannot change tasks: ") + folder + ": " + systemReason());
        }
    }
}

void requireSameCopies() {
    switch (compareCopies()) {
    case Copies::Same:
    case Copies::PersistentMissing:
        return;
    case Copies::WorkingMissing:
        throw Failure(std::string("the tasks of ") + kPersistent + " are not in use, as " +
                      kWorkingCopy + " is missing or empty; \"tavisched check --repair\" makes it");
    case Copies::Different:
        throw Failure(std::string(kWorkingCopy) + " and " + kPersistent +
                      " differ, and a change would lose what the second one says; \"tavisched "
                      "check\" tells what to do");
    }
}

sigset_t endingSignals() {
    sigset_t signals;
    sigemptyset(&signals);
    for (const int signal : {SIGINT, SIGTERM, SIGHUP}) {
        sigaddset(&signals, signal);
    }
    return signals;
}

[[noreturn]] void fail(const TAVI_SCHED_TASK &task, const char *what) {
    throw Failure(called(task) + " could not be " + what + ": " + libraryError());
}

void requireBackends() {
    if (TAVISchedBackendInit() != 0) {
        throw Failure("the library cannot be used: " + libraryError());
    }
}

const TAVI_SCHED_BACKEND_RECORD &scheduleBackend() {
    requireBackends();
    const std::span backends(SchedBackends, cBackend);
    return *std::find_if(backends.begin(), backends.end(), [](const auto &backend) {
        return backend.id == TAVI_SCHED_BACKEND_SCHEDULE;
    });
}

} // namespace

// ---- Reading ----

Task newTask(int32_t backend) {
    auto task = std::make_unique<TAVI_SCHED_TASK>();
    task->backend = backend;
    if (TAVISchedTaskGetDefault(task.get()) != 0) {
        throw Failure("a new task could not be made: " + libraryError());
    }
    return task;
}

Task copyOf(const TAVI_SCHED_TASK &task) {
    auto copy = std::make_unique<TAVI_SCHED_TASK>(task);
    copy->next = nullptr;
    return copy;
}

bool isEnabledPower(const TAVI_SCHED_TASK &task, std::string_view arguments) {
    return isPower(task) && task.state == TAVI_SCHED_STATE_ENABLED && task.appArgs == arguments;
}

bool isSameSchedule(const TAVI_SCHED_TASK &one, const TAVI_SCHED_TASK &other) {
    return isPower(one) && isPower(other) && std::string_view(one.appArgs) == other.appArgs &&
           std::string_view(one.week) == other.week && one.state == other.state &&
           one.runHour == other.runHour && one.runMin == other.runMin;
}

// The library's own list only logs when a backend cannot list its tasks, so each is asked itself.
Tasks Tasks::read() {
    requireReadable();
    requireBackends();
    Tasks tasks;
    TAVI_SCHED_TASK *head = nullptr;
    bool lacksSchedule = false;
    for (const TAVI_SCHED_BACKEND_RECORD &backend : std::span(SchedBackends, cBackend)) {
        const bool failed = backend.list_get(&head, nullptr) < 0;
        lacksSchedule |= failed && backend.id == TAVI_SCHED_BACKEND_SCHEDULE;
        tasks.lacksPower_ |= failed && backend.id == TAVI_SCHED_BACKEND_AUTOPOWER;
    }
    tasks.list_.reset(head);
    if (lacksSchedule) {
        throw Failure("the tasks cannot be read: " + libraryError() +
                      "; \"tavisched check\" looks for the cause");
    }
    if (tasks.lacksPower_) {
        std::cerr << "tavisched: warning: power schedules cannot be read: " << libraryError()
                  << "\n";
    }
    for (TAVI_SCHED_TASK *task = head; task; task = TAVISchedTaskNext(task)) {
        tasks.ordered_.push_back(task);
    }
    std::stable_sort(tasks.ordered_.begin(), tasks.ordered_.end(),
                     [](const auto *one, const auto *other) { return one->id < other->id; });
    return tasks;
}

TAVI_SCHED_TASK *Tasks::find(int32_t id) const {
    const auto found = std::find_if(ordered_.begin(), ordered_.end(),
                                    [id](const auto *task) { return task->id == id; });
    return found == ordered_.end() ? nullptr : *found;
}

TAVI_SCHED_TASK *Tasks::findSameSchedule(const TAVI_SCHED_TASK &schedule) const {
    const auto found = std::find_if(ordered_.begin(), ordered_.end(), [&](const auto *task) {
        return isSameSchedule(*task, schedule);
    });
    return found == ordered_.end() ? nullptr : *found;
}

std::vector<TAVI_SCHED_TASK *> Tasks::select(const std::vector<int32_t> &ids) const {
    if (ids.empty()) {
        return ordered_;
    }
    std::vector<TAVI_SCHED_TASK *> selected;
    for (const int32_t id : ids) {
        TAVI_SCHED_TASK *const task = find(id);
        if (!task) {
            throw Refusal("there is no task " + std::to_string(id) +
                          "; \"tavisched list --all\" shows those that there are");
        }
        if (std::find(selected.begin(), selected.end(), task) == selected.end()) {
            selected.push_back(task);
        }
    }
    return selected;
}

std::string called(const TAVI_SCHED_TASK &task) {
    const std::string number = task.id == -1 ? "the task" : "task " + std::to_string(task.id);
    return task.name[0] == '\0' ? number : number + " (" + printable(task.name) + ")";
}

Copies compareCopies() {
    const auto contentOf = [](const char *path) {
        std::ifstream file(path, std::ios::binary);
        return std::string(std::istreambuf_iterator<char>(file), {});
    };
    const std::string working = contentOf(kWorkingCopy);
    const std::string persistent = contentOf(kPersistent);
    if (working == persistent) {
        return Copies::Same;
    }
    if (working.empty()) {
        return Copies::WorkingMissing;
    }
    return access(kPersistent, F_OK) != 0 ? Copies::PersistentMissing : Copies::Different;
}

// ---- Changing ----

ChangeLock::Descriptor::~Descriptor() {
    if (number != -1) {
        close(number);
    }
}

ChangeLock::ChangeLock(Expecting expecting) {
    if (expecting == Expecting::SameCopies) {
        requireWritable();
    }
    lock_.number = open(kChangeLock, O_RDWR | O_CREAT | O_NOFOLLOW | O_CLOEXEC, 0600);
    if (lock_.number == -1) {
        throw Failure(std::string("cannot open the lock of changes: ") + kChangeLock + ": " +
                      systemReason());
    }
    int tries = 0;
    while (flock(lock_.number, LOCK_EX | LOCK_NB) != 0) {
        if (++tries == kLockTries) {
            throw Failure("another change by tavisched has not ended for a minute");
        }
        usleep(kLockPause);
    }
    if (expecting == Expecting::SameCopies) {
        requireSameCopies();
    }
    const sigset_t signals = endingSignals();
    sigprocmask(SIG_BLOCK, &signals, nullptr);
}

ChangeLock::~ChangeLock() {
    const sigset_t signals = endingSignals();
    sigprocmask(SIG_UNBLOCK, &signals, nullptr);
}

std::optional<std::string> whyCronRejects(const TAVI_SCHED_TASK &task) {
    if (isPower(task) || task.state != TAVI_SCHED_STATE_ENABLED) {
        return std::nullopt;
    }
    const CrontabLine line = parseCrontabLine(crontabLine(task));
    return line.kind == CrontabLine::Kind::Rejected ? std::optional(line.reason) : std::nullopt;
}

std::string crontabLine(const TAVI_SCHED_TASK &task) {
    std::array<char, 512> line{};
    if (TAVISchedCrontabLine(&task, line.data(), line.size()) != 0) {
        throw Failure(called(task) + " has no line: " + libraryError());
    }
    return line.data();
}

void requireGoodCrontab(const std::vector<const TAVI_SCHED_TASK *> &tasksAfterwards) {
    const auto crontab = readCrontab();
    if (!crontab) {
        throw Failure(std::string("cannot read ") + kCrontab + ": " + systemReason());
    }
    for (const TAVI_SCHED_TASK *const task : tasksAfterwards) {
        const auto why = whyCronRejects(*task);
        const auto &lines = crontab->lines;
        if (why && std::find(lines.begin(), lines.end(), crontabLine(*task)) == lines.end()) {
            const std::string id = std::to_string(task->id);
            throw Refusal("cron would ignore all of " + std::string(kCrontab) +
                          " for the line of " + called(*task) + ": " + *why +
                          "; first \"tavisched disable " + id +
                          "\" or mend its schedule with \"tavisched edit " + id + "\"");
        }
    }
}

CrontabDifference compareCrontab(const Tasks &tasks) {
    const auto crontab = readCrontab();
    if (!crontab) {
        throw Failure(std::string("cannot read ") + kCrontab + ": " + systemReason());
    }
    std::vector<std::string> present;
    std::copy_if(crontab->lines.begin(), crontab->lines.end(), std::back_inserter(present),
                 [](const std::string &line) { return line.find(kRunner) != std::string::npos; });
    CrontabDifference difference;
    for (const TAVI_SCHED_TASK *const task : tasks.all()) {
        if (isPower(*task) || task->state != TAVI_SCHED_STATE_ENABLED) {
            continue;
        }
        const std::string line = crontabLine(*task);
        const auto found = std::find(present.begin(), present.end(), line);
        if (found == present.end()) {
            difference.missing.push_back(line);
        } else {
            present.erase(found);
        }
    }
    difference.surplus = std::move(present);
    return difference;
}

bool arePowerOffLinesRight(const Tasks &tasks, const Crontab &crontab) {
    std::vector<CronTimes> expected;
    for (const TAVI_SCHED_TASK *const task : tasks.all()) {
        const CrontabLine line = parseCrontabLine(crontabLine(*task));
        if (isEnabledPower(*task, kPowerOff) && line.kind == CrontabLine::Kind::Entry) {
            expected.push_back(line.times);
        }
    }
    for (const std::string &line : crontab.lines) {
        if (line.find(kPowerOffCheck) != std::string::npos) {
            const auto found =
                std::find(expected.begin(), expected.end(), parseCrontabLine(line).times);
            if (found == expected.end()) {
                return false;
            }
            expected.erase(found);
        }
    }
    return expected.empty();
}

void requireSyncedCrontab() {
    if (compareCrontab(Tasks::read()).any()) {
        throw Failure(std::string("the tasks are stored, but ") + kCrontab +
                      " could not be written: " + libraryError());
    }
}

bool isSectionFree(int32_t id) {
    PLATCSZHASH *pairs = PLATCSzHashAlloc(1);
    const int found = access(kWorkingCopy, F_OK) == 0
                          ? PLATCFileGetSection(kWorkingCopy, std::to_string(id).c_str(), &pairs)
                          : 0;
    PLATCSzHashFree(pairs);
    return found == 0;
}

void create(TAVI_SCHED_TASK &task) {
    if (TAVISchedTaskCreate(&task) == 0) {
        return;
    }
    const std::string error = libraryError();
    if (isPower(task) && task.id != -1) {
        TAVISchedTaskRemove(task.id);
    }
    throw Failure(called(task) + " could not be stored: " + error);
}

void createWithId(TAVI_SCHED_TASK &task) {
    if (scheduleBackend().edit(&task) != 0) {
        fail(task, "stored");
    }
}

void edit(const TAVI_SCHED_TASK &before, TAVI_SCHED_TASK &task) {
    const int result = TAVISchedTaskEdit(&task);
    const std::string error = libraryError();
    if (isPower(task)) {
        // Its id is made of what it says.
        const Tasks now = Tasks::read();
        if (const TAVI_SCHED_TASK *const stored = now.findSameSchedule(task)) {
            task.id = stored->id;
        }
        if (result != 0) {
            Task restored = copyOf(before);
            restored->id = task.id;
            TAVISchedTaskEdit(restored.get());
        }
    }
    if (result != 0) {
        throw Failure(called(before) + " could not be changed: " + error);
    }
}

void remove(const TAVI_SCHED_TASK &task) {
    if (TAVISchedTaskRemove(task.id) != 0) {
        fail(task, "removed");
    }
}

} // namespace tavisched
