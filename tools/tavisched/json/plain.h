// Tasks and runs as plain JSON, for scripts and for people: "list --json", "show --json" and
// "history --json" write it, and "export" and "import" exchange tasks in it.
#pragma once

#include "tasks/runs.h"
#include "tasks/starts.h"
#include "tasks/tasks.h"
#include "json/faults.h"

#include <json/value.h>

namespace tavisched {

// Bytes that are no UTF-8 become U+FFFD.
std::string plainText(const std::string &text);
// What is stored of a task.
Json::Value plainStored(const TAVI_SCHED_TASK &task);
// The same with what follows from it: the schedule in words, the next run as the library shows it
// and as it will be, the last one, and what is remarkable.
Json::Value plainTask(const TAVI_SCHED_TASK &task, const LatestRuns &latestRuns,
                      const Notes &notes);
// That with the starts that come next.
Json::Value plainTaskWithStarts(const TAVI_SCHED_TASK &task, const LatestRuns &latestRuns,
                                const Notes &notes);
Json::Value plainTimes(const std::vector<time_t> &times);
// "on" or "off" for a power schedule, else null.
Json::Value plainPower(const TAVI_SCHED_TASK &task);
Json::Value plainRun(const Run &run);

// A task that was read, and what a person should know of it; no task when it has faults.
struct Imported {
    Task task;
    std::string note;
};
// Members that are left out have the defaults of a new task, and those that follow from others are
// passed over.
Imported readPlain(const Json::Value &element, ImportFaults &faults);

// Gives the task the owner of that name, as numbers differ between machines, and says so when it
// differs from the number that the task has.
void takeOwner(const std::string &name, const std::string &member, Imported &imported,
               ImportFaults &faults);
// What is wrong with the whole task is told under `nameOf`'s name of the field. False then.
bool requireGood(const TAVI_SCHED_TASK &task, std::string (*nameOf)(const std::string &key),
                 ImportFaults &faults);

} // namespace tavisched
