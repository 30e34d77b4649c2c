// A crontab that is rewritten: lines that are not ours survive byte by byte, ours are those of the
// tasks.
#include "fuzz.h"

#include <array>

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

void requireSynced(const std::string &content) {
    fuzz::writeFile(fuzz::kCrontab, content);
    REQUIRE(TAVISchedTaskSync() == 0);
    // There is no power schedule either.
    const auto isOurs = [](const std::string &line) {
        return (holds(line, fuzz::kRunner) && !isOfTheUnreadable(line)) || holds(line, kProgram);
    };
    const std::string expected = ended(without(content, isOurs)) + kLine;
    REQUIRE(fuzz::readFile(fuzz::kCrontab) == expected);
    REQUIRE(content.size() % 4 != 0 || TAVISchedTaskSync() == 0);
    REQUIRE(fuzz::readFile(fuzz::kCrontab) == expected);
}

// One line is replaced or goes, all of a program's lines go, and one is added.
void requireLines(const std::string &content) {
    fuzz::writeFile(fuzz::kCrontab, content);
    const auto first = PLATCFileSetLine(fuzz::kCrontab, kProgram, "# another");
    bool isFirst = true;
    std::string expected;
    for (const std::string &line : fuzz::linesOf(content)) {
        const bool isReplaced = isFirst && holds(line, kProgram);
        expected += isReplaced ? "# another\n" : line;
        isFirst = isFirst && !isReplaced;
    }
    REQUIRE(first == (isFirst ? 0 : 1) && fuzz::readFile(fuzz::kCrontab) == expected);

    expected = without(expected, [](const std::string &line) { return holds(line, kProgram); });
    REQUIRE(TAVIUpdateCrontab(kProgram, 0, 1) == 0 && fuzz::readFile(fuzz::kCrontab) == expected);

    TAVISCHEDULE schedule{.weekBits = 3,
                          .hour = 22,
                          .reserved1 = 0,
                          .lastHour = 22,
                          .minute = 5,
                          .reserved2 = 0,
                          .szCommand = "/usr/tavi/bin/tavi_poweroff_feasible_check"};
    REQUIRE(TAVIScheduleSet(&schedule, 1) == 0);
    REQUIRE(fuzz::readFile(fuzz::kCrontab) ==
            ended(expected) + "5\t22\t*\t*\t0,1\troot\t" + kProgram + "\n");
    REQUIRE(TAVIScheduleSet(&schedule, 0) == 0);
    REQUIRE(fuzz::readFile(fuzz::kCrontab) == ended(expected));
}

void requireVerdict(const std::string &line) {
    std::array<char, 512> reason{};
    TAVI_SCHED_CRON_TIMES times{};
    const int judged =
        TAVISchedCrontabLineCheck(line.c_str(), &times, reason.data(), reason.size());
    REQUIRE(judged == (reason[0] == '\0' ? 0 : 1));
    REQUIRE(times.minutes >> 60 == 0 && times.hours >> 24 == 0 && times.weekDays >> 7 == 0 &&
            times.months >> 13 == 0 && (times.months & 1) == 0 && (times.monthDays & 1) == 0);
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size) {
    static const bool isStored = (fuzz::storeTasks(kTasks), true);
    static_cast<void>(isStored);
    fuzz::Input input(data, size);
    const std::string content = input.rest();
    for (std::string line : fuzz::linesOf(content)) {
        requireVerdict(line.substr(0, line.find('\n')));
    }
    requireSynced(content);
    requireLines(content);
    return 0;
}
