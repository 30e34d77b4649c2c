// The file of the power schedules: its entries, the tasks that stand for them, and the other kind's
// when one is written.
#include "fuzz.h"

#include <algorithm>
#include <cstdio>
#include <cstring>
#include <optional>

namespace {

using Entries = std::vector<TAVIAUTOPOWER>;

constexpr const char *kWakeAlarm = "/sys/class/rtc/rtc0/wakealarm";

// Each entry is its pair's four numbers. Nothing that cannot be read is damaged.
void requirePairs(int kind, int count, const Entries &entries) {
    const fuzz::Hash hash = fuzz::hashOf({});
    PLATCSZHASH *form = hash.get();
    PLATCFileGetSection(fuzz::kAutoPower, kind == TAVI_AUTOPOWER_KIND_ON ? "power on" : "power off",
                        &form);
    const fuzz::Pairs pairs = fuzz::pairsOf(form);
    const fuzz::List keys = fuzz::newList(); // more than pairs when there are NULs
    PLATCSZLIST *list = keys.get();
    const auto most =
        static_cast<size_t>(std::min(PLATCSzHashEnumKey(form, &list), TAVI_AUTOPOWER_MAX_ENTRIES));
    bool isWhole = true;
    for (size_t i = 0; i < most; ++i) {
        const auto pair = pairs.find(std::to_string(1000 + i).substr(1));
        unsigned long long numbers[4] = {}; // too large ones do not wrap to small ones
        int end = 0;
        isWhole = pair != pairs.end() &&
                  pair->second.find_first_not_of("0123456789 ") == std::string::npos &&
                  std::sscanf(pair->second.c_str(), "%llu %llu %llu %llu%n", &numbers[0],
                              &numbers[1], &numbers[2], &numbers[3], &end) == 4 &&
                  std::count(pair->second.begin(), pair->second.end(), ' ') == 3 &&
                  static_cast<size_t>(end) == pair->second.size() &&
                  std::all_of(std::begin(numbers), std::end(numbers),
                              [](unsigned long long number) { return number <= 255; });
        if (!isWhole) {
            break;
        }
        REQUIRE(count < 0 || (i < entries.size() && entries[i].enabled == numbers[0] &&
                              entries[i].weekBits == numbers[1] && entries[i].hour == numbers[2] &&
                              entries[i].minute == numbers[3]));
    }
    REQUIRE(count == (isWhole ? static_cast<int>(most) : -1));
}

std::optional<Entries> entriesOf(int kind) {
    Entries entries(TAVI_AUTOPOWER_MAX_ENTRIES);
    const int count = TAVIAutoPowerConfGet(kind, TAVI_AUTOPOWER_MAX_ENTRIES, entries.data());
    REQUIRE(count >= -1 && count <= TAVI_AUTOPOWER_MAX_ENTRIES);
    entries.resize(static_cast<size_t>(std::max(count, 0)));
    requirePairs(kind, count, entries);
    return count < 0 ? std::nullopt : std::optional(entries);
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

// Id, arguments, days, state and time.
std::string inWords(int kind, const TAVIAUTOPOWER &entry) {
    const bool isOn = kind == TAVI_AUTOPOWER_KIND_ON;
    const bool isEnabled = entry.enabled == 1;
    std::string words =
        std::to_string((isOn ? 60'000'000 : 80'000'000) + (isEnabled ? 10'000'000 : 0) +
                       entry.weekBits * 10'000 + entry.hour * 100 + entry.minute) +
        (isOn ? " poweron " : " poweroff ");
    for (int day = 0; day < TAVI_SCHED_WEEK_DAYS; ++day) {
        words += (entry.weekBits >> day & 1) != 0 ? '1' : '0';
    }
    return words + (isEnabled ? " 1 " : " 0 ") + std::to_string(entry.hour) + ":" +
           std::to_string(entry.minute);
}

// Tasks stand for all entries of both kinds, the last one first, or for none when one is damaged.
void requireTasks(const std::optional<Entries> &on, const std::optional<Entries> &off) {
    const bool isWhole = isListed(on) && isListed(off);
    std::vector<std::string> expected;
    for (size_t i = isWhole ? off->size() : 0; i > 0; --i) {
        expected.push_back(inWords(TAVI_AUTOPOWER_KIND_OFF, (*off)[i - 1]));
    }
    for (size_t i = isWhole ? on->size() : 0; i > 0; --i) {
        expected.push_back(inWords(TAVI_AUTOPOWER_KIND_ON, (*on)[i - 1]));
    }
    TAVI_SCHED_TASK *list = nullptr;
    const int count = TAVISchedTaskListGetOf(TAVI_SCHED_BACKEND_AUTOPOWER, &list, nullptr);
    REQUIRE(count == (isWhole ? static_cast<int>(expected.size()) : -1));
    auto next = expected.begin();
    for (const TAVI_SCHED_TASK *task = list; task; task = TAVISchedTaskNext(task)) {
        REQUIRE(next != expected.end());
        REQUIRE(*next++ == std::to_string(task->id) + " " + task->appArgs + " " + task->week + " " +
                               std::to_string(task->state) + " " + std::to_string(task->runHour) +
                               ":" + std::to_string(task->runMin));
        requireTask(*task);
    }
    TAVISchedTaskListFree(&list);
}

// The next time of all enabled entries that have one, in UTC; 0 = never.
time_t nextTime(const Entries &entries) {
    constexpr time_t kDay = 86400;
    constexpr time_t kThursday = 4; // the first day of all
    const time_t midnight = fuzz::now / kDay * kDay;
    time_t next = 0;
    for (const TAVIAUTOPOWER &entry : entries) {
        for (time_t day = midnight; isSound(entry) && day <= midnight + 7 * kDay; day += kDay) {
            const time_t time = day + entry.hour * 3600 + entry.minute * 60;
            if (entry.enabled == 1 && (entry.weekBits >> (day / kDay + kThursday) % 7 & 1) != 0 &&
                time > fuzz::now && (next == 0 || time < next)) {
                next = time;
            }
        }
    }
    return next;
}

// The clock is cleared, and set when there is a time.
void requireArmed(const std::optional<Entries> &on) {
    fuzz::contentOf(kWakeAlarm).clear();
    REQUIRE(TAVIAutoPoweronSet() == (on ? 0 : -1));
    const time_t next = on ? nextTime(*on) : 0;
    REQUIRE(fuzz::contentOf(kWakeAlarm) ==
            (on ? "0\n" : "") + (next > 0 ? std::to_string(next) + "\n" : ""));
}

// What is written of one kind comes back, and the other one stays.
void requireWritten(int kind, const Entries &entries) {
    const auto other = entriesOf(1 - kind);
    REQUIRE(TAVIAutoPowerConfSet(kind, static_cast<int>(entries.size()), entries.data()) == 0);
    REQUIRE(isSame(entriesOf(kind), entries));
    REQUIRE(isSame(entriesOf(1 - kind), other));
}

} // namespace

void fuzz::test(Input input) {
    shortenReads(input.step());
    fuzz::contentOf(fuzz::kAutoPower) = input.rest();
    const auto on = entriesOf(TAVI_AUTOPOWER_KIND_ON);
    const auto off = entriesOf(TAVI_AUTOPOWER_KIND_OFF);
    requireArmed(on);
    const size_t size = input.rest().size();
    if (size % 3 == 0) {
        const bool isOn = size % 2 == 0;
        requireWritten(isOn ? TAVI_AUTOPOWER_KIND_ON : TAVI_AUTOPOWER_KIND_OFF,
                       (isOn ? on : off).value_or(Entries{{1, 127, 23, 59}}));
    } else {
        requireTasks(on, off);
    }
}
