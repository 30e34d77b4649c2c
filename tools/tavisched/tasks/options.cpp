// What "add" and "edit" can say about a task. Every refusal names the option, what is wrong with it
// and what is accepted.
#include "tasks/options.h"
#include "failure.h"
#include "tasks/tasks.h"
#include "text/days.h"
#include "text/utf8.h"
#include "text/words.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <cstring>
#include <pwd.h>
#include <string_view>

namespace tavisched {

namespace {

constexpr uint32_t kLastHour = 23;
constexpr uint32_t kAnyYear = 2012; // one in which every day of the year is there

[[noreturn]] void refuse(const char *option, const std::string &what) {
    throw Refusal(std::string(option) + ": " + what, option + std::strlen("--"));
}

[[noreturn]] void refuseText(const char *option, std::string_view text, const char *accepted) {
    refuse(option, "\"" + printable(text) + "\" is not accepted; accepted: " + accepted);
}

// Digits alone, at most so many.
std::optional<uint32_t> parseNumber(std::string_view text, size_t digits) {
    uint32_t number = 0;
    const char *const end = text.data() + text.size();
    const auto parsed = std::from_chars(text.data(), end, number);
    const bool isNumber = parsed.ec == std::errc() && parsed.ptr == end && text.size() <= digits;
    return isNumber ? std::optional(number) : std::nullopt;
}

uint32_t numberOption(const char *option, const std::string &text, uint32_t low, uint32_t high,
                      const char *accepted) {
    const auto number = parseNumber(text, 2);
    if (!number || *number < low || *number > high) {
        refuseText(option, text, accepted);
    }
    return *number;
}

// Numbers of at most four digits, as many as asked for, with one separator between them.
template <size_t count>
std::optional<std::array<uint32_t, count>> parseNumbers(std::string_view text, char separator) {
    const auto parts = split(text, separator);
    std::array<uint32_t, count> numbers{};
    if (parts.size() != count) {
        return std::nullopt;
    }
    for (size_t i = 0; i < count; ++i) {
        const auto number = parseNumber(parts[i], 4);
        if (!number) {
            return std::nullopt;
        }
        numbers[i] = *number;
    }
    return numbers;
}

// ---- When ----

void applyTime(const std::string &text, TAVI_SCHED_TASK &task) {
    const auto time = parseNumbers<2>(text, ':');
    const size_t colon = text.find(':');
    if (!time || colon > 2 || text.size() - colon != 3 || (*time)[0] > kLastHour ||
        (*time)[1] > 59) {
        refuseText("--at", text, "HH:MM from 00:00 to 23:59");
    }
    task.runHour = (*time)[0];
    task.runMin = (*time)[1];
}

void setStart(TAVI_SCHED_TASK &task, uint32_t year, uint32_t month, uint32_t day) {
    task.startYear = year;
    task.startMonth = month;
    task.startDay = day;
}

// A first day that lies ahead would keep the task from running until then.
void applyDaily(TAVI_SCHED_TASK &task) {
    TAVISchedCTaskSetDaily(&task);
    TAVISchedCTaskSetWeek(&task, "1111111");
    setStart(task, 0, 0, 0);
}

void applyWeekDays(const std::string &text, TAVI_SCHED_TASK &task) {
    const std::string week = parseDays(text, "--weekly");
    if (text == "daily") {
        applyDaily(task);
        return;
    }
    TAVISchedCTaskSetWeekly(&task);
    setStart(task, 0, 0, 0);
    TAVISchedCTaskSetWeek(&task, week.c_str());
}

void applyMonthDay(const std::string &text, TAVI_SCHED_TASK &task) {
    setStart(task, kAnyYear, 1, numberOption("--monthly", text, 1, 31, "a day from 1 to 31"));
    TAVISchedCTaskSetMonthly(&task);
}

// Sets the first day of a new task of the type and answers whether there is such a day.
bool isDay(int type, uint32_t year, uint32_t month, uint32_t day) {
    const Task task = newTask(TAVI_SCHED_BACKEND_SCHEDULE);
    task->type = type;
    setStart(*task, year, month, day);
    return !findFault(*task);
}

void applyYearDay(const std::string &text, TAVI_SCHED_TASK &task) {
    const auto date = parseNumbers<2>(text, '-');
    if (!date || !isDay(TAVI_SCHED_TYPE_YEARLY, kAnyYear, (*date)[0], (*date)[1])) {
        refuseText("--yearly", text, "MM-DD, a month and one of its days");
    }
    setStart(task, kAnyYear, (*date)[0], (*date)[1]);
    TAVISchedCTaskSetYearly(&task);
}

void applyDate(const std::string &text, TAVI_SCHED_TASK &task) {
    const auto date = parseNumbers<3>(text, '-');
    if (!date || !isDay(TAVI_SCHED_TYPE_ONCE, (*date)[0], (*date)[1], (*date)[2])) {
        refuseText("--once", text, "YYYY-MM-DD, a date of the calendar");
    }
    setStart(task, (*date)[0], (*date)[1], (*date)[2]);
    TAVISchedCTaskSetOnce(&task);
}

// The interval in a day. An interval without an end goes on to the end of the day.
void applyInterval(const TaskOptions &options, TAVI_SCHED_TASK &task) {
    const bool repeated = task.repeatHour > 0;
    if (options.every) {
        task.repeatHour =
            numberOption("--every", *options.every, 0, kLastHour, "hours from 1 to 23, or 0");
    }
    if (options.until) {
        task.lastWorkHour =
            numberOption("--until", *options.until, 0, kLastHour, "an hour from 00 to 23");
        if (task.repeatHour == 0) {
            refuse("--until", "it needs an interval, such as --every 4");
        }
    } else if (options.every && task.repeatHour > 0 && !repeated) {
        task.lastWorkHour = kLastHour;
    }
    if (task.repeatHour > 0 && task.lastWorkHour < task.runHour &&
        (options.every || options.until || options.at)) {
        refuse("--until", "hour " + std::to_string(task.lastWorkHour) +
                              " is before the first run of the day at hour " +
                              std::to_string(task.runHour));
    }
}

void applySchedule(const TaskOptions &options, TAVI_SCHED_TASK &task) {
    if (options.at) {
        applyTime(*options.at, task);
    }
    if (options.daily) {
        applyDaily(task);
    }
    const struct {
        const std::optional<std::string> &text;
        void (*apply)(const std::string &, TAVI_SCHED_TASK &);
    } kDays[] = {{options.weekly, applyWeekDays},
                 {options.monthly, applyMonthDay},
                 {options.yearly, applyYearDay},
                 {options.once, applyDate}};
    for (const auto &[text, apply] : kDays) {
        if (text) {
            apply(*text, task);
        }
    }
    applyInterval(options, task);
}

// ---- What and who ----

void applyOwner(const std::string &owner, TAVI_SCHED_TASK &task) {
    const passwd *user = getpwnam(owner.c_str());
    const auto uid = parseNumber(owner, 10);
    if (!user && uid) {
        user = getpwuid(*uid);
    }
    if (!user) {
        refuse("--owner",
               "there is no user \"" + printable(owner) + "\"; accepted: a user's name or number");
    }
    TAVISchedCTaskSetOwner(&task, static_cast<int>(user->pw_uid));
}

// A text that a person types for a field: what can be stored in it, and no more than one line of
// it.
void requireText(const char *option, const char *key, const std::string &text) {
    TAVI_SCHED_FAULT fault{};
    if (TAVISchedValueCheck(key, text.c_str(), &fault) != 0) {
        refuse(option, printable(fault.reason));
    }
    if (!isUtf8(text)) {
        refuse(option, "it is not valid UTF-8; accepted: one line of UTF-8");
    }
    if (holdsControls(text)) {
        refuse(option,
               "it holds a line break or another control character; accepted: one line of text");
    }
}

void applyTexts(const TaskOptions &options, TAVI_SCHED_TASK &task) {
    if (options.name) {
        requireText("--name", "name", *options.name);
        if (isBlank(*options.name)) {
            refuse("--name", "it is empty; accepted: one line of text");
        }
        TAVISchedCTaskSetName(&task, options.name->c_str());
    }
    if (options.app) {
        requireText("--app", "app", *options.app);
        TAVISchedCTaskSetApp(&task, options.app->c_str());
    }
    if (options.command) {
        if (options.command->find_first_not_of(" \t\n") == std::string::npos) {
            refuse("--command", "it is empty; accepted: a command for the shell");
        }
        if (options.command->size() > TAVI_SCHED_MAX_COMMAND) {
            refuse("--command",
                   std::to_string(options.command->size()) + " bytes; accepted: at most " +
                       std::to_string(TAVI_SCHED_MAX_COMMAND) + "; put a longer one into a script");
        }
        TAVISchedCTaskSetCommand(&task, options.command->c_str());
    }
    if (options.owner) {
        applyOwner(*options.owner, task);
    }
}

// A power schedule has days, a time and a state, and nothing else.
void refuseWhatPowerLacks(const TaskOptions &options) {
    const struct {
        const char *option;
        bool given;
    } kOthers[] = {
        {"--name", options.name.has_value()},       {"--command", options.command.has_value()},
        {"--monthly", options.monthly.has_value()}, {"--yearly", options.yearly.has_value()},
        {"--once", options.once.has_value()},       {"--every", options.every.has_value()},
        {"--until", options.until.has_value()},     {"--owner", options.owner.has_value()},
        {"--app", options.app.has_value()},         {"--allow-overlap", options.allowOverlap},
        {"--no-overlap", options.noOverlap}};
    for (const auto &[option, given] : kOthers) {
        if (given) {
            refuse(option, "a power schedule has none; accepted: --at, --daily, --weekly, "
                           "--enabled, --disabled");
        }
    }
}

void applyPower(const TaskOptions &options, TAVI_SCHED_TASK &task) {
    refuseWhatPowerLacks(options);
    if (!options.power) {
        return;
    }
    if (*options.power != "on" && *options.power != "off") {
        refuseText("--power", *options.power, "on or off");
    }
    const std::string arguments = "power" + *options.power;
    if (task.id != -1 && arguments != task.appArgs) {
        refuse("--power", "a stored schedule keeps its kind; remove it and add another one");
    }
    TAVISchedCTaskSetAppArgs(&task, arguments.c_str());
}

void refuseConflicts(const TaskOptions &options) {
    const int days = static_cast<int>(options.daily) + options.weekly.has_value() +
                     options.monthly.has_value() + options.yearly.has_value() +
                     options.once.has_value();
    if (days > 1) {
        throw Refusal("only one of --daily, --weekly, --monthly, --yearly and --once is accepted");
    }
    if (options.enabled && options.disabled) {
        throw Refusal("only one of --enabled and --disabled is accepted");
    }
    if (options.allowOverlap && options.noOverlap) {
        throw Refusal("only one of --allow-overlap and --no-overlap is accepted");
    }
}

// The option that sets a field, by the field's stored key; "" for none.
std::string optionOf(const std::string &key, const TaskOptions &options) {
    constexpr struct {
        std::string_view key;
        const char *option;
    } kOptions[] = {{"name", "name"},         {"cmd", "command"},          {"owner", "owner"},
                    {"app", "app"},           {"run hour", "at"},          {"run min", "at"},
                    {"repeat hour", "every"}, {"last work hour", "until"}, {"week", "weekly"},
                    {"app args", "power"}};
    const auto *const row = std::find_if(std::begin(kOptions), std::end(kOptions),
                                         [&](const auto &option) { return option.key == key; });
    if (row != std::end(kOptions)) {
        return row->option;
    }
    return !key.starts_with("start ") ? ""
           : options.once             ? "once"
           : options.yearly           ? "yearly"
           : options.monthly          ? "monthly"
                                      : "";
}

} // namespace

bool TaskOptions::schedule() const {
    return at || daily || weekly || monthly || yearly || once || every || until;
}

bool TaskOptions::any() const {
    return schedule() || name || command || owner || app || power || enabled || disabled ||
           allowOverlap || noOverlap;
}

void apply(const TaskOptions &options, TAVI_SCHED_TASK &task) {
    const auto faultBefore = findFault(task);
    refuseConflicts(options);
    if (isPower(task)) {
        applyPower(options, task);
    } else if (options.power) {
        refuse("--power", "this is no power schedule");
    }
    applySchedule(options, task);
    applyTexts(options, task);
    if (options.enabled || options.disabled) {
        TAVISchedCTaskSetState(&task, options.enabled ? 1 : 0);
    }
    if (options.allowOverlap || options.noOverlap) {
        TAVISchedCTaskSetCanRunTaskSameTime(&task, options.allowOverlap ? 1 : 0);
    }
    // A fault that was there before cannot be helped here and must not stand in the way.
    const auto fault = findFault(task);
    if (fault && (!faultBefore || std::strcmp(faultBefore->reason, fault->reason) != 0)) {
        throw Refusal(called(task) + ": " + printable(inWords(*fault)),
                      optionOf(fault->key, options));
    }
    if (options.schedule() || options.enabled) {
        refusePast(task);
    }
}

void refusePast(TAVI_SCHED_TASK &task) {
    computeNextRun(task);
    if (std::string_view(task.nextTriggerTime) == "N/A") {
        throw Refusal("the time of " + called(task) + ", " + scheduleInWords(task) +
                          ", has passed; accepted: a time in the future",
                      "once");
    }
}

} // namespace tavisched
