// What a task must fulfil. The field table has the ranges; what else a field must be stands in one
// table here.
#include "cron/cron_grammar.h"
#include "cron/cron_line.h"
#include "sched_error.h"
#include "sched_guard.h"
#include "validity/fault.h"
#include "validity/utf8.h"

#include <algorithm>
#include <chrono>
#include <cstring>
#include <optional>
#include <pwd.h>
#include <string_view>

namespace {

using sched::Field;
using sched::FieldKind;
using sched::Range;
using Task = TAVI_SCHED_TASK;
using Reason = std::optional<std::string>;

bool isPower(const Task &task) {
    return task.backend == TAVI_SCHED_BACKEND_AUTOPOWER;
}

// A text field up to its end; callers may not have ended it.
template <size_t size> std::string_view textOf(const char (&field)[size]) {
    return {field, strnlen(field, size)};
}

// ---- Every field ----

Reason faultOfNumber(int64_t number, const Range &range) {
    if (number >= range.low && number <= range.high) {
        return std::nullopt;
    }
    return std::to_string(number) + "; accepted: " + std::to_string(range.low) +
           (range.high - range.low == 1 ? " or " : " to ") + std::to_string(range.high);
}

Reason faultOfName(const Field &field, int32_t value) {
    if (value >= field.range.low && value <= field.range.high) {
        return std::nullopt;
    }
    return std::to_string(value) + "; accepted: " + sched::acceptedNames(field);
}

// The command is kept in base64, where every byte is as good as another.
Reason faultOfText(const Field &field, const char *text) {
    const std::string_view content(text, strnlen(text, field.size));
    if (content.size() == field.size) {
        return "it does not end; accepted: at most " + std::to_string(field.size - 1) +
               " bytes and an end";
    }
    if (sched::isCommand(field)) {
        return std::nullopt;
    }
    if (content.find('\n') != std::string_view::npos) {
        return sched::kHoldsLineBreak;
    }
    return sched::isUtf8(content) ? std::nullopt
                                  : Reason("it is not valid UTF-8; accepted: one line of UTF-8");
}

Reason faultOfField(const Field &field, const Task &task) {
    switch (field.kind) {
    case FieldKind::Signed:
        return faultOfNumber(field.signedIn(task), field.range);
    case FieldKind::Unsigned:
        return faultOfNumber(field.unsignedIn(task), field.range);
    case FieldKind::Enum:
        return faultOfName(field, field.signedIn(task));
    default:
        return faultOfText(field, field.textIn(task));
    }
}

// The computed next trigger time is not the caller's, and of the first day only what the type looks
// at counts.
bool counts(const Field &field, const Task &task) {
    const bool isOnce = task.type == TAVI_SCHED_TYPE_ONCE;
    const bool isOnADate = isOnce || task.type == TAVI_SCHED_TYPE_YEARLY;
    switch (field.offset) {
    case offsetof(Task, nextTriggerTime):
        return false;
    case offsetof(Task, startYear):
        return isOnce;
    case offsetof(Task, startMonth):
        return isOnADate;
    case offsetof(Task, startDay):
        return isOnADate || task.type == TAVI_SCHED_TYPE_MONTHLY;
    default:
        return true;
    }
}

// ---- Some fields ----

Reason faultOfOwner(const Task &task) {
    return getpwuid(task.owner)
               ? std::nullopt
               : Reason("there is no user with the id " + std::to_string(task.owner));
}

// Month and year are good. A yearly task may be one of leap years alone.
Reason faultOfDay(const Task &task) {
    if (task.type == TAVI_SCHED_TYPE_MONTHLY) {
        return std::nullopt;
    }
    constexpr uint32_t kLeapYear = 2012;
    const uint32_t year = task.type == TAVI_SCHED_TYPE_ONCE ? task.startYear : kLeapYear;
    const std::chrono::year_month_day_last last{
        std::chrono::year(static_cast<int>(year)),
        std::chrono::month_day_last{std::chrono::month(task.startMonth)}};
    return faultOfNumber(task.startDay, {1, static_cast<unsigned int>(last.day())});
}

Reason faultOfRepetition(const Task &task) {
    return isPower(task) && task.repeatHour != 0
               ? Reason(std::to_string(task.repeatHour) + "; accepted for a power schedule: 0")
               : std::nullopt;
}

Reason faultOfArguments(const Task &task) {
    const std::string_view arguments = textOf(task.appArgs);
    if (!isPower(task) || arguments == "poweron" || arguments == "poweroff") {
        return std::nullopt;
    }
    return sched::quoted(arguments) + "; accepted for a power schedule: poweron, poweroff";
}

// The power backend looks at the days alone, also of a daily schedule.
Reason faultOfWeek(const Task &task) {
    const std::string_view week = textOf(task.week);
    if (week.size() != TAVI_SCHED_WEEK_DAYS ||
        week.find_first_not_of("01") != std::string_view::npos) {
        return sched::quoted(week) + "; accepted: seven characters 0 or 1, Sunday first";
    }
    if (task.type == TAVI_SCHED_TYPE_WEEKLY && week.find('1') == std::string_view::npos) {
        return "no day is chosen; a weekly task needs at least one";
    }
    const bool isEveryDay = week.find('0') == std::string_view::npos;
    if (isPower(task) && task.type == TAVI_SCHED_TYPE_DAILY && !isEveryDay) {
        return sched::quoted(week) + "; accepted for a daily power schedule: 1111111";
    }
    return std::nullopt;
}

Reason faultOfCommand(const Task &task) {
    const size_t length = textOf(task.command).size();
    if (length <= TAVI_SCHED_MAX_COMMAND) {
        return std::nullopt;
    }
    return std::to_string(length) + " bytes; accepted: at most " +
           std::to_string(TAVI_SCHED_MAX_COMMAND) + "; put a longer one into a script";
}

Reason faultOfType(const Task &task) {
    const bool isByDay = task.type == TAVI_SCHED_TYPE_DAILY || task.type == TAVI_SCHED_TYPE_WEEKLY;
    return isPower(task) && !isByDay ? Reason("accepted for a power schedule: daily, weekly")
                                     : std::nullopt;
}

// What a field must be beside its kind and range, which are good already.
constexpr struct {
    std::string_view key;
    Reason (*fault)(const Task &);
} kRules[] = {
    {"owner", faultOfOwner},        {"start day", faultOfDay}, {"repeat hour", faultOfRepetition},
    {"app args", faultOfArguments}, {"week", faultOfWeek},     {"cmd", faultOfCommand},
    {"type", faultOfType}};

Reason faultByRule(const Field &field, const Task &task) {
    const auto *const rule = std::find_if(std::begin(kRules), std::end(kRules),
                                          [&](const auto &row) { return row.key == field.key; });
    return rule == std::end(kRules) ? std::nullopt : rule->fault(task);
}

// ---- The task as a whole ----

Reason faultOfLine(const Task &task) {
    if (isPower(task)) {
        return std::nullopt;
    }
    const auto verdict = sched::judgeCronLine(sched::CronLine(task).c_str());
    return verdict.kind == sched::CronVerdict::Kind::Rejected
               ? Reason("cron would reject its line: " + verdict.reason)
               : std::nullopt;
}

int check(const Task &task, TAVI_SCHED_FAULT &fault) {
    for (const Field &field : sched::parm_table) {
        if (!counts(field, task)) {
            continue;
        }
        auto reason = faultOfField(field, task);
        if (!reason) {
            reason = faultByRule(field, task);
        }
        if (reason) {
            sched::setFault(fault, TAVI_SCHED_FAULT_VALUE, field.key, *reason);
            return 1;
        }
    }
    if (const auto reason = faultOfLine(task)) {
        sched::setFault(fault, TAVI_SCHED_FAULT_VALUE, "", *reason);
        return 1;
    }
    return 0;
}

} // namespace

std::string sched::acceptedNames(const Field &field) {
    std::string names;
    for (const auto *row = field.enumTable; row->name; ++row) {
        if (row->value >= field.range.low && row->value <= field.range.high) {
            names += (names.empty() ? "" : ", ") + std::string(row->name);
        }
    }
    return names;
}

int TAVISchedTaskCheck(const TAVI_SCHED_TASK *pTask, TAVI_SCHED_FAULT *pFault) {
    SCHED_REQUIRE(pTask, "((void *)0) != pTask", -1);
    SCHED_REQUIRE(pFault, "((void *)0) != pFault", -1);
    return sched::guarded(SCHED_SITE, [&] { return check(*pTask, *pFault); });
}
