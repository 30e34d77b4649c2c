// The subcommand "list": the tasks, a line each.
#include "commands/commands.h"
#include "failure.h"
#include "tasks/findings.h"
#include "tasks/runs_table.h"
#include "tasks/starts.h"
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

// A task with what a line says of it.
struct Listed {
    const TAVI_SCHED_TASK *task;
    const Run *lastRun; // or nullptr
    std::optional<time_t> next;
};

Listed lookAt(const TAVI_SCHED_TASK &task, const LatestRuns &runs) {
    const auto run = runs.find(task.id);
    return {&task, run == runs.end() ? nullptr : &run->second, nextStart(task)};
}

// ---- Which ----

bool holds(const char *text, const std::string &word) {
    return folded(text).find(word) != std::string::npos;
}

bool hasWord(const TAVI_SCHED_TASK &task, const Run *run, const std::string &word) {
    return holds(task.name, word) || holds(ownerName(task.owner).c_str(), word) ||
           holds(task.app, word) || folded(stateInWords(task, run)) == word;
}

// The end of a time such as "24h" from now.
time_t endOfSpan(const std::string &span) {
    const auto seconds = parseSpan(span);
    if (!seconds) {
        throw Refusal("--next: \"" + printable(span) +
                      "\" is not accepted; accepted: a time such as 30m, 24h, 7d or 2w");
    }
    return time(nullptr) + *seconds;
}

// Whether a task is to be listed.
class Filter {
  public:
    explicit Filter(const ListOptions &options)
        : options_(options),
          until_(options.next.empty() ? std::nullopt : std::optional(endOfSpan(options.next))) {
        for (const std::string &word : options.words) {
            words_.push_back(folded(word));
        }
    }
    bool operator()(const Listed &listed) const {
        const std::string &owner = options_.owner;
        const TAVI_SCHED_TASK &task = *listed.task;
        const Run *const run = listed.lastRun;
        return (options_.all || task.listable == 1) &&
               (!options_.failed || (run && hasFailed(*run))) &&
               (owner.empty() || owner == ownerName(task.owner) ||
                owner == std::to_string(task.owner)) &&
               (!until_ || (listed.next && *listed.next <= *until_)) &&
               std::all_of(words_.begin(), words_.end(),
                           [&](const std::string &word) { return hasWord(task, run, word); });
    }

  private:
    const ListOptions &options_;
    std::optional<time_t> until_;
    std::vector<std::string> words_;
};

// ---- In which order ----

using Before = std::function<bool(const Listed &, const Listed &)>;

const std::map<std::string, Before> &orders() {
    const auto byTask = [](auto field) -> Before {
        return [field](const Listed &one, const Listed &other) {
            return field(*one.task) < field(*other.task);
        };
    };
    static const std::map<std::string, Before> all = {
        {"id", byTask([](const auto &task) { return task.id; })},
        {"name",
         [](const Listed &one, const Listed &other) {
             return strcasecmp(one.task->name, other.task->name) < 0;
         }},
        {"state", byTask([](const auto &task) { return -task.state; })},
        {"schedule", byTask([](const auto &task) { return scheduleInWords(task); })},
        {"next", [](const Listed &one, const Listed &other) { return one.next < other.next; }},
        {"owner", byTask([](const auto &task) { return ownerName(task.owner); })},
        {"last", [](const Listed &one, const Listed &other) {
             return startOf(*one.lastRun) > startOf(*other.lastRun);
         }}};
    return all;
}

// Tasks without a next or a last run come last, in either direction.
void sort(std::vector<Listed> &tasks, const ListOptions &options) {
    const auto hasField = [&](const Listed &listed) {
        return (options.sort != "next" || listed.next) &&
               (options.sort != "last" || listed.lastRun);
    };
    const auto lacking = std::stable_partition(tasks.begin(), tasks.end(), hasField);
    std::stable_sort(tasks.begin(), lacking, orders().at(options.sort));
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

Row rowOf(const Listed &listed) {
    const TAVI_SCHED_TASK &task = *listed.task;
    const Run *const run = listed.lastRun;
    return {{std::to_string(task.id)},
            {printable(task.name)},
            {stateInWords(task, run), isEnabled(task) ? Style::Plain : Style::Faint},
            {scheduleInWords(task)},
            {listed.next       ? localMinute(*listed.next)
             : isEnabled(task) ? "never"
                               : "-"},
            {printable(ownerName(task.owner))},
            run ? Cell{printable(resultWithTime(*run)), styleOf(*run)} : Cell{"-"}};
}

void printTasks(const std::vector<Listed> &tasks) {
    std::vector<Row> rows;
    std::transform(tasks.begin(), tasks.end(), std::back_inserter(rows), rowOf);
    printTable({{"ID", true},
                {"NAME", false, true},
                {"STATE", false, false, 2},
                {"SCHEDULE", false, true, 4},
                {"NEXT RUN"},
                {"OWNER", false, true, 1},
                {"LAST RUN", false, true, 3}},
               rows);
}

void printAsJson(const std::vector<Listed> &shown, const TaskPointers &all,
                 const LatestRuns &runs) {
    auto notes = notesOnAll(all);
    Json::Value values(Json::arrayValue);
    for (const Listed &listed : shown) {
        values.append(plainTask(*listed.task, runs, notes[listed.task]));
    }
    printJson(values);
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
    std::vector<Listed> shown;
    for (const TAVI_SCHED_TASK *const task : tasks.all()) {
        const Listed listed = lookAt(*task, runs);
        if (filter(listed)) {
            shown.push_back(listed);
        }
    }
    sort(shown, options);
    if (options.json) {
        printAsJson(shown, tasks.all(), runs);
    } else if (shown.empty()) {
        std::printf("There are no tasks%s.\n",
                    tasks.all().empty() ? "" : " to list; --all shows all");
    } else {
        printTasks(shown);
    }
    std::fflush(stdout);
    warnWhenNothingRuns();
    return warnOf({"task files"}) ? 1 : 0; // what was listed may not be the tasks
}

} // namespace tavisched
