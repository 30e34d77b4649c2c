// What is wrong with this machine, as far as scheduled tasks are concerned. Each function looks at
// one thing and adds what it finds; machine.cpp has the table of them.
#pragma once

#include <functional>
#include <string>
#include <vector>

namespace sched {

struct Finding {
    std::string what;
    std::string advice;
    std::function<bool()> repair = nullptr; // empty when it is not safe without a person
    std::string repaired{};                 // what the repair has done
    bool isNote = false;                    // nothing is wrong yet
    int32_t taskId = 0;                     // that it is about; 0 for none
};

// What was found, and what those that come later build on.
struct Inspection {
    std::vector<Finding> findings;
    bool isSettled = true;       // no change goes on that could be met half done
    bool hasRoom = true;         // in /tmp
    bool canReadTasks = true;    // else everything that follows from them would look wrong
    bool areCopiesSame = true;   // both task files say the same
    bool areSectionsGood = true; // every section is a task as it is written
    bool canReadPower = true;
    bool looksAtTasks = true; // what is wrong with a task's line is told of the task

    void add(Finding finding) { findings.push_back(std::move(finding)); }
    void add(std::string what, std::string advice) {
        findings.push_back({.what = std::move(what), .advice = std::move(advice)});
    }
};

// inspect_files.cpp
void inspectRoom(Inspection &inspection);
void inspectFolders(Inspection &inspection);
void inspectTaskFiles(Inspection &inspection);
void inspectMissingFiles(Inspection &inspection);
void inspectLeftovers(Inspection &inspection);
void inspectPutAside(Inspection &inspection);
void inspectRunner(Inspection &inspection);

// inspect_tasks.cpp
void inspectSections(Inspection &inspection);
void inspectTasks(Inspection &inspection);
void inspectSchedules(Inspection &inspection);

// inspect_cron.cpp
void inspectCron(Inspection &inspection);
void inspectCrontabFile(Inspection &inspection);
void inspectLines(Inspection &inspection);

// inspect_power.cpp
void inspectPower(Inspection &inspection);

// inspect_runs.cpp
void inspectStatusDatabase(Inspection &inspection);
void inspectRecordFiles(Inspection &inspection);
void inspectRecords(Inspection &inspection);
void inspectPlugins(Inspection &inspection);

} // namespace sched
