// cron, its table, and the lines that tasks ask for.
#include "backends/task_file.h"
#include "base/descriptor.h"
#include "base/trust.h"
#include "cron/cron_grammar.h"
#include "cron/cron_line.h"
#include "finding.h"
#include "platc.h"
#include "sched_handle.h"
#include "sched_paths.h"
#include "tavischeduler.h"

#include <algorithm>
#include <array>
#include <cstring>
#include <fcntl.h>
#include <fstream>
#include <iterator>
#include <set>
#include <sys/stat.h>

namespace sched {

namespace {

struct Crontab {
    std::vector<std::string> lines; // without their line feeds
    bool isReadable = false;
    bool endsWithLineFeed = true;
};

Crontab readCrontab() {
    Crontab crontab;
    std::ifstream file(kCrontab, std::ios::binary);
    for (std::string line; std::getline(file, line);) {
        crontab.endsWithLineFeed = !file.eof();
        crontab.lines.push_back(line);
    }
    crontab.isReadable = file.eof() && !file.bad();
    return crontab;
}

// cron holds a lock on the file with its process id for as long as it runs; another process can
// have come by the same id.
bool isCronRunning() {
    pid_t pid = 0;
    std::string name;
    if (std::ifstream file(kCronPid); file >> pid && PLATCProcAlive(pid) == 1) {
        std::getline(std::ifstream("/proc/" + std::to_string(pid) + "/comm"), name);
    }
    return name.find("cron") != std::string::npos;
}

// The lines of the tasks that the working copy has now.
bool expectedLines(std::vector<std::string> &lines) {
    return forEachStoredTask({.onTask = [&](const char *, TAVI_SCHED_TASK *task) {
               if (task->state == TAVI_SCHED_STATE_ENABLED) {
                   lines.emplace_back(CronLine(*task).c_str());
               }
               return true;
           }}) == 0;
}

// "" for a line that cron takes.
std::string whyRejected(const std::string &line) {
    std::array<char, 512> reason{};
    const bool isRejected =
        TAVISchedCrontabLineCheck(line.c_str(), nullptr, reason.data(), reason.size()) == 1;
    return isRejected ? reason.data() : "";
}

// Whether its power-off lines are those of the enabled power-off schedules.
bool arePowerOffLinesRight(const Crontab &crontab) {
    TaskList tasks;
    if (TAVISchedTaskListGetOf(TAVI_SCHED_BACKEND_AUTOPOWER, tasks.address(), nullptr) < 0) {
        return true; // somebody else tells of it
    }
    using Times = std::vector<std::array<uint64_t, 5>>;
    const auto timesOf = [](const char *line) -> std::array<uint64_t, 5> {
        TAVI_SCHED_CRON_TIMES times{};
        std::array<char, 512> reason{};
        TAVISchedCrontabLineCheck(line, &times, reason.data(), reason.size());
        return {times.minutes, times.hours, times.monthDays, times.months, times.weekDays};
    };
    Times asked;
    for (const TAVI_SCHED_TASK *task = tasks.head(); task; task = task->next) {
        if (task->state == TAVI_SCHED_STATE_ENABLED &&
            std::strcmp(task->appArgs, "poweroff") == 0 && std::strchr(task->week, '1')) {
            asked.push_back(timesOf(CronLine(*task).c_str()));
        }
    }
    Times present;
    for (const std::string &line : crontab.lines) {
        if (line.find(kPowerOffCheck) != std::string::npos) {
            present.push_back(timesOf(line.c_str()));
        }
    }
    std::sort(asked.begin(), asked.end());
    std::sort(present.begin(), present.end());
    return asked == present;
}

// What the crontab lacks and has too much, each for behind its name.
std::vector<std::string> compareLines(const Crontab &crontab, const std::vector<std::string> &asked,
                                      const Inspection &inspection) {
    std::multiset<std::string> surplus;
    std::copy_if(crontab.lines.begin(), crontab.lines.end(), std::inserter(surplus, surplus.end()),
                 [](const std::string &line) { return line.find(kRunner) != std::string::npos; });
    std::vector<std::string> differences;
    for (const std::string &line : asked) {
        const auto found = surplus.find(line);
        if (found == surplus.end()) {
            differences.push_back("lacks a task's line: " + line);
        } else {
            surplus.erase(found);
        }
    }
    for (const std::string &line : surplus) {
        differences.push_back("has a line that no task asks for: " + line);
    }
    if (inspection.canReadPower && !arePowerOffLinesRight(crontab)) {
        differences.emplace_back("has other power-off lines than the power-off schedules ask for");
    }
    return differences;
}

bool synchronise() {
    return TAVISchedTaskSync() == 0;
}

} // namespace

void inspectCron(Inspection &inspection) {
    if (!isCronRunning()) {
        inspection.add("cron is not running, so that no task runs",
                       "start it: systemctl enable --now cron");
    }
}

void inspectCrontabFile(Inspection &inspection) {
    const Crontab crontab = readCrontab();
    const std::string all = "cron ignores all of " + std::string(kCrontab);
    if (!crontab.isReadable) {
        inspection.canReadTasks = false;
        inspection.add(std::string(kCrontab) + " cannot be read",
                       "make it; an empty file is enough");
        return;
    }
    base::TrustRule rule = base::kRootsFile;
    rule.oneName = true;
    if (base::look(kCrontab, rule) != base::Found::Trusted) {
        inspection.add("cron ignores " + std::string(kCrontab) +
                           ", which must be a file of root's with one name, and writable by "
                           "nobody else",
                       std::string("look who changed it; then chown root ") + kCrontab +
                           " and chmod go-w " + kCrontab);
    }
    for (size_t i = 0; i < crontab.lines.size(); ++i) {
        const bool isTasks = crontab.lines[i].find(kRunner) != std::string::npos;
        const std::string why =
            isTasks && inspection.looksAtTasks ? "" : whyRejected(crontab.lines[i]);
        if (!why.empty()) {
            inspection.add(all + " for its line " + std::to_string(i + 1) + ": " + why,
                           isTasks ? "mend the schedule of the line's task with tavisched edit"
                                   : "mend the line by hand");
        }
    }
    if (!crontab.endsWithLineFeed) {
        inspection.add(all + ", as its last line has no line feed",
                       "add one at the end of the file");
    }
}

// Lines are only taken out when it is clear what the tasks are: both files say the same, every
// section can be read, and there are tasks at all, as the lines may be the last trace of tasks
// whose files are gone. Lines that cron would reject are for a person to mend.
void inspectLines(Inspection &inspection) {
    std::vector<std::string> asked;
    if (!inspection.canReadTasks || !expectedLines(asked)) {
        return;
    }
    const Crontab crontab = readCrontab();
    const std::vector<std::string> differences = compareLines(crontab, asked, inspection);
    if (differences.empty()) {
        return;
    }
    const bool hasLines =
        std::any_of(crontab.lines.begin(), crontab.lines.end(), [](const std::string &line) {
            return line.find(kRunner) != std::string::npos;
        });
    const bool isLastTrace = asked.empty() && hasLines;
    const bool isClear = inspection.isSettled && inspection.areCopiesSame &&
                         inspection.areSectionsGood && inspection.canReadPower && !isLastTrace &&
                         std::all_of(asked.begin(), asked.end(), [](const std::string &line) {
                             return whyRejected(line).empty();
                         });
    Finding finding{.what = std::string(kCrontab) + " " + differences.front(),
                    .advice = isLastTrace ? "look where the tasks have gone; tavisched sync takes "
                                            "such lines out"
                                          : "tavisched sync"};
    if (differences.size() > 1) {
        finding.what += " (and " + std::to_string(differences.size() - 1) + " more differences)";
    }
    if (isClear) {
        finding.repair = synchronise;
        finding.repaired = "the lines were written anew";
    }
    inspection.add(std::move(finding));
}

} // namespace sched
