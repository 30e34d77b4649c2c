// The subcommands of tavisched with their options, and the exit status.
#include "command_line.h"
#include "commands/commands.h"
#include "failure.h"
#include "tasks/change.h"
#include "text/utf8.h"
#include "waiting.h"
#include "json/json.h"
#include "json/plain.h"

#include <CLI/CLI.hpp>
#include <algorithm>
#include <charconv>
#include <cstdio>
#include <cstdlib>
#include <functional>
#include <optional>
#include <string>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

namespace tavisched {

namespace {

constexpr const char *kVersion = "tavisched " TAVISCHED_VERSION;

using Command = std::function<int()>;

// Makes a subcommand that leaves its work in `command` when it is the one that was typed.
CLI::App *subcommand(CLI::App &app, Command &command, const char *name, const char *what,
                     const char *example, Command work) {
    CLI::App *const sub = app.add_subcommand(name, what);
    sub->fallthrough(); // --verbose may stand behind the command too
    sub->footer(std::string("Example:\n  ") + example);
    sub->final_callback([&command, work = std::move(work)] { command = work; });
    return sub;
}

// ---- Options of several subcommands ----

struct Settings {
    ListOptions list;
    TaskOptions task;
    ImportOptions import;
    std::vector<std::string> ids;
    std::string id;
    HistoryOptions history;
    std::string run;
    int after = 10;
    NextOptions next;
    CalendarOptions calendar;
    Manner manner;
    RunOptions running;
    bool json = false, web = false, yes = false, repair = false, follow = false;
};

// A number as it was typed; digits alone, as lists show it.
template <typename Number>
Number parseNumber(const std::string &text, const char *what, const char *command) {
    Number number = 0;
    const auto parsed = std::from_chars(text.data(), text.data() + text.size(), number);
    if (parsed.ec != std::errc() || parsed.ptr != text.data() + text.size()) {
        throw Refusal("\"" + printable(text) + "\" is no " + what +
                      "; accepted: a number as \"tavisched " + command + "\" shows it");
    }
    return number;
}

int32_t parseId(const std::string &text) {
    return parseNumber<int32_t>(text, "id", "list");
}

std::optional<int64_t> parseRun(const std::string &text) {
    return text.empty() ? std::nullopt
                        : std::optional(parseNumber<int64_t>(text, "run", "history"));
}

Ids parseIds(const std::vector<std::string> &texts) {
    Ids ids;
    std::transform(texts.begin(), texts.end(), std::back_inserter(ids), parseId);
    return ids;
}

void idsOption(CLI::App *sub, std::vector<std::string> &ids, bool required) {
    sub->add_option("ID", ids, "ids of tasks")->required(required);
}

void jsonOption(CLI::App *sub, bool &json, const char *what = "as JSON for scripts") {
    sub->add_flag("--json", json, what);
}

// For commands that print no tasks. How a command fails is decided by the option as it was typed.
void jsonErrorsOption(CLI::App *sub, Settings &given) {
    jsonOption(sub, given.json, "errors as JSON for scripts");
}

void taskOptions(CLI::App *sub, TaskOptions &options) {
    sub->add_option("--name", options.name, "what the task is called")->type_name("TEXT");
    sub->add_option("--command", options.command, "shell command to run")->type_name("TEXT");
    sub->add_option("--at", options.at, "time of the day")->type_name("HH:MM");
    sub->add_flag("--daily", options.daily, "run every day");
    sub->add_option("--weekly", options.weekly, "run on these days of the week")
        ->type_name("Mon-Fri");
    sub->add_option("--monthly", options.monthly, "run on this day of the month")->type_name("DAY");
    sub->add_option("--yearly", options.yearly, "run on this day of the year")->type_name("MM-DD");
    sub->add_option("--once", options.once, "run on this day alone")->type_name("YYYY-MM-DD");
    sub->add_option("--every", options.every,
                    "run again every so many hours of the day; 0 stops that")
        ->type_name("HOURS");
    sub->add_option("--until", options.until, "last hour at which that may start")->type_name("HH");
    sub->add_option("--owner", options.owner, "user that the command runs as")->type_name("USER");
    sub->add_option("--app", options.app, "application that the task belongs to")->type_name("ID");
    sub->add_flag("--enabled", options.enabled, "run it when it is due");
    sub->add_flag("--disabled", options.disabled, "keep it without running it");
    sub->add_flag("--allow-overlap", options.allowOverlap,
                  "start it also while an earlier run goes on");
    sub->add_flag("--no-overlap", options.noOverlap, "wait for an earlier run");
    sub->add_option("--power", options.power, "switch the machine on or off")->type_name("on|off");
}

void mannerOptions(CLI::App *sub, Manner &manner) {
    sub->add_flag("--dry-run", manner.dryRun, "show what would come of it, store nothing");
    sub->add_flag("-q,--quiet", manner.quiet, "print the id alone");
    jsonOption(sub, manner.json, "the task, and errors, as JSON for scripts");
}

// ---- Subcommands ----

void addListCommand(CLI::App &app, Settings &given, Command &command) {
    auto *const listing =
        subcommand(app, command, "list", "show the tasks", "tavisched list --sort next",
                   [&] { return list(given.list); });
    listing->add_option("WORD", given.list.words,
                        "only tasks with this in name, owner or application, or of this state");
    listing->add_flag("--all", given.list.all, "also those that are not listable");
    listing->add_flag("--failed", given.list.failed, "only those whose last run failed");
    listing->add_option("--owner", given.list.owner, "only those of this user")->type_name("USER");
    listing->add_option("--next", given.list.next, "only those that run within this time")
        ->type_name("24h");
    listing->add_option("--sort", given.list.sort, "field to sort by")
        ->check(CLI::IsMember(sortFields()));
    listing->add_flag("--reverse", given.list.reverse, "the other way round");
    jsonOption(listing, given.list.json);
}

void addRunReadingCommands(CLI::App &app, Settings &given, Command &command) {
    auto *const past = subcommand(app, command, "history", "show what runs did, newest first",
                                  "tavisched history 3 --since 7d", [&] {
                                      if (!given.ids.empty()) {
                                          given.history.id = parseId(given.ids.front());
                                      }
                                      return history(given.history);
                                  });
    past->add_option("ID", given.ids, "id of a task; without it, of all")->expected(0, 1);
    past->add_flag("--failed", given.history.failed, "only those without a good end");
    past->add_option("--since", given.history.since, "only those since then")
        ->type_name("7d|YYYY-MM-DD");
    past->add_option("--limit", given.history.limit, "at most so many")
        ->type_name("NUMBER")
        ->check(CLI::Range(1, 1000000));
    jsonOption(past, given.history.json, "as JSON for scripts, a line each");

    auto *const output = subcommand(
        app, command, "log", "show what the last run of a task printed", "tavisched log 3 --follow",
        [&] { return log(parseId(given.id), parseRun(given.run), given.follow); });
    output->add_option("ID", given.id, "id of the task")->required();
    output->add_option("--run", given.run, "that run instead of the last one")->type_name("NUMBER");
    output->add_flag("--follow", given.follow, "go on until the run ends");
}

void addTimeCommands(CLI::App &app, Settings &given, Command &command) {
    auto *const coming = subcommand(app, command, "next", "show when tasks will be started",
                                    "tavisched next --until 24h", [&] {
                                        given.next.ids = parseIds(given.ids);
                                        return next(given.next);
                                    });
    idsOption(coming, given.ids, false);
    coming
        ->add_option("-n,--number", given.next.number,
                     "at most so many starts; 10, or with --until all")
        ->type_name("NUMBER")
        ->check(CLI::Range(1, 1000000));
    coming->add_option("--until", given.next.until, "only those until then, a date as a whole")
        ->type_name("YYYY-MM-DD|7d");
    coming->add_flag("--all", given.next.all, "also of tasks that are not listable");
    jsonOption(coming, given.next.json, "as JSON for scripts, a line each");

    auto *const timeline =
        subcommand(app, command, "calendar", "show past and coming runs on a timeline",
                   "tavisched calendar --days 2 --hours", [&] { return calendar(given.calendar); });
    timeline->add_option("--days", given.calendar.days, "so many days, today the first; 7")
        ->type_name("NUMBER")
        ->check(CLI::Range(1, 366));
    timeline->add_option("--past", given.calendar.past, "and so many before today; 1")
        ->type_name("NUMBER")
        ->check(CLI::Range(0, 366));
    timeline->add_flag("--hours", given.calendar.hours,
                       "columns of an hour or less, one part below the other");
    timeline->add_flag("--all", given.calendar.all, "also tasks that are not listable");
    jsonOption(timeline, given.calendar.json);
}

void addReadingCommands(CLI::App &app, Settings &given, Command &command) {
    addListCommand(app, given, command);

    auto *const showing =
        subcommand(app, command, "show", "show every field of a task", "tavisched show 3",
                   [&] { return show(parseId(given.id), given.json); });
    showing->add_option("ID", given.id, "id of the task")->required();
    jsonOption(showing, given.json);

    addTimeCommands(app, given, command);
    addRunReadingCommands(app, given, command);

    auto *const exporting = subcommand(app, command, "export", "write tasks as a JSON array",
                                       "tavisched export > tasks.json",
                                       [&] { return exportTasks(parseIds(given.ids), given.web); });
    idsOption(exporting, given.ids, false);
    exporting->add_flag("--web", given.web, "as the web back end exchanges them");
}

void addChangingCommands(CLI::App &app, Settings &given, Command &command) {
    auto *const adding =
        subcommand(app, command, "add", "store a new task",
                   "tavisched add --name Backup --command /usr/local/bin/backup --weekly Mon,Fri "
                   "--at 22:00 --owner alice",
                   [&] { return add(given.task, given.manner); });
    taskOptions(adding, given.task);
    mannerOptions(adding, given.manner);

    auto *const editing =
        subcommand(app, command, "edit", "change a task; what is left out keeps its value",
                   "tavisched edit 3 --at 23:30 --every 0",
                   [&] { return edit(parseId(given.id), given.task, given.manner); });
    editing->add_option("ID", given.id, "id of the task")->required();
    taskOptions(editing, given.task);
    mannerOptions(editing, given.manner);

    auto *const enabling =
        subcommand(app, command, "enable", "let tasks run when they are due",
                   "tavisched enable 3 4", [&] { return setEnabled(parseIds(given.ids), true); });
    auto *const disabling =
        subcommand(app, command, "disable", "keep tasks without running them",
                   "tavisched disable 3", [&] { return setEnabled(parseIds(given.ids), false); });
    for (CLI::App *const sub : {enabling, disabling}) {
        idsOption(sub, given.ids, true);
        jsonErrorsOption(sub, given);
    }

    auto *const removing =
        subcommand(app, command, "remove", "remove tasks", "tavisched remove 3 4 --yes",
                   [&] { return removeTasks(parseIds(given.ids), given.yes); });
    idsOption(removing, given.ids, true);
    removing->add_flag("-y,--yes", given.yes, "do not ask; needed without a terminal");
    jsonErrorsOption(removing, given);

    auto *const importing =
        subcommand(app, command, "import", "store the tasks of a JSON array, all or none",
                   "tavisched import tasks.json", [&] { return importTasks(given.import); });
    importing->add_option("FILE", given.import.file, "file to read; - is standard input")
        ->required();
    importing->add_flag("--replace", given.import.replace,
                        "overwrite tasks of the same id and name");
    importing->add_flag("--dry-run", given.import.dryRun,
                        "show what would come of it, store nothing");
    jsonErrorsOption(importing, given);
}

void addMachineCommands(CLI::App &app, Settings &given, Command &command) {
    auto *const running = subcommand(app, command, "run", "run tasks now, in the background",
                                     "tavisched run 3 --wait",
                                     [&] { return run(parseIds(given.ids), given.running); });
    idsOption(running, given.ids, false);
    running->add_flag("--wait", given.running.wait,
                      "wait for the end, show the output and exit as the command");
    running->add_flag("--missed", given.running.missed,
                      "those that missed their last time, each once");
    jsonErrorsOption(running, given);

    auto *const stopping =
        subcommand(app, command, "stop", "end running tasks", "tavisched stop 3 --after 60",
                   [&] { return stop(parseIds(given.ids), given.after); });
    idsOption(stopping, given.ids, true);
    stopping->add_option("--after", given.after, "kill what is left after so many seconds")
        ->type_name("SECONDS")
        ->check(CLI::Range(0, 86400));
    jsonErrorsOption(stopping, given);

    subcommand(app, command, "sync", "write the lines of /etc/crontab anew", "tavisched sync",
               [] { return syncTasks(); });

    auto *const checking =
        subcommand(app, command, "check", "look for what is wrong with this machine",
                   "tavisched check --repair", [&] { return check(given.repair, given.json); });
    checking->add_flag("--repair", given.repair, "repair what needs no person");
    jsonOption(checking, given.json, "as JSON for scripts, a line each");

    subcommand(app, command, "complete-ids", "ids and names, for completion",
               "tavisched complete-ids", [] { return completeIds(); })
        ->group(""); // not shown
}

// ---- What was not understood ----

// Letters that must be added, left out, changed or exchanged with the next one.
size_t distance(const std::string &one, const std::string &other) {
    const size_t width = other.size() + 1;
    std::vector<size_t> steps((one.size() + 1) * width);
    const auto at = [&](size_t i, size_t j) -> size_t & { return steps[i * width + j]; };
    for (size_t i = 0; i <= one.size(); ++i) {
        for (size_t j = 0; j <= other.size(); ++j) {
            if (i == 0 || j == 0) {
                at(i, j) = i + j;
                continue;
            }
            const bool isSame = one[i - 1] == other[j - 1];
            at(i, j) =
                std::min({at(i - 1, j) + 1, at(i, j - 1) + 1, at(i - 1, j - 1) + (isSame ? 0 : 1)});
            if (i > 1 && j > 1 && one[i - 1] == other[j - 2] && one[i - 2] == other[j - 1]) {
                at(i, j) = std::min(at(i, j), at(i - 2, j - 2) + 1);
            }
        }
    }
    return at(one.size(), other.size());
}

// "; did you mean ...?", or "" when nothing is near.
std::string suggest(const std::string &typed, const std::vector<std::string> &known) {
    const std::string *nearest = nullptr;
    size_t least = std::max<size_t>(1, typed.size() / 3) + 1;
    for (const std::string &name : known) {
        if (const size_t steps = distance(typed, name); steps < least) {
            nearest = &name;
            least = steps;
        }
    }
    return nearest ? "; did you mean \"" + *nearest + "\"?" : "";
}

std::vector<std::string> optionsOf(const CLI::App &app) {
    std::vector<std::string> names;
    for (const CLI::Option *const option : app.get_options()) {
        for (const std::string &name : option->get_lnames()) {
            names.push_back("--" + name);
        }
    }
    return names;
}

std::vector<std::string> commandsOf(const CLI::App &app) {
    std::vector<std::string> names;
    for (const CLI::App *const sub : app.get_subcommands(nullptr)) {
        if (!sub->get_group().empty()) {
            names.push_back(sub->get_name());
        }
    }
    return names;
}

std::string explainExtras(const CLI::App &app, const CLI::App *sub) {
    const std::vector<std::string> extras = app.remaining();
    const std::string first = extras.empty() ? "" : extras.front();
    if (!first.starts_with('-')) {
        return sub ? "\"" + join(extras, " ") + "\" is not expected"
                   : "there is no command \"" + first + "\"" + suggest(first, commandsOf(app));
    }
    std::vector<std::string> known = optionsOf(app);
    const std::vector<std::string> subs = sub ? optionsOf(*sub) : std::vector<std::string>();
    known.insert(known.end(), subs.begin(), subs.end());
    return "\"" + join(extras, " ") + "\" is not understood" +
           suggest(first.substr(0, first.find('=')), known);
}

// How the command line is wrong, and where its help is.
std::string explain(const CLI::App &app, const CLI::ParseError &error) {
    const auto parsed = app.get_subcommands();
    const CLI::App *const sub = parsed.empty() ? nullptr : parsed.front();
    const bool isExtra = dynamic_cast<const CLI::ExtrasError *>(&error) != nullptr;
    return printable(isExtra ? explainExtras(app, sub) : error.what()) + "\n\"tavisched " +
           (sub ? sub->get_name() + " " : "") + "--help\" tells more.";
}

// The option that the parser's message begins with.
std::string optionNamed(const std::string &message) {
    const size_t end = message.find(':');
    return message.starts_with("--") && end != std::string::npos ? message.substr(2, end - 2) : "";
}

// The arguments without the program's name, the last one first, as the parser takes them.
std::vector<std::string> argumentsOf(int argc, char **argv) {
    std::vector<std::string> arguments(argv + std::min(argc, 1), argv + argc);
    const auto command =
        std::find_if(arguments.begin(), arguments.end(),
                     [](const std::string &argument) { return !argument.starts_with('-'); });
    if (command != arguments.end()) {
        *command = commandFor(*command);
    }
    std::reverse(arguments.begin(), arguments.end());
    return arguments;
}

// ---- Executing ----

// Tells of the end without success, as JSON when the command was asked to print that.
class Failing {
  public:
    explicit Failing(bool json) : json_(json) {}

    int with(const std::string &what, int status, const std::string &option = "") const {
        std::fflush(stdout);
        if (json_) {
            Json::Value error;
            error["error"] = plainText(what);
            error["option"] = option.empty() ? Json::Value() : Json::Value(option);
            error["status"] = status;
            std::fprintf(stderr, "%s\n", jsonLine(error).c_str());
        } else {
            std::fprintf(stderr, "tavisched: %s\n", printableLines(what).c_str());
        }
        return status;
    }
    int with(const Refusal &refusal) const {
        return with(refusal.what(), Refusal::kExitStatus, refusal.option);
    }

  private:
    bool json_;
};

// What fails behind a change that is stored has not undone it.
std::string withDone(const char *what) {
    return (Change::isStored() ? "what was asked for was done, but " : "") + std::string(what);
}

int execute(const Command &command, const Failing &fail) {
    try {
        if (geteuid() != 0) {
            throw Failure("tasks are kept in root's files: it must be run by root");
        }
        tellOfWaiting();
        const int status = command();
        return std::fflush(stdout) == 0 && std::ferror(stdout) == 0
                   ? status
                   : fail.with("what was asked for was done, but the output could not be written",
                               Failure::kExitStatus);
    } catch (const Refusal &refusal) {
        return fail.with(refusal);
    } catch (const std::bad_alloc &) {
        throw; // there is none for words either
    } catch (const std::exception &failure) {
        return fail.with(withDone(failure.what()), Failure::kExitStatus);
    }
}

} // namespace

// The options and subcommands, and what was typed of them.
struct CommandLine::Parts {
    CLI::App app{"Scheduled tasks: list, change and run them, and check the machine.", "tavisched"};
    Settings given;
    Command command;
    bool verbose = false;
};

CommandLine::CommandLine() : parts_(std::make_unique<Parts>()) {
    CLI::App &app = parts_->app;
    app.set_version_flag("--version", kVersion);
    app.add_flag("-v,--verbose", parts_->verbose, "show the library's log lines on standard error");
    app.footer("\"ls\" and \"rm\" stand for list and remove.\n"
               "\"tavisched COMMAND --help\" shows a command's options and an example.");
    app.require_subcommand(0, 1);
    addReadingCommands(app, parts_->given, parts_->command);
    addChangingCommands(app, parts_->given, parts_->command);
    addMachineCommands(app, parts_->given, parts_->command);
}

CommandLine::~CommandLine() = default;

int CommandLine::run(int argc, char **argv) {
    std::vector<std::string> arguments = argumentsOf(argc, argv);
    const Failing fail(std::find(arguments.begin(), arguments.end(), "--json") != arguments.end());
    parts_->given = {};
    parts_->command = nullptr;
    parts_->verbose = false;
    try {
        parts_->app.parse(std::move(arguments));
    } catch (const CLI::ParseError &error) {
        return error.get_exit_code() == 0
                   ? parts_->app.exit(error)
                   : fail.with(Refusal(explain(parts_->app, error), optionNamed(error.what())));
    }
    if (!parts_->command) {
        return fail.with(Refusal("a command is needed; \"tavisched --help\" lists them"));
    }
    unsetenv("TZ"); // times are the machine's, as cron takes them
    umask(022);
    openlog("tavisched", LOG_PID | (parts_->verbose ? LOG_PERROR : 0), LOG_USER);
    return execute(parts_->command, fail);
}

std::string commandFor(const std::string &typed) {
    return typed == "ls" ? "list" : typed == "rm" ? "remove" : typed;
}

} // namespace tavisched
