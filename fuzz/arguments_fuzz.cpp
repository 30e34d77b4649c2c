// The command line of tavisched, an argument a line: parsed and turned into a task, with the
// commands' own work left out. A command is given what was typed, and for the rest the defaults; a
// task becomes what it is to become; what is said can go to a terminal.
#include "command_line.h"
#include "commands/commands.h"
#include "fuzz.h"
#include "task_options.h"
#include "tasks/tasks.h"
#include "text/utf8.h"
#include "waiting.h"

#include <algorithm>
#include <iostream>
#include <limits>
#include <random>
#include <utility>

namespace tavisched {

namespace {

// ---- What a command was given ----

// By the names of options and arguments; the command's own name under "".
fuzz::Pairs told;

std::string flag(bool given) {
    return given ? "yes" : "";
}

template <typename Number> std::string textOf(const std::optional<Number> &number) {
    return number ? std::to_string(*number) : "";
}

std::string textOf(const Ids &ids) {
    std::vector<std::string> texts;
    std::transform(ids.begin(), ids.end(), std::back_inserter(texts),
                   [](int32_t id) { return std::to_string(id); });
    return join(texts, " ");
}

fuzz::Pairs pairsOf(const TaskOptions &options, const Manner &manner) {
    return {
        {"--name", options.name.value_or("")},     {"--command", options.command.value_or("")},
        {"--at", options.at.value_or("")},         {"--daily", flag(options.daily)},
        {"--weekly", options.weekly.value_or("")}, {"--monthly", options.monthly.value_or("")},
        {"--yearly", options.yearly.value_or("")}, {"--once", options.once.value_or("")},
        {"--every", options.every.value_or("")},   {"--until", options.until.value_or("")},
        {"--owner", options.owner.value_or("")},   {"--app", options.app.value_or("")},
        {"--power", options.power.value_or("")},   {"--enabled", flag(options.enabled)},
        {"--disabled", flag(options.disabled)},    {"--allow-overlap", flag(options.allowOverlap)},
        {"--no-overlap", flag(options.noOverlap)}, {"--dry-run", flag(manner.dryRun)},
        {"--quiet", flag(manner.quiet)},           {"--json", flag(manner.json)}};
}

} // namespace

void tellOfWaiting() {}

const std::vector<std::string> &sortFields() {
    static const std::vector<std::string> fields = {"id", "name"};
    return fields;
}

int list(const ListOptions &options) {
    told = {{"", "list"},
            {"WORD", join(options.words, " ")},
            {"--all", flag(options.all)},
            {"--failed", flag(options.failed)},
            {"--owner", options.owner},
            {"--next", options.next},
            {"--sort", options.sort},
            {"--reverse", flag(options.reverse)},
            {"--json", flag(options.json)}};
    return 0;
}
int show(int32_t id, bool json) {
    told = {{"", "show"}, {"ID", std::to_string(id)}, {"--json", flag(json)}};
    return 0;
}
int history(const HistoryOptions &options) {
    told = {{"", "history"},
            {"ID", textOf(options.id)},
            {"--failed", flag(options.failed)},
            {"--since", options.since},
            {"--limit", std::to_string(options.limit)},
            {"--json", flag(options.json)}};
    return 0;
}
int log(int32_t id, std::optional<int64_t> number, bool follow) {
    told = {{"", "log"},
            {"ID", std::to_string(id)},
            {"--run", textOf(number)},
            {"--follow", flag(follow)}};
    return 0;
}
int exportTasks(const Ids &ids, bool web) {
    told = {{"", "export"}, {"ID", textOf(ids)}, {"--web", flag(web)}};
    return 0;
}
int add(const TaskOptions &options, const Manner &manner) {
    told = pairsOf(options, manner);
    told[""] = "add";
    fuzz::requireChange(
        *newTask(options.power ? TAVI_SCHED_BACKEND_AUTOPOWER : TAVI_SCHED_BACKEND_SCHEDULE),
        options);
    return 0;
}
// Of a task that repeats, on a date that has passed.
int edit(int32_t id, const TaskOptions &options, const Manner &manner) {
    told = pairsOf(options, manner);
    told[""] = "edit";
    told["ID"] = std::to_string(id);
    Task task = newTask(TAVI_SCHED_BACKEND_SCHEDULE);
    task->repeatHour = 4;
    task->lastWorkHour = 20;
    TAVISchedCTaskSetOnce(task.get());
    task->startYear = 2020;
    task->startMonth = task->startDay = 2;
    fuzz::requireChange(*task, options);
    return 0;
}
int setEnabled(const Ids &ids, bool enabled) {
    told = {{"", enabled ? "enable" : "disable"}, {"ID", textOf(ids)}};
    return 0;
}
int removeTasks(const Ids &ids, bool yes) {
    told = {{"", "remove"}, {"ID", textOf(ids)}, {"--yes", flag(yes)}};
    return 0;
}
int importTasks(const ImportOptions &options) {
    told = {{"", "import"},
            {"FILE", options.file},
            {"--replace", flag(options.replace)},
            {"--dry-run", flag(options.dryRun)}};
    return 0;
}
int run(const Ids &ids, const RunOptions &options) {
    told = {{"", "run"},
            {"ID", textOf(ids)},
            {"--wait", flag(options.wait)},
            {"--missed", flag(options.missed)}};
    return 0;
}
int next(const NextOptions &options) {
    told = {{"", "next"},
            {"ID", textOf(options.ids)},
            {"--number", std::to_string(options.number)},
            {"--until", options.until},
            {"--all", flag(options.all)},
            {"--json", flag(options.json)}};
    return 0;
}
int calendar(const CalendarOptions &options) {
    told = {{"", "calendar"},
            {"--days", std::to_string(options.days)},
            {"--past", std::to_string(options.past)},
            {"--hours", flag(options.hours)},
            {"--all", flag(options.all)},
            {"--json", flag(options.json)}};
    return 0;
}
int stop(const Ids &ids, int graceSeconds) {
    told = {{"", "stop"}, {"ID", textOf(ids)}, {"--after", std::to_string(graceSeconds)}};
    return 0;
}
int syncTasks() {
    told = {{"", "sync"}};
    return 0;
}
int check(bool repair, bool json) {
    told = {{"", "check"}, {"--repair", flag(repair)}, {"--json", flag(json)}};
    return 0;
}
int completeIds() {
    told = {{"", "complete-ids"}};
    return 0;
}

} // namespace tavisched

namespace {

using tavisched::commandFor;
using tavisched::split;

// ---- What is expected of a plain command line ----

// Defaults stand behind "=", and of arguments how many there are.
constexpr std::string_view kTaskUsage =
    "--name= --command= --at= --daily --weekly= --monthly= --yearly= --once= --every= --until= "
    "--owner= --app= --power= --enabled --disabled --allow-overlap --no-overlap --dry-run --quiet "
    "--json";
constexpr size_t kAny = std::numeric_limits<size_t>::max();
constexpr struct {
    std::string_view name, argument;
    size_t least, most;
    std::string_view usage;
} kCommands[] = {
    {"list", "WORD", 0, kAny, "--all --failed --owner= --next= --sort=id --reverse --json"},
    {"show", "ID", 1, 1, "--json"},
    {"history", "ID", 0, 1, "--failed --since= --limit=0 --json"},
    {"log", "ID", 1, 1, "--run= --follow"},
    {"export", "ID", 0, kAny, "--web"},
    {"add", "", 0, 0, kTaskUsage},
    {"edit", "ID", 1, 1, kTaskUsage},
    {"enable", "ID", 1, kAny, ""},
    {"disable", "ID", 1, kAny, ""},
    {"remove", "ID", 1, kAny, "--yes"},
    {"import", "FILE", 1, 1, "--replace --dry-run"},
    {"run", "ID", 0, kAny, "--wait --missed"},
    {"next", "ID", 0, kAny, "--number=0 --until= --all --json"},
    {"calendar", "", 0, 0, "--days=7 --past=1 --hours --all --json"},
    {"stop", "ID", 1, kAny, "--after=10"},
    {"sync", "", 0, 0, ""},
    {"check", "", 0, 0, "--repair --json"},
    {"complete-ids", "", 0, 0, ""}};
constexpr struct {
    std::string_view name;
    uint32_t low, high;
} kNumbers[] = {{"ID", 0, 999999999},     {"--run", 0, 999999999}, {"--limit", 1, 1000000},
                {"--number", 1, 1000000}, {"--days", 1, 366},      {"--past", 0, 366},
                {"--after", 0, 86400}};

enum class Outcome { Given, Refused, Unknown };

// One that could be read otherwise is left to the parser.
Outcome outcomeOf(std::string_view name, const std::string &value) {
    const auto *const row =
        std::find_if(std::begin(kNumbers), std::end(kNumbers),
                     [name](const auto &number) { return number.name == name; });
    if (name == "--sort") {
        return value == "id" || value == "name" ? Outcome::Given : Outcome::Refused;
    }
    if (value.empty() || value.find_first_of("-+[") == 0) {
        return Outcome::Unknown;
    }
    if (row == std::end(kNumbers)) {
        return Outcome::Given;
    }
    const auto number = fuzz::numberIn(value, 9, 0, 999999999);
    if (!number || std::to_string(*number) != value) {
        return Outcome::Unknown;
    }
    return *number >= row->low && *number <= row->high ? Outcome::Given : Outcome::Refused;
}

class Forecast {
  public:
    explicit Forecast(const std::vector<std::string> &arguments) {
        const std::string name = arguments.empty() ? "" : commandFor(arguments.front());
        const auto *const command = std::find_if(std::begin(kCommands), std::end(kCommands),
                                                 [&](const auto &row) { return row.name == name; });
        if (command == std::end(kCommands)) {
            return;
        }
        outcome_ = Outcome::Given;
        given_[std::string(command->argument)] = "";
        given_[""] = name;
        for (const std::string &option : split(command->usage, ' ')) {
            const size_t equals = option.find('=');
            if (!option.empty()) {
                given_[option.substr(0, equals)] =
                    equals == std::string::npos ? "" : option.substr(equals + 1);
                takesValue_[option.substr(0, equals)] = equals != std::string::npos;
            }
        }
        size_t count = 0;
        for (size_t i = 1; i < arguments.size(); ++i) {
            if (!arguments[i].starts_with("--")) {
                ++count;
                add(std::string(command->argument), arguments[i]);
            } else {
                i += takeOption(arguments, i);
            }
        }
        if (outcome_ == Outcome::Given && (count < command->least || count > command->most)) {
            outcome_ = Outcome::Refused;
        }
    }

    Outcome outcome() const { return outcome_; }
    const fuzz::Pairs &given() const { return given_; }

  private:
    void note(Outcome outcome) { outcome_ = std::max(outcome_, outcome); }

    void add(const std::string &name, const std::string &value) {
        note(outcomeOf(name, value));
        given_[name] += (given_[name].empty() ? "" : " ") + value;
    }

    // How many arguments more it takes.
    size_t takeOption(const std::vector<std::string> &arguments, size_t at) {
        const std::string &argument = arguments[at];
        const size_t equals = argument.find('=');
        const std::string name = argument.substr(0, equals);
        const auto known = takesValue_.find(name);
        if (known == takesValue_.end() || (!known->second && equals != std::string::npos)) {
            note(Outcome::Unknown);
            return 0;
        }
        const bool takesNext = known->second && equals == std::string::npos;
        const std::string value = !known->second              ? "yes"
                                  : !takesNext                ? argument.substr(equals + 1)
                                  : at + 1 < arguments.size() ? arguments[at + 1]
                                                              : "";
        note(outcomeOf(name, value));
        given_[name] = value;
        takesValue_.erase(known); // twice is another matter
        return takesNext ? 1 : 0;
    }

    Outcome outcome_ = Outcome::Unknown;
    fuzz::Pairs given_;
    std::map<std::string, bool> takesValue_;
};

void requireForecast(const std::vector<std::string> &arguments, int status) {
    const Forecast forecast(arguments);
    const fuzz::Pairs &told = tavisched::told;
    REQUIRE(forecast.outcome() != Outcome::Refused || (status == 2 && told.empty()));
    REQUIRE(forecast.outcome() != Outcome::Given || told == forecast.given());
}

// ---- What is typed ----

// Those at which something begins or ends.
constexpr const char *kValues[] = {"0",          "1",
                                   "2",          "7",
                                   "9",          "10",
                                   "12",         "13",
                                   "23",         "24",
                                   "29",         "30",
                                   "31",         "32",
                                   "59",         "60",
                                   "365",        "366",
                                   "367",        "1000",
                                   "86400",      "86401",
                                   "1000000",    "1000001",
                                   "00:00",      "09:00",
                                   "09:01",      "23:59",
                                   "24:00",      "7:60",
                                   "8:5",        "02-29",
                                   "02-30",      "04-31",
                                   "12-31",      "00-10",
                                   "13-01",      "2024-05-08",
                                   "2024-05-07", "1969-1-1",
                                   "2100-02-29", "9999-12-31",
                                   "Mon-Fri",    "fri-mon",
                                   "Sunday,tue", "weekend",
                                   "weekdays",   "daily",
                                   "Sat, thurs", "su",
                                   "alice",      "root",
                                   "on",         "off",
                                   "name",       "id",
                                   "a b",        "\u00e4\u202e",
                                   "3",          "4"};

using Random = std::minstd_rand;

template <typename Values> const auto &oneOf(const Values &values, Random &random) {
    return values[random() % std::size(values)];
}

// An option of the command, or another argument.
std::string argumentFor(const std::string &command, Random &random) {
    const auto *const row =
        std::find_if(std::begin(kCommands), std::end(kCommands),
                     [&](const auto &each) { return each.name == commandFor(command); });
    const std::string value = oneOf(kValues, random);
    if (row == std::end(kCommands) || row->usage.empty() || random() % 8 == 0) {
        return value;
    }
    const std::string option = oneOf(split(row->usage, ' '), random);
    const size_t equals = option.find('=');
    return equals == std::string::npos ? option : option.substr(0, equals + 1) + value;
}

// Up to three options of a command.
std::vector<std::string> fresh(Random &random) {
    const auto &command = oneOf(kCommands, random);
    std::vector<std::string> lines(1, std::string(command.name));
    lines.resize(1 + command.least, "3");
    for (uint64_t count = random() % 4; count > 0; --count) {
        lines.push_back(argumentFor(lines.front(), random));
    }
    return lines;
}

// Changes, adds or removes one argument.
std::vector<std::string> mutated(std::vector<std::string> lines, Random &random) {
    if (lines.empty() || random() % 4 == 0) {
        return fresh(random);
    }
    const auto place = lines.begin() + 1 + static_cast<ptrdiff_t>(random() % lines.size());
    const std::string argument = argumentFor(lines.front(), random);
    const uint64_t way = random() % 4;
    if (place == lines.end() || way == 0) {
        lines.insert(place, argument);
    } else if (way == 1) {
        lines.erase(place);
    } else {
        *place = argument;
    }
    return lines;
}

std::vector<std::string> argumentsOf(const std::string &text) {
    std::vector<std::string> arguments = fuzz::linesOf(text);
    for (std::string &argument : arguments) {
        argument.erase(argument.find_last_not_of('\n') + 1);
    }
    return arguments;
}

// ---- Typing ----

// Made once for many inputs, as that takes longer than to read one; but the parser keeps a little
// of all that it reads.
tavisched::CommandLine &commandLine() {
    constexpr int kMost = 1000;
    static std::optional<tavisched::CommandLine> line;
    static int typed = 0;
    if (typed++ % kMost == 0) {
        line.emplace();
    }
    return *line;
}

int type(std::vector<std::string> arguments) {
    std::vector<char *> argv = {const_cast<char *>("tavisched")};
    std::transform(arguments.begin(), arguments.end(), std::back_inserter(argv),
                   [](std::string &argument) { return argument.data(); });
    argv.push_back(nullptr);
    return commandLine().run(static_cast<int>(argv.size()) - 1, argv.data());
}

} // namespace

void fuzz::test(Input input) {
    const std::vector<std::string> arguments = argumentsOf(input.text());
    char *said = nullptr;
    size_t length = 0;
    FILE *const standard = stderr;
    stderr = open_memstream(&said, &length);
    std::cout.setstate(std::ios::failbit); // no help
    tavisched::told.clear();
    const int status = type(arguments);
    std::fclose(std::exchange(stderr, standard));
    const std::string text = said;
    std::free(said);
    REQUIRE(status >= 0 && status <= 2);
    REQUIRE((status == 0) == text.empty());
    REQUIRE(text == tavisched::printableLines(text));
    requireForecast(arguments, status);
}

extern "C" {

size_t LLVMFuzzerMutate(uint8_t *data, size_t size, size_t most);

// Mostly what the bytes mean, else the bytes.
size_t LLVMFuzzerCustomMutator(uint8_t *data, size_t size, size_t most, unsigned int seed) {
    Random random(seed);
    random.discard(2);
    if (random() % 4 == 0) {
        return LLVMFuzzerMutate(data, size, most);
    }
    const auto lines = mutated(argumentsOf(fuzz::Input(data, size).text()), random);
    const std::string text = tavisched::join(lines, "\n").substr(0, most);
    std::copy(text.begin(), text.end(), data);
    return text.size();
}

} // extern "C"
