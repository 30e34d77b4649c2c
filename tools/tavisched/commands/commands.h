// The subcommands, each in the file of its name. They print their results and return the exit
// status; a Refusal or a Failure ends them early.
#pragma once

#include "tasks/options.h"

#include <cstdint>
#include <ctime>
#include <optional>
#include <string>
#include <vector>

namespace tavisched {

using Ids = std::vector<int32_t>;

struct ListOptions {
    std::vector<std::string> words; // each must be found in the task
    std::string owner;
    std::string next; // such as "24h"
    std::string sort = "id";
    bool all = false;
    bool failed = false;
    bool reverse = false;
    bool json = false;
};
// The fields that a list can be sorted by.
const std::vector<std::string> &sortFields();
int list(const ListOptions &options);

int show(int32_t id, bool json);
struct HistoryOptions {
    std::optional<int32_t> id; // without it, of all tasks, removed ones too
    std::string since;         // such as "24h" or "2026-12-24"
    int limit = 0;             // 0 = all
    bool failed = false;
    bool json = false;
};
int history(const HistoryOptions &options);
int log(int32_t id, std::optional<int64_t> number, bool follow);
int exportTasks(const Ids &ids, bool web);
struct NextOptions {
    Ids ids;           // none: of all tasks
    int number = 0;    // at most so many starts; 0 = 10, or all until a moment that was given
    std::string until; // such as "2026-12-24" or "24h"
    bool all = false;
    bool json = false;
};
int next(const NextOptions &options);
struct CalendarOptions {
    int days = 7; // from today on
    int past = 1; // before today
    bool hours = false;
    bool all = false;
    bool json = false;
};
int calendar(const CalendarOptions &options);

// How a change of a task goes, and is told.
struct Manner {
    bool dryRun = false;
    bool quiet = false; // the id alone
    bool json = false;
};
int add(const TaskOptions &options, const Manner &manner);
int edit(int32_t id, const TaskOptions &options, const Manner &manner);
int setEnabled(const Ids &ids, bool enabled); // enable.cpp
int removeTasks(const Ids &ids, bool yes);
struct ImportOptions {
    std::string file;
    bool replace = false;
    bool dryRun = false;
};
int importTasks(const ImportOptions &options);

struct RunOptions {
    bool wait = false;
    bool missed = false; // all tasks that missed their last time, instead of ids
};
int run(const Ids &ids, const RunOptions &options);
int stop(const Ids &ids, int graceSeconds);
int syncTasks();
int check(bool repair, bool json);

// Ids and names of all tasks, a line each, for completion.
int completeIds();

} // namespace tavisched
