// Power-on: the real-time clock is armed with the next time of all power-on entries.
#include "base/descriptor.h"
#include "platform.h"
#include "tavisdk.h"

#include <array>
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <ctime>
#include <fcntl.h>
#include <optional>
#include <string>
#include <unistd.h>

namespace {

constexpr const char *kWakeAlarm = "/sys/class/rtc/rtc0/wakealarm";

// The first time after now at which an enabled entry switches the machine on.
std::optional<time_t> nextTime(const TAVIAUTOPOWER &entry, const tm &today, time_t now) {
    if (entry.enabled != 1 || entry.weekBits > platform::kEveryDay || entry.hour > 23 ||
        entry.minute > 59) {
        return std::nullopt;
    }
    for (int days = 0; days <= platform::kWeekDays; ++days) {
        if ((entry.weekBits >> ((today.tm_wday + days) % platform::kWeekDays) & 1) == 0) {
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

} // namespace

int TAVIAutoPoweronSet() {
    std::array<TAVIAUTOPOWER, TAVI_AUTOPOWER_MAX_ENTRIES> entries{};
    const int count =
        TAVIAutoPowerConfGet(TAVI_AUTOPOWER_KIND_ON, TAVI_AUTOPOWER_MAX_ENTRIES, entries.data());
    if (count < 0) {
        return -1;
    }
    const time_t now = time(nullptr);
    tm today{};
    if (!localtime_r(&now, &today)) {
        PLATFORM_LOG("power-on cannot be armed: %s: %m", "local time");
        return PLATFORM_FAIL(platform::kSystemCallFailed);
    }
    std::optional<time_t> wake;
    for (int i = 0; i < count; ++i) {
        const auto time = nextTime(entries[static_cast<size_t>(i)], today, now);
        if (time && (!wake || *time < *wake)) {
            wake = time;
        }
    }
    return platform::guarded([&] { return armClock(wake); }, -1);
}

int TAVIAutoPoweronCheck(char *szReason, size_t cbReason) {
    if (access(kWakeAlarm, W_OK) == 0) {
        return 0;
    }
    if (szReason && cbReason > 0) {
        std::snprintf(szReason, cbReason, "%s: %s", kWakeAlarm, std::strerror(errno));
    }
    return -1;
}
