// A change of tasks.
#include "change.h"
#include "failure.h"
#include "paths.h"
#include "stored_form.h"

#include <algorithm>
#include <cerrno>
#include <fcntl.h>
#include <iostream>
#include <span>
#include <unistd.h>

namespace tavisched {

namespace {

constexpr int kEndingSignals[] = {SIGINT, SIGTERM, SIGHUP, SIGQUIT, SIGPIPE};
volatile sig_atomic_t seenSignals[NSIG];

void requireRights() {
    for (const char *const folder : {kFolder, "/tmp", "/etc"}) {
        if (access(folder, W_OK) != 0) {
            throw Failure(std::string("cannot change tasks: ") + folder + ": " + systemReason());
        }
    }
}

// Another program that stores a change just now has written one of them and not yet the other.
Copies settledCopies() {
    constexpr int kTries = 25;
    constexpr useconds_t kPause = 20000; // microseconds
    Copies copies = compareCopies();
    for (int tries = 0; copies == Copies::Different && tries < kTries; ++tries) {
        usleep(kPause);
        copies = compareCopies();
    }
    return copies;
}

void requireSameCopies() {
    switch (settledCopies()) {
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
    case Copies::Strange:
        throw Failure("a task file is not a file of root's that nobody else may write; "
                      "\"tavisched check\" tells what to do");
    }
}

// In one step, or, when the file system has no room for that, in place.
void writeBack(const char *path, const std::optional<std::string> &content) {
    if (!content) {
        if (unlink(path) != 0) {
            throw Failure(std::string(path) + " could not be removed: " + systemReason());
        }
        return;
    }
    try {
        replaceFile(path, *content);
    } catch (const Failure &) {
        const int fd = open(path, O_WRONLY | O_TRUNC | O_NOFOLLOW | O_CLOEXEC);
        const bool written = fd != -1 && write(fd, content->data(), content->size()) ==
                                             static_cast<ssize_t>(content->size());
        if (fd != -1) {
            close(fd);
        }
        if (!written) {
            throw;
        }
    }
}

} // namespace

// ---- Signals ----

DelayedSignals::DelayedSignals() {
    struct sigaction note {};
    note.sa_handler = [](int signal) { seenSignals[signal] = 1; };
    note.sa_flags = SA_RESTART;
    for (const int signal : kEndingSignals) {
        struct sigaction &before = before_[signal];
        sigaction(signal, nullptr, &before);
        if (before.sa_handler != SIG_IGN) {
            sigaction(signal, &note, nullptr);
        }
    }
}

DelayedSignals::~DelayedSignals() {
    for (const auto &[signal, action] : before_) {
        sigaction(signal, &action, nullptr);
        // A closed pipe shows once more when something is printed.
        if (seenSignals[signal] != 0 && signal != SIGPIPE) {
            raise(signal);
        }
    }
}

// ---- Changes ----

Change::Change() {
    requireRights();
    requireSameCopies();
    before_ = readContents();
    lastWritten_ = before_;
}

Change::Contents Change::readContents() {
    Contents contents;
    for (const char *const path : {kPersistent, kWorkingCopy, kPowerSchedules}) {
        contents[path] = contentIfThere(path);
    }
    return contents;
}

void Change::finishStep(bool succeeded, const TAVI_SCHED_TASK &task, const char *what) {
    const std::string error = libraryError();
    touched_ = true;
    lastWritten_ = readContents();
    if (!succeeded) {
        throw Failure(called(task) + " could not be " + what + ": " + error +
                      "; \"tavisched check\" looks for the cause");
    }
}

Change::~Change() {
    if (kept_ || !touched_) {
        return;
    }
    try {
        takeBack();
    } catch (const std::exception &failure) {
        std::cerr << "tavisched: what was changed could not be taken back: " << failure.what()
                  << "\n";
    }
}

void Change::takeBack() {
    const Contents now = readContents();
    if (now == before_) {
        return;
    }
    for (const auto &[path, content] : before_) {
        if (now.at(path) != content && now.at(path) == lastWritten_.at(path)) {
            writeBack(path, content);
        }
    }
    if (readContents() != before_) {
        throw Failure(
            "another program has changed tasks meanwhile; \"tavisched check\" tells more");
    }
    try {
        syncCrontab();
        std::cerr << "tavisched: everything is as it was before\n";
    } catch (const std::exception &) {
        std::cerr
            << "tavisched: the tasks are as they were before; \"tavisched sync\" writes their "
               "lines of /etc/crontab\n";
    }
}

void Change::create(TAVI_SCHED_TASK &task) {
    finishStep(TAVISchedTaskCreate(&task) == 0, task, "stored");
}

void Change::createWithId(TAVI_SCHED_TASK &task) {
    const auto backends = registeredBackends();
    const auto schedule = std::find_if(backends.begin(), backends.end(), [](const auto &backend) {
        return backend.id == TAVI_SCHED_BACKEND_SCHEDULE;
    });
    finishStep(schedule->edit(&task) == 0, task, "stored");
}

void Change::edit(TAVI_SCHED_TASK &task) {
    finishStep(TAVISchedTaskEdit(&task) == 0, task, "changed");
    if (isPower(task)) {
        const Tasks now = Tasks::read();
        if (const TAVI_SCHED_TASK *const stored = now.findSameSchedule(task)) {
            task.id = stored->id;
        }
    }
}

void Change::remove(const TAVI_SCHED_TASK &task) {
    finishStep(TAVISchedTaskRemove(task.id) == 0, task, "removed");
}

void Change::defuse(const TaskPointers &tasks) {
    for (const TAVI_SCHED_TASK *const task : tasks) {
        if (!whyCronRejects(*task)) {
            continue;
        }
        const Task harmless = copyOf(*task);
        harmless->state = TAVI_SCHED_STATE_DISABLED;
        const Hash form(*harmless);
        for (const char *const path : {kPersistent, kWorkingCopy}) {
            const bool done =
                stateOf(path) == FileState::Missing ||
                PLATCFileSetSection(path, std::to_string(task->id).c_str(), form.get()) == 1;
            finishStep(done, *task, "changed");
        }
    }
}

void Change::keep() {
    // Another program may have written the file between our step and now.
    if (compareCrontab(Tasks::read()).any()) {
        TAVISchedTaskSync();
    }
    requireSyncedCrontab();
    kept_ = true;
}

bool isFreeForSchedule(int32_t id) {
    const auto backends = registeredBackends();
    const bool claimed = std::any_of(backends.begin(), backends.end(), [id](const auto &backend) {
        return backend.owns_id && backend.owns_id(id) != 0;
    });
    Hash pairs;
    const int found =
        stateOf(kWorkingCopy) == FileState::Missing
            ? 0
            : PLATCFileGetSection(kWorkingCopy, std::to_string(id).c_str(), pairs.address());
    return !claimed && found == 0;
}

} // namespace tavisched
