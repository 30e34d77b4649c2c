// /etc/crontab as cron reads it. cron ignores the whole file for one line that it does not take, so
// it must be known beforehand which ones those are.
#pragma once

#include <bitset>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace tavisched {

// When an entry is due; a bit for each value, the week's Sunday being 0.
struct CronTimes {
    std::bitset<60> minutes;
    std::bitset<24> hours;
    std::bitset<32> monthDays;
    std::bitset<13> months;
    std::bitset<8> weekDays;

    bool operator==(const CronTimes &) const = default;
};

struct CrontabLine {
    enum class Kind { Ignored, Variable, Entry, Rejected };
    Kind kind;
    std::string reason; // why cron rejects it
    CronTimes times;    // of an entry without "@"
};

// Reads a line without its line feed.
CrontabLine parseCrontabLine(std::string_view line);

// The lines of /etc/crontab, without their line feeds; nothing when the file cannot be read.
struct Crontab {
    std::vector<std::string> lines;
    bool endsWithLineFeed = true;
};
std::optional<Crontab> readCrontab();

} // namespace tavisched
