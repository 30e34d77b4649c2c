// The subcommand "show": every field of one task, and how it ran.
#include "commands/commands.h"
#include "tasks/runs_table.h"
#include "tasks/starts.h"
#include "text/utf8.h"
#include "text/words.h"
#include "json/json.h"
#include "json/plain.h"

#include <array>
#include <cstdio>
#include <iostream>

namespace tavisched {

namespace {

constexpr int32_t kRuns = 5;

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

std::string lastRunInWords(const Run *run) {
    return run ? resultInWords(*run) + (run->began != 0 ? ", started " : ", due ") +
                     localTime(startOf(*run)) + " (" + ago(startOf(*run), time(nullptr)) + ")"
               : "none on record";
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

void printTask(const TAVI_SCHED_TASK &task, const Run *lastRun, const Notes &notes) {
    std::printf("%s\n", styled("Task " + std::to_string(task.id) + ": " + printable(task.name),
                               Style::Strong)
                            .c_str());
    printField("Kind", isPower(task) ? "power schedule (taviautopower)" : "task (tavischedule)");
    printField("State", stateInWords(task, lastRun));
    printField("Schedule", scheduleInWords(task));
    printField("Next run", nextStartInWords(task) + (isEnabled(task) ? "" : " while disabled"));
    printField("Last run", printable(lastRunInWords(lastRun)));
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
        printField("Crontab", crontabLine(task).value_or("no line while disabled"));
    }
    for (const std::string &note : notes) {
        printField("Note", note);
    }
}

std::vector<Run> lastRuns(int32_t id) {
    try {
        TAVI_SCHED_RUN_FILTER filter = runsOf(id);
        filter.limit = kRuns;
        return readRuns(filter);
    } catch (const std::exception &failure) {
        std::cerr << "tavisched: warning: " << failure.what() << "\n";
        return {};
    }
}

} // namespace

int show(int32_t id, bool json) {
    const Task task = readTask(id);
    const std::vector<Run> runs = lastRuns(id);
    const Notes notes = notesOn(*task, Tasks::read().all());
    if (json) {
        printJson(plainTaskWithStarts(
            *task, runs.empty() ? LatestRuns{} : LatestRuns{{id, runs.front()}}, notes));
        return 0;
    }
    printTask(*task, runs.empty() ? nullptr : &runs.front(), notes);
    if (!runs.empty()) {
        std::printf("\n");
        printRunsTable(runs);
    }
    return 0;
}

} // namespace tavisched
