// The subcommand "history": what runs did, and why some did not happen.
#include "commands/commands.h"
#include "failure.h"
#include "tasks/runs_table.h"
#include "tasks/tasks.h"
#include "text/moments.h"
#include "text/utf8.h"
#include "json/json.h"
#include "json/plain.h"

#include <cstdio>

namespace tavisched {

namespace {

constexpr int64_t kSecond = 1000;

int64_t sinceOf(const std::string &text) {
    const auto moment = parseMoment(text);
    const auto span = moment ? std::nullopt : parseSpan(text);
    if (!moment && !span) {
        throw Refusal("--since: \"" + printable(text) +
                      "\" is not accepted; accepted: a time such as 30m, 24h, 7d or 2w, or a date "
                      "such as 2026-12-24 or \"2026-12-24 18:00\"");
    }
    return (moment ? *moment : time(nullptr) - *span) * kSecond;
}

} // namespace

int history(const HistoryOptions &options) {
    TAVI_SCHED_RUN_FILTER filter = options.id ? runsOf(*options.id) : kAllRuns;
    filter.failedOnly = options.failed ? 1 : 0;
    filter.limit = options.limit;
    filter.since = options.since.empty() ? 0 : sinceOf(options.since);
    const bool isAny = findNewest(filter, [](const Run &) { return true; }).has_value();
    const bool isNarrowed = options.failed || !options.since.empty();
    const Task task = options.id && !isAny ? readTask(*options.id) : nullptr; // or refused
    if (options.json) {
        forEachRun(filter, [](const Run &run) {
            printJsonLine(plainRun(run));
            return true;
        });
    } else if (isAny) {
        printRunsTable(filter);
    } else {
        std::printf("There are no %sruns%s on record.\n", isNarrowed ? "such " : "",
                    task ? (" of " + called(*task)).c_str() : "");
    }
    return 0;
}

} // namespace tavisched
