// /etc/crontab as cron reads it: the grammar of crontab(5) with a user before the command.
#include "crontab.h"
#include "paths.h"

#include <algorithm>
#include <array>
#include <cctype>
#include <charconv>
#include <fstream>
#include <pwd.h>
#include <sstream>
#include <strings.h>

namespace tavisched {

namespace {

constexpr std::string_view kBlanks = " \t";
constexpr size_t kMaxCommand = 998; // bytes

using Names = std::vector<std::string_view>;
const Names kMonths = {"jan", "feb", "mar", "apr", "may", "jun",
                       "jul", "aug", "sep", "oct", "nov", "dec"};
const Names kWeekDays = {"sun", "mon", "tue", "wed", "thu", "fri", "sat"};
const Names kNicknames = {"@reboot", "@yearly",   "@annually", "@monthly",
                          "@weekly", "@midnight", "@daily",    "@hourly"};

// One of the five fields: its range and names.
struct Field {
    const char *title;
    unsigned int low, high;
    const Names *names = nullptr;
};
constexpr size_t kFieldCount = 5;
const std::array<Field, kFieldCount> kFields = {{{"minute", 0, 59},
                                                 {"hour", 0, 23},
                                                 {"day of month", 1, 31},
                                                 {"month", 1, 12, &kMonths},
                                                 {"day of week", 0, 7, &kWeekDays}}};
using Values = std::bitset<64>;

// Takes letters and digits off the text: a number in the field's range, or one of its names.
std::optional<unsigned int> takeValue(std::string_view &text, unsigned int low, unsigned int high,
                                      const Names *names) {
    const auto end = std::find_if_not(text.begin(), text.end(),
                                      [](unsigned char letter) { return std::isalnum(letter); });
    const std::string_view word = text.substr(0, static_cast<size_t>(end - text.begin()));
    text.remove_prefix(word.size());
    for (size_t i = 0; names && i < names->size(); ++i) {
        if (word.size() == (*names)[i].size() &&
            strncasecmp(word.data(), (*names)[i].data(), word.size()) == 0) {
            return low + static_cast<unsigned int>(i);
        }
    }
    unsigned int number = 0;
    const auto parsed = std::from_chars(word.data(), word.data() + word.size(), number);
    const bool isWhole = parsed.ec == std::errc() && parsed.ptr == word.data() + word.size();
    return isWhole && number >= low && number <= high ? std::optional(number) : std::nullopt;
}

bool takeCharacter(std::string_view &text, char character) {
    if (!text.starts_with(character)) {
        return false;
    }
    text.remove_prefix(1);
    return true;
}

// Takes "*", "5" or "5-9" off the text, those with two ends also with a step: "*/2". A range whose
// first value is above its last one is taken and means nothing.
bool takeRange(std::string_view &text, const Field &field, Values &values) {
    auto first = std::optional(field.low);
    auto last = std::optional(field.high);
    bool hasTwoEnds = takeCharacter(text, '*');
    if (!hasTwoEnds) {
        first = last = takeValue(text, field.low, field.high, field.names);
        hasTwoEnds = takeCharacter(text, '-');
        if (hasTwoEnds) {
            last = takeValue(text, field.low, field.high, field.names);
        }
    }
    auto step = std::optional(1U);
    if (takeCharacter(text, '/')) {
        constexpr unsigned int kLargestStep = 1000000;
        step = hasTwoEnds ? takeValue(text, 1, kLargestStep, nullptr) : std::nullopt;
    }
    if (!first || !last || !step) {
        return false;
    }
    for (unsigned int value = *first; value <= *last; value += *step) {
        values.set(value);
    }
    return true;
}

// A comma-separated list of ranges. cron does not look at what follows one behind anything but a
// comma.
std::optional<Values> parseField(std::string_view text, const Field &field) {
    Values values;
    do {
        if (!takeRange(text, field, values)) {
            return std::nullopt;
        }
    } while (takeCharacter(text, ','));
    return values;
}

std::string_view withoutLeadingBlanks(std::string_view text) {
    text.remove_prefix(std::min(text.find_first_not_of(kBlanks), text.size()));
    return text;
}

// Takes the next word off the text, with the blanks behind it.
std::string_view takeWord(std::string_view &text) {
    const std::string_view word = text.substr(0, text.find_first_of(kBlanks));
    text = withoutLeadingBlanks(text.substr(word.size()));
    return word;
}

CrontabLine rejected(std::string reason) {
    return {CrontabLine::Kind::Rejected, std::move(reason), {}};
}

// "NAME = value", where name and value may stand in quotes and a bare value is not empty.
bool isVariable(std::string_view line) {
    const bool isQuoted = line.front() == '"' || line.front() == '\'';
    const size_t end = isQuoted ? line.find(line.front(), 1) : line.find_first_of(" \t=");
    if (end == std::string_view::npos) {
        return false;
    }
    std::string_view rest = withoutLeadingBlanks(line.substr(end + (isQuoted ? 1 : 0)));
    return takeCharacter(rest, '=') && !withoutLeadingBlanks(rest).empty();
}

// User and command, after the times. A command may be empty, but not the blank before it.
CrontabLine parseJob(std::string_view text, const CronTimes &times) {
    const size_t rest = text.size();
    const std::string user(takeWord(text));
    if (!getpwnam(user.c_str())) {
        return rejected("there is no user \"" + user + "\"");
    }
    if (user.size() == rest) {
        return rejected("the command is missing");
    }
    if (text.size() > kMaxCommand) {
        return rejected("the command is longer than " + std::to_string(kMaxCommand) + " bytes");
    }
    return {CrontabLine::Kind::Entry, "", times};
}

CrontabLine parseEntry(std::string_view text) {
    std::array<Values, kFieldCount> values;
    for (size_t i = 0; i < kFieldCount; ++i) {
        // Every field ends with one blank or more; a field that is missing shows as a bad next one.
        const std::string_view word = takeWord(text);
        const auto parsed = parseField(word, kFields[i]);
        if (!parsed) {
            return rejected(std::string("the ") + kFields[i].title + " \"" + std::string(word) +
                            "\" is not valid");
        }
        values[i] = *parsed;
    }
    CronTimes times;
    times.minutes = values[0].to_ullong();
    times.hours = values[1].to_ullong();
    times.monthDays = values[2].to_ullong();
    times.months = values[3].to_ullong();
    times.weekDays = values[4].to_ullong();
    times.weekDays[0] = times.weekDays[0] || times.weekDays[7]; // Sunday is 0 and 7
    times.weekDays[7] = false;
    return parseJob(text, times);
}

} // namespace

CrontabLine parseCrontabLine(std::string_view line) {
    std::string_view text = withoutLeadingBlanks(line);
    if (text.empty() || text.front() == '#') {
        return {CrontabLine::Kind::Ignored, "", {}};
    }
    if (isVariable(text)) {
        return {CrontabLine::Kind::Variable, "", {}};
    }
    if (text.front() != '@') {
        return parseEntry(text);
    }
    const std::string_view nickname = takeWord(text);
    if (std::find(kNicknames.begin(), kNicknames.end(), nickname) == kNicknames.end()) {
        return rejected("\"" + std::string(nickname) + "\" is not known");
    }
    return parseJob(text, {});
}

std::optional<Crontab> readCrontab() {
    std::ifstream file(kCrontab, std::ios::binary);
    std::stringstream content;
    if (!file || (file.peek() != EOF && !(content << file.rdbuf()))) {
        return std::nullopt;
    }
    Crontab crontab;
    for (std::string line; std::getline(content, line);) {
        crontab.endsWithLineFeed = !content.eof();
        crontab.lines.push_back(line);
    }
    return crontab;
}

} // namespace tavisched
