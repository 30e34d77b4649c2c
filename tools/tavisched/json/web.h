// Tasks as the web back end exchanges them: every member is a text that is a JSON string once more,
// the command is base64.
#pragma once

#include "json/plain.h"

namespace tavisched {

// The task with two members beside, which the back end does not look at: "backend", and the owner's
// name.
Json::Value webTask(const TAVI_SCHED_TASK &task);

// Whether an element looks like one.
bool isWebTask(const Json::Value &element);
Imported readWeb(const Json::Value &element, ImportFaults &faults);

} // namespace tavisched
