// The power backend: shows the machine's power-on and power-off schedules as tasks. It stores
// nothing of its own: the auto-power configuration is the only store, and a task's id is computed
// from the entry that it stands for, so that an edit changes the id.
#include "base/file.h"
#include "base/trust.h"
#include "change/batch.h"
#include "change/change.h"
#include "platc.h"
#include "sched_calendar.h"
#include "sched_command.h"
#include "sched_error.h"
#include "sched_field.h"
#include "sched_guard.h"
#include "sched_handle.h"
#include "sched_text.h"
#include "tavischeduler.h"
#include "tavisdk.h"

#include <algorithm>
#include <array>
#include <cstdio>
#include <cstring>
#include <optional>
#include <span>
#include <string_view>
#include <sys/wait.h>
#include <vector>

namespace {

using Entry = TAVIAUTOPOWER;
using Task = TAVI_SCHED_TASK;

constexpr std::string_view kName = "taviautopower";
constexpr const char *kCheckProgram = "/usr/tavi/bin/tavi_poweroff_feasible_check";
constexpr const char *kCrontab = "/etc/crontab";
constexpr unsigned int kEveryDay = 127;
constexpr int kMaxRemovals = 100;

// ---- Ids: leading digit 6 to 9 for kind and state, then week bits, hour and minute ----

constexpr int32_t kLeadingUnit = 10'000'000;
constexpr int32_t kWeekUnit = 10'000;
constexpr int32_t kHourUnit = 100;

bool isPowerId(int32_t id) {
    return id / kLeadingUnit >= 6 && id / kLeadingUnit <= 9;
}

int kindOf(int32_t id) {
    return id / kLeadingUnit >= 8 ? TAVI_AUTOPOWER_KIND_OFF : TAVI_AUTOPOWER_KIND_ON;
}

bool hasRanges(unsigned int weekBits, unsigned int hour, unsigned int minute) {
    return weekBits <= kEveryDay && hour <= 23 && minute <= 59;
}

// Nothing for an entry whose numbers are out of their ranges.
std::optional<int32_t> idOf(int kind, const Entry &entry) {
    if (!hasRanges(entry.weekBits, entry.hour, entry.minute)) {
        return std::nullopt;
    }
    const int32_t leading =
        (kind == TAVI_AUTOPOWER_KIND_OFF ? 8 : 6) + (entry.enabled == 1 ? 1 : 0);
    return leading * kLeadingUnit + entry.weekBits * kWeekUnit + entry.hour * kHourUnit +
           entry.minute;
}

// ---- Entries and tasks ----

// What a batch has changed, by kind, and whether it asks for the configuration to be applied.
std::array<std::optional<std::vector<Entry>>, 2> staged;
bool applicationIsStaged = false;

// A kind's entries, with room for one more than are read.
class Entries {
  public:
    // False when the configuration cannot be read.
    bool read(int kind) {
        const auto &changed = staged[static_cast<size_t>(kind)];
        if (changed) {
            count_ =
                static_cast<int>(std::min<size_t>(changed->size(), TAVI_AUTOPOWER_MAX_ENTRIES));
            std::copy_n(changed->begin(), count_, entries_.begin());
        } else {
            count_ = TAVIAutoPowerConfGet(kind, TAVI_AUTOPOWER_MAX_ENTRIES, entries_.data());
        }
        return count_ >= 0;
    }
    std::span<Entry> all() { return {entries_.data(), static_cast<size_t>(count_)}; }
    void append(const Entry &entry) { entries_[static_cast<size_t>(count_++)] = entry; }
    void remove(size_t index) {
        std::copy(all().begin() + static_cast<ptrdiff_t>(index) + 1, all().end(),
                  all().begin() + static_cast<ptrdiff_t>(index));
        --count_;
    }

  private:
    std::array<Entry, TAVI_AUTOPOWER_MAX_ENTRIES + 1> entries_{};
    int count_ = 0;
};

int readEntries(int kind, Entries &entries) {
    if (!entries.read(kind)) {
        SCHED_LOG("Get auto poweron conf failed. [0x%04X %s:%d]", SCHED_LAST_ERROR);
        return -1;
    }
    return 0;
}

// Nothing when hour or minute does not fit an entry: 300 must not become 44.
std::optional<Entry> toEntry(const Task &task) {
    if (!hasRanges(0, task.runHour, task.runMin)) {
        SCHED_SET_ERROR(sched::kInvalidArgument);
        return std::nullopt;
    }
    Entry entry{};
    entry.enabled = task.state == TAVI_SCHED_STATE_ENABLED ? 1 : 0;
    for (unsigned int day = 0; day < TAVI_SCHED_WEEK_DAYS; ++day) {
        entry.weekBits |= sched::runsOnWeekDay(task, day) ? 1U << day : 0U;
    }
    entry.hour = static_cast<uint8_t>(task.runHour);
    entry.minute = static_cast<uint8_t>(task.runMin);
    return entry;
}

template <size_t size> void setText(char (&field)[size], const char *text) {
    sched::copyText(field, size, text);
}

// The fields of a task that has the defaults already; the name and the id are the caller's.
void setFields(int kind, const Entry &entry, Task &task) {
    const bool off = kind == TAVI_AUTOPOWER_KIND_OFF;
    task.backend = TAVI_SCHED_BACKEND_AUTOPOWER;
    task.state = entry.enabled == 1 ? TAVI_SCHED_STATE_ENABLED : TAVI_SCHED_STATE_DISABLED;
    task.type = entry.weekBits == kEveryDay ? TAVI_SCHED_TYPE_DAILY : TAVI_SCHED_TYPE_WEEKLY;
    for (unsigned int day = 0; day < TAVI_SCHED_WEEK_DAYS; ++day) {
        task.week[day] = (entry.weekBits >> day & 1) != 0 ? '1' : '0';
    }
    task.week[TAVI_SCHED_WEEK_DAYS] = '\0';
    task.runHour = entry.hour;
    task.runMin = entry.minute;
    task.repeatHour = 0;
    task.lastWorkHour = entry.hour;
    task.listable = 1;
    task.canEditName = 0;
    task.canEditOwner = 0;
    task.canRunAppSameTime = 1;
    task.canRunTaskSameTime = 1;
    task.canRunFromUI = off ? 1 : 0;
    setText(task.app, "TAVI.VEX.TaskScheduler.AutoPower");
    setText(task.appArgs, off ? "poweroff" : "poweron");
    setText(task.appName, "#schedule:power_on_off#");
    setText(task.action, off ? "#schedule:power_off#" : "#schedule:power_on#");
}

// ---- Defaults ----

int GetDefault(Task *pTask) {
    SCHED_REQUIRE(pTask, "((void *)0) != pTask", -1);
    sched::Hash hash(1024);
    if (!hash) {
        SCHED_LOG("Alloc hash failed. [0x%04X %s:%d]", SCHED_LAST_ERROR);
        return -1;
    }
    sched::setNewTaskValues(hash.address(), "Power", "#schedule:power_on_off#");
    return sched::fillTaskFromHash(hash.get(), *pTask, SCHED_SITE);
}

// ---- Reading ----

int setNextTriggerTime(Task &task) {
    if (TAVISchedNextTriggerTime(&task) != 0) {
        SCHED_LOG("Failed to obtain next trigger time. id:[%ld]. [0x%04X %s:%d]",
                  static_cast<long>(task.id), SCHED_LAST_ERROR);
        return -1;
    }
    return 0;
}

// The task of a list for an entry, or nothing, which is logged.
sched::Allocated<Task> makeTask(int kind, size_t index, const Entry &entry) {
    auto task = sched::allocateTask();
    if (!task) {
        SCHED_LOG("malloc TAVI_SCHED_TASK failed.");
        SCHED_SET_ERROR(sched::kTaskOutOfMemory);
        return nullptr;
    }
    if (GetDefault(task.get()) != 0) {
        SCHED_LOG("Get task from Power schedule failed. ");
        return nullptr;
    }
    const auto id = idOf(kind, entry);
    if (!id) {
        SCHED_LOG("taviautopower_get_from_psched failed.");
        SCHED_SET_ERROR(sched::kBadFormat);
        return nullptr;
    }
    // The name of a listed task, of one fetched by id and of a new one differ; front ends know all
    // three.
    std::snprintf(task->name, sizeof task->name, "Power%s task %d",
                  kind == TAVI_AUTOPOWER_KIND_OFF ? "Off" : "On", static_cast<int>(index));
    setFields(kind, entry, *task);
    task->id = *id;
    return setNextTriggerTime(*task) == 0 ? std::move(task) : nullptr;
}

// Puts the kind's tasks in front of the list: the number of tasks kept, or -1.
int listKind(int kind, TAVI_SCHED_FILTER filter, sched::TaskList &tasks) {
    Entries entries;
    if (readEntries(kind, entries) != 0) {
        return -1;
    }
    int count = 0;
    const auto all = entries.all();
    for (size_t index = 0; index < all.size(); ++index) {
        auto task = makeTask(kind, index, all[index]);
        if (!task) {
            return -1;
        }
        if (!filter || filter(task.get())) {
            tasks.pushFront(std::move(task));
            ++count;
        }
    }
    return count;
}

int ListGet(Task **pTaskList, TAVI_SCHED_FILTER filter) {
    SCHED_REQUIRE(pTaskList, "((void *)0) != pTaskList", -1);
    sched::TaskList tasks;
    int total = 0;
    for (const int kind : {TAVI_AUTOPOWER_KIND_ON, TAVI_AUTOPOWER_KIND_OFF}) {
        const int count = listKind(kind, filter, tasks);
        if (count < 0) {
            return -1;
        }
        total += count;
    }
    tasks.appendTo(pTaskList);
    return total;
}

int OwnsId(int32_t id) {
    return isPowerId(id) ? 1 : 0;
}

int GetByID(int32_t id, Task *pTask) {
    if (!isPowerId(id)) {
        return 0;
    }
    const int kind = kindOf(id);
    Entries entries;
    if (readEntries(kind, entries) != 0) {
        return -1;
    }
    const auto all = entries.all();
    for (size_t index = 0; index < all.size(); ++index) {
        const auto entryId = idOf(kind, all[index]);
        if (!entryId) {
            SCHED_LOG("transform power schedule to id failed. ");
            SCHED_SET_ERROR(sched::kBadFormat);
            return -1;
        }
        if (*entryId != id) {
            continue;
        }
        if (GetDefault(pTask) != 0) {
            SCHED_LOG("Get default failed. [0x%04X %s:%d]", SCHED_LAST_ERROR);
            return -1;
        }
        std::snprintf(pTask->name, sizeof pTask->name, "Power%s %d",
                      kind == TAVI_AUTOPOWER_KIND_OFF ? "off" : "on", static_cast<int>(index));
        setFields(kind, all[index], *pTask);
        pTask->id = id;
        return setNextTriggerTime(*pTask) == 0 ? 1 : -1;
    }
    return 0;
}

// ---- Changing ----

std::optional<size_t> findEntry(int32_t id, std::span<const Entry> entries) {
    for (size_t index = 0; index < entries.size(); ++index) {
        const auto entryId = idOf(kindOf(id), entries[index]);
        if (!entryId) {
            SCHED_LOG("wired id in power schedule [%ld] ", static_cast<long>(id));
        } else if (*entryId == id) {
            return index;
        }
    }
    return std::nullopt;
}

int writeEntries(int kind, std::span<const Entry> entries) {
    const int count = static_cast<int>(entries.size());
    if (TAVIAutoPowerConfSet(kind, count, entries.data()) < 0) {
        SCHED_LOG("TAVIAutoPowerConfSet failed. num:[%d] [0x%04X %s:%d]", count, SCHED_LAST_ERROR);
        return -1;
    }
    return 0;
}

int describeKind(int kind, std::span<const Entry> entries, sched::Before &before) {
    before.power[static_cast<size_t>(kind)].emplace(entries.begin(), entries.end());
    return 0;
}

bool isStored = false; // by the change that goes on

// Stores what a kind's entries have become: for the batch that goes on, or with a record of what
// they were.
int storeEntries(int kind, std::span<const Entry> before, std::span<const Entry> after) {
    if (sched::isBatchOpen()) {
        staged[static_cast<size_t>(kind)].emplace(after.begin(), after.end());
        return 0;
    }
    sched::Before record;
    describeKind(kind, before, record);
    if (sched::Change::record(record) != 0 || writeEntries(kind, after) != 0) {
        return -1;
    }
    isStored = true;
    return 0;
}

// Replaces or appends the entry of the id, or removes it when there is no task: 1 changed, 0
// nothing to change, -1. The kind stays that of the given id.
int SetSchedule(int32_t id, const Task *task) {
    if (!isPowerId(id)) {
        return 0;
    }
    const int kind = kindOf(id);
    Entries entries;
    if (readEntries(kind, entries) != 0) {
        return -1;
    }
    Entries before = entries;
    const auto index = findEntry(id, entries.all());
    if (task) {
        const auto entry = toEntry(*task);
        if (!entry) {
            SCHED_LOG("Convert to autopower schedule failed. ");
            return -1;
        }
        if (index) {
            entries.all()[*index] = *entry;
        } else {
            entries.append(*entry);
        }
    } else if (index) {
        entries.remove(*index);
    } else {
        return 0;
    }
    return storeEntries(kind, before.all(), entries.all()) == 0 ? 1 : -1;
}

// ---- Applying the configuration to the machine ----

// The entry's days and time as texts. They go nowhere, but an entry for which they cannot be made
// is not applied.
int composeTexts(const Entry &entry) {
    std::array<char, 32> days{};
    std::array<char, 16> time{};
    size_t length = 0;
    for (unsigned int day = 0; day < TAVI_SCHED_WEEK_DAYS && length < days.size(); ++day) {
        if ((entry.weekBits >> day & 1) != 0) {
            length += static_cast<size_t>(std::snprintf(days.data() + length, days.size() - length,
                                                        length == 0 ? "%s" : ",%s",
                                                        TAVISchedWeekDayNames[day]));
        }
    }
    const int timeLength =
        std::snprintf(time.data(), time.size(), "%02d:%02d", entry.hour, entry.minute);
    if (length >= days.size() || static_cast<size_t>(timeLength) >= time.size()) {
        SCHED_LOG("Out of string size");
        return -1;
    }
    return 0;
}

// Removes the check program's lines from the crontab, one a call.
int removeCrontabLines() {
    for (int i = 0; i < kMaxRemovals; ++i) {
        const int removed = PLATCFileSetLine(kCrontab, kCheckProgram, nullptr);
        if (removed < 0) {
            SCHED_LOG("Failed to remove line in crontab (0x%x)", PLATCErrGet());
        }
        if (removed <= 0) {
            return removed;
        }
    }
    return 0;
}

int addCrontabLine(const Entry &entry) {
    TAVISCHEDULE schedule{};
    schedule.weekBits = entry.weekBits;
    schedule.hour = entry.hour;
    schedule.lastHour = entry.hour;
    schedule.minute = entry.minute;
    setText(schedule.szCommand, kCheckProgram);
    if (composeTexts(entry) != 0) {
        return -1;
    }
    if (TAVIScheduleSet(&schedule, 1) == -1) {
        SCHED_LOG("TAVIScheduleSet Error %d", static_cast<int>(PLATCErrGet()));
        return -1;
    }
    return 0;
}

// The crontab as it is when this is made, for a failure between the removal of lines and the last
// of the new ones: what is due meanwhile must not be missing.
class CrontabBefore {
  public:
    CrontabBefore() : opened_(base::openTrusted(kCrontab, base::kOrdinaryFile)) {
        if (opened_.found == base::Found::Trusted) {
            content_ = base::readAll(opened_.file.get());
        }
    }
    // The error stays that of the failure.
    void putBack() const {
        const sched::KeptError error;
        if (sched::guarded(SCHED_SITE, [&] { return replaceOther(); }) != 0) {
            SCHED_LOG("%s cannot be put back: %m", kCrontab);
            sched::ChangeLock::leaveToNext();
        }
    }

  private:
    int replaceOther() const {
        const auto now = CrontabBefore().content_;
        if (!content_ || now == content_) {
            return 0;
        }
        base::Replacement crontab(kCrontab, base::processTemporary());
        return crontab.open() && crontab.write(*content_) &&
                       crontab.commit({.like = &opened_.status, .later = true})
                   ? 0
                   : -1;
    }

    base::Opened opened_;
    std::optional<std::string> content_;
};

int replacePowerOffLines(std::span<const Entry> entries) {
    if (removeCrontabLines() < 0) {
        return -1;
    }
    if (TAVIUpdateCrontab(kCheckProgram, 0, 1) < 0) {
        SCHED_LOG("Failed to kill crontab task (0x%x)", PLATCErrGet());
        return -1;
    }
    for (const Entry &entry : entries) {
        if (entry.enabled != 0 && addCrontabLine(entry) != 0) {
            return -1;
        }
    }
    return 0;
}

int setPowerOffLines(std::span<const Entry> entries) {
    const CrontabBefore before;
    const int result = replacePowerOffLines(entries);
    if (result != 0) {
        before.putBack();
    }
    return result;
}

int applyConfiguration() {
    if (TAVIAutoPoweronSet() < 0) {
        SCHED_LOG("set auto poweron failed. [0x%04X %s:%d]", SCHED_LAST_ERROR);
        return -1;
    }
    Entries entries;
    if (!entries.read(TAVI_AUTOPOWER_KIND_OFF)) {
        SCHED_LOG("get auto power off failed. [0x%04X %s:%d]", SCHED_LAST_ERROR);
        return -1;
    }
    if (setPowerOffLines(entries.all()) != 0) {
        SCHED_LOG("Set Power Off Schedule ERROR! [0x%04X %s:%d]", SCHED_LAST_ERROR);
        return -1;
    }
    return 0;
}

// ---- Operations ----

// Runs the body as a change; what it stored stays also when applying it failed.
template <typename Body> int inChange(Body &&body) {
    return sched::guarded(
        SCHED_SITE,
        [&] {
            sched::Change change;
            if (!change) {
                return -1;
            }
            isStored = false;
            const int result = body();
            return (result >= 0 || isStored) && change.finish() != 0 ? -1 : result;
        },
        -1);
}

int applyNow() {
    if (sched::isBatchOpen()) {
        applicationIsStaged = true;
        return 0;
    }
    return applyConfiguration();
}

int Sync() {
    return inChange(applyNow);
}

int setSchedule(int32_t id, const Task *task) {
    const int changed = SetSchedule(id, task);
    if (changed < 0) {
        SCHED_LOG("set task failed. [%ld] [0x%04X %s:%d]", static_cast<long>(id), SCHED_LAST_ERROR);
    }
    return changed;
}

int syncPowerHardware() {
    if (applyNow() < 0) {
        SCHED_LOG("sync power hw failed. [0x%04X %s:%d]", SCHED_LAST_ERROR);
        return -1;
    }
    return 0;
}

std::optional<int> kindOfArguments(const Task &task) {
    if (std::strcmp(task.appArgs, "poweron") == 0) {
        return TAVI_AUTOPOWER_KIND_ON;
    }
    if (std::strcmp(task.appArgs, "poweroff") == 0) {
        return TAVI_AUTOPOWER_KIND_OFF;
    }
    return std::nullopt;
}

int Create(Task *pTask) {
    SCHED_REQUIRE(pTask, "((void *)0) != pTask", -1);
    const auto entry = toEntry(*pTask);
    if (!entry) {
        SCHED_LOG("convert task from power schedule failed. [0x%04X %s:%d]", SCHED_LAST_ERROR);
        return -1;
    }
    const auto kind = kindOfArguments(*pTask);
    if (!kind) {
        SCHED_LOG("Invalid app args for power [%s]", sched::LogText(pTask->appArgs).c_str());
        SCHED_SET_ERROR(sched::kInvalidArgument);
        return -1;
    }
    pTask->id = idOf(*kind, *entry).value(); // an entry made of a task has its ranges
    if (pTask->name[0] == '\0') {
        setText(pTask->name, "Power task");
    }
    return inChange([&] { return setSchedule(pTask->id, pTask) < 0 ? -1 : syncPowerHardware(); });
}

// An id that is no power id changes nothing, but the configuration is applied all the same.
int Edit(Task *pTask) {
    SCHED_REQUIRE(pTask, "((void *)0) != pTask", -1);
    return inChange([&] {
        if (setSchedule(pTask->id, pTask) < 0) {
            return -1;
        }
        if (applyNow() < 0) {
            SCHED_LOG("sync hw autopower failed. [0x%04X %s:%d]", SCHED_LAST_ERROR);
            return -1;
        }
        return 0;
    });
}

int Remove(int32_t id) {
    return inChange([&] {
        const int removed = setSchedule(id, nullptr);
        if (removed <= 0) {
            return removed;
        }
        return syncPowerHardware() == 0 ? 1 : -1;
    });
}

// ---- Batches ----

bool isTouched() {
    return applicationIsStaged || staged[0] || staged[1];
}

int describe(sched::Before &before) {
    for (const int kind : {TAVI_AUTOPOWER_KIND_ON, TAVI_AUTOPOWER_KIND_OFF}) {
        auto changed = std::move(staged[static_cast<size_t>(kind)]);
        if (!changed) {
            continue;
        }
        staged[static_cast<size_t>(kind)].reset();
        Entries entries;
        const int read = readEntries(kind, entries);
        staged[static_cast<size_t>(kind)] = std::move(changed);
        if (read != 0) {
            return -1;
        }
        describeKind(kind, entries.all(), before);
    }
    return 0;
}

int store() {
    for (const int kind : {TAVI_AUTOPOWER_KIND_ON, TAVI_AUTOPOWER_KIND_OFF}) {
        const auto &changed = staged[static_cast<size_t>(kind)];
        if (changed && writeEntries(kind, *changed) != 0) {
            return -1;
        }
    }
    return 0;
}

void forget() {
    staged = {};
    applicationIsStaged = false;
}

int Run(Task *pTask, int *pStatusCode, char *szComment, size_t cbComment) {
    SCHED_REQUIRE(pTask, "((void *)0) != pTask", -1);
    SCHED_REQUIRE(pStatusCode, "((void *)0) != pStatusCode", -1);
    SCHED_REQUIRE(szComment, "((void *)0) != szComment", -1);
    SCHED_REQUIRE(cbComment > 0, "0 < cbComment", -1);
    szComment[0] = '\0';
    const bool off = std::strcmp(pTask->appArgs, "poweroff") == 0;
    const int status = off ? sched::runCommand(kCheckProgram) : 0;
    const size_t room = std::min<size_t>(4, cbComment);
    if (status == 0) {
        *pStatusCode = SCHED_STATUS_CODE_SUCCESS;
    } else if (status == -1) {
        *pStatusCode = SCHED_STATUS_CODE_START_FAILED;
    } else if (WIFSIGNALED(status)) {
        *pStatusCode = SCHED_STATUS_CODE_SIGNALED;
        std::snprintf(szComment, room, "%d", WTERMSIG(status));
    } else {
        *pStatusCode = SCHED_STATUS_CODE_EXIT_FAILED;
        std::snprintf(szComment, room, "%d", WEXITSTATUS(status));
    }
    return 0;
}

} // namespace

int taviautopower_init(const char *szName, TAVI_SCHED_BACKEND_RECORD *pBackend) {
    SCHED_REQUIRE(szName, "((void *)0) != szName", -1);
    SCHED_REQUIRE(pBackend, "NULL != pBackend", -1);
    if (szName != kName) {
        SCHED_LOG("backend name is mismatch for taviautopower!! [%s]",
                  sched::LogText(szName).c_str());
        return -1;
    }
    sched::joinBatches({isTouched, describe, store, applyConfiguration, forget});
    *pBackend = {.id = pBackend->id,
                 .name = szName,
                 .sync = Sync,
                 .create = Create,
                 .edit = Edit,
                 .remove = Remove,
                 .get_default = GetDefault,
                 .owns_id = OwnsId,
                 .get_by_id = GetByID,
                 .run = Run,
                 .list_get = ListGet};
    return 0;
}
