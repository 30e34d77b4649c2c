// The schedule backend's task file: the working copy, which every read takes, and the persistent
// file, which every change writes first. While a batch goes on, what it has staged lies over them.
//
// Messages and errors name the backend's source, with stable site numbers.
#pragma once

#include "tavischeduler.h"

#include <array>
#include <cstdint>
#include <functional>
#include <string>
#include <vector>

namespace sched {

struct Before;

using SectionName = std::array<char, 512>;
SectionName sectionName(int32_t id);

// What a pass over all tasks does with each of them: the task is the pass's own and is overwritten
// by the next one, or, with `fresh`, it is the function's to keep. Only then it has its next
// trigger time, which costs as much as the rest.
struct TaskPass {
    bool fresh = false;
    // False ends the pass.
    std::function<bool(const char *section, TAVI_SCHED_TASK *task)> onTask;
    // A section that cannot be read, or is no task; that has been logged.
    std::function<void(const char *section)> onUnreadable = [](const char *) {};
};
// Hands every task over, in file order. 0, or -1 when the file cannot be read or memory is out.
int forEachStoredTask(const TaskPass &pass);

// 1 found, 0 not there, -1; the site numbers are those of a look-up by id.
int readStoredTask(int32_t id, TAVI_SCHED_TASK *task);

// The smallest free id. 0 or -1.
int nextFreeId(int32_t *id);

// Writes the task's section, or removes the id's when there is no task: 1 changed, 0 nothing to
// remove, -1. To be called within a change.
int setTaskSection(int32_t id, const TAVI_SCHED_TASK *task);

// The schedule backend's part in a batch but for the crontab.
bool isAnyTaskStaged();
// The batch stores the section.
bool isTaskStaged(const std::string &section);
int describeStaged(Before &before);
int storeStaged();
void forgetStaged();

} // namespace sched
