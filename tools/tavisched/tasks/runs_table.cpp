// Runs as a table.
#include "tasks/runs_table.h"
#include "text/utf8.h"
#include "text/words.h"

#include <algorithm>
#include <iterator>

namespace tavisched {

Style styleOf(const Run &run) {
    return run.result == TAVI_SCHED_RUN_SUCCESS ? Style::Good
           : goesOn(run)                        ? Style::Busy
           : hasFailed(run)                     ? Style::Bad
                                                : Style::Plain;
}

namespace {

const std::vector<Column> kColumns{{"RUN", true},
                                   {"TASK", true},
                                   {"NAME", false, true, 3},
                                   {"START"},
                                   {"END", false, false, 4},
                                   {"DURATION", false, false, 5},
                                   {"WAITED", false, false, 1},
                                   {"STARTED BY", false, true, 2},
                                   {"RESULT", false, true}};

Row rowOf(const Run &run) {
    const bool ended = run.ended != 0;
    const std::string name = run.name[0] != '\0' ? printable(run.name) : "-";
    return {{std::to_string(run.run)},
            {std::to_string(run.taskId)},
            {run.isOfRemovedTask == 1 ? name + " (removed)" : name},
            {localTime(startOf(run))},
            {ended ? localTime(seconds(run.ended)) : "-"},
            {ended && run.began != 0 ? durationInWords(seconds(run.duration)) : "-"},
            {run.waited > 0 ? durationInWords(run.waited) : "-"},
            {printable(startInWords(run))},
            {printable(resultInWords(run)), styleOf(run)}};
}

} // namespace

void printRunsTable(const std::vector<Run> &runs) {
    std::vector<Row> rows;
    std::transform(runs.begin(), runs.end(), std::back_inserter(rows), rowOf);
    printTable(kColumns, rows);
}

void printRunsTable(const TAVI_SCHED_RUN_FILTER &filter) {
    printTable(kColumns, [&](const RowReader &reader) {
        forEachRun(filter, [&](const Run &run) {
            reader(rowOf(run));
            return true;
        });
    });
}

} // namespace tavisched
