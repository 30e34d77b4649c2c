// What options make of a task: the schedule and the other fields, in a few lines of its own, and
// what follows from a task in words and for cron.
#include "task_options.h"
#include "failure.h"
#include "fuzz.h"
#include "tasks/tasks.h"
#include "text/utf8.h"
#include "text/words.h"

#include <algorithm>
#include <chrono>
#include <cstring>

using namespace tavisched;
using fuzz::numberIn;

namespace {

// ---- When ----

std::optional<size_t> dayOf(const std::string &name) {
    const std::string names[] = {"sunday",   "monday", "tuesday", "wednesday",
                                 "thursday", "friday", "saturday"};
    for (size_t day = 0; day < 7; ++day) {
        if (name.size() >= 3 && names[day].find(name) == 0) {
            return day;
        }
    }
    return std::nullopt;
}

std::optional<std::string> weekOf(std::string text) {
    std::transform(text.begin(), text.end(), text.begin(), ::tolower);
    std::string week = "0000000";
    for (std::string part : split(text, ',')) {
        part.erase(0, part.find_first_not_of(' '));
        part.erase(part.find_last_not_of(' ') + 1);
        part = part == "daily"                           ? "sun-sat"
               : part == "weekday" || part == "weekdays" ? "mon-fri"
               : part == "weekend" || part == "weekends" ? "sat-sun"
                                                         : part;
        const size_t dash = part.find('-');
        const auto first = dayOf(part.substr(0, dash));
        const auto last = dash == std::string::npos ? first : dayOf(part.substr(dash + 1));
        if (!first || !last) {
            return std::nullopt;
        }
        for (size_t day = *first; day <= *last + (*last < *first ? 7 : 0); ++day) {
            week[day % 7] = '1';
        }
    }
    return week;
}

// Sets the first day by a date without a year or with one.
bool setDay(const std::string &text, bool hasYear, TAVI_SCHED_TASK &task) {
    const auto parts = split(text, '-');
    if (parts.size() != (hasYear ? 3 : 2)) {
        return false;
    }
    const auto year = hasYear ? numberIn(parts[0], 4, 1970, 9999) : std::optional(2012U);
    const auto month = numberIn(parts[hasYear ? 1 : 0], 4, 1, 12);
    const std::chrono::year_month_day_last end(
        std::chrono::year(static_cast<int>(year.value_or(1970))) /
        std::chrono::month(month.value_or(1)) / std::chrono::last);
    const auto day = numberIn(parts[hasYear ? 2 : 1], 4, 1, static_cast<unsigned int>(end.day()));
    task.startYear = year.value_or(0);
    task.startMonth = month.value_or(0);
    task.startDay = day.value_or(0);
    return year && month && day;
}

bool setDays(const TaskOptions &options, TAVI_SCHED_TASK &task) {
    const auto setWeek = [&task](int type, const std::string &week) {
        task.type = type;
        task.startYear = task.startMonth = task.startDay = 0;
        std::strcpy(task.week, week.c_str());
    };
    if (options.daily || options.weekly == "daily") {
        setWeek(TAVI_SCHED_TYPE_DAILY, "1111111");
    } else if (options.weekly) {
        const auto week = weekOf(*options.weekly);
        setWeek(TAVI_SCHED_TYPE_WEEKLY, week.value_or(""));
        return week.has_value();
    } else if (options.monthly) {
        task.type = TAVI_SCHED_TYPE_MONTHLY;
        task.startYear = 2012;
        task.startMonth = 1;
        task.startDay = numberIn(*options.monthly, 2, 1, 31).value_or(0);
        return task.startDay != 0;
    } else if (options.yearly || options.once) {
        task.type = options.once ? TAVI_SCHED_TYPE_ONCE : TAVI_SCHED_TYPE_YEARLY;
        return setDay(options.once ? *options.once : *options.yearly, options.once.has_value(),
                      task);
    }
    return true;
}

bool setHours(const TaskOptions &options, TAVI_SCHED_TASK &task) {
    const bool hasRepeated = task.repeatHour > 0;
    const auto every = options.every ? numberIn(*options.every, 2, 0, 23) : task.repeatHour;
    const auto until = options.until ? numberIn(*options.until, 2, 0, 23)
                       : options.every && !hasRepeated && every.value_or(0) > 0 ? 23U
                                                                                : task.lastWorkHour;
    if (options.at) {
        const size_t colon = std::min(options.at->find(':'), options.at->size());
        const auto hour = numberIn(options.at->substr(0, colon), 2, 0, 23);
        const auto minute =
            numberIn(options.at->substr(std::min(colon + 1, options.at->size())), 2, 0, 59);
        if (!hour || !minute || options.at->size() != colon + 3) {
            return false;
        }
        task.runHour = *hour;
        task.runMin = *minute;
    }
    if (!every || !until) {
        return false;
    }
    task.repeatHour = *every;
    task.lastWorkHour = *until;
    return task.repeatHour == 0 ? !options.until
                                : task.lastWorkHour >= task.runHour ||
                                      !(options.every || options.until || options.at);
}

bool hasPassed(const TAVI_SCHED_TASK &task) {
    const uint32_t repeats = task.repeatHour > 0 && task.lastWorkHour > task.runHour
                                 ? (task.lastWorkHour - task.runHour) / task.repeatHour
                                 : 0;
    tm last{};
    last.tm_year = static_cast<int>(task.startYear) - 1900;
    last.tm_mon = static_cast<int>(task.startMonth) - 1;
    last.tm_mday = static_cast<int>(task.startDay);
    last.tm_hour = static_cast<int>(task.runHour + repeats * task.repeatHour);
    last.tm_min = static_cast<int>(task.runMin);
    return task.type == TAVI_SCHED_TYPE_ONCE && timegm(&last) <= fuzz::now;
}

bool isContradictory(const TaskOptions &options) {
    const bool hasOthers = options.name || options.command || options.monthly || options.yearly ||
                           options.once || options.every || options.until || options.owner ||
                           options.app || options.allowOverlap || options.noOverlap;
    return options.daily + options.weekly.has_value() + options.monthly.has_value() +
                   options.yearly.has_value() + options.once.has_value() >
               1 ||
           (options.enabled && options.disabled) || (options.allowOverlap && options.noOverlap) ||
           (options.power && (hasOthers || (options.power != "on" && options.power != "off")));
}

void setOthers(const TaskOptions &options, TAVI_SCHED_TASK &task) {
    const auto copy = [](const std::optional<std::string> &text, char *field, size_t size) {
        REQUIRE(!text || text->size() < size);
        if (text) {
            std::strcpy(field, text->c_str());
        }
    };
    copy(options.name, task.name, sizeof task.name);
    copy(options.app, task.app, sizeof task.app);
    copy(options.command, task.command, TAVI_SCHED_MAX_COMMAND + 1);
    if (options.owner) {
        const bool isRoot = options.owner == "root" || numberIn(*options.owner, 10, 0, 0);
        REQUIRE(isRoot || options.owner == "alice" || numberIn(*options.owner, 10, 1000, 1000));
        task.owner = isRoot ? 0 : 1000;
    }
    if (options.power) {
        std::strcpy(task.appArgs, ("power" + *options.power).c_str());
    }
    task.state = options.disabled ? 0 : options.enabled ? 1 : task.state;
    task.canRunTaskSameTime = options.allowOverlap ? 1
                              : options.noOverlap  ? 0
                                                   : task.canRunTaskSameTime;
}

// Whether the options' schedule is accepted.
bool setSchedule(const TaskOptions &options, TAVI_SCHED_TASK &task) {
    return !isContradictory(options) && (!options.power || isPower(task)) &&
           setDays(options, task) && setHours(options, task) &&
           !((options.schedule() || options.enabled) && hasPassed(task));
}

bool isSame(const TAVI_SCHED_TASK &one, const TAVI_SCHED_TASK &other) {
    return one.backend == other.backend && fuzz::formOf(one) == fuzz::formOf(other);
}

// ---- A task in words ----

// "Mon-Fri 22:00 every 4 h until 20:00" as options.
TaskOptions optionsOf(std::string words) {
    TaskOptions options;
    const size_t every = words.find(" every ");
    if (every != std::string::npos) {
        options.every = std::to_string(std::atoi(words.c_str() + every + 7));
        options.until = words.substr(words.find(" until ") + 7, 2);
        words.erase(every);
    }
    options.at = words.substr(words.size() - 5);
    words.erase(words.size() - 6);
    const auto takeDate = [&words](const std::string &begin, std::optional<std::string> &date) {
        if (words.starts_with(begin)) {
            date = words.substr(begin.size(), words.size() - begin.size() - 3); // " at"
        }
        return words.starts_with(begin);
    };
    options.daily = words == "daily";
    if (!options.daily && !takeDate("once on ", options.once) &&
        !takeDate("monthly on day ", options.monthly) && !takeDate("yearly on ", options.yearly)) {
        options.weekly = words;
    }
    return options;
}

void requireWords(const TAVI_SCHED_TASK &task) {
    const std::string words = scheduleInWords(task);
    REQUIRE(words == printable(words));
    if (isPower(task) || hasPassed(task)) {
        return;
    }
    const auto again = newTask(task.backend);
    apply(optionsOf(words), *again);
    const auto isSameOf = [&](uint32_t TAVI_SCHED_TASK::*field, bool counts) {
        return !counts || task.*field == (*again).*field;
    };
    const bool isOnce = task.type == TAVI_SCHED_TYPE_ONCE;
    const bool isOnDate = isOnce || task.type == TAVI_SCHED_TYPE_YEARLY;
    REQUIRE(task.type == again->type);
    REQUIRE(task.type != TAVI_SCHED_TYPE_WEEKLY || std::strcmp(task.week, again->week) == 0);
    REQUIRE(
        isSameOf(&TAVI_SCHED_TASK::runHour, true) && isSameOf(&TAVI_SCHED_TASK::runMin, true) &&
        isSameOf(&TAVI_SCHED_TASK::repeatHour, true) &&
        isSameOf(&TAVI_SCHED_TASK::startYear, isOnce) &&
        isSameOf(&TAVI_SCHED_TASK::startMonth, isOnDate) &&
        isSameOf(&TAVI_SCHED_TASK::startDay, isOnDate || task.type == TAVI_SCHED_TYPE_MONTHLY) &&
        isSameOf(&TAVI_SCHED_TASK::lastWorkHour, task.repeatHour > 0));
}

} // namespace

std::optional<uint32_t> fuzz::numberIn(const std::string &text, size_t digits, uint32_t low,
                                       uint32_t high) {
    const bool isNumber = !text.empty() && text.size() <= digits &&
                          text.find_first_not_of("0123456789") == std::string::npos;
    const uint64_t value = isNumber ? std::stoull(text) : 0;
    return isNumber && value >= low && value <= high ? std::optional(static_cast<uint32_t>(value))
                                                     : std::nullopt;
}

// Of texts it is not foretold which are refused.
void fuzz::requireChange(const TAVI_SCHED_TASK &before, const TaskOptions &options) {
    const bool hasTexts = options.name || options.app || options.command || options.owner;
    const auto task = copyOf(before);
    const auto expected = copyOf(before);
    const bool isAccepted = setSchedule(options, *expected);
    try {
        apply(options, *task);
    } catch (const Refusal &) {
        REQUIRE(!isAccepted || hasTexts);
        throw;
    }
    REQUIRE(isAccepted && !findFault(*task));
    setOthers(options, *expected);
    REQUIRE(isSame(*task, *expected));
    requireWords(*task);
    if (!isPower(*task)) {
        requireLine(*task, true);
    }
}
