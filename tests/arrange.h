// What tests put on a machine: plug-in handlers, power schedules, runs that go on.
#pragma once

#include "support.h"

namespace support {

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
    Task task = newTask();
    task->backend = TAVI_SCHED_BACKEND_AUTOPOWER;
    EXPECT_EQ(TAVISchedTaskGetDefault(task.get()), 0);
    TAVISchedCTaskSetAppArgs(task.get(), kind);
    TAVISchedCTaskSetRunHour(task.get(), hour);
    TAVISchedCTaskSetRunMin(task.get(), minute);
    return task;
}

// The row of a run of a task that goes on, with which every other run of the task conflicts.
inline void addRunning(int32_t taskId = 1) {
    query("INSERT INTO task_status (pid, timestamp, app, task_id, status_code) VALUES (" +
          std::to_string(getpid()) + ", 1, '', " + std::to_string(taskId) + ", 2)");
}

} // namespace support
