// What tests put on a machine, and its task files as a whole: what they hold, what does not belong
// beside them, and the same machine again for the next try.
#pragma once

#include "support.h"

#include <filesystem>
#include <map>

namespace support {

// Tests of many points take each, or, where a fork costs many times as much, one of so many.
#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
constexpr size_t kStep = 9;
#else
constexpr size_t kStep = 1;
#endif

constexpr const char *kPower = "/usr/tavi/etc/auto_power";
constexpr const char *kRecord = "/usr/tavi/etc/scheduled_tasks.journal";

// A handler of changes of tasks, or of another plug-in, from the lines of a shell script.
inline void addHandler(const std::string &name, const std::string &script, mode_t mode = 0755,
                       const std::string &plugin = "task_scheduler") {
    const std::string folder = "/usr/tavi/etc/plugins/" + plugin;
    const std::string path = folder + "/" + name;
    EXPECT_EQ(shell("mkdir -p " + folder), 0);
    writeFile(path, "#!/bin/sh\n" + script + "\n");
    chmod(path.c_str(), mode);
}

// A new power schedule of every day: "poweron" or "poweroff".
inline Task powerTask(const char *kind, int hour = 0, int minute = 0) {
    const OwnAllocations own;
    Task task = newTask();
    TAVISchedCTaskSetBackend(task.get(), TAVI_SCHED_BACKEND_AUTOPOWER);
    TAVISchedTaskGetDefault(task.get());
    TAVISchedCTaskSetAppArgs(task.get(), kind);
    TAVISchedCTaskSetRunHour(task.get(), hour);
    TAVISchedCTaskSetRunMin(task.get(), minute);
    return task;
}

// The row of a run of task 1 that goes on, with which its every other run conflicts.
inline void addRunning() {
    query("INSERT INTO task_status (pid, timestamp, app, task_id, status_code) VALUES (" +
          std::to_string(getpid()) + ", 1, '', 1, 2)");
}

// The runs on record of a task, or with -1 of all; those that are wanted, the newest first.
TAVI_SCHED_RUN_FILTER ofTask(int32_t id);
std::vector<TAVI_SCHED_RUN> runs(TAVI_SCHED_RUN_FILTER filter);

// By path; a file that is not there is "(none)", and the crontab's lines are sorted: they may
// change places. With "list", what a process that has just started lists.
using State = std::map<std::string, std::string>;
State stateNow(const std::string &list = "");

// What is in the folders of these files and does not belong there.
std::vector<std::string> leftovers();

// The files as they are when it is made, also those of runs, to start again from.
class Snapshot {
  public:
    Snapshot();
    void restore() const;

  private:
    std::map<std::string, std::pair<std::string, std::filesystem::file_time_type>> files_;
};

// At one of many points nothing is wrong, and nothing left; else it tells what the library logged.
void expectNone(std::string faults, const std::string &where);

// Of these points those that a test takes: all with TAVI_TEST_ALL, else at most so many.
std::vector<size_t> chosen(const std::vector<size_t> &points, size_t most);
// 1 to so many.
std::vector<size_t> upTo(size_t count);

// What a process that has just started lists: "id name command; ...", or "failed".
std::string listOfFreshProcess();

// Stores a task of that name, task 2 with another one, a power-off schedule: 0 or 1.
int created(const char *name, const char *command = "true");
int edited(const char *name, const char *command = "true");
int powerCreated(int hour = 22);

// The result of a function in a process of its own.
template <typename Function> int inChild(Function &&function) {
    return exitOf(start(function));
}

} // namespace support
