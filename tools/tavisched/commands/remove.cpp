// The subcommand "remove". People take their time to answer: the question is asked before the
// change begins, and what was shown must still be true then.
#include "commands/commands.h"
#include "failure.h"
#include "tasks/change.h"
#include "tasks/report.h"
#include "text/words.h"

#include <cstdio>
#include <iostream>
#include <unistd.h>

namespace tavisched {

namespace {

using Lines = std::vector<std::string>;

std::string shownOf(const TAVI_SCHED_TASK &task) {
    return called(task) + ": " + scheduleInWords(task);
}

Lines shownOf(const Ids &ids) {
    const Tasks tasks = Tasks::read();
    Lines shown;
    for (const TAVI_SCHED_TASK *const task : tasks.select(ids)) {
        shown.push_back(shownOf(*task));
    }
    return shown;
}

bool isConfirmed(const Lines &shown) {
    for (const std::string &line : shown) {
        std::cerr << line << "\n";
    }
    std::cerr << "Remove " << (shown.size() == 1 ? "it" : "them") << "? [y/N] ";
    std::string answer;
    std::getline(std::cin, answer);
    return answer == "y" || answer == "Y" || answer == "yes";
}

// `shown` is empty when nobody was asked.
Lines removeShown(const Ids &ids, const Lines &shown) {
    Change change;
    Lines lines;
    for (const TAVI_SCHED_TASK *const task : change.tasks().select(ids)) {
        if (!shown.empty() && shownOf(*task) != shown.at(lines.size())) {
            throw Refusal("it has changed meanwhile: " + shownOf(*task));
        }
        change.remove(*task);
        lines.push_back(called(*task) + ": removed");
    }
    change.commit();
    return lines;
}

} // namespace

int removeTasks(const Ids &ids, bool yes) {
    Lines shown;
    if (!yes) {
        if (isatty(STDIN_FILENO) != 1) {
            throw Refusal("there is no terminal to ask on; --yes removes without a question");
        }
        shown = shownOf(ids);
        if (!isConfirmed(shown)) {
            std::printf("Nothing was removed.\n");
            return 1;
        }
    }
    print(removeShown(ids, shown));
    return 0;
}

} // namespace tavisched
