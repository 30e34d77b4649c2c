// Runs as a table.
#include "tasks/runs_table.h"
#include "text/utf8.h"
#include "text/words.h"

#include <algorithm>

namespace tavisched {

Style styleOf(const Run &run) {
    return run.code == SCHED_STATUS_CODE_SUCCESS   ? Style::Good
           : run.code == SCHED_STATUS_CODE_RUNNING ? Style::Busy
                                                   : Style::Bad;
}

const TAVI_SCHED_TASK *taskOf(const Run &run, const TaskPointers &tasks) {
    const auto found = std::find_if(tasks.begin(), tasks.end(),
                                    [&](const auto *task) { return task->id == run.taskId; });
    return found == tasks.end() ? nullptr : *found;
}

void printRunsTable(const std::vector<Run> &runs, const TaskPointers &tasks) {
    std::vector<Row> rows;
    rows.reserve(runs.size());
    for (const Run &run : runs) {
        const TAVI_SCHED_TASK *const task = taskOf(run, tasks);
        rows.push_back({{std::to_string(run.taskId)},
                        {task && task->name[0] != '\0' ? printable(task->name) : "-"},
                        {localTime(run.start)},
                        {run.end ? localTime(*run.end) : "-"},
                        {run.end ? durationInWords(*run.end - run.start) : "-"},
                        {printable(resultInWords(run, task)), styleOf(run)},
                        {std::to_string(run.pid)}});
    }
    printTable({{"TASK", true},
                {"NAME", false, true, 2},
                {"START"},
                {"END", false, false, 3},
                {"DURATION", false, false, 4},
                {"RESULT", false, true},
                {"PID", true, false, 1}},
               std::move(rows));
}

} // namespace tavisched
