// What a task must fulfil to be stored by this program.
#include "task_rules.h"
#include "text.h"

#include <chrono>
#include <pwd.h>

namespace tavisched {

namespace {

std::optional<std::string> faultOfNumber(uint32_t number, uint32_t low, uint32_t high) {
    if (number >= low && number <= high) {
        return std::nullopt;
    }
    return std::to_string(number) + "; accepted: " + std::to_string(low) + " to " +
           std::to_string(high);
}

std::optional<Fault> faultOfTimes(const TAVI_SCHED_TASK &task) {
    const struct {
        std::string_view key;
        uint32_t number, high;
    } kNumbers[] = {{"run hour", task.runHour, 23},
                    {"run min", task.runMin, 59},
                    {"repeat hour", task.repeatHour, 23},
                    {"last work hour", task.lastWorkHour, 23}};
    for (const auto &[key, number, high] : kNumbers) {
        if (auto fault = faultOfNumber(number, 0, high)) {
            return Fault{key, *fault};
        }
    }
    return std::nullopt;
}

std::optional<Fault> faultOfWeek(const TAVI_SCHED_TASK &task) {
    const std::string_view week(task.week);
    const bool isMask = week.size() == TAVI_SCHED_WEEK_DAYS &&
                        week.find_first_not_of("01") == std::string_view::npos;
    if (!isMask) {
        return Fault{"week", "\"" + printable(week) +
                                 "\"; accepted: seven characters 0 or 1, Sunday first"};
    }
    if (task.type == TAVI_SCHED_TYPE_WEEKLY && week.find('1') == std::string_view::npos) {
        return Fault{"week", "no day is chosen; a weekly task needs at least one"};
    }
    return std::nullopt;
}

// The start date, as far as the type looks at it.
std::optional<Fault> faultOfDate(const TAVI_SCHED_TASK &task) {
    constexpr uint32_t kFirstYear = 1970;
    constexpr uint32_t kLastYear = 9999;
    constexpr uint32_t kLongestMonth = 31;
    const bool isOnce = task.type == TAVI_SCHED_TYPE_ONCE;
    if (!isOnce && task.type != TAVI_SCHED_TYPE_YEARLY && task.type != TAVI_SCHED_TYPE_MONTHLY) {
        return std::nullopt;
    }
    uint32_t days = kLongestMonth;
    if (task.type != TAVI_SCHED_TYPE_MONTHLY) {
        if (auto fault = faultOfNumber(task.startMonth, 1, 12)) {
            return Fault{"start month", *fault};
        }
        days = daysInMonth(task.startMonth, isOnce ? std::optional(task.startYear) : std::nullopt);
    }
    if (auto fault = faultOfNumber(task.startDay, 1, days)) {
        return Fault{"start day", *fault};
    }
    auto fault = isOnce ? faultOfNumber(task.startYear, kFirstYear, kLastYear) : std::nullopt;
    return fault ? std::optional(Fault{"start year", *fault}) : std::nullopt;
}

std::optional<Fault> faultOfFlags(const TAVI_SCHED_TASK &task) {
    const struct {
        std::string_view key;
        int32_t value;
    } kFlags[] = {{"listable", task.listable},
                  {"can edit name", task.canEditName},
                  {"can edit owner", task.canEditOwner},
                  {"can run app same time", task.canRunAppSameTime},
                  {"can run task same time", task.canRunTaskSameTime},
                  {"can run from ui", task.canRunFromUI},
                  {"can delete from ui", task.canDeleteFromUI},
                  {"can edit from ui", task.canEditFromUI},
                  {"simple edit form", task.simpleEditForm}};
    for (const auto &[key, value] : kFlags) {
        if (value != 0 && value != 1) {
            return Fault{key, std::to_string(value) + "; accepted: 0 or 1"};
        }
    }
    return std::nullopt;
}

std::optional<Fault> faultOfTexts(const TAVI_SCHED_TASK &task) {
    const struct {
        std::string_view key;
        const char *text;
    } kTexts[] = {{"name", task.name},         {"app", task.app},
                  {"app name", task.appName},  {"app args", task.appArgs},
                  {"action", task.action},     {"edit dialog", task.editDialog},
                  {"edit form", task.editForm}};
    // What a web form may have put there is no fault, as long as it can be exchanged.
    for (const auto &[key, text] : kTexts) {
        if (!isUtf8(text)) {
            return Fault{key, "it is not valid UTF-8; accepted: UTF-8"};
        }
    }
    auto fault = faultOfCommand(task.command);
    return fault ? std::optional(Fault{"cmd", *fault}) : std::nullopt;
}

std::optional<Fault> faultOfChoices(const TAVI_SCHED_TASK &task) {
    if (task.type < TAVI_SCHED_TYPE_ONCE || task.type > TAVI_SCHED_TYPE_YEARLY) {
        return Fault{"type", std::to_string(task.type) +
                                 "; accepted: once, daily, weekly, monthly, yearly"};
    }
    if (task.state != TAVI_SCHED_STATE_ENABLED && task.state != TAVI_SCHED_STATE_DISABLED) {
        return Fault{"state", "accepted: enabled, disabled"};
    }
    if (!getpwuid(task.owner)) {
        return Fault{"owner", "there is no user with the id " + std::to_string(task.owner)};
    }
    return std::nullopt;
}

} // namespace

uint32_t daysInMonth(uint32_t month, std::optional<uint32_t> year) {
    const std::chrono::year_month_day_last last{
        std::chrono::year(static_cast<int>(year.value_or(kAnyYear))),
        std::chrono::month_day_last{std::chrono::month(month)}};
    return static_cast<unsigned int>(last.day());
}

std::optional<std::string> faultOfText(std::string_view text, size_t fieldSize) {
    if (text.size() >= fieldSize) {
        return std::to_string(text.size()) + " bytes; accepted: at most " +
               std::to_string(fieldSize - 1);
    }
    if (!isUtf8(text)) {
        return "it is not valid UTF-8; accepted: one line of UTF-8";
    }
    if (holdsControls(text)) {
        return "it holds a line break or another control character; accepted: one line of text";
    }
    return std::nullopt;
}

std::optional<std::string> faultOfCommand(std::string_view command) {
    if (command.size() <= kMaxCommandBytes) {
        return std::nullopt;
    }
    return std::to_string(command.size()) + " bytes; accepted: at most " +
           std::to_string(kMaxCommandBytes) + "; put a longer one into a script";
}

std::optional<Fault> findFault(const TAVI_SCHED_TASK &task) {
    for (const auto &find :
         {faultOfTimes, faultOfWeek, faultOfDate, faultOfFlags, faultOfTexts, faultOfChoices}) {
        if (auto fault = find(task)) {
            return fault;
        }
    }
    return std::nullopt;
}

} // namespace tavisched
