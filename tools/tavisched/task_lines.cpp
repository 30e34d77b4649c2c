// The lines of /etc/crontab that stand for tasks.
#include "task_lines.h"
#include "failure.h"
#include "paths.h"
#include "text.h"

#include <algorithm>
#include <array>
#include <iterator>

namespace tavisched {

namespace {

Crontab requireCrontab() {
    auto crontab = readCrontab();
    if (!crontab) {
        throw Failure(std::string("cannot read ") + kCrontab + ": " + systemReason());
    }
    return *crontab;
}

// The ids of the tasks that a person has to disable before anything else can be changed.
std::string idsOfRejected(const Tasks &tasks) {
    std::vector<std::string> ids;
    for (const TAVI_SCHED_TASK *const task : tasks.all()) {
        if (whyCronRejects(*task)) {
            ids.push_back(std::to_string(task->id));
        }
    }
    return join(ids, " ");
}

} // namespace

std::string crontabLine(const TAVI_SCHED_TASK &task) {
    std::array<char, 512> line{};
    if (TAVISchedCrontabLine(&task, line.data(), line.size()) != 0) {
        throw Failure(called(task) + " has no line: " + libraryError());
    }
    return line.data();
}

std::optional<std::string> whyCronRejects(const TAVI_SCHED_TASK &task) {
    if (isPower(task) || task.state != TAVI_SCHED_STATE_ENABLED) {
        return std::nullopt;
    }
    const CrontabLine line = parseCrontabLine(crontabLine(task));
    return line.kind == CrontabLine::Kind::Rejected ? std::optional(line.reason) : std::nullopt;
}

bool anyRejected(const Tasks &tasks) {
    return std::any_of(tasks.all().begin(), tasks.all().end(),
                       [](const auto *task) { return whyCronRejects(*task).has_value(); });
}

void requireGoodCrontab(const TaskPointers &tasksAfterwards) {
    const std::vector<std::string> lines = requireCrontab().lines;
    for (const TAVI_SCHED_TASK *const task : tasksAfterwards) {
        const auto why = whyCronRejects(*task);
        if (!why || std::find(lines.begin(), lines.end(), crontabLine(*task)) != lines.end()) {
            continue;
        }
        const std::string present = idsOfRejected(Tasks::read());
        const std::string ids =
            present.empty() ? ""
                            : "; first \"tavisched disable " + present + "\", or mend the schedule";
        throw Refusal("cron would ignore all of " + std::string(kCrontab) + " for the line of " +
                      called(*task) + ": " + *why + ids);
    }
}

CrontabDifference compareCrontab(const Tasks &tasks) {
    const Crontab crontab = requireCrontab();
    std::vector<std::string> present;
    std::copy_if(crontab.lines.begin(), crontab.lines.end(), std::back_inserter(present),
                 [](const std::string &line) { return line.find(kRunner) != std::string::npos; });
    CrontabDifference difference;
    for (const TAVI_SCHED_TASK *const task : tasks.all()) {
        if (isPower(*task) || task->state != TAVI_SCHED_STATE_ENABLED) {
            continue;
        }
        const std::string line = crontabLine(*task);
        const auto found = std::find(present.begin(), present.end(), line);
        if (found == present.end()) {
            difference.missing.push_back(line);
        } else {
            present.erase(found);
        }
    }
    difference.surplus = std::move(present);
    return difference;
}

bool arePowerOffLinesRight(const Tasks &tasks) {
    const Crontab crontab = requireCrontab();
    std::vector<CronTimes> expected;
    for (const TAVI_SCHED_TASK *const task : tasks.all()) {
        const CrontabLine line = parseCrontabLine(crontabLine(*task));
        if (isEnabledPower(*task, kPowerOff) && line.kind == CrontabLine::Kind::Entry) {
            expected.push_back(line.times);
        }
    }
    for (const std::string &line : crontab.lines) {
        if (line.find(kPowerOffCheck) != std::string::npos) {
            const auto found =
                std::find(expected.begin(), expected.end(), parseCrontabLine(line).times);
            if (found == expected.end()) {
                return false;
            }
            expected.erase(found);
        }
    }
    return expected.empty();
}

void requireSyncedCrontab() {
    if (compareCrontab(Tasks::read()).any()) {
        throw Failure(std::string(kCrontab) + " could not be written: " + libraryError());
    }
}

void syncCrontab() {
    const Tasks tasks = Tasks::read();
    requireGoodCrontab({tasks.all().begin(), tasks.all().end()});
    TAVISchedTaskSync(); // tells of no failure
    requireSyncedCrontab();
    if (tasks.lacksPower() || !arePowerOffLinesRight(tasks)) {
        throw Failure("the power schedules could not be set: " + libraryError());
    }
}

} // namespace tavisched
