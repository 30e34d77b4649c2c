// What is remarkable about schedules: rules that look at one task, and the one that looks for tasks
// of an application in the same minute, in a time that grows with the tasks and not with the pairs
// of them.
#include "sched_error.h"
#include "sched_guard.h"
#include "sched_text.h"
#include "schedule/off_hours.h"
#include "schedule/starts.h"

#include <algorithm>
#include <array>
#include <cstdarg>
#include <cstdio>
#include <map>
#include <string_view>
#include <tuple>
#include <unordered_map>

namespace {

using sched::Day;
using sched::Gap;
using sched::kDay;
using sched::kHour;
using sched::kMinute;

constexpr int kDays = 366; // that are looked at
constexpr int64_t kWeek = 7 * kDay;
constexpr uint32_t kMostMonthsHave = 28;

using Text = std::array<char, sizeof TAVI_SCHED_REMARK::text>;

[[gnu::format(printf, 1, 2)]] Text format(const char *format, ...) {
    Text text{};
    va_list arguments;
    va_start(arguments, format);
    std::vsnprintf(text.data(), text.size(), format, arguments);
    va_end(arguments);
    return text;
}

// "2026-12-24 18:00" of a local time in seconds as if it were at Greenwich.
Text localInWords(int64_t local) {
    const auto time = static_cast<time_t>(local);
    tm broken{};
    gmtime_r(&time, &broken);
    Text text{};
    std::strftime(text.data(), text.size(), "%Y-%m-%d %H:%M", &broken);
    return text;
}

// ---- Rules that look at one task ----

// What all of them look at.
struct Year {
    int64_t from;
    int64_t until;
    sched::OffHours off;
    std::vector<Gap> gaps;
};

constexpr Text kNothing{};

// A once task that is past has run, or its state tells that it is past.
bool isPast(const TAVI_SCHED_TASK &task, int64_t now) {
    bool has = false;
    sched::forEachStart(task, 0, task.type == TAVI_SCHED_TYPE_ONCE ? now : 0, [&](int64_t) {
        has = true;
        return false;
    });
    return has;
}

Text neverRuns(const TAVI_SCHED_TASK &task, const Year &year) {
    return sched::findNextStart(task, year.from) || isPast(task, year.from)
               ? kNothing
               : format("it will never run");
}

Text runsOnceADay(const TAVI_SCHED_TASK &task, const Year &) {
    const uint32_t last = std::max(task.runHour, task.lastWorkHour);
    return task.repeatHour > 0 && uint64_t{task.runHour} + task.repeatHour > last
               ? format("it runs once a day, at %02u:%02u, as %u hours later is after hour %u",
                        task.runHour, task.runMin, task.repeatHour, last)
               : kNothing;
}

Text missesMonths(const TAVI_SCHED_TASK &task, const Year &) {
    constexpr uint32_t kFebruary = 2;
    constexpr uint32_t kLeapDay = 29;
    const bool isLeapDay = task.startDay == kLeapDay;
    if (task.type == TAVI_SCHED_TYPE_MONTHLY && task.startDay > kMostMonthsHave) {
        return isLeapDay ? format("it does not run in February but in leap years")
                         : format("months without a day %u are passed over", task.startDay);
    }
    return task.type == TAVI_SCHED_TYPE_YEARLY && task.startMonth == kFebruary && isLeapDay
               ? format("it runs in leap years alone")
               : kNothing;
}

Text isSkipped(const TAVI_SCHED_TASK &task, const Year &year) {
    const auto hours = sched::hoursOf(task);
    const sched::Days days(task);
    for (const Gap &gap : year.gaps) {
        for (int64_t local = gap.begin; local < gap.end; local += kMinute) {
            const Day day = std::chrono::floor<std::chrono::days>(
                std::chrono::sys_seconds(std::chrono::seconds(local)));
            const auto hour = static_cast<size_t>(local % kDay / kHour);
            if (!hours.test(hour) || local % kHour / kMinute != task.runMin || !days.has(day)) {
                continue;
            }
            return format("it does not run on %s, as daylight saving time skips %s to %s",
                          localInWords(local).data(), &localInWords(gap.begin)[11],
                          &localInWords(gap.end)[11]);
        }
    }
    return kNothing;
}

// Power schedules are the same every week: of a task by the day a week is enough.
int64_t endOfLook(const TAVI_SCHED_TASK &task, const Year &year) {
    int64_t until = year.until;
    if (task.type == TAVI_SCHED_TYPE_DAILY || task.type == TAVI_SCHED_TYPE_WEEKLY) {
        const auto first = sched::findNextStart(task, year.from);
        until = std::min(until, first.value_or(until) + kWeek);
    }
    return until;
}

Text runsWhileOff(const TAVI_SCHED_TASK &task, const Year &year) {
    if (year.off.all().empty()) {
        return kNothing;
    }
    std::optional<int64_t> first;
    bool isAlways = true;
    sched::forEachStart(task, year.from, endOfLook(task, year), [&](int64_t moment) {
        const bool isOff = year.off.has(moment);
        isAlways = isAlways && isOff;
        first = first || !isOff ? first : moment;
        return true;
    });
    return first ? format("%s fall into hours in which the power schedules have the machine off, "
                          "first on %s",
                          isAlways ? "its runs" : "some of its runs",
                          localInWords(sched::localOf(*first)).data())
                 : kNothing;
}

struct Rule {
    int32_t kind;
    bool isOfPower; // also of power schedules
    Text (*look)(const TAVI_SCHED_TASK &task, const Year &year);
    const char *advice;
};

constexpr std::array<Rule, 5> kRules = {
    {{TAVI_SCHED_REMARK_NEVER, true, neverRuns, "give it days and a time that come, or remove it"},
     {TAVI_SCHED_REMARK_ONE_RUN, false, runsOnceADay, "give it a later last hour, or no interval"},
     {TAVI_SCHED_REMARK_SHORT_MONTHS, false, missesMonths,
      "give it a day that every month has, if it is to run in all of them"},
     {TAVI_SCHED_REMARK_SKIPPED_HOUR, false, isSkipped,
      "give it another time, if it must run on that day too"},
     {TAVI_SCHED_REMARK_OFF_HOURS, false, runsWhileOff,
      "give it a time at which the machine is on, or change the power schedules"}}};
constexpr const char *kMoveOne = "give one of them another time";

// ---- Tasks of an application in the same minute ----

// An hour of a task, whose minute is that of the day.
struct Hour {
    size_t app; // a number that the application has got
    uint32_t minute;
    const TAVI_SCHED_TASK *task;
};

struct Meeting {
    const TAVI_SCHED_TASK *other;
    int64_t local; // when they meet first
};
using Meetings = std::map<const TAVI_SCHED_TASK *, Meeting>;

bool isSameTask(const TAVI_SCHED_TASK &one, const TAVI_SCHED_TASK &other) {
    return one.id == other.id && one.backend == other.backend;
}

std::vector<Hour> hoursOfApplications(sched::TaskSpan tasks, const TAVI_SCHED_TASK *of) {
    std::vector<Hour> all;
    std::unordered_map<std::string_view, size_t> apps;
    const auto add = [&](const TAVI_SCHED_TASK &task) {
        const bool counts = !sched::isPower(task) && task.state == TAVI_SCHED_STATE_ENABLED &&
                            task.app[0] != '\0' && (!of || std::strcmp(task.app, of->app) == 0);
        const auto hours = counts ? sched::hoursOf(task) : std::bitset<sched::kHours>();
        const size_t app = hours.any() ? apps.try_emplace(task.app, apps.size()).first->second : 0;
        for (uint32_t hour = 0; hour < sched::kHours; ++hour) {
            if (hours.test(hour)) {
                all.push_back({app, hour * 60 + task.runMin, &task});
            }
        }
    };
    if (of) {
        add(*of);
    }
    for (const TAVI_SCHED_TASK *const task : tasks) {
        if (!of || !isSameTask(*task, *of)) {
            add(*task);
        }
    }
    std::stable_sort(all.begin(), all.end(), [](const Hour &one, const Hour &other) {
        return std::tie(one.app, one.minute) < std::tie(other.app, other.minute);
    });
    return all;
}

void addMeeting(Meetings &meetings, const TAVI_SCHED_TASK *one, const Meeting &meeting) {
    const auto [place, isNew] = meetings.try_emplace(one, meeting);
    if (!isNew && meeting.local < place->second.local) {
        place->second = meeting;
    }
}

// The hours are of one application and one minute; a day belongs to the first task that has it.
void findMeetings(std::span<const Hour> hours, int64_t now, Meetings &meetings) {
    std::array<const TAVI_SCHED_TASK *, kDays + 1> first{};
    for (const Hour &hour : hours) {
        const sched::Days days(*hour.task);
        Day day = std::chrono::floor<std::chrono::days>(
            std::chrono::sys_seconds(std::chrono::seconds(now)));
        bool hasMet = false;
        for (const TAVI_SCHED_TASK *&owner : first) {
            const int64_t local = sched::secondsOf(day) + hour.minute * kMinute;
            if (local >= now && days.has(day)) {
                if (!owner) {
                    owner = hour.task;
                } else if (!hasMet) {
                    hasMet = true;
                    addMeeting(meetings, hour.task, {owner, local});
                    addMeeting(meetings, owner, {hour.task, local});
                }
            }
            day += std::chrono::days(1);
        }
    }
}

Meetings findMeetings(sched::TaskSpan tasks, const TAVI_SCHED_TASK *of, int64_t now) {
    Meetings meetings;
    const bool isAsked = !of || of->app[0] != '\0';
    const std::vector<Hour> hours = isAsked ? hoursOfApplications(tasks, of) : std::vector<Hour>();
    for (auto begin = hours.begin(); begin != hours.end();) {
        const auto end = std::find_if(begin, hours.end(), [&](const Hour &hour) {
            return hour.app != begin->app || hour.minute != begin->minute;
        });
        if (end - begin > 1) {
            findMeetings({begin, end}, now, meetings);
        }
        begin = end;
    }
    return meetings;
}

Text meetingInWords(const TAVI_SCHED_TASK &task, const Meeting &meeting) {
    const bool waits = task.canRunAppSameTime != 1 || meeting.other->canRunAppSameTime != 1;
    return format("task %ld, of the same application, starts in the same minute, first on %s%s",
                  static_cast<long>(meeting.other->id), localInWords(meeting.local).data(),
                  waits ? ", so that one of them waits" : "");
}

// ---- Telling ----

// Hands remarks over until the reader has enough.
class Teller {
  public:
    Teller(TAVI_SCHED_REMARK_READER reader, void *context) : reader_(reader), context_(context) {}

    void tell(const TAVI_SCHED_TASK &task, const TAVI_SCHED_TASK *other, int32_t kind,
              const Text &text, const char *advice) {
        if (hasEnough_ || text[0] == '\0') {
            return;
        }
        TAVI_SCHED_REMARK remark{.task = &task, .other = other, .kind = kind, .text{}, .advice{}};
        sched::copyText(remark.text, sizeof remark.text, text.data());
        sched::copyText(remark.advice, sizeof remark.advice, advice);
        ++count_;
        hasEnough_ = reader_(context_, &remark) != 0;
    }
    bool hasEnough() const { return hasEnough_; }
    int count() const { return count_; }

  private:
    TAVI_SCHED_REMARK_READER reader_;
    void *context_;
    bool hasEnough_ = false;
    int count_ = 0;
};

void tellOf(const TAVI_SCHED_TASK &task, const Year &year, const Meetings &meetings,
            Teller &teller) {
    if (task.state != TAVI_SCHED_STATE_ENABLED) {
        return;
    }
    for (const Rule &rule : kRules) {
        if (rule.isOfPower || !sched::isPower(task)) {
            teller.tell(task, nullptr, rule.kind, rule.look(task, year), rule.advice);
        }
    }
    if (const auto meeting = meetings.find(&task); meeting != meetings.end()) {
        teller.tell(task, meeting->second.other, TAVI_SCHED_REMARK_SAME_MINUTE,
                    meetingInWords(task, meeting->second), kMoveOne);
    }
}

int tellAll(sched::TaskSpan tasks, const TAVI_SCHED_TASK *of, int64_t from, Teller &teller) {
    const int64_t until = from + kDays * kDay;
    const Year year{.from = from,
                    .until = until,
                    .off{tasks, from, until},
                    .gaps = sched::findGaps(from, until)};
    const Meetings meetings = findMeetings(tasks, of, sched::localOf(from));
    for (const TAVI_SCHED_TASK *const task : of ? sched::TaskSpan(&of, 1) : tasks) {
        if (teller.hasEnough()) {
            break;
        }
        tellOf(*task, year, meetings, teller);
    }
    return teller.count();
}

} // namespace

int TAVISchedTaskRemarks(const TAVI_SCHED_TASK *const *rgTasks, size_t cTasks,
                         const TAVI_SCHED_TASK *pOf, int64_t from, TAVI_SCHED_REMARK_READER reader,
                         void *pContext) {
    SCHED_REQUIRE(rgTasks || cTasks == 0, "((void *)0) != rgTasks", -1);
    SCHED_REQUIRE(reader, "((void *)0) != reader", -1);
    tzset();
    return sched::guarded(SCHED_SITE, [&] {
        Teller teller(reader, pContext);
        return tellAll({rgTasks, cTasks}, pOf, sched::inTime(from), teller);
    });
}
