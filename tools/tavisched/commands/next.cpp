// The subcommand "next": when tasks will really be started.
#include "commands/commands.h"
#include "failure.h"
#include "tasks/starts.h"
#include "text/moments.h"
#include "text/table.h"
#include "text/utf8.h"
#include "text/words.h"
#include "json/json.h"
#include "json/plain.h"

#include <algorithm>
#include <cstdio>

namespace tavisched {

namespace {

constexpr size_t kNumber = 10;
constexpr size_t kMost = 1000000;
constexpr time_t kFarAhead = 253402300800; // the year 10000

struct Start {
    time_t time;
    const TAVI_SCHED_TASK *task;
};

// The end of what was given: a date counts as a whole.
time_t endOf(const std::string &text) {
    const auto moment = parseMoment(text + (text.find(' ') == std::string::npos ? " 23:59" : ""));
    const auto span = moment ? std::nullopt : parseSpan(text);
    if (!moment && !span) {
        throw Refusal("--until: \"" + printable(text) +
                          "\" is not accepted; accepted: a date such as 2026-12-24 or \"2026-12-24 "
                          "18:00\", or a time such as 30m, 24h, 7d or 2w",
                      "until");
    }
    return std::min(moment ? *moment + 60 : time(nullptr) + *span + 1, kFarAhead);
}

std::vector<Start> collectStarts(const TaskPointers &tasks, time_t until, size_t number) {
    const time_t now = time(nullptr);
    std::vector<Start> starts;
    for (const TAVI_SCHED_TASK *const task : tasks) {
        const auto next = nextStart(*task);
        for (const time_t start :
             next &&*next < until ? startsOf(*task, now, until, number) : std::vector<time_t>()) {
            starts.push_back({start, task});
        }
    }
    std::stable_sort(starts.begin(), starts.end(),
                     [](const Start &one, const Start &other) { return one.time < other.time; });
    starts.resize(std::min(starts.size(), number));
    return starts;
}

void printStartAsJson(const Start &start) {
    Json::Value value;
    value["time"] = isoTime(start.time);
    value["task"] = start.task->id;
    value["name"] = plainText(start.task->name);
    value["owner"] = ownerName(start.task->owner);
    value["backend"] = start.task->backend;
    value["power"] = plainPower(*start.task);
    printJsonLine(value);
}

void printStarts(const std::vector<Start> &starts) {
    std::vector<Row> rows;
    rows.reserve(starts.size());
    for (const auto &[time, task] : starts) {
        rows.push_back({{weekDayOf(time) + " " + localMinute(time)},
                        {std::to_string(task->id)},
                        {printable(task->name)},
                        {printable(ownerName(task->owner))}});
    }
    printTable({{"START"}, {"ID", true}, {"NAME", false, true}, {"OWNER", false, true, 1}}, rows);
}

} // namespace

int next(const NextOptions &options) {
    const time_t until = options.until.empty() ? kFarAhead : endOf(options.until);
    const size_t number = options.number > 0      ? static_cast<size_t>(options.number)
                          : options.until.empty() ? kNumber
                                                  : kMost;
    const Tasks all = Tasks::read();
    TaskPointers tasks = all.select(options.ids);
    if (options.ids.empty() && !options.all) {
        std::erase_if(tasks, [](const auto *task) { return task->listable != 1; });
    }
    const std::vector<Start> starts = collectStarts(tasks, until, number);
    if (options.json) {
        std::for_each(starts.begin(), starts.end(), printStartAsJson);
    } else if (starts.empty()) {
        std::printf("Nothing will run%s.\n", options.until.empty() ? "" : " until then");
    } else {
        printStarts(starts);
    }
    return 0;
}

} // namespace tavisched
