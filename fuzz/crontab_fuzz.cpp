// A crontab that is rewritten: lines that are not ours survive byte by byte, ours are those of the
// tasks.
#include "fuzz.h"

#include <algorithm>
#include <array>
#include <sstream>

namespace {

// The second is disabled, the third cannot be read.
constexpr const char *kTasks =
    "[1]\naction=\napp=\napp name=\ncmd=\nid=1\nname=a\nrun hour=3\nrun min=4\nstate=enabled\n"
    "type=daily\n"
    "[2]\naction=\napp=\napp name=\ncmd=\nid=2\nname=b\nrun hour=3\nrun min=4\nstate=disabled\n"
    "type=daily\n"
    "[5]\nid=5\n";
constexpr const char *kLine = "4\t3\t*\t*\t*\troot\t/tmp/tavischedtask --run id=1\n";
constexpr const char *kProgram = "/usr/tavi/bin/tavi_poweroff_feasible_check";

bool holds(const std::string &line, const char *text) {
    return line.find(text) != std::string::npos;
}

// The lines for which the predicate is false, and whether the last of them ends.
template <typename Predicate>
std::string without(const std::string &content, Predicate &&isLeftOut) {
    std::string rest;
    for (const std::string &line : fuzz::linesOf(content)) {
        rest += isLeftOut(line) ? "" : line;
    }
    return rest;
}

std::string ended(std::string text) {
    return text + (text.empty() || text.back() == '\n' ? "" : "\n");
}

// Of the third task, which cannot be read, the line stays.
bool isOfTheUnreadable(const std::string &line) {
    const size_t at = line.find(" --run id=5");
    return at != std::string::npos && line.find(" --run id=") == at &&
           (at + 11 == line.size() ||
            std::string_view(" \t\n").find(line[at + 11]) != std::string_view::npos);
}

void requireSynced(const std::string &content, bool twice) {
    fuzz::contentOf(fuzz::kCrontab) = content;
    REQUIRE(TAVISchedTaskSync() == 0);
    // There is no power schedule either.
    const auto isOurs = [](const std::string &line) {
        return (holds(line, fuzz::kRunner) && !isOfTheUnreadable(line)) || holds(line, kProgram);
    };
    const std::string expected = ended(without(content, isOurs)) + kLine;
    REQUIRE(fuzz::contentOf(fuzz::kCrontab) == expected);
    REQUIRE(!twice || TAVISchedTaskSync() == 0);
    REQUIRE(fuzz::contentOf(fuzz::kCrontab) == expected);
}

// One line is replaced or goes, or all of a program's lines go.
void requireSetLine(const std::string &content) {
    fuzz::contentOf(fuzz::kCrontab) = content;
    const char *const line = content.size() % 8 == 2 ? "# another" : nullptr;
    const auto set = PLATCFileSetLine(fuzz::kCrontab, kProgram, line);
    bool isFirst = true;
    std::string expected;
    for (const std::string &each : fuzz::linesOf(content)) {
        const bool isReplaced = isFirst && holds(each, kProgram);
        expected += !isReplaced ? each : line ? std::string(line) + "\n" : "";
        isFirst = isFirst && !isReplaced;
    }
    REQUIRE(set == (isFirst ? 0 : 1) && fuzz::contentOf(fuzz::kCrontab) == expected);
    expected = without(expected, [](const std::string &each) { return holds(each, kProgram); });
    REQUIRE(TAVIUpdateCrontab(kProgram, 0, 1) == 0 && fuzz::contentOf(fuzz::kCrontab) == expected);
}

// A line is added and goes again, with those that are the same.
void requireSchedule(const std::string &content) {
    constexpr std::string_view kAdded =
        "5\t22\t*\t*\t0,1\troot\t/usr/tavi/bin/tavi_poweroff_feasible_check\n";
    fuzz::contentOf(fuzz::kCrontab) = content;
    TAVISCHEDULE schedule{.weekBits = 3,
                          .hour = 22,
                          .reserved1 = 0,
                          .lastHour = 22,
                          .minute = 5,
                          .reserved2 = 0,
                          .szCommand = "/usr/tavi/bin/tavi_poweroff_feasible_check"};
    REQUIRE(TAVIScheduleSet(&schedule, 1) == 0);
    REQUIRE(fuzz::contentOf(fuzz::kCrontab) == ended(content).append(kAdded));
    REQUIRE(TAVIScheduleSet(&schedule, 0) == 0);
    REQUIRE(fuzz::contentOf(fuzz::kCrontab) ==
            without(ended(content), [&](const std::string &each) { return each == kAdded; }));
}

// A list of "*", "5" and "5-9", with a step behind the first and the last: "*/2".
struct Field {
    bool isPlain = true; // nothing else stands there
    bool isValid = true;
    uint64_t values = 0;
};

bool takeNumber(std::string_view &text, unsigned int &number) {
    const size_t digits = std::min(text.find_first_not_of("0123456789"), text.size());
    const bool isNumber = digits >= 1 && digits <= 4;
    number = isNumber ? std::stoul(std::string(text.substr(0, digits))) : 0;
    text.remove_prefix(digits);
    return isNumber;
}

bool takeSign(std::string_view &text, char sign) {
    const bool isThere = text.starts_with(sign);
    text.remove_prefix(isThere ? 1 : 0);
    return isThere;
}

Field fieldOf(std::string_view text, unsigned int low, unsigned int high) {
    Field field;
    do {
        unsigned int first = low;
        unsigned int last = high;
        unsigned int step = 1;
        bool isRange = takeSign(text, '*');
        if (!isRange) {
            field.isPlain = field.isPlain && takeNumber(text, first);
            last = first;
            isRange = takeSign(text, '-');
            field.isPlain = field.isPlain && (!isRange || takeNumber(text, last));
        }
        if (takeSign(text, '/')) {
            field.isPlain = field.isPlain && takeNumber(text, step);
            field.isValid = field.isValid && isRange;
        }
        field.isValid = field.isValid && first >= low && first <= high && last >= low &&
                        last <= high && step > 0;
        for (unsigned int value = first; field.isValid && value <= last; value += step) {
            field.values |= uint64_t{1} << value;
        }
    } while (field.isPlain && takeSign(text, ','));
    field.isPlain = field.isPlain && text.empty();
    return field;
}

// Of a line with plain fields, its times and whether it is taken.
void requireTimes(const std::string &line, int judged, const TAVI_SCHED_CRON_TIMES &times) {
    std::istringstream words(line);
    std::string word;
    std::array<Field, 5> fields;
    constexpr unsigned int kRanges[5][2] = {{0, 59}, {0, 23}, {1, 31}, {1, 12}, {0, 7}};
    for (size_t i = 0; i < fields.size(); ++i) {
        words >> word;
        fields[i] = fieldOf(words ? word : "", kRanges[i][0], kRanges[i][1]);
        if (!fields[i].isPlain) {
            return;
        }
    }
    const bool isValid =
        std::all_of(fields.begin(), fields.end(), [](const Field &field) { return field.isValid; });
    std::getline(words >> std::ws, word);
    REQUIRE(judged == (isValid && word.starts_with("root ") ? 0 : isValid ? judged : 1));
    REQUIRE(judged != 0 ||
            (times.minutes == fields[0].values && times.hours == fields[1].values &&
             times.monthDays == fields[2].values && times.months == fields[3].values &&
             times.weekDays == ((fields[4].values | fields[4].values >> 7) & 0x7f)));
}

void requireVerdict(const std::string &line) {
    std::array<char, 512> reason{};
    TAVI_SCHED_CRON_TIMES times{};
    const int judged =
        TAVISchedCrontabLineCheck(line.c_str(), &times, reason.data(), reason.size());
    REQUIRE(judged == (reason[0] == '\0' ? 0 : 1));
    REQUIRE(times.minutes >> 60 == 0 && times.hours >> 24 == 0 && times.weekDays >> 7 == 0 &&
            times.months >> 13 == 0 && (times.months & 1) == 0 && (times.monthDays & 1) == 0);
    if (line.find_first_not_of("0123456789*/,- \t") == line.find("root")) {
        requireTimes(line.c_str(), judged, times);
    }
}

} // namespace

void fuzz::test(Input input) {
    static const bool isStored = (fuzz::storeTasks(kTasks), true);
    static_cast<void>(isStored);
    const std::string content = input.rest();
    for (std::string line : fuzz::linesOf(content)) {
        requireVerdict(line.substr(0, line.find('\n')));
    }
    switch (content.size() % 4) {
    case 2:
        requireSetLine(content);
        break;
    case 3:
        requireSchedule(content);
        break;
    default:
        requireSynced(content, content.size() % 4 == 0);
    }
}
