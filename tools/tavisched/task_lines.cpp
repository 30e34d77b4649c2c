// The lines of /etc/crontab that stand for tasks.
#include "task_lines.h"
#include "failure.h"
#include "paths.h"
#include "text.h"

#include <algorithm>
#include <array>
#include <cstring>
#include <fstream>
#include <iterator>
#include <sstream>

namespace tavisched {

namespace {

struct Judgement {
    std::optional<std::string> whyRejected;
    TAVI_SCHED_CRON_TIMES times;
};

Judgement judge(const std::string &line) {
    std::array<char, 512> reason{};
    TAVI_SCHED_CRON_TIMES times{};
    const int result =
        TAVISchedCrontabLineCheck(line.c_str(), &times, reason.data(), reason.size());
    if (result < 0) {
        throw Failure("a line of the crontab cannot be judged: " + libraryError());
    }
    return {result > 0 ? std::optional<std::string>(reason.data()) : std::nullopt, times};
}

bool isSameTime(const TAVI_SCHED_CRON_TIMES &one, const TAVI_SCHED_CRON_TIMES &other) {
    return std::memcmp(&one, &other, sizeof one) == 0;
}

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

std::optional<Crontab> readCrontab() {
    std::ifstream file(kCrontab, std::ios::binary);
    std::stringstream content;
    if (!file || (file.peek() != EOF && !(content << file.rdbuf()))) {
        return std::nullopt;
    }
    Crontab crontab;
    for (std::string line; std::getline(content, line);) {
        crontab.endsWithLineFeed = !content.eof();
        crontab.lines.push_back(line);
    }
    return crontab;
}

std::optional<std::string> whyCronRejects(const std::string &line) {
    return judge(line).whyRejected;
}

std::string crontabLine(const TAVI_SCHED_TASK &task) {
    std::array<char, 512> line{};
    if (TAVISchedCrontabLine(&task, line.data(), line.size()) != 0) {
        throw Failure(called(task) + " has no line: " + libraryError());
    }
    return line.data();
}

std::optional<std::string> whyCronRejects(const TAVI_SCHED_TASK &task) {
    const bool hasLine = !isPower(task) && task.state == TAVI_SCHED_STATE_ENABLED;
    return hasLine ? whyCronRejects(crontabLine(task)) : std::nullopt;
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
    std::vector<TAVI_SCHED_CRON_TIMES> expected;
    for (const TAVI_SCHED_TASK *const task : tasks.all()) {
        const Judgement judgement = judge(crontabLine(*task));
        if (isEnabledPower(*task, kPowerOff) && !judgement.whyRejected) {
            expected.push_back(judgement.times);
        }
    }
    for (const std::string &line : crontab.lines) {
        if (line.find(kPowerOffCheck) != std::string::npos) {
            const auto found = std::find_if(
                expected.begin(), expected.end(),
                [times = judge(line).times](const auto &each) { return isSameTime(each, times); });
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
