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

constexpr int kEndingSignals[] = {SIGINT, SIGTERM, SIGHUP};
volatile sig_atomic_t lastSignal = 0;

void requireRights() {
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
    case Copies::Strange:
        throw Failure("a task file is not a file of root's that nobody else may write; "
                      "\"tavisched check\" tells what to do");
    }
}

// In one step, or, when the file system has no room for that, in place.
void writeBack(const char *path, const std::optional<std::string> &content) {
    if (!content) {
        unlink(path);
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

[[noreturn]] void fail(const TAVI_SCHED_TASK &task, const char *what) {
    throw Failure(called(task) + " could not be " + what + ": " + libraryError() +
                  "; \"tavisched check\" looks for the cause");
}

} // namespace

// ---- Signals ----

DelayedSignals::DelayedSignals() {
    struct sigaction note {};
    note.sa_handler = [](int signal) { lastSignal = signal; };
    note.sa_flags = SA_RESTART;
    for (const int signal : kEndingSignals) {
        sigaction(signal, &note, &before_[signal]);
    }
}

DelayedSignals::~DelayedSignals() {
    for (const auto &[signal, action] : before_) {
        sigaction(signal, &action, nullptr);
    }
    if (lastSignal != 0) {
        raise(lastSignal);
    }
}

// ---- Changes ----

Change::Change() {
    requireRights();
    requireSameCopies();
    for (const char *const path : {kPersistent, kWorkingCopy, kPowerSchedules}) {
        before_[path] = contentIfThere(path);
    }
}

Change::~Change() {
    if (kept_) {
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
    bool changed = false;
    for (const auto &[path, content] : before_) {
        if (contentIfThere(path) != content) {
            writeBack(path, content);
            changed = true;
        }
    }
    if (changed) {
        const Tasks tasks = Tasks::read();
        requireGoodCrontab({tasks.all().begin(), tasks.all().end()});
        TAVISchedTaskSync();
        std::cerr << "tavisched: everything is as it was before\n";
    }
}

void Change::create(TAVI_SCHED_TASK &task) {
    if (TAVISchedTaskCreate(&task) != 0) {
        fail(task, "stored");
    }
}

void Change::createWithId(TAVI_SCHED_TASK &task) {
    const auto backends = registeredBackends();
    const auto schedule = std::find_if(backends.begin(), backends.end(), [](const auto &backend) {
        return backend.id == TAVI_SCHED_BACKEND_SCHEDULE;
    });
    if (schedule->edit(&task) != 0) {
        fail(task, "stored");
    }
}

void Change::edit(TAVI_SCHED_TASK &task) {
    if (TAVISchedTaskEdit(&task) != 0) {
        fail(task, "changed");
    }
    if (isPower(task)) {
        const Tasks now = Tasks::read();
        if (const TAVI_SCHED_TASK *const stored = now.findSameSchedule(task)) {
            task.id = stored->id;
        }
    }
}

void Change::remove(const TAVI_SCHED_TASK &task) {
    if (TAVISchedTaskRemove(task.id) != 0) {
        fail(task, "removed");
    }
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
            if (PLATCFileSetSection(path, std::to_string(task->id).c_str(), form.get()) < 0) {
                fail(*task, "changed");
            }
        }
    }
}

void Change::keep() {
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
