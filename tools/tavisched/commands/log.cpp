// The subcommand "log": what a run's command printed.
#include "commands/commands.h"
#include "failure.h"
#include "tasks/runs.h"
#include "tasks/tasks.h"
#include "text/utf8.h"
#include "text/words.h"

#include <cstdio>

namespace tavisched {

namespace {

// The run of that number, or the last one that has a command to show or will have one.
Run runToShow(int32_t id, std::optional<int64_t> number) {
    if (number) {
        const auto run = findRun(*number);
        if (!run || run->taskId != id) {
            throw Refusal("task " + std::to_string(id) + " has no run " + std::to_string(*number) +
                          "; \"tavisched history " + std::to_string(id) + "\" lists its runs");
        }
        if (run->isOfRemovedTask == 1) {
            std::fprintf(stderr, "tavisched: run %lld is of a removed task, %s\n",
                         static_cast<long long>(run->run), printable(run->name).c_str());
        }
        return *run;
    }
    const auto run =
        findNewest(runsOf(id), [](const Run &one) { return one.began != 0 || goesOn(one); });
    if (!run) {
        throw Failure(called(*readTask(id)) + " has no run on record that printed anything");
    }
    return *run;
}

} // namespace

int log(int32_t id, std::optional<int64_t> number, bool follow) {
    const Run run = runToShow(id, number);
    const bool isKept = printOutput(run.run, follow);
    const Run now = findRun(run.run).value_or(run);
    if (!isKept && now.outputSize > 0) {
        throw Failure("the output of run " + std::to_string(run.run) + " is no longer kept");
    }
    if (now.outputSize == 0 && (!isKept || !goesOn(now))) {
        std::fprintf(stderr, "tavisched: run %lld has printed nothing: %s\n",
                     static_cast<long long>(run.run), resultInWords(now).c_str());
    }
    return 0;
}

} // namespace tavisched
