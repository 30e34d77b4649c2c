// What is told of a task that was stored, or would be.
#include "tasks/report.h"
#include "tasks/starts.h"
#include "text/utf8.h"
#include "text/words.h"

#include <cstdio>

namespace tavisched {

namespace {

void addNotes(const TAVI_SCHED_TASK &task, const Tasks &stored, std::vector<std::string> &lines) {
    for (const std::string &note : notesOn(task, stored.all())) {
        lines.push_back("Note: " + note + ".");
    }
}

// What the machine does at the time of a power schedule.
std::string effectOf(const TAVI_SCHED_TASK &task) {
    if (!isEnabled(task)) {
        return "nothing while it is disabled";
    }
    return task.appArgs == kPowerOn
               ? "the machine's clock is set to switch it on, should it be off then"
               : "cron runs the power-off check, which switches the machine off if it may be";
}

} // namespace

Task asListed(const TAVI_SCHED_TASK &task, const Tasks &stored) {
    const TAVI_SCHED_TASK *const found = stored.find(task.id);
    Task listed = copyOf(found ? *found : task);
    if (!found) {
        computeNextRun(*listed);
    }
    return listed;
}

std::vector<std::string> reportOf(const TAVI_SCHED_TASK &task, int32_t idBefore,
                                  const Tasks &stored) {
    const Task listed = asListed(task, stored);
    const std::string before = listed->id == idBefore ? "" : ", was " + std::to_string(idBefore);
    const std::string next =
        isEnabled(*listed) ? "next run " + nextStartInWords(*listed) : "disabled";
    std::vector<std::string> lines = {called(*listed) + before + ": " + scheduleInWords(*listed) +
                                      ", " + next};
    addNotes(*listed, stored, lines);
    return lines;
}

std::vector<std::string> previewOf(const TAVI_SCHED_TASK &task, const Tasks &stored) {
    std::vector<std::string> starts;
    for (const time_t start : comingStarts(task)) {
        starts.push_back(localMinute(start));
    }
    std::vector<std::string> lines = {
        "Schedule: " + scheduleInWords(task),
        isPower(task) ? "What happens: " + effectOf(task)
                      : "Crontab line: " + crontabLine(task).value_or("none while disabled"),
        "Next runs: " + (starts.empty() ? "never" : join(starts, ", "))};
    addNotes(task, stored, lines);
    return lines;
}

void print(const std::vector<std::string> &lines) {
    for (const std::string &line : lines) {
        std::printf("%s\n", line.c_str());
    }
}

} // namespace tavisched
