// A stored form, as text of "key=value" lines, through the conversion to a task and back, the next
// trigger time, the crontab line and JSON.
#include "fuzz.h"
#include "json/json.h"

#include <algorithm>
#include <array>

namespace {

using fuzz::Pairs;

Pairs parse(const std::string &text) {
    Pairs pairs;
    for (std::string line : fuzz::linesOf(text)) {
        const size_t equals = line.find('=');
        if (line.back() == '\n') {
            line.pop_back();
        }
        if (equals != std::string::npos && equals < line.size()) {
            pairs[line.substr(0, equals)] = line.substr(equals + 1);
        }
    }
    return pairs;
}

// What the check says of the form is what the conversion then does.
void requireCheck(const Pairs &pairs, bool isRead, const TAVI_SCHED_TASK &task) {
    std::array<TAVI_SCHED_FAULT, 64> faults{};
    const int count = TAVISchedHashCheck(fuzz::hashOf(pairs).get(), faults.data(), faults.size());
    REQUIRE(count >= 0);
    const bool canBeRead = std::none_of(faults.begin(), faults.end(), [](const auto &fault) {
        return fault.kind == TAVI_SCHED_FAULT_UNREADABLE || fault.kind == TAVI_SCHED_FAULT_MISSING;
    });
    REQUIRE(isRead == canBeRead); // those of known keys come first
    if (count == 0 && isRead) {
        Pairs stored = fuzz::formOf(task);
        std::erase_if(stored, [&](const auto &pair) { return !pairs.contains(pair.first); });
        REQUIRE(stored == pairs);
    }
}

// A task that is read from its own form is the same task.
void requireRoundTrip(const TAVI_SCHED_TASK &task) {
    const Pairs form = fuzz::formOf(task);
    const fuzz::Task again = fuzz::newTask();
    REQUIRE(TAVISchedInitTaskFromHash(fuzz::hashOf(form).get(), again.get()) == 0);
    REQUIRE(fuzz::formOf(*again) == form);
}

void requireJson(const TAVI_SCHED_TASK &task) {
    static std::string text(160 * 1024, '\0');
    REQUIRE(TAVISchedTaskConvertToJson(&task, text.data(), text.size()) == 0);
    Json::Value root;
    REQUIRE(!tavisched::parseJson(text.c_str(), false, root) && root.isObject());
    const Pairs form = fuzz::formOf(task);
    REQUIRE(root.size() == form.size());
    for (const auto &[key, value] : form) {
        Json::Value inner;
        REQUIRE(!tavisched::parseJson(root[key].asString(), true, inner) && inner.isString());
        REQUIRE(inner.asString() == value ||
                inner.asString().find("\xef\xbf\xbd") != std::string::npos);
    }
}

std::string textOf(int64_t moment) {
    const time_t time = moment;
    std::array<char, 64> text{};
    REQUIRE(std::strftime(text.data(), text.size(), "%Y-%m-%d %H:%M", std::localtime(&time)) > 0);
    return text.data();
}

// In the next trigger time and the real starts the same rules stand twice. Where days have 24
// hours, they agree for every task of the days of the week, and a later time is shown for no task.
void requireNextTime(TAVI_SCHED_TASK &task, bool isSound, bool isUtc) {
    REQUIRE(TAVISchedNextTriggerTime(&task) == 0);
    const std::string shown = task.nextTriggerTime;
    REQUIRE(shown == "N/A" || shown.size() >= sizeof "YYYY-MM-DD hh:mm" - 1);
    int64_t start = 0;
    constexpr int64_t kYear = 366 * 86400;
    const int64_t from = fuzz::now - fuzz::now % 60 + 60;
    const int found = TAVISchedTaskStarts(&task, from, from + kYear, &start, 1);
    REQUIRE(found == 0 || found == 1);
    if (!isSound || !isUtc || task.state != TAVI_SCHED_STATE_ENABLED) {
        return;
    }
    REQUIRE(shown == "N/A" || shown >= textOf(from));
    REQUIRE(found == 0 || (start >= from && shown <= textOf(start)));
    const bool hasBegun = task.startYear < 2000;
    if (hasBegun && (task.type == TAVI_SCHED_TYPE_DAILY || task.type == TAVI_SCHED_TYPE_WEEKLY)) {
        REQUIRE(found == 1 && shown == textOf(start));
    }
}

} // namespace

void fuzz::test(Input input) {
    // UTC, Berlin, New York and Lord Howe; files of zones would be read again and again.
    constexpr std::array kZones = {"UTC0", "CET-1CEST,M3.5.0,M10.5.0/3", "EST5EDT,M3.2.0,M11.1.0",
                                   "<+1030>-10:30<+11>-11,M10.1.0,M4.1.0"};
    fuzz::now = 946684800 + static_cast<time_t>(input.number(4) % 2'000'000'000); // from 2000 on
    const size_t zone = input.number(1) % kZones.size();
    const Pairs pairs = parse(input.text());
    setenv("TZ", kZones[zone], 1);

    const fuzz::Task task = fuzz::newTask();
    task->backend = TAVI_SCHED_BACKEND_SCHEDULE;
    const bool isRead = TAVISchedInitTaskFromHash(fuzz::hashOf(pairs).get(), task.get()) == 0;
    requireCheck(pairs, isRead, *task);
    if (isRead) {
        TAVI_SCHED_FAULT fault{};
        const bool isSound = TAVISchedTaskCheck(task.get(), &fault) == 0;
        requireRoundTrip(*task);
        requireJson(*task);
        fuzz::requireLine(*task, isSound);
        requireNextTime(*task, isSound, zone == 0);
    }
}
