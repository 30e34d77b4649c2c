// Auto-power: the configuration is a section file with a section a kind, power-on is armed in the
// real-time clock, and schedules become lines of /etc/crontab.
#include "base/descriptor.h"
#include "file.h"
#include "platform.h"
#include "tavisdk.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <charconv>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <ctime>
#include <fcntl.h>
#include <memory>
#include <optional>
#include <string>
#include <unistd.h>

namespace {

using platform::guarded;

constexpr const char *kConfiguration = "/usr/tavi/etc/auto_power";
constexpr const char *kWakeAlarm = "/sys/class/rtc/rtc0/wakealarm";
constexpr const char *kCrontab = "/etc/crontab";
constexpr const char *kCronPid = "/var/run/crond.pid";
constexpr std::array<const char *, 2> kSections = {"power on", "power off"};
constexpr int kWeekDays = 7;
constexpr unsigned int kEveryDay = 127;

bool isKind(int kind) {
    return kind == TAVI_AUTOPOWER_KIND_ON || kind == TAVI_AUTOPOWER_KIND_OFF;
}

// ---- Configuration: a pair an entry, "000=enabled week-bits hour minute" ----

using Hash = std::unique_ptr<PLATCSZHASH, decltype(&PLATCSzHashFree)>;
using List = std::unique_ptr<PLATCSZLIST, decltype(&PLATCSzListFree)>;

std::string entryKey(int index) {
    std::array<char, 16> key{};
    std::snprintf(key.data(), key.size(), "%03d", index);
    return key.data();
}

// Four numbers from 0 to 255 with single blanks between them.
bool parseEntry(std::string_view text, TAVIAUTOPOWER &entry) {
    const char *at = text.data();
    const char *const end = at + text.size();
    for (uint8_t *field : {&entry.enabled, &entry.weekBits, &entry.hour, &entry.minute}) {
        if (field != &entry.enabled && (at == end || *at++ != ' ')) {
            return false;
        }
        const auto parsed = std::from_chars(at, end, *field);
        if (parsed.ec != std::errc()) {
            return false;
        }
        at = parsed.ptr;
    }
    return at == end;
}

int refuseConfiguration(int kind, const std::string &key) {
    PLATFORM_LOG("%s: entry [%s] in [%s] is missing or damaged", kConfiguration, key.c_str(),
                 kSections[static_cast<size_t>(kind)]);
    return PLATFORM_FAIL(platform::kBadFormat);
}

// How many pairs the section has, read into the hash; 0 without a configuration.
int readSection(int kind, PLATCSZHASH **pairs) {
    if (!PLATCFileExist(kConfiguration)) {
        return 0;
    }
    List keys(PLATCSzListAlloc(TAVI_AUTOPOWER_MAX_ENTRIES), PLATCSzListFree);
    PLATCSZLIST *list = keys.get();
    const int found =
        PLATCFileGetSection(kConfiguration, kSections[static_cast<size_t>(kind)], pairs);
    return found <= 0 ? found : PLATCSzHashEnumKey(*pairs, &list);
}

// A gap in the numbering would hide the entries behind it, and the next change would erase them.
int readEntries(int kind, int max, TAVIAUTOPOWER *entries) {
    Hash hash(PLATCSzHashAlloc(max), PLATCSzHashFree);
    PLATCSZHASH *pairs = hash.get();
    const int stored = pairs ? readSection(kind, &pairs) : -1;
    const int count = std::min(stored, max);
    for (int i = 0; i < count; ++i) {
        const std::string key = entryKey(i);
        const char *const text = PLATCSzHashGetValue(pairs, key.c_str());
        if (!text || !parseEntry(text, entries[i])) {
            return refuseConfiguration(kind, key);
        }
    }
    return count;
}

int writeEntries(int kind, int count, const TAVIAUTOPOWER *entries) {
    Hash hash(PLATCSzHashAlloc(count), PLATCSzHashFree);
    PLATCSZHASH *pairs = hash.get();
    for (int i = 0; i < count; ++i) {
        std::array<char, 32> text{};
        std::snprintf(text.data(), text.size(), "%u %u %u %u", entries[i].enabled,
                      entries[i].weekBits, entries[i].hour, entries[i].minute);
        if (PLATCSzHashSetValue(&pairs, entryKey(i).c_str(), text.data()) != 0) {
            return -1;
        }
    }
    const int replaced =
        PLATCFileExist(kConfiguration)
            ? PLATCFileSetSection(kConfiguration, kSections[static_cast<size_t>(kind)], pairs)
            : 0;
    if (replaced != 0) {
        return replaced < 0 ? -1 : 0;
    }
    return PLATCFileAddSection(kConfiguration, kSections[static_cast<size_t>(kind)], pairs) < 0 ? -1
                                                                                                : 0;
}

// ---- Wake alarm ----

// The first time after now at which an enabled entry switches the machine on.
std::optional<time_t> nextTime(const TAVIAUTOPOWER &entry, time_t now) {
    if (entry.enabled != 1 || entry.weekBits > kEveryDay || entry.hour > 23 || entry.minute > 59) {
        return std::nullopt;
    }
    tm today{};
    localtime_r(&now, &today);
    for (int days = 0; days <= kWeekDays; ++days) {
        if ((entry.weekBits >> ((today.tm_wday + days) % kWeekDays) & 1) == 0) {
            continue;
        }
        tm due{};
        due.tm_year = today.tm_year;
        due.tm_mon = today.tm_mon;
        due.tm_mday = today.tm_mday + days;
        due.tm_hour = entry.hour;
        due.tm_min = entry.minute;
        due.tm_isdst = -1;
        const time_t time = mktime(&due);
        if (time > now) {
            return time;
        }
    }
    return std::nullopt;
}

bool writeWakeAlarm(int fd, time_t time) {
    const std::string text = std::to_string(time) + "\n";
    return write(fd, text.data(), text.size()) == static_cast<ssize_t>(text.size());
}

// The clock refuses a new alarm while one is set, so it is cleared first.
int armClock(std::optional<time_t> wake) {
    const base::Descriptor clock(open(kWakeAlarm, O_WRONLY | O_CLOEXEC));
    if (!clock) {
        if (!wake && (errno == ENOENT || errno == EROFS || errno == ENODEV || errno == ENXIO)) {
            return 0; // there is no clock that could have been armed
        }
        PLATFORM_LOG("power-on cannot be armed: %s: %m", kWakeAlarm);
        return PLATFORM_FAIL(platform::kOpenFailed);
    }
    if (!writeWakeAlarm(clock.get(), 0) || (wake && !writeWakeAlarm(clock.get(), *wake))) {
        PLATFORM_LOG("power-on cannot be armed: writing to %s: %m", kWakeAlarm);
        return PLATFORM_FAIL(platform::kReadWriteFailed);
    }
    return 0;
}

// ---- Crontab ----

std::string dayField(unsigned int weekBits) {
    if (weekBits == kEveryDay) {
        return "*";
    }
    std::string days;
    for (int day = 0; day < kWeekDays; ++day) {
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
    return schedule.weekBits <= kEveryDay && schedule.hour >= 0 && schedule.hour <= 23 &&
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

// No cron is running when there is no file with its process id.
void tellCron() {
    const auto content = platform::readFile(kCronPid);
    const pid_t cron = content ? std::atoi(content->text.c_str()) : 0;
    if (cron > 1 && kill(cron, SIGHUP) != 0) {
        PLATFORM_LOG("cron (process %d) cannot be told: %m", cron);
    }
}

} // namespace

int TAVIAutoPowerConfGet(int kind, int max, TAVIAUTOPOWER *rgEntries) {
    if (!isKind(kind) || max < 0 || !rgEntries) {
        return PLATFORM_FAIL(platform::kInvalidArgument);
    }
    return guarded(
        [&] { return readEntries(kind, std::min(max, TAVI_AUTOPOWER_MAX_ENTRIES), rgEntries); },
        -1);
}

int TAVIAutoPowerConfSet(int kind, int count, const TAVIAUTOPOWER *rgEntries) {
    if (!isKind(kind) || count < 0 || (count > 0 && !rgEntries)) {
        return PLATFORM_FAIL(platform::kInvalidArgument);
    }
    return guarded([&] { return writeEntries(kind, count, rgEntries); }, -1);
}

int TAVIAutoPoweronSet() {
    std::array<TAVIAUTOPOWER, TAVI_AUTOPOWER_MAX_ENTRIES> entries{};
    const int count =
        TAVIAutoPowerConfGet(TAVI_AUTOPOWER_KIND_ON, TAVI_AUTOPOWER_MAX_ENTRIES, entries.data());
    if (count < 0) {
        return -1;
    }
    const time_t now = time(nullptr);
    std::optional<time_t> wake;
    for (int i = 0; i < count; ++i) {
        const auto time = nextTime(entries[static_cast<size_t>(i)], now);
        if (time && (!wake || *time < *wake)) {
            wake = time;
        }
    }
    return guarded([&] { return armClock(wake); }, -1);
}

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

int TAVIUpdateCrontab(const char *szProgram, int keepLines, int tellCronToo) {
    if (!szProgram || *szProgram == '\0') {
        return PLATFORM_FAIL(platform::kInvalidArgument);
    }
    return guarded(
        [&] {
            const auto holdsProgram = [&](std::string_view line) {
                return line.find(szProgram) != std::string_view::npos;
            };
            if (keepLines == 0 && removeLines(holdsProgram) != 0) {
                return -1;
            }
            if (tellCronToo != 0 && PLATCFileExist(kCronPid)) {
                tellCron();
            }
            return 0;
        },
        -1);
}
