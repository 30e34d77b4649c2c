// Tasks and runs in words.
#include "text/words.h"
#include "tasks/tasks.h"
#include "text/utf8.h"

#include <algorithm>
#include <array>
#include <cstdarg>
#include <cstdio>
#include <cstring>
#include <pwd.h>
#include <string_view>
#include <vector>

namespace tavisched {

namespace {

[[gnu::format(printf, 1, 2)]] std::string format(const char *format, ...) {
    std::array<char, 128> text{};
    va_list arguments;
    va_start(arguments, format);
    std::vsnprintf(text.data(), text.size(), format, arguments);
    va_end(arguments);
    return text.data();
}

// "Mon, Fri"; three or more days in a row as "Mon-Fri". Everything but a '0' is a day on which the
// task runs, for cron and here.
std::string weekDays(const char *week) {
    std::vector<std::string> parts;
    for (int day = 0; day < TAVI_SCHED_WEEK_DAYS; ++day) {
        if (week[day] == '0') {
            continue;
        }
        int last = day;
        while (last + 1 < TAVI_SCHED_WEEK_DAYS && week[last + 1] != '0') {
            ++last;
        }
        if (last - day >= 2) {
            parts.push_back(std::string(TAVISchedWeekDayNames[day]) + "-" +
                            TAVISchedWeekDayNames[last]);
            day = last;
        } else {
            parts.emplace_back(TAVISchedWeekDayNames[day]);
        }
    }
    return parts.empty() ? "on no day" : join(parts, ", ");
}

// The days, up to where the time follows.
std::string daysInWords(const TAVI_SCHED_TASK &task) {
    switch (task.type) {
    case TAVI_SCHED_TYPE_ONCE:
        return format("once on %04u-%02u-%02u at", task.startYear, task.startMonth, task.startDay);
    case TAVI_SCHED_TYPE_WEEKLY:
        return weekDays(task.week);
    case TAVI_SCHED_TYPE_MONTHLY:
        return format("monthly on day %u at", task.startDay);
    case TAVI_SCHED_TYPE_YEARLY:
        return format("yearly on %02u-%02u at", task.startMonth, task.startDay);
    default:
        return "daily";
    }
}

// Days from one local calendar day to another.
int daysBetween(time_t from, time_t to) {
    const auto noon = [](time_t time) {
        tm local{};
        localtime_r(&time, &local);
        local.tm_hour = 12;
        local.tm_min = local.tm_sec = 0;
        local.tm_isdst = -1;
        return mktime(&local);
    };
    constexpr time_t kDay = 86400;
    return static_cast<int>((noon(to) - noon(from) + kDay / 2) / kDay);
}

} // namespace

std::string scheduleInWords(const TAVI_SCHED_TASK &task) {
    std::string words = daysInWords(task) + format(" %02u:%02u", task.runHour, task.runMin);
    if (task.repeatHour > 0) {
        words += format(" every %u h until %02u:%02u", task.repeatHour,
                        std::max(task.runHour, task.lastWorkHour), task.runMin);
    }
    return words;
}

std::string stateInWords(const TAVI_SCHED_TASK &task, const Run *run) {
    if (task.type == TAVI_SCHED_TYPE_ONCE && isEnabled(task) && !nextRun(task)) {
        return run && run->began != 0 ? "done" : "past";
    }
    const char *const name = TAVISchedEnumToName(TAVISchedStateTable, task.state);
    return name ? name : std::to_string(task.state);
}

std::optional<std::string> nextRun(const TAVI_SCHED_TASK &task) {
    const bool runs = isEnabled(task) && std::string_view(task.nextTriggerTime) != "N/A";
    return runs ? std::optional<std::string>(task.nextTriggerTime) : std::nullopt;
}

std::string resultInWords(const Run &run) {
    const std::string number = std::to_string(run.number);
    const std::string other =
        run.waitedFor == 0 ? "the run lock" : "task " + std::to_string(run.waitedFor);
    switch (run.result) {
    case TAVI_SCHED_RUN_INTERRUPTED:
        return "interrupted";
    case TAVI_SCHED_RUN_RUNNING:
        return "running";
    case TAVI_SCHED_RUN_SUCCESS:
        return "ok";
    case TAVI_SCHED_RUN_START_FAILED:
        return "not started";
    case TAVI_SCHED_RUN_STOPPED:
        return "stopped by signal " + number;
    case TAVI_SCHED_RUN_SIGNALED:
        return "killed by signal " + number;
    case TAVI_SCHED_RUN_EXIT_FAILED:
        return "exit " + number;
    case TAVI_SCHED_RUN_WAITING:
        return "waiting for " + other + " since " + localTime(seconds(run.waitingSince));
    case TAVI_SCHED_RUN_STOPPED_BY_USER:
        return "stopped by a person";
    case TAVI_SCHED_RUN_GIVEN_UP:
        return "given up, " + other + " was running";
    case TAVI_SCHED_RUN_LOCK_FAILED:
        return "not run: no run lock";
    case TAVI_SCHED_RUN_DATABASE_FAILED:
        return "not run: status database failed";
    case TAVI_SCHED_RUN_OWNER_UNKNOWN:
        return "not started: no such user";
    case TAVI_SCHED_RUN_TASK_REMOVED:
        return "not run: removed meanwhile";
    case TAVI_SCHED_RUN_TASK_DISABLED:
        return run.waitingSince != 0 ? "not run: disabled meanwhile" : "not run: disabled";
    case TAVI_SCHED_RUN_NOT_DUE:
        return "not run: not due";
    case TAVI_SCHED_RUN_MISSED:
        return "missed";
    default:
        return "no result";
    }
}

std::string startInWords(const Run &run) {
    return run.mode == 1 ? "cron" : ownerName(run.startedBy);
}

std::string durationInWords(time_t seconds) {
    constexpr int kMinute = 60;
    constexpr int kHour = 60 * kMinute;
    const auto whole = static_cast<int>(std::max<time_t>(seconds, 0));
    if (whole < kMinute) {
        return format("%d s", whole);
    }
    return whole < kHour ? format("%d min %d s", whole / kMinute, whole % kMinute)
                         : format("%d h %d min", whole / kHour, whole % kHour / kMinute);
}

std::string ago(time_t then, time_t now) {
    constexpr time_t kMinute = 60;
    constexpr time_t kHour = 60 * kMinute;
    const time_t passed = now - then;
    const int days = daysBetween(then, now);
    if (passed < kMinute) {
        return "just now";
    }
    if (passed < kHour) {
        return format("%d min ago", static_cast<int>(passed / kMinute));
    }
    if (passed < 24 * kHour) {
        return format("%d h ago", static_cast<int>(passed / kHour));
    }
    if (days <= 1) {
        return "yesterday";
    }
    return days < 7 ? format("%d days ago", days)
                    : localTime(then).substr(0, std::strlen("YYYY-MM-DD"));
}

std::string localTime(time_t time) {
    tm local{};
    localtime_r(&time, &local);
    std::array<char, 32> text{};
    std::strftime(text.data(), text.size(), "%Y-%m-%d %H:%M:%S", &local);
    return text.data();
}

std::string localMinute(time_t time) {
    return localTime(time).substr(0, std::strlen("YYYY-MM-DD hh:mm"));
}

std::string weekDayOf(time_t time) {
    tm local{};
    localtime_r(&time, &local);
    return TAVISchedWeekDayNames[local.tm_wday];
}

std::string ownerName(uint32_t uid) {
    const passwd *const user = getpwuid(uid);
    return user ? user->pw_name : std::to_string(uid);
}

} // namespace tavisched
