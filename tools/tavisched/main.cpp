// tavisched, the command line of the task scheduler: its subcommands with their options, and the
// exit status.
#include "commands.h"
#include "failure.h"
#include "text.h"

#include <CLI/CLI.hpp>
#include <algorithm>
#include <charconv>
#include <cstdio>
#include <cstdlib>
#include <functional>
#include <limits>
#include <string>
#include <sys/stat.h>
#include <syslog.h>

namespace {

using namespace tavisched;

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

// An id as it was typed; digits alone, as lists show it.
int32_t parseId(const std::string &text) {
    int32_t id = 0;
    const auto parsed = std::from_chars(text.data(), text.data() + text.size(), id);
    if (parsed.ec != std::errc() || parsed.ptr != text.data() + text.size()) {
        throw Refusal("\"" + printable(text) + "\" is no id; accepted: a number as \"tavisched " +
                      "list\" shows it");
    }
    return id;
}

Ids parseIds(const std::vector<std::string> &texts) {
    Ids ids;
    std::transform(texts.begin(), texts.end(), std::back_inserter(ids), parseId);
    return ids;
}

void idsOption(CLI::App *sub, std::vector<std::string> &ids, bool required) {
    sub->add_option("ID", ids, "ids of tasks")->required(required);
}

void jsonOption(CLI::App *sub, bool &json, const char *what) {
    sub->add_flag("--json", json, what);
}

void taskOptions(CLI::App *sub, TaskOptions &options) {
    sub->add_option("--name", options.name, "what the task is called")->type_name("TEXT");
    sub->add_option("--command", options.command, "shell command to run")->type_name("TEXT");
    sub->add_option("--at", options.at, "time of the day")->type_name("HH:MM");
    sub->add_flag("--daily", options.daily, "run every day");
    sub->add_option("--weekly", options.weekly, "run on these days of the week")
        ->type_name("Mon,Fri");
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

// ---- Subcommands ----

struct Settings {
    ListOptions list;
    TaskOptions task;
    std::vector<std::string> ids;
    std::string id;
    int limit = std::numeric_limits<int>::max();
    std::string file;
    bool json = false, dryRun = false, quiet = false, yes = false, wait = false, repair = false;
};

void addReadingCommands(CLI::App &app, Settings &given, Command &command) {
    auto *const listing =
        subcommand(app, command, "list", "show the tasks", "tavisched list --sort next",
                   [&] { return list(given.list); });
    listing->add_flag("--all", given.list.all, "also those that are not listable");
    listing->add_option("--sort", given.list.sort, "field to sort by")
        ->check(CLI::IsMember(sortFields()));
    listing->add_flag("--reverse", given.list.reverse, "the other way round");
    jsonOption(listing, given.list.json, "as JSON for scripts");

    auto *const showing =
        subcommand(app, command, "show", "show every field of a task", "tavisched show 3",
                   [&] { return show(parseId(given.id), given.json); });
    showing->add_option("ID", given.id, "id of the task")->required();
    jsonOption(showing, given.json, "as the web back end exchanges it");

    auto *const past =
        subcommand(app, command, "history", "show how runs ended, newest first",
                   "tavisched history 3 --limit 10", [&] {
                       return history(given.ids.empty() ? std::nullopt
                                                        : std::optional(parseId(given.ids.front())),
                                      static_cast<size_t>(given.limit), given.json);
                   });
    past->add_option("ID", given.ids, "id of a task; without it, of all")->expected(0, 1);
    past->add_option("--limit", given.limit, "at most so many")
        ->type_name("NUMBER")
        ->check(CLI::Range(1, 1000000));
    jsonOption(past, given.json, "as JSON for scripts");

    auto *const exporting = subcommand(app, command, "export", "write tasks as a JSON array",
                                       "tavisched export > tasks.json",
                                       [&] { return exportTasks(parseIds(given.ids)); });
    idsOption(exporting, given.ids, false);
}

void addChangingCommands(CLI::App &app, Settings &given, Command &command) {
    auto *const adding =
        subcommand(app, command, "add", "store a new task",
                   "tavisched add --name Backup --command /usr/local/bin/backup --weekly Mon,Fri "
                   "--at 22:00 --owner alice",
                   [&] { return add(given.task, given.dryRun, given.quiet); });
    taskOptions(adding, given.task);
    adding->add_flag("--dry-run", given.dryRun, "show crontab line and next run, store nothing");
    adding->add_flag("-q,--quiet", given.quiet, "print the id alone");

    auto *const editing =
        subcommand(app, command, "edit", "change a task; what is left out keeps its value",
                   "tavisched edit 3 --at 23:30 --every 0",
                   [&] { return edit(parseId(given.id), given.task, given.quiet); });
    editing->add_option("ID", given.id, "id of the task")->required();
    taskOptions(editing, given.task);
    editing->add_flag("-q,--quiet", given.quiet, "print the id alone");

    idsOption(subcommand(app, command, "enable", "let tasks run when they are due",
                         "tavisched enable 3 4",
                         [&] { return setEnabled(parseIds(given.ids), true); }),
              given.ids, true);
    idsOption(subcommand(app, command, "disable", "keep tasks without running them",
                         "tavisched disable 3",
                         [&] { return setEnabled(parseIds(given.ids), false); }),
              given.ids, true);

    auto *const removing =
        subcommand(app, command, "remove", "remove tasks", "tavisched remove 3 4 --yes",
                   [&] { return removeTasks(parseIds(given.ids), given.yes); });
    idsOption(removing, given.ids, true);
    removing->add_flag("-y,--yes", given.yes, "do not ask");

    subcommand(app, command, "import", "store the tasks of a JSON array, all or none",
               "tavisched import tasks.json", [&] { return importTasks(given.file); })
        ->add_option("FILE", given.file, "file to read; - is standard input")
        ->required();
}

void addMachineCommands(CLI::App &app, Settings &given, Command &command) {
    auto *const running =
        subcommand(app, command, "run", "run tasks now, in the background",
                   "tavisched run 3 --wait", [&] { return run(parseIds(given.ids), given.wait); });
    idsOption(running, given.ids, true);
    running->add_flag("--wait", given.wait, "wait for the end and exit with the command's result");

    subcommand(app, command, "sync", "write the lines of /etc/crontab anew", "tavisched sync",
               [] { return syncTasks(); });

    subcommand(app, command, "check", "look for what is wrong with this machine",
               "tavisched check --repair", [&] { return check(given.repair); })
        ->add_flag("--repair", given.repair, "mend what is safe to mend");

    subcommand(app, command, "complete-ids", "ids and names, for completion",
               "tavisched complete-ids", [] { return completeIds(); })
        ->group(""); // not shown
}

int fail(const std::exception &error, int status) {
    std::fflush(stdout);
    std::fprintf(stderr, "tavisched: %s\n", error.what());
    return status;
}

int execute(const Command &command) {
    try {
        const int status = command();
        if (std::fflush(stdout) != 0 || std::ferror(stdout) != 0) {
            throw Failure("what was asked for was done, but the output could not be written");
        }
        return status;
    } catch (const Refusal &refusal) {
        return fail(refusal, Refusal::kExitStatus);
    } catch (const std::exception &failure) {
        return fail(failure, Failure::kExitStatus);
    }
}

// Parses the command line and executes what it asks for.
int tavischedMain(int argc, char **argv) {
    CLI::App app("Scheduled tasks: list, change and run them, and check the machine.", "tavisched");
    Settings given;
    Command command;
    bool verbose = false;
    app.set_version_flag("--version", kVersion);
    app.add_flag("-v,--verbose", verbose, "show the library's log lines on standard error");
    app.footer("\"tavisched COMMAND --help\" shows a command's options and an example.");
    app.require_subcommand(0, 1);
    app.failure_message([](const CLI::App *, const CLI::Error &error) {
        return std::string("tavisched: ") + error.what() + "\n\"tavisched --help\" tells more.\n";
    });
    addReadingCommands(app, given, command);
    addChangingCommands(app, given, command);
    addMachineCommands(app, given, command);
    try {
        app.parse(argc, argv);
    } catch (const CLI::ParseError &error) {
        return app.exit(error) == 0 ? 0 : Refusal::kExitStatus;
    }
    if (!command) {
        return fail(Refusal("a command is needed; \"tavisched --help\" lists them"),
                    Refusal::kExitStatus);
    }
    unsetenv("TZ"); // times are the machine's, as cron takes them
    umask(022);
    openlog("tavisched", LOG_PID | (verbose ? LOG_PERROR : 0), LOG_USER);
    return execute(command);
}

} // namespace

int main(int argc, char **argv) {
    try {
        return tavischedMain(argc, argv);
    } catch (const std::exception &error) {
        return fail(error, Failure::kExitStatus);
    }
}
