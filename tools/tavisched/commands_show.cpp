// The subcommands that only read: list, show, history, export.
#include "commands.h"
#include "failure.h"
#include "json.h"
#include "lock.h"
#include "runs.h"
#include "table.h"
#include "task_lines.h"
#include "tasks.h"
#include "text.h"
#include "words.h"

#include <algorithm>
#include <array>
#include <cstdio>
#include <ctime>
#include <functional>
#include <iostream>
#include <map>
#include <strings.h>

namespace tavisched {

namespace {

using LatestRuns = std::map<int32_t, Run>;

// Both are held together by the lock only while they are read.
struct Stored {
    Tasks tasks;
    LatestRuns runs;
};

// Tasks are shown also when nothing is known of their runs.
Stored readAll() {
    const Lock lock(Lock::Kind::Reading);
    Stored stored{.tasks = Tasks::read(), .runs = {}};
    try {
        stored.runs = readLatestRuns();
    } catch (const Failure &failure) {
        std::cerr << "tavisched: warning: " << failure.what() << "\n";
    }
    return stored;
}

Style styleOf(const Run &run) {
    switch (run.code) {
    case SCHED_STATUS_CODE_SUCCESS:
        return Style::Good;
    case SCHED_STATUS_CODE_RUNNING:
        return Style::Busy;
    default:
        return Style::Bad;
    }
}

std::string resultWithTime(const Run &run) {
    const std::string result = resultInWords(run);
    return run.code == SCHED_STATUS_CODE_RUNNING ? result
                                                 : result + " " + ago(run.start, time(nullptr));
}

std::string stateName(const TAVI_SCHED_TASK &task) {
    const char *const name = TAVISchedEnumToName(TAVISchedStateTable, task.state);
    return name ? name : std::to_string(task.state);
}

// ---- list ----

using Before = std::function<bool(const TAVI_SCHED_TASK &, const TAVI_SCHED_TASK &)>;

// In rising order, in which tasks without a next or a last run come last.
std::map<std::string, Before> orders(const LatestRuns &runs) {
    const auto lastStart = [&runs](const TAVI_SCHED_TASK &task) {
        const auto run = runs.find(task.id);
        return run == runs.end() ? 0 : run->second.start;
    };
    return {{"id", [](auto &one, auto &other) { return one.id < other.id; }},
            {"name", [](auto &one, auto &other) { return strcasecmp(one.name, other.name) < 0; }},
            {"state", [](auto &one, auto &other) { return one.state > other.state; }},
            {"schedule",
             [](auto &one, auto &other) { return scheduleInWords(one) < scheduleInWords(other); }},
            {"next",
             [](auto &one, auto &other) {
                 return nextRun(one).value_or("never") < nextRun(other).value_or("never");
             }},
            {"owner",
             [](auto &one, auto &other) { return ownerName(one.owner) < ownerName(other.owner); }},
            {"last", [=](auto &one, auto &other) { return lastStart(one) > lastStart(other); }}};
}

Row listRow(const TAVI_SCHED_TASK &task, const LatestRuns &runs) {
    const bool enabled = task.state == TAVI_SCHED_STATE_ENABLED;
    const auto run = runs.find(task.id);
    return {{std::to_string(task.id)},
            {printable(task.name)},
            {stateName(task), enabled ? Style::Plain : Style::Faint},
            {printable(scheduleInWords(task))},
            {nextRun(task).value_or("-")},
            {printable(ownerName(task.owner))},
            run == runs.end() ? Cell{"-"}
                              : Cell{printable(resultWithTime(run->second)), styleOf(run->second)}};
}

// The tasks to list, in order.
std::vector<const TAVI_SCHED_TASK *> chosen(const Stored &stored, const ListOptions &options) {
    std::vector<const TAVI_SCHED_TASK *> shown;
    for (const TAVI_SCHED_TASK *const task : stored.tasks.all()) {
        if (options.all || task->listable == 1) {
            shown.push_back(task);
        }
    }
    const Before before = orders(stored.runs).at(options.sort);
    std::stable_sort(shown.begin(), shown.end(),
                     [&](const auto *one, const auto *other) { return before(*one, *other); });
    if (options.reverse) {
        std::reverse(shown.begin(), shown.end());
    }
    return shown;
}

void printList(const std::vector<const TAVI_SCHED_TASK *> &shown, const LatestRuns &runs) {
    std::vector<Row> rows;
    rows.reserve(shown.size());
    for (const TAVI_SCHED_TASK *const task : shown) {
        rows.push_back(listRow(*task, runs));
    }
    printTable({{"ID", true},
                {"NAME", false, true},
                {"STATE"},
                {"SCHEDULE", false, true},
                {"NEXT RUN"},
                {"OWNER", false, true},
                {"LAST RUN", false, true}},
               std::move(rows));
}

// ---- show ----

void printField(const char *title, const std::string &text) {
    std::printf("%s  %s\n",
                styled(title + std::string(13 - widthOf(title), ' '), Style::Faint).c_str(),
                text.c_str());
}

std::string orDash(const char *text) {
    return *text == '\0' ? "-" : printable(text);
}

// A command may have several lines; the following ones stand below the first.
std::string commandInLines(const char *command) {
    std::vector<std::string> lines;
    for (const std::string &line : split(command, '\n')) {
        lines.push_back(printable(line));
    }
    return lines.size() == 1 && lines.front().empty() ? "-"
                                                      : join(lines, "\n" + std::string(15, ' '));
}

std::string permissionsInWords(const TAVI_SCHED_TASK &task) {
    std::vector<std::string> parts;
    const struct {
        const char *what;
        int32_t allowed;
    } kPermissions[] = {{"listed", task.listable},     {"edited", task.canEditFromUI},
                        {"renamed", task.canEditName}, {"given another owner", task.canEditOwner},
                        {"run", task.canRunFromUI},    {"deleted", task.canDeleteFromUI}};
    for (const auto &[what, allowed] : kPermissions) {
        if (allowed == 1) {
            parts.emplace_back(what);
        }
    }
    return parts.empty() ? "may not be touched" : "may be " + join(parts, ", ");
}

std::string overlapInWords(const TAVI_SCHED_TASK &task) {
    return std::string(task.canRunTaskSameTime == 1 ? "may start" : "waits") +
           " while an earlier run goes on, " +
           (task.canRunAppSameTime == 1 ? "may start" : "waits") +
           " while another task of its application runs";
}

std::string lastRunInWords(const LatestRuns &runs, int32_t id) {
    const auto run = runs.find(id);
    if (run == runs.end()) {
        return "none known since the machine was started";
    }
    return resultInWords(run->second) + ", started " + localTime(run->second.start) + " (" +
           ago(run->second.start, time(nullptr)) + ")";
}

// Looked at by once, monthly and yearly schedules.
std::string firstDay(const TAVI_SCHED_TASK &task) {
    if (task.startDay == 0) {
        return "-";
    }
    std::array<char, 40> text{};
    std::snprintf(text.data(), text.size(), "%04u-%02u-%02u", task.startYear, task.startMonth,
                  task.startDay);
    return text.data();
}

void printTask(const TAVI_SCHED_TASK &task, const LatestRuns &runs) {
    const bool enabled = task.state == TAVI_SCHED_STATE_ENABLED;
    std::printf("%s\n", styled("Task " + std::to_string(task.id) + ": " + printable(task.name),
                               Style::Strong)
                            .c_str());
    printField("Kind", isPower(task) ? "power schedule (taviautopower)" : "task (tavischedule)");
    printField("State", stateName(task));
    printField("Schedule", printable(scheduleInWords(task)));
    printField("Next run", nextRun(task).value_or(enabled ? "never" : "never while disabled"));
    printField("Last run", printable(lastRunInWords(runs, task.id)));
    printField("Owner", printable(ownerName(task.owner)) + " (" + std::to_string(task.owner) + ")");
    printField("Command", commandInLines(task.command));
    printField("Action", orDash(task.action));
    printField("Application", orDash(task.app));
    printField("  name", orDash(task.appName));
    printField("  arguments", orDash(task.appArgs));
    printField("Overlap", overlapInWords(task));
    printField("Web", permissionsInWords(task));
    printField("  dialog", orDash(task.editDialog));
    printField("  form", orDash(task.editForm) + (task.simpleEditForm == 1 ? " (simple)" : ""));
    printField("First day", firstDay(task));
    if (!isPower(task)) {
        printField("Crontab", enabled ? crontabLine(task) : "no line while disabled");
    }
}

} // namespace

const std::vector<std::string> &sortFields() {
    static const std::vector<std::string> fields = {"id",   "name",  "state", "schedule",
                                                    "next", "owner", "last"};
    return fields;
}

int list(const ListOptions &options) {
    const Stored stored = readAll();
    const auto shown = chosen(stored, options);
    if (options.json) {
        Json::Value values(Json::arrayValue);
        for (const TAVI_SCHED_TASK *const task : shown) {
            values.append(plainTask(*task, stored.runs));
        }
        printJson(values);
    } else if (shown.empty()) {
        std::printf("There are no tasks%s.\n",
                    stored.tasks.all().empty() ? "" : " to list; --all shows all");
    } else {
        printList(shown, stored.runs);
    }
    return 0;
}

int show(int32_t id, bool json) {
    const Stored stored = readAll();
    const TAVI_SCHED_TASK &task = *stored.tasks.select({id}).front();
    if (json) {
        std::printf("%s\n", webText(task).c_str());
    } else {
        printTask(task, stored.runs);
    }
    return 0;
}

int history(std::optional<int32_t> id, size_t limit, bool json) {
    std::vector<Run> runs = readRuns(id);
    if (id && runs.empty()) {
        Tasks::read().select({*id}); // refused when there is no such task
    }
    runs.resize(std::min(runs.size(), limit));
    if (json) {
        Json::Value values(Json::arrayValue);
        for (const Run &run : runs) {
            values.append(plainRun(run));
        }
        printJson(values);
    } else if (runs.empty()) {
        std::printf("There were no runs since the machine was started.\n");
    } else {
        std::vector<Row> rows;
        rows.reserve(runs.size());
        for (const Run &run : runs) {
            rows.push_back({{std::to_string(run.taskId)},
                            {localTime(run.start)},
                            {printable(resultInWords(run)), styleOf(run)},
                            {std::to_string(run.pid)}});
        }
        printTable({{"TASK", true}, {"START"}, {"RESULT", false, true}, {"PID", true}},
                   std::move(rows));
    }
    return 0;
}

int exportTasks(const Ids &ids) {
    const Tasks tasks = readAll().tasks;
    if (tasks.lacksPower() && ids.empty()) {
        throw Failure("nothing was exported, as power schedules would be missing; name the ids of "
                      "other tasks to export those");
    }
    Json::Value values(Json::arrayValue);
    for (const TAVI_SCHED_TASK *const task : tasks.select(ids)) {
        values.append(exportedTask(*task));
    }
    printJson(values);
    return 0;
}

int completeIds() {
    try {
        const Tasks tasks = Tasks::read();
        for (const TAVI_SCHED_TASK *const task : tasks.all()) {
            std::printf("%ld\t%s\n", static_cast<long>(task->id), printable(task->name).c_str());
        }
    } catch (const Failure &) {
        return 0; // a completion has nowhere to tell of it
    }
    return 0;
}

} // namespace tavisched
