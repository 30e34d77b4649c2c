// The subcommands. Each prints its results and returns the exit status; a Refusal or a Failure ends
// it early.
#pragma once

#include "task_options.h"

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

namespace tavisched {

using Ids = std::vector<int32_t>;

struct ListOptions {
    bool all = false;
    bool reverse = false;
    bool json = false;
    std::string sort = "id";
};
// The fields that a list can be sorted by.
const std::vector<std::string> &sortFields();

// commands_show.cpp
int list(const ListOptions &options);
int show(int32_t id, bool json);
int history(std::optional<int32_t> id, size_t limit, bool json);
int exportTasks(const Ids &ids);
// Ids and names of all tasks, a line each, for completion; nothing when they cannot be read.
int completeIds();

// commands_change.cpp
int add(const TaskOptions &options, bool dryRun, bool quiet);
int edit(int32_t id, const TaskOptions &options, bool quiet);
int setEnabled(const Ids &ids, bool enabled);
int removeTasks(const Ids &ids, bool yes);
int importTasks(const std::string &file);
int syncTasks();

// commands_run.cpp
int run(const Ids &ids, bool wait);

// commands_check.cpp
int check(bool repair);

} // namespace tavisched
