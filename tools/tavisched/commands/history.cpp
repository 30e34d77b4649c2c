// The subcommand "history": how runs ended.
#include "commands/commands.h"
#include "tasks/runs_table.h"
#include "json/json.h"
#include "json/plain.h"

#include <cstdio>

namespace tavisched {

namespace {

// The name of a run's task is the one that it has now; a task that was removed has none.
int printRuns(const std::vector<Run> &runs, const TaskPointers &tasks, bool json) {
    if (!json) {
        printRunsTable(runs, tasks);
        return 0;
    }
    Json::Value values(Json::arrayValue);
    for (const Run &run : runs) {
        values.append(plainRun(run, taskOf(run, tasks)));
    }
    printJson(values);
    return 0;
}

} // namespace

int history(std::optional<int32_t> id, size_t limit, bool json) {
    const std::vector<Run> runs = readRuns(id, limit);
    Tasks tasks;
    Task one;
    if (id && runs.empty()) {
        one = readTask(*id); // refused when there is no such task
    } else {
        tasks = Tasks::read();
    }
    if (runs.empty() && !json) {
        std::printf("%s since the machine was started.\n",
                    one ? (called(*one) + " has not run").c_str() : "There were no runs");
        return 0;
    }
    return printRuns(runs, tasks.all(), json);
}

} // namespace tavisched
