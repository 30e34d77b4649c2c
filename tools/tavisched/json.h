// Tasks and runs as JSON: plain objects for scripts, and the text of the web back end, in which
// every member's text is a JSON string once more, for export and import.
#pragma once

#include "runs.h"
#include "tasks.h"

#include <json/value.h>
#include <map>
#include <string>
#include <vector>

namespace tavisched {

// ---- For scripts ----

Json::Value plainTask(const TAVI_SCHED_TASK &task, const std::map<int32_t, Run> &latestRuns);
Json::Value plainRun(const Run &run);
void printJson(const Json::Value &value);

// ---- For exchange ----

// The task as the web back end exchanges it, on one line.
std::string webText(const TAVI_SCHED_TASK &task);
// The same as an object, with the member "backend" beside, which the back end does not look at.
// Fails when a text of the task is no UTF-8, as it would not come back.
Json::Value exportedTask(const TAVI_SCHED_TASK &task);
// The tasks of an exported array. Refused with every fault that it has: element, member, what is
// wrong and what is accepted.
std::vector<Task> parseImport(const std::string &text);

} // namespace tavisched
