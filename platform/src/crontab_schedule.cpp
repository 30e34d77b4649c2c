// Schedules of programs that cron runs as root: lines of /etc/crontab.
#include "file.h"
#include "platform.h"
#include "tavisdk.h"

#include <algorithm>
#include <csignal>
#include <cstdlib>
#include <string>

namespace {

using platform::guarded;

constexpr const char *kCrontab = "/etc/crontab";
constexpr const char *kCronPid = "/var/run/crond.pid";

std::string dayField(unsigned int weekBits) {
    if (weekBits == platform::kEveryDay) {
        return "*";
    }
    std::string days;
    for (int day = 0; day < platform::kWeekDays; ++day) {
        if ((weekBits >> day & 1) != 0) {
            days += (days.empty() ? "" : ",") + std::to_string(day);
        }
    }
    return days;
}

// cron would ignore the whole file for one bad line.
bool cronTakes(const TAVISCHEDULE &schedule) {
    constexpr size_t kMaxCommand = 998; // cron refuses a longer one
    const size_t length = strnlen(schedule.szCommand, sizeof schedule.szCommand);
    return schedule.weekBits <= platform::kEveryDay && schedule.hour >= 0 && schedule.hour <= 23 &&
           schedule.minute >= 0 && schedule.minute <= 59 && length > 0 && length <= kMaxCommand &&
           !std::strchr(schedule.szCommand, '\n');
}

int addLine(const std::string &line) {
    auto content = platform::readFile(kCrontab);
    if (!content) {
        return -1;
    }
    std::string &text = content->text;
    if (!text.empty() && text.back() != '\n') {
        text += '\n';
    }
    return platform::replaceWatchedFile(kCrontab, text + line);
}

// Removes the lines of which the predicate is true; the lines come with their line feed.
template <typename Predicate> int removeLines(Predicate &&isRemoved) {
    const auto content = platform::readFile(kCrontab);
    if (!content) {
        return -1;
    }
    const std::string_view text = content->text;
    std::string kept;
    for (size_t begin = 0; begin < text.size();) {
        const size_t feed = text.find('\n', begin);
        const std::string_view line =
            text.substr(begin, feed == std::string_view::npos ? feed : feed + 1 - begin);
        kept += isRemoved(line) ? std::string_view() : line;
        begin += line.size();
    }
    return kept.size() == text.size() ? 0 : platform::replaceWatchedFile(kCrontab, kept);
}

// The process id of the running cron; 0 when none is running, as there is no file with its id. -1.
pid_t findCron() {
    const int there = platform::isThere(kCronPid);
    if (there != 1) {
        return there;
    }
    const auto content = platform::readFile(kCronPid);
    return content ? std::max(0, std::atoi(content->text.c_str())) : -1;
}

void tell(pid_t cron) {
    if (cron > 1 && kill(cron, SIGHUP) != 0) {
        PLATFORM_LOG("cron (process %d) cannot be told: %m", cron);
    }
}

} // namespace

int TAVIScheduleSet(const TAVISCHEDULE *pSchedule, int enable) {
    if (!pSchedule || !cronTakes(*pSchedule)) {
        return PLATFORM_FAIL(platform::kInvalidArgument);
    }
    if (pSchedule->weekBits == 0) {
        return 0;
    }
    return guarded(
        [&] {
            const std::string line = std::to_string(pSchedule->minute) + "\t" +
                                     std::to_string(pSchedule->hour) + "\t*\t*\t" +
                                     dayField(pSchedule->weekBits) + "\troot\t" +
                                     pSchedule->szCommand + "\n";
            return enable != 0 ? addLine(line)
                               : removeLines([&](std::string_view other) { return other == line; });
        },
        -1);
}

int TAVIUpdateCrontab(const char *szProgram, int keepLines, int tellCron) {
    if (!szProgram || *szProgram == '\0') {
        return PLATFORM_FAIL(platform::kInvalidArgument);
    }
    return guarded(
        [&] {
            const auto holdsProgram = [&](std::string_view line) {
                return line.find(szProgram) != std::string_view::npos;
            };
            // First, so that a failure changes nothing.
            const pid_t cron = tellCron != 0 ? findCron() : 0;
            if (cron < 0) {
                PLATFORM_LOG("cron cannot be told: %s cannot be read", kCronPid);
                return -1;
            }
            if (keepLines == 0 && removeLines(holdsProgram) != 0) {
                return -1;
            }
            tell(cron);
            return 0;
        },
        -1);
}
