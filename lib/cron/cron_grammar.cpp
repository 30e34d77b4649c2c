// cron's grammar, to the letter where it is lax: what follows a range in a field is not looked at,
// and a range whose first value is above its last one means nothing.
#include "cron/cron_grammar.h"
#include "sched_error.h"
#include "sched_guard.h"
#include "sched_text.h"
#include "validity/utf8.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <limits>
#include <optional>
#include <pwd.h>
#include <span>
#include <strings.h>

namespace {

using sched::CronTimes;
using sched::CronVerdict;
using Kind = CronVerdict::Kind;

constexpr std::string_view kBlanks = " \t";
constexpr size_t kMaxCommand = 998; // bytes

using Names = std::span<const std::string_view>;
constexpr std::string_view kMonths[] = {"jan", "feb", "mar", "apr", "may", "jun",
                                        "jul", "aug", "sep", "oct", "nov", "dec"};
constexpr std::string_view kWeekDays[] = {"sun", "mon", "tue", "wed", "thu", "fri", "sat"};
constexpr std::string_view kNicknames[] = {"@reboot", "@yearly",   "@annually", "@monthly",
                                           "@weekly", "@midnight", "@daily",    "@hourly"};

// One of the five fields: its range and names.
struct CronField {
    const char *title;
    unsigned int low, high;
    Names names;
};
const std::array<CronField, 5> kFields = {{{"minute", 0, 59, {}},
                                           {"hour", 0, 23, {}},
                                           {"day of month", 1, 31, {}},
                                           {"month", 1, 12, kMonths},
                                           {"day of week", 0, 7, kWeekDays}}};

// Values as bits.
using Values = uint64_t;
constexpr Values bit(unsigned int value) {
    return Values{1} << value;
}

bool isLetterOrDigit(char byte) {
    return (byte >= '0' && byte <= '9') || (byte >= 'a' && byte <= 'z') ||
           (byte >= 'A' && byte <= 'Z');
}

bool equalsInAnyCase(std::string_view one, std::string_view other) {
    return one.size() == other.size() && strncasecmp(one.data(), other.data(), one.size()) == 0;
}

// cron reads numbers as 64 bits wide and keeps 32 of them.
std::optional<unsigned int> numberOf(std::string_view word) {
    uint64_t number = 0;
    const auto parsed = std::from_chars(word.data(), word.data() + word.size(), number);
    const bool isWhole = parsed.ec == std::errc() && parsed.ptr == word.data() + word.size();
    return isWhole ? std::optional(static_cast<unsigned int>(number)) : std::nullopt;
}

// Takes letters and digits off the text: a number in the range, or one of the names.
std::optional<unsigned int> takeValue(std::string_view &text, unsigned int low, unsigned int high,
                                      Names names) {
    const auto end = std::find_if_not(text.begin(), text.end(), isLetterOrDigit);
    const std::string_view word = text.substr(0, static_cast<size_t>(end - text.begin()));
    text.remove_prefix(word.size());
    for (size_t i = 0; i < names.size(); ++i) {
        if (equalsInAnyCase(word, names[i])) {
            return low + static_cast<unsigned int>(i);
        }
    }
    const auto number = numberOf(word);
    return number && *number >= low && *number <= high ? number : std::nullopt;
}

bool takeCharacter(std::string_view &text, char character) {
    if (!text.starts_with(character)) {
        return false;
    }
    text.remove_prefix(1);
    return true;
}

// Takes "*", "5" or "5-9" off the text, those with two ends also with a step: "*/2".
bool takeRange(std::string_view &text, const CronField &field, Values &values) {
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
        constexpr unsigned int kLargestStep = std::numeric_limits<int>::max();
        step = hasTwoEnds ? takeValue(text, 1, kLargestStep, {}) : std::nullopt;
    }
    if (!first || !last || !step) {
        return false;
    }
    for (uint64_t value = *first; value <= *last; value += *step) {
        values |= bit(static_cast<unsigned int>(value));
    }
    return true;
}

// A comma-separated list of ranges.
std::optional<Values> parseField(std::string_view text, const CronField &field) {
    Values values = 0;
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

CronVerdict rejected(std::string reason) {
    return {Kind::Rejected, std::move(reason)};
}

// "NAME = value", where name and value may stand in quotes, nothing follows a value in quotes, and
// a bare value is not empty.
bool isVariable(std::string_view line) {
    constexpr std::string_view kSpaces = " \t\v\f\r";
    const auto quoteOf = [](std::string_view text) {
        return text.front() == '"' || text.front() == '\'' ? text.substr(0, 1) : "";
    };
    const auto withoutSpaces = [&](std::string_view text) {
        return text.substr(std::min(text.find_first_not_of(kSpaces), text.size()));
    };
    const std::string_view quote = quoteOf(line);
    const std::string nameEnds = std::string(quote.empty() ? kSpaces : quote) + "=";
    const size_t end = line.find_first_of(nameEnds, quote.size());
    if (end == std::string_view::npos || (!quote.empty() && line[end] == '=')) {
        return false;
    }
    std::string_view value = withoutSpaces(line.substr(end + quote.size()));
    if (!takeCharacter(value, '=') || (value = withoutSpaces(value)).empty()) {
        return false;
    }
    const std::string_view valueQuote = quoteOf(value);
    if (valueQuote.empty()) {
        return true;
    }
    const size_t valueEnd = value.find(valueQuote, 1);
    return valueEnd != std::string_view::npos && withoutSpaces(value.substr(valueEnd + 1)).empty();
}

// User and command, after the times. A command may be empty, but not the blank before it.
CronVerdict judgeJob(std::string_view text, const CronTimes &times) {
    const size_t rest = text.size();
    const std::string user(takeWord(text));
    if (!getpwnam(user.c_str())) {
        return rejected("there is no user " + sched::quoted(user));
    }
    if (user.size() == rest) {
        return rejected("the command is missing");
    }
    if (text.size() > kMaxCommand) {
        return rejected("the command is longer than " + std::to_string(kMaxCommand) + " bytes");
    }
    return {Kind::Entry, "", times};
}

CronVerdict judgeEntry(std::string_view text) {
    std::array<Values, kFields.size()> values{};
    for (size_t i = 0; i < kFields.size(); ++i) {
        // Every field ends with one blank or more; a field that is missing shows as a bad next one.
        const std::string_view word = takeWord(text);
        const auto parsed = parseField(word, kFields[i]);
        if (!parsed) {
            return rejected(std::string("the ") + kFields[i].title + " " + sched::quoted(word) +
                            " is not valid");
        }
        values[i] = *parsed;
    }
    constexpr unsigned int kOtherSunday = 7;
    const Values sunday = (values[4] & bit(kOtherSunday)) != 0 ? bit(0) : 0;
    return judgeJob(text,
                    {.minutes = values[0],
                     .hours = static_cast<uint32_t>(values[1]),
                     .monthDays = static_cast<uint32_t>(values[2]),
                     .months = static_cast<uint32_t>(values[3]),
                     .weekDays = static_cast<uint32_t>((values[4] | sunday) & ~bit(kOtherSunday))});
}

} // namespace

CronVerdict sched::judgeCronLine(std::string_view line) {
    std::string_view text = withoutLeadingBlanks(line);
    if (text.empty() || text.front() == '#') {
        return {Kind::Ignored};
    }
    if (isVariable(text)) {
        return {Kind::Variable};
    }
    if (text.front() != '@') {
        return judgeEntry(text);
    }
    const std::string_view nickname = takeWord(text);
    if (std::find(std::begin(kNicknames), std::end(kNicknames), nickname) == std::end(kNicknames)) {
        return rejected(quoted(nickname) + " is not known");
    }
    return judgeJob(text, {});
}

int TAVISchedCrontabLineCheck(const char *szLine, TAVI_SCHED_CRON_TIMES *pTimes, char *szReason,
                              size_t cbReason) {
    SCHED_REQUIRE(szLine, "((void *)0) != szLine", -1);
    SCHED_REQUIRE(szReason, "((void *)0) != szReason", -1);
    SCHED_REQUIRE(cbReason > 0, "0 < cbReason", -1);
    return sched::guarded(SCHED_SITE, [&] {
        const CronVerdict verdict = sched::judgeCronLine(szLine);
        sched::copyText(szReason, cbReason, verdict.reason.c_str());
        if (pTimes) {
            *pTimes = verdict.times;
        }
        return verdict.kind == Kind::Rejected ? 1 : 0;
    });
}
