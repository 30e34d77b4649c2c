// What is told of a task that was stored.
#include "tasks/report.h"
#include "text/words.h"

#include <cstdio>

namespace tavisched {

std::vector<std::string> reportOf(const TAVI_SCHED_TASK &stored, int32_t idBefore) {
    Task task = copyOf(stored);
    computeNextRun(*task);
    if (isPower(*task)) { // lists name it otherwise
        const Tasks power = Tasks::readPower();
        if (const TAVI_SCHED_TASK *const same = findSameSchedule(power.all(), *task)) {
            task = copyOf(*same);
        }
    }
    const std::string before = task->id == idBefore ? "" : ", was " + std::to_string(idBefore);
    const std::string next =
        isEnabled(*task) ? "next run " + nextRun(*task).value_or("never") : "disabled";
    std::vector<std::string> lines = {called(*task) + before + ": " + scheduleInWords(*task) +
                                      ", " + next};
    if (const std::string remark = remarkOn(*task); !remark.empty()) {
        lines.push_back("Note: " + remark + ".");
    }
    return lines;
}

void print(const std::vector<std::string> &lines) {
    for (const std::string &line : lines) {
        std::printf("%s\n", line.c_str());
    }
}

} // namespace tavisched
