// The schedule backend's task file.
#include "task_file.h"
#include "backend_source.h"
#include "base/file.h"
#include "base/trust.h"
#include "change/batch.h"
#include "change/change.h"
#include "platc.h"
#include "sched_guard.h"
#include "sched_handle.h"
#include "sched_paths.h"
#include "sched_sections.h"
#include "sched_shared_file.h"
#include "staged_tasks.h"

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <span>
#include <string_view>
#include <unistd.h>

#pragma weak PLATCFileEditSections // an appliance's own platform may lack it

namespace {

using sched::Hash;
using sched::kPersistent;
using sched::kWorkingCopy;
using sched::LogText;

constexpr int kCapacity = 1024;

void setOwnError(unsigned int code, const sched::Site &site) {
    PLATCErrSetEx(code, site.file, site.line);
}

sched::StagedTasks staged;

// ---- Reading ----

// The section's stored form, in the hash or as it is staged; nullptr when it cannot be read.
PLATCSZHASH *readSection(const char *path, const char *section, Hash &hash, int &found) {
    if (PLATCSZHASH *const form = staged.find(section)) {
        found = 1;
        return form;
    }
    PLATCHashRemoveAll(hash.get());
    found = staged.stateOf(section) == sched::StagedTasks::State::Removed
                ? 0
                : PLATCFileGetSection(path, section, hash.address());
    return found > 0 ? hash.get() : nullptr;
}

// Fills the task from its section's stored form; a failure is logged.
bool readTask(const char *section, PLATCSZHASH *form, TAVI_SCHED_TASK &task, bool withTime) {
    if (!form) {
        SCHED_LOG_AT(51, "Get section [%s] from [%s] failed. [0x%04X %s:%d]",
                     LogText(section).c_str(), kWorkingCopy, SCHED_LAST_ERROR);
        return false;
    }
    if (TAVISchedInitTaskFromHash(form, &task) != 0) {
        SCHED_LOG_AT(60, "Init task from hash failed. [0x%04X %s:%d]", SCHED_LAST_ERROR);
        return false;
    }
    if (withTime && TAVISchedNextTriggerTime(&task) != 0) {
        SCHED_LOG_AT(65, "Failed to obtain next trigger time. id:[%ld]. [0x%04X %s:%d]",
                     static_cast<long>(task.id), SCHED_LAST_ERROR);
        return false;
    }
    return true;
}

bool isThere(const char *path, bool &unreadable) {
    const base::Found found = base::look(path, base::kSharedFileToRead);
    unreadable = found == base::Found::Unreadable;
    if (unreadable) {
        SCHED_LOG_FOR(SCHED_OWN_SITE, "%s cannot be looked at: %m", path);
        setOwnError(sched::kOpenFailed, SCHED_OWN_SITE);
    }
    return found != base::Found::Nothing && !unreadable;
}

// What a look-up finds before it reads: enumerations that a section does not name stay as they are,
// and so do the days behind the end of a short mask.
void makeFresh(TAVI_SCHED_TASK &task) {
    task.state = 0;
    task.type = 0;
    std::fill(std::begin(task.week), std::end(task.week), '\0');
}

// One pass, from section to section.
class Pass {
  public:
    explicit Pass(const sched::TaskPass &how) : how_(how) {}

    // What is staged takes the place of what is stored.
    bool takeStored(const char *name, PLATCSZHASH *form) {
        if (!staged.any()) {
            return take(name, form);
        }
        stored_.insert(name);
        PLATCSZHASH *const stagedForm = staged.find(name);
        return staged.stateOf(name) == sched::StagedTasks::State::Removed ||
               take(name, stagedForm ? stagedForm : form);
    }
    // What is handed over may change what is staged.
    bool takeStaged() {
        const std::vector<std::string> names(staged.order().begin(), staged.order().end());
        return std::all_of(names.begin(), names.end(), [&](const std::string &name) {
            PLATCSZHASH *const form = staged.find(name);
            return !form || stored_.contains(name) || take(name.c_str(), form);
        });
    }
    bool isOutOfMemory() const { return isOutOfMemory_; }

  private:
    // False ends the pass.
    bool take(const char *name, PLATCSZHASH *form) {
        if (!task_ && !(task_ = sched::allocateTask())) {
            SCHED_LOG_AT(55, "malloc TAVI_SCHED_TASK failed. key:[%s]", LogText(name).c_str());
            SCHED_SET_ERROR_AT(56, sched::kTaskOutOfMemory);
            isOutOfMemory_ = true;
            return false;
        }
        makeFresh(*task_);
        if (!readTask(name, form, *task_, how_.fresh)) {
            *task_ = {}; // what it has of this section is nobody's
            how_.onUnreadable(name);
            return true;
        }
        return how_.onTask(name, how_.fresh ? task_.release() : task_.get());
    }

    const sched::TaskPass &how_;
    sched::Allocated<TAVI_SCHED_TASK> task_;
    std::set<std::string, std::less<>> stored_; // names in the file, when anything is staged
    bool isOutOfMemory_ = false;
};

// Those of the file come first, then those that are new.
int passOverAll(const sched::TaskPass &how) {
    const sched::Reading reading;
    bool unreadable = false;
    if (!reading) {
        return -1;
    }
    Pass pass(how);
    bool goesOn = true;
    const auto take = [&](const char *name, PLATCSZHASH *form) {
        goesOn = pass.takeStored(name, form);
        return goesOn;
    };
    if ((isThere(reading.path(), unreadable) && sched::forEachSection(reading.path(), take) != 0) ||
        unreadable) {
        return -1;
    }
    goesOn = goesOn && pass.takeStaged();
    return pass.isOutOfMemory() ? -1 : 0;
}

int lookUp(int32_t id, TAVI_SCHED_TASK *task) {
    const sched::Reading reading;
    Hash hash(kCapacity);
    if (!reading || !hash) {
        return -1;
    }
    const sched::SectionName section = sched::sectionName(id);
    bool unreadable = false;
    if (staged.stateOf(section.data()) != sched::StagedTasks::State::Stored &&
        !isThere(reading.path(), unreadable)) {
        return unreadable ? -1 : 0;
    }
    int found = 0;
    PLATCSZHASH *const form = readSection(reading.path(), section.data(), hash, found);
    if (found < 0) {
        SCHED_LOG_AT(537, "Get section [%s] from [%s] failed. [0x%04X %s:%d]", section.data(),
                     kWorkingCopy, SCHED_LAST_ERROR);
    }
    if (found <= 0) {
        return found;
    }
    if (TAVISchedInitTaskFromHash(form, task) != 0) {
        SCHED_LOG_AT(545, "Init task from hash failed. [0x%04X %s:%d]", SCHED_LAST_ERROR);
        return -1;
    }
    if (TAVISchedNextTriggerTime(task) != 0) {
        SCHED_LOG_AT(550, "Failed to obtain next trigger time. id:[%ld]. [0x%04X %s:%d]",
                     static_cast<long>(task->id), SCHED_LAST_ERROR);
        return -1;
    }
    return 1;
}

// ---- Ids ----

// An id is in use when a task has it or a section is named by it: one that cannot be read must not
// be overwritten.
int gatherIds(sched::StagedTasks::Ids &ids) {
    return passOverAll({.onTask =
                            [&](const char *section, TAVI_SCHED_TASK *task) {
                                ids.add(section, task->id);
                                return true;
                            },
                        .onUnreadable =
                            [&](const char *section) {
                                if (const auto id = sched::idOfSection(section)) {
                                    ids.add(section, *id);
                                }
                            }});
}

// From 1 upward: a smallest id above 1 gives 1, else the first gap above the smallest id, else the
// largest plus 1. Nothing below the smallest id is looked at, and that is kept.
int32_t smallestFreeId(const std::multiset<int32_t> &ids) {
    if (ids.empty() || *ids.begin() > 1) {
        return 1;
    }
    const auto gap = std::adjacent_find(ids.begin(), ids.end(), [](int32_t lower, int32_t upper) {
        return int64_t{upper} - lower >= 2;
    });
    return (gap == ids.end() ? *ids.rbegin() : *gap) + 1;
}

// ---- Programs that copy ----

int logCopyFailure(const char *from, const char *to, int line) {
    SCHED_LOG_AT(line, "Copy sched conf failed. [%s] -> [%s] [0x%04X %s:%d]", from, to,
                 SCHED_LAST_ERROR);
    return -1;
}

// Runs cp without a shell; a failure is logged under the site number. Nobody looks at what it
// overwrites before it has ended, whatever becomes of this process.
int copyFile(const char *from, const char *to, int line) {
    const sched::ChangeLock::Inherited lock;
    const std::array<const char *, 4> arguments = {"-f", from, to, nullptr};
    return PLATCExec("/bin/cp", arguments.data()) == 0 ? 0 : logCopyFailure(from, to, line);
}

// The persistent file may have further names: its folder is root's.
constexpr base::TrustRule kPersistentRule{.oneName = false};

// Whether the file is one that may be believed and has just this content; then it is flushed, too,
// when it is to last.
bool holds(const char *path, const std::string &content, bool durable) {
    const base::Opened opened =
        base::openTrusted(path, durable ? kPersistentRule : base::kSharedFile);
    if (opened.found != base::Found::Trusted) {
        return false;
    }
    const auto present = base::readAll(opened.file.get());
    return present && *present == content && (!durable || fsync(opened.file.get()) == 0);
}

// What a copy left must be what was to be copied: between a look at a name and its use by another
// program somebody else may have acted.
int verify(const char *from, const char *to, const std::string &content, bool durable, int line) {
    if (holds(to, content, durable)) {
        return 0;
    }
    SCHED_SET_ERROR_AT(line, sched::kReadWriteFailed);
    return logCopyFailure(from, to, line);
}

// ---- The scratch file ----

// The scratch file of one change, named for this process.
class Scratch {
  public:
    Scratch() { std::snprintf(path_.data(), path_.size(), "%s.%d", sched::kScratchStem, getpid()); }
    ~Scratch() { unlink(path_.data()); }
    Scratch(const Scratch &) = delete;
    Scratch &operator=(const Scratch &) = delete;

    const char *path() const { return path_.data(); }

    // Starts as a copy of the working copy, or empty when there is none.
    int prepare(const std::optional<std::string> &working) const {
        unlink(path());
        const bool claimed = sched::claimSharedFile(path()) == 0;
        if (!claimed) {
            setOwnError(sched::kOpenFailed, SCHED_OWN_SITE);
        }
        if (working) {
            return claimed ? copyWorking(*working) : logCopyFailure(kWorkingCopy, path(), 379);
        }
        if (!claimed || PLATCFileTouch(path()) != 0) {
            SCHED_LOG_AT(374, "PLATCFileTouch [%s] failed. [0x%04X %s:%d]", path(),
                         SCHED_LAST_ERROR);
            return -1;
        }
        return 0;
    }

    // What it holds now.
    std::optional<std::string> read() const {
        const base::Opened opened = base::openTrusted(path(), base::kSharedFile);
        auto content =
            opened.found == base::Found::Trusted ? base::readAll(opened.file.get()) : std::nullopt;
        if (!content) {
            setOwnError(sched::kReadWriteFailed, SCHED_OWN_SITE);
            SCHED_LOG_FOR(SCHED_OWN_SITE, "%s cannot be read: %m", path());
        }
        return content;
    }

  private:
    int copyWorking(const std::string &working) const {
        return copyFile(kWorkingCopy, path(), 379) != 0
                   ? -1
                   : verify(kWorkingCopy, path(), working, false, 379);
    }

    std::array<char, 4096> path_{};
};

// ---- Writing ----

// The task's stored form, or nothing, which is logged.
std::unique_ptr<Hash> formOf(const TAVI_SCHED_TASK &task) {
    auto hash = std::make_unique<Hash>(kCapacity);
    if (!*hash) {
        SCHED_LOG_AT(398, "PLATCSzHashAlloc failed.[0x%04X %s:%d]", SCHED_LAST_ERROR);
        return nullptr;
    }
    if (TAVISchedInitHashFromTask(hash->address(), &task) != 0) {
        SCHED_LOG_AT(403, "Init hash from task failed. [0x%04X %s:%d]", SCHED_LAST_ERROR);
        return nullptr;
    }
    return hash;
}

int writeSection(const char *path, const char *section, const PLATCSZHASH *form) {
    const int replaced = PLATCFileSetSection(path, section, form);
    if (replaced < 0) {
        SCHED_LOG_AT(408, "Save section [%s] to [%s] failed. [0x%04X %s:%d]", section, path,
                     SCHED_LAST_ERROR);
        return -1;
    }
    if (replaced == 0 && PLATCFileAddSection(path, section, form) < 0) {
        SCHED_LOG_AT(412, "Add section [%s] to [%s] failed. [0x%04X %s:%d]", section, path,
                     SCHED_LAST_ERROR);
        return -1;
    }
    return 1;
}

int removeSection(const char *path, const char *section) {
    const int removed = PLATCFileRemoveSection(path, section);
    if (removed < 0) {
        SCHED_LOG_AT(393, "PLATCFileRemoveSection [%s] from [%s] failed.[0x%04X %s:%d]", section,
                     path, SCHED_LAST_ERROR);
    }
    return removed;
}

// Reads a task file as it is before a change. False when it must not be believed or cannot be read.
bool readBefore(const char *path, const base::TrustRule &rule,
                std::optional<std::string> &content) {
    const base::Opened opened = base::openTrusted(path, rule);
    if (opened.found == base::Found::Trusted) {
        content = base::readAll(opened.file.get());
    }
    if (opened.found == base::Found::Nothing || content) {
        return true;
    }
    setOwnError(sched::kOpenFailed, SCHED_OWN_SITE);
    if (opened.found == base::Found::Strange) {
        SCHED_LOG_FOR(SCHED_OWN_SITE,
                      "[%s] is refused: another user may have put it there or may write it", path);
    } else {
        SCHED_LOG_FOR(SCHED_OWN_SITE, "[%s] cannot be read: %m", path);
    }
    return false;
}

bool readBefore(sched::Before::Tasks &before) {
    return readBefore(kWorkingCopy, base::kSharedFileToRead, before.working) &&
           readBefore(kPersistent, kPersistentRule, before.persistent);
}

constexpr int kPutAsideSite = 416; // no other message of this source has it

// Without a working copy, or with one that a failed copy left empty, a change starts from nothing
// and would erase every task of the persistent file for good, so that file is put aside first. What
// was put aside before moves on to the next free number.
int savePersistent(const sched::Before::Tasks &before) {
    if ((before.working && !before.working->empty()) || !before.persistent ||
        before.persistent->empty()) {
        return 0;
    }
    if (holds(sched::kPutAside, *before.persistent, true)) {
        return 0;
    }
    if (PLATCFileExist(sched::kPutAside)) {
        std::array<char, 512> older{};
        int number = 0;
        do {
            std::snprintf(older.data(), older.size(), "%s.%d", sched::kPutAside, ++number);
        } while (PLATCFileExist(older.data()));
        if (rename(sched::kPutAside, older.data()) != 0) {
            setOwnError(sched::kRenameFailed, SCHED_OWN_SITE);
            return logCopyFailure(sched::kPutAside, older.data(), kPutAsideSite);
        }
    }
    if (copyFile(kPersistent, sched::kPutAside, kPutAsideSite) == 0 &&
        verify(kPersistent, sched::kPutAside, *before.persistent, true, kPutAsideSite) == 0) {
        return 0;
    }
    unlink(sched::kPutAside);
    return -1;
}

// A working copy that this process makes is made before cp opens it, so that cp follows no link
// that somebody put there in between.
int publishWorking(const char *scratch, const std::string &content) {
    const sched::WritingLock lock;
    if (!lock) {
        return logCopyFailure(scratch, kWorkingCopy, 424);
    }
    if (sched::claimSharedFile(kWorkingCopy) != 0) {
        setOwnError(sched::kOpenFailed, SCHED_OWN_SITE);
        return logCopyFailure(scratch, kWorkingCopy, 424);
    }
    if (copyFile(scratch, kWorkingCopy, 424) != 0 ||
        verify(scratch, kWorkingCopy, content, false, 424) != 0) {
        return -1;
    }
    sched::tellWorkingCopyIsWhole();
    return 0;
}

// The persistent file first, the working copy second. What fails is taken back with the change.
int publish(const Scratch &scratch) {
    const auto content = scratch.read();
    if (!content || copyFile(scratch.path(), kPersistent, 419) != 0 ||
        verify(scratch.path(), kPersistent, *content, true, 419) != 0) {
        return -1;
    }
    return publishWorking(scratch.path(), *content);
}

int changeScratch(const Scratch &scratch, const std::string &section,
                  const sched::Before::Tasks &before, const TAVI_SCHED_TASK *task) {
    if (!task) {
        return before.working ? removeSection(scratch.path(), section.c_str()) : 0;
    }
    const auto form = formOf(*task);
    return form ? writeSection(scratch.path(), section.c_str(), form->get()) : -1;
}

int storeSection(const std::string &section, const TAVI_SCHED_TASK *task) {
    sched::Before before;
    if (!readBefore(before.tasks.emplace())) {
        return -1;
    }
    const Scratch scratch;
    if (scratch.prepare(before.tasks->working) != 0) {
        return -1;
    }
    const int changed = changeScratch(scratch, section, *before.tasks, task);
    if (changed <= 0) {
        return changed;
    }
    if (sched::Change::record(before) != 0 || (task && savePersistent(*before.tasks) != 0)) {
        return -1;
    }
    return publish(scratch) == 0 ? 1 : -1;
}

// ---- Batches ----

int stage(const std::string &section, const TAVI_SCHED_TASK *task) {
    if (task) {
        auto form = formOf(*task);
        if (!form) {
            return -1;
        }
        staged.store(section, task->id, std::move(form));
        return 1;
    }
    if (staged.stateOf(section) == sched::StagedTasks::State::Untouched) {
        const sched::Reading reading;
        Hash hash(kCapacity);
        bool unreadable = false;
        int found = 0;
        if (!reading || !hash) {
            return -1;
        }
        if (isThere(reading.path(), unreadable)) {
            readSection(reading.path(), section.c_str(), hash, found);
        }
        if (unreadable || found <= 0) {
            return unreadable ? -1 : found;
        }
    } else if (!staged.find(section)) {
        return 0;
    }
    staged.remove(section);
    return 1;
}

int writeStaged(const char *path) {
    std::vector<const char *> names;
    std::vector<const PLATCSZHASH *> forms;
    for (const std::string &section : staged.order()) {
        names.push_back(section.c_str());
        forms.push_back(staged.find(section));
    }
    if (!PLATCFileEditSections) {
        for (size_t i = 0; i < names.size(); ++i) {
            if ((forms[i] ? writeSection(path, names[i], forms[i])
                          : removeSection(path, names[i])) < 0) {
                return -1;
            }
        }
        return 0;
    }
    if (PLATCFileEditSections(path, static_cast<int>(names.size()), names.data(), forms.data()) !=
        0) {
        SCHED_LOG_FOR(SCHED_OWN_SITE, "Save %zu sections to [%s] failed. [0x%04X %s:%d]",
                      names.size(), path, SCHED_LAST_ERROR);
        return -1;
    }
    return 0;
}

sched::Before::Tasks beforeBatch;

} // namespace

namespace sched {

SectionName sectionName(int32_t id) {
    SectionName name{};
    std::snprintf(name.data(), name.size(), "%ld", static_cast<long>(id));
    return name;
}

int forEachStoredTask(const TaskPass &how) {
    return guarded(
        SCHED_OWN_SITE, [&] { return passOverAll(how); }, -1);
}

int readStoredTask(int32_t id, TAVI_SCHED_TASK *task) {
    return guarded(SCHED_OWN_SITE, [&] { return lookUp(id, task); });
}

int nextFreeId(int32_t *id) {
    StagedTasks::Ids gathered;
    try {
        if (staged.ids) {
            *id = smallestFreeId(staged.ids->used);
            return 0;
        }
        if (gatherIds(gathered) != 0) {
            return -1;
        }
        *id = smallestFreeId(gathered.used);
        if (isBatchOpen()) {
            staged.ids = std::move(gathered);
        }
        return 0;
    } catch (const std::exception &) {
        setOwnError(kTaskOutOfMemory, SCHED_OWN_SITE);
        SCHED_LOG_AT(321, "Alloc id slot failed. num:[%d] [0x%04X %s:%d]",
                     static_cast<int>(gathered.bySection.size()), SCHED_LAST_ERROR);
        return -1;
    }
}

int setTaskSection(int32_t id, const TAVI_SCHED_TASK *task) {
    return guarded(
        SCHED_OWN_SITE,
        [&] {
            const std::string section = sectionName(id).data();
            return isBatchOpen() ? stage(section, task) : storeSection(section, task);
        },
        -1);
}

bool isTaskStaged(const std::string &section) {
    return staged.find(section) != nullptr;
}

bool isAnyTaskStaged() {
    return staged.any();
}

int describeStaged(Before &before) {
    beforeBatch = {};
    if (!readBefore(beforeBatch)) {
        return -1;
    }
    before.tasks = beforeBatch;
    return 0;
}

int storeStaged() {
    const Scratch scratch;
    return savePersistent(beforeBatch) != 0 || scratch.prepare(beforeBatch.working) != 0 ||
                   writeStaged(scratch.path()) != 0
               ? -1
               : publish(scratch);
}

void forgetStaged() {
    staged = {};
}

} // namespace sched
