// The subcommand "list": the tasks, a line each.
#include "commands/commands.h"
#include "failure.h"
#include "tasks/findings.h"
#include "tasks/runs_table.h"
#include "text/moments.h"
#include "text/utf8.h"
#include "text/words.h"
#include "json/json.h"
#include "json/plain.h"

#include <algorithm>
#include <cstdio>
#include <functional>
#include <map>
#include <strings.h>

namespace tavisched {

namespace {

const Run *lastRunOf(const TAVI_SCHED_TASK &task, const LatestRuns &runs) {
    const auto run = runs.find(task.id);
    return run == runs.end() ? nullptr : &run->second;
}

// ---- Which ----

bool holds(const char *text, const std::string &word) {
    return folded(text).find(word) != std::string::npos;
}

bool hasWord(const TAVI_SCHED_TASK &task, const Run *run, const std::string &word) {
    return holds(task.name, word) || holds(ownerName(task.owner).c_str(), word) ||
           holds(task.app, word) || folded(stateInWords(task, run)) == word;
}

// The end of a time such as "24h" from now, as next runs are written.
std::string endOf(const std::string &span) {
    const auto seconds = parseSpan(span);
    if (!seconds) {
        throw Refusal("--next: \"" + printable(span) +
                      "\" is not accepted; accepted: a time such as 30m, 24h, 7d or 2w");
    }
    return localTime(time(nullptr) + *seconds).substr(0, sizeof "YYYY-MM-DD hh:mm" - 1);
}

// Whether a task is to be listed.
class Filter {
  public:
    explicit Filter(const ListOptions &options)
        : options_(options), until_(options.next.empty() ? "" : endOf(options.next)) {
        for (const std::string &word : options.words) {
            words_.push_back(folded(word));
        }
    }
    bool operator()(const TAVI_SCHED_TASK &task, const Run *run) const {
        const std::string &owner = options_.owner;
        return (options_.all || task.listable == 1) &&
               (!options_.failed || (run && hasFailed(*run))) &&
               (owner.empty() || owner == ownerName(task.owner) ||
                owner == std::to_string(task.owner)) &&
               (until_.empty() || nextRun(task).value_or("never") <= until_) &&
               std::all_of(words_.begin(), words_.end(),
                           [&](const std::string &word) { return hasWord(task, run, word); });
    }

  private:
    const ListOptions &options_;
    std::string until_;
    std::vector<std::string> words_;
};

// ---- In which order ----

using Before = std::function<bool(const TAVI_SCHED_TASK &, const TAVI_SCHED_TASK &)>;

time_t lastStart(const TAVI_SCHED_TASK &task, const LatestRuns &runs) {
    const Run *const run = lastRunOf(task, runs);
    return run ? startOf(*run) : 0;
}

std::map<std::string, Before> orders(const LatestRuns &runs) {
    return {{"id", [](auto &one, auto &other) { return one.id < other.id; }},
            {"name", [](auto &one, auto &other) { return strcasecmp(one.name, other.name) < 0; }},
            {"state", [](auto &one, auto &other) { return one.state > other.state; }},
            {"schedule",
             [](auto &one, auto &other) { return scheduleInWords(one) < scheduleInWords(other); }},
            {"next",
             [](auto &one, auto &other) {
                 return nextRun(one).value_or("") < nextRun(other).value_or("");
             }},
            {"owner",
             [](auto &one, auto &other) { return ownerName(one.owner) < ownerName(other.owner); }},
            {"last", [&runs](auto &one, auto &other) {
                 return lastStart(one, runs) > lastStart(other, runs);
             }}};
}

// Tasks without a next or a last run come last, in either direction.
void sort(TaskPointers &tasks, const ListOptions &options, const LatestRuns &runs) {
    const Before before = orders(runs).at(options.sort);
    const auto lacksField = [&](const TAVI_SCHED_TASK *task) {
        return (options.sort == "next" && !nextRun(*task)) ||
               (options.sort == "last" && !lastRunOf(*task, runs));
    };
    const auto lacking = std::stable_partition(tasks.begin(), tasks.end(),
                                               [&](const auto *task) { return !lacksField(task); });
    std::stable_sort(tasks.begin(), lacking,
                     [&](const auto *one, const auto *other) { return before(*one, *other); });
    if (options.reverse) {
        std::reverse(tasks.begin(), lacking);
    }
}

// ---- As a table ----

// What needs a person says so without colours too.
std::string resultWithTime(const Run &run) {
    const bool isMissed = run.result == TAVI_SCHED_RUN_MISSED;
    return (hasFailed(run) && !isMissed ? "failed: " : "") + resultInWords(run) +
           (goesOn(run) ? "" : " " + ago(startOf(run), time(nullptr)));
}

Row rowOf(const TAVI_SCHED_TASK &task, const Run *run) {
    return {{std::to_string(task.id)},
            {printable(task.name)},
            {stateInWords(task, run), isEnabled(task) ? Style::Plain : Style::Faint},
            {scheduleInWords(task)},
            {nextRun(task).value_or("-")},
            {printable(ownerName(task.owner))},
            run ? Cell{printable(resultWithTime(*run)), styleOf(*run)} : Cell{"-"}};
}

void printTasks(const TaskPointers &tasks, const LatestRuns &runs) {
    std::vector<Row> rows;
    rows.reserve(tasks.size());
    for (const TAVI_SCHED_TASK *const task : tasks) {
        rows.push_back(rowOf(*task, lastRunOf(*task, runs)));
    }
    printTable({{"ID", true},
                {"NAME", false, true},
                {"STATE", false, false, 2},
                {"SCHEDULE", false, true, 4},
                {"NEXT RUN"},
                {"OWNER", false, true, 1},
                {"LAST RUN", false, true, 3}},
               std::move(rows));
}

} // namespace

const std::vector<std::string> &sortFields() {
    static const std::vector<std::string> fields = {"id",   "name",  "state", "schedule",
                                                    "next", "owner", "last"};
    return fields;
}

int list(const ListOptions &options) {
    const Filter filter(options);
    const Tasks tasks = Tasks::read();
    const LatestRuns runs = readLatestRuns();
    TaskPointers shown;
    std::copy_if(tasks.all().begin(), tasks.all().end(), std::back_inserter(shown),
                 [&](const auto *task) { return filter(*task, lastRunOf(*task, runs)); });
    sort(shown, options, runs);
    if (options.json) {
        Json::Value values(Json::arrayValue);
        for (const TAVI_SCHED_TASK *const task : shown) {
            values.append(plainTask(*task, runs));
        }
        printJson(values);
    } else if (shown.empty()) {
        std::printf("There are no tasks%s.\n",
                    tasks.all().empty() ? "" : " to list; --all shows all");
    } else {
        printTasks(shown, runs);
    }
    std::fflush(stdout);
    warnWhenNothingRuns();
    return warnOf({"task files"}) ? 1 : 0; // what was listed may not be the tasks
}

} // namespace tavisched
