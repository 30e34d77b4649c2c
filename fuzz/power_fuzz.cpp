// The file of the power schedules: its entries, the tasks that stand for them, and the other kind's
// when one is written.
#include "fuzz.h"

#include <algorithm>
#include <cstdio>
#include <cstring>
#include <optional>

namespace {

using Entries = std::vector<TAVIAUTOPOWER>;

// Each entry is its pair's four numbers.
void requirePairs(int kind, const Entries &entries) {
    const fuzz::Hash hash = fuzz::hashOf({});
    PLATCSZHASH *form = hash.get();
    PLATCFileGetSection(fuzz::kAutoPower, kind == TAVI_AUTOPOWER_KIND_ON ? "power on" : "power off",
                        &form);
    const fuzz::Pairs pairs = fuzz::pairsOf(form);
    REQUIRE(entries.size() == std::min<size_t>(pairs.size(), TAVI_AUTOPOWER_MAX_ENTRIES));
    for (size_t i = 0; i < entries.size(); ++i) {
        const std::string key = std::to_string(1000 + i).substr(1);
        unsigned int numbers[4] = {};
        REQUIRE(pairs.contains(key) &&
                std::sscanf(pairs.at(key).c_str(), "%u %u %u %u", &numbers[0], &numbers[1],
                            &numbers[2], &numbers[3]) == 4);
        REQUIRE(entries[i].enabled == numbers[0] && entries[i].weekBits == numbers[1] &&
                entries[i].hour == numbers[2] && entries[i].minute == numbers[3]);
    }
}

std::optional<Entries> entriesOf(int kind) {
    Entries entries(TAVI_AUTOPOWER_MAX_ENTRIES);
    const int count = TAVIAutoPowerConfGet(kind, TAVI_AUTOPOWER_MAX_ENTRIES, entries.data());
    REQUIRE(count >= -1 && count <= TAVI_AUTOPOWER_MAX_ENTRIES);
    entries.resize(static_cast<size_t>(std::max(count, 0)));
    if (count < 0) {
        return std::nullopt;
    }
    requirePairs(kind, entries);
    return entries;
}

bool isSame(const std::optional<Entries> &one, const std::optional<Entries> &other) {
    return one.has_value() == other.has_value() &&
           (!one || (one->size() == other->size() &&
                     std::equal(one->begin(), one->end(), other->begin(),
                                [](const TAVIAUTOPOWER &left, const TAVIAUTOPOWER &right) {
                                    return std::memcmp(&left, &right, sizeof left) == 0;
                                })));
}

// An entry that a task can stand for.
bool isSound(const TAVIAUTOPOWER &entry) {
    return entry.weekBits <= 127 && entry.hour <= 23 && entry.minute <= 59;
}

bool isListed(const std::optional<Entries> &entries) {
    return entries && std::all_of(entries->begin(), entries->end(), isSound);
}

void requireTask(const TAVI_SCHED_TASK &task) {
    REQUIRE(task.backend == TAVI_SCHED_BACKEND_AUTOPOWER && task.runHour <= 23 &&
            task.runMin <= 59);
    TAVI_SCHED_FAULT fault{};
    REQUIRE(TAVISchedTaskCheck(&task, &fault) == 0 ||
            std::strcmp(task.week, "0000000") ==
                0); // no day: an entry of its own, but no task to make
    const fuzz::Task found = fuzz::newTask();
    REQUIRE(TAVISchedTaskGetByID(task.id, found.get()) == 0);
    REQUIRE(found->id == task.id && found->state == task.state && found->runHour == task.runHour &&
            found->runMin == task.runMin && std::strcmp(found->week, task.week) == 0 &&
            std::strcmp(found->appArgs, task.appArgs) == 0);
}

// Tasks stand for all entries of both kinds, or for none when one is damaged.
void requireTasks(const std::optional<Entries> &on, const std::optional<Entries> &off) {
    const bool isWhole = isListed(on) && isListed(off);
    TAVI_SCHED_TASK *list = nullptr;
    const int count = TAVISchedTaskListGetOf(TAVI_SCHED_BACKEND_AUTOPOWER, &list, nullptr);
    REQUIRE(count == (isWhole ? static_cast<int>(on->size() + off->size()) : -1));
    for (const TAVI_SCHED_TASK *task = list; task; task = TAVISchedTaskNext(task)) {
        requireTask(*task);
    }
    TAVISchedTaskListFree(&list);
}

// What is written of one kind comes back, and the other one stays.
void requireWritten(int kind, const Entries &entries) {
    const auto other = entriesOf(1 - kind);
    REQUIRE(TAVIAutoPowerConfSet(kind, static_cast<int>(entries.size()), entries.data()) == 0);
    REQUIRE(isSame(entriesOf(kind), entries));
    REQUIRE(isSame(entriesOf(1 - kind), other));
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size) {
    fuzz::Input input(data, size);
    fuzz::readStep = input.step();
    fuzz::writeFile(fuzz::kAutoPower, input.rest());
    const auto on = entriesOf(TAVI_AUTOPOWER_KIND_ON);
    const auto off = entriesOf(TAVI_AUTOPOWER_KIND_OFF);
    requireTasks(on, off);
    const int armed = TAVIAutoPoweronSet();
    REQUIRE(on ? armed == 0 || PLATCErrGet() == TAVI_SCHED_ERR_OPEN : armed == -1);
    requireWritten(TAVI_AUTOPOWER_KIND_OFF, off.value_or(Entries()));
    requireWritten(TAVI_AUTOPOWER_KIND_ON, on ? *on : Entries{{1, 127, 23, 59}});
    return 0;
}
