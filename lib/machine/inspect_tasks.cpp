// The sections of the working copy, and the tasks that they are.
#include "backends/task_file.h"
#include "change/change.h"
#include "cron/cron_line.h"
#include "finding.h"
#include "platc.h"
#include "sched_handle.h"
#include "sched_paths.h"
#include "sched_sections.h"
#include "tavischeduler.h"

#include <algorithm>
#include <array>
#include <ctime>

#pragma weak PLATCFileCheckSections // an appliance's own platform may lack it

namespace sched {

namespace {

constexpr const char *kByHand = "mend it in both task files by hand";
constexpr size_t kMostFaults = 32;

void inspectHeaders(const char *path, Inspection &inspection) {
    List faults(16);
    const int count =
        PLATCFileCheckSections && faults ? PLATCFileCheckSections(path, faults.address()) : 0;
    for (int i = 0; i < count; ++i) {
        inspection.add(std::string(kWorkingCopy) + ": " + PLATCSzListGet(faults.get(), i), kByHand);
    }
}

// What is wrong with a stored form, for behind the section's name; "" for nothing. Keys that no
// task has are passed over by readers.
std::string faultsOf(PLATCSZHASH *form) {
    std::array<TAVI_SCHED_FAULT, kMostFaults> faults{};
    const int count = TAVISchedHashCheck(form, faults.data(), faults.size());
    bool isReadable = true;
    std::string words;
    for (size_t i = 0; i < std::min<size_t>(faults.size(), static_cast<size_t>(std::max(count, 0)));
         ++i) {
        const TAVI_SCHED_FAULT &fault = faults[i];
        if (fault.kind == TAVI_SCHED_FAULT_UNKNOWN_KEY) {
            continue;
        }
        const bool isMissing = fault.kind == TAVI_SCHED_FAULT_MISSING;
        isReadable = isReadable && fault.kind == TAVI_SCHED_FAULT_VALUE;
        words += (words.empty() ? "\"" : "; \"") + std::string(fault.key) +
                 (isMissing ? "\" is missing" : "\": " + std::string(fault.reason));
    }
    return words.empty()
               ? ""
               : (isReadable ? "is not read as it is written: " : "is no task that can be read: ") +
                     words;
}

void inspectSection(const std::string &name, PLATCSZHASH *form, Inspection &inspection) {
    const std::string section = "the section [" + name + "] of " + kWorkingCopy;
    if (!form) {
        inspection.add(section + " cannot be read", kByHand);
        return;
    }
    const std::string faults = faultsOf(form);
    const char *const id = PLATCSzHashGetValue(form, "id");
    if (!faults.empty()) {
        inspection.add(section + " " + faults, std::string(kByHand) + ", or remove it there");
    } else if (name != (id ? id : "")) {
        inspection.add(section + " says that its task has the id " + (id ? id : ""),
                       "give both the same number in both task files");
    } else if (name.starts_with('-') || name == "0") {
        inspection.add(section + " has a number below 1", "give it another one in both task files");
    }
}

bool runsOnFirstDay(const TAVI_SCHED_TASK &task) {
    TAVI_SCHED_DATE now{};
    TAVI_SCHED_DATE start{};
    start.year = task.startYear;
    start.month = task.startMonth;
    start.day = task.startDay;
    return TAVISchedDateGet(&now) != 0 || TAVISchedDateComp(&now, &start) >= 0;
}

// Daily and weekly tasks run from their first day on, although their next run is shown before it.
bool startsLater(const TAVI_SCHED_TASK &task) {
    const bool isByDay = task.type == TAVI_SCHED_TYPE_DAILY || task.type == TAVI_SCHED_TYPE_WEEKLY;
    return isByDay && task.state == TAVI_SCHED_STATE_ENABLED && !runsOnFirstDay(task);
}

std::string called(const TAVI_SCHED_TASK &task) {
    const std::string number = "task " + std::to_string(task.id);
    return task.name[0] == '\0' ? number : number + " (" + task.name + ")";
}

// Why cron rejects the line that an enabled task has; "" for nothing.
std::string whyLineIsRejected(const TAVI_SCHED_TASK &task) {
    std::array<char, 512> reason{};
    return task.state == TAVI_SCHED_STATE_ENABLED &&
                   TAVISchedCrontabLineCheck(CronLine(task).c_str(), nullptr, reason.data(),
                                             reason.size()) == 1
               ? reason.data()
               : "";
}

void inspectTask(const TAVI_SCHED_TASK &task, Inspection &inspection) {
    const std::string id = std::to_string(task.id);
    const auto add = [&](std::string what, std::string advice) {
        inspection.add({.what = std::move(what), .advice = std::move(advice), .taskId = task.id});
    };
    TAVI_SCHED_FAULT fault{};
    if (const std::string why = whyLineIsRejected(task); !why.empty()) {
        add("cron ignores all of " + std::string(kCrontab) + " for the line of " + called(task) +
                ": " + why,
            "mend its schedule with tavisched edit " + id + ", or tavisched disable " + id);
    } else if (TAVISchedTaskCheck(&task, &fault) == 1) {
        add(called(task) +
                (fault.key[0] == '\0' ? std::string(": ")
                                      : ": its \"" + std::string(fault.key) + "\" is wrong: ") +
                fault.reason,
            "mend it with tavisched edit " + id + ", or where the task was made");
    } else if (startsLater(task)) {
        add(called(task) + " does not run before its first day, whatever other front ends show as "
                           "its next run",
            "say its days anew: tavisched edit " + id + " --daily or --weekly");
    }
}

// The sound ones of a backend; others have findings of their own.
void addSoundTasks(const TaskList &tasks, std::vector<const TAVI_SCHED_TASK *> &sound) {
    TAVI_SCHED_FAULT fault{};
    for (const TAVI_SCHED_TASK *task = tasks.head(); task; task = task->next) {
        if (TAVISchedTaskCheck(task, &fault) == 0) {
            sound.push_back(task);
        }
    }
}

int addRemark(void *inspection, const TAVI_SCHED_REMARK *remark) {
    static_cast<Inspection *>(inspection)
        ->add({.what = called(*remark->task) + ": " + remark->text,
               .advice = remark->advice,
               .isNote = true,
               .taskId = remark->task->id});
    return 0;
}

} // namespace

void inspectSections(Inspection &inspection) {
    if (!inspection.canReadTasks) {
        return;
    }
    const Reading reading;
    if (!reading || PLATCFileExist(reading.path()) != 1) {
        return;
    }
    const size_t before = inspection.findings.size();
    inspectHeaders(reading.path(), inspection);
    forEachSection(reading.path(), [&](const char *name, PLATCSZHASH *form) {
        inspectSection(name, form, inspection);
        return true;
    });
    inspection.areSectionsGood = inspection.findings.size() == before;
}

void inspectTasks(Inspection &inspection) {
    if (!inspection.canReadTasks) {
        return;
    }
    forEachStoredTask({.onTask = [&](const char *, TAVI_SCHED_TASK *task) {
        task->backend = TAVI_SCHED_BACKEND_SCHEDULE;
        inspectTask(*task, inspection);
        return true;
    }});
}

// Notes: every schedule may be meant as it is.
void inspectSchedules(Inspection &inspection) {
    TaskList tasks;
    TaskList power;
    if (!inspection.canReadTasks ||
        TAVISchedTaskListGetOf(TAVI_SCHED_BACKEND_SCHEDULE, tasks.address(), nullptr) < 0) {
        return;
    }
    TAVISchedTaskListGetOf(TAVI_SCHED_BACKEND_AUTOPOWER, power.address(), nullptr); // or none
    std::vector<const TAVI_SCHED_TASK *> sound;
    addSoundTasks(tasks, sound);
    addSoundTasks(power, sound);
    std::sort(sound.begin(), sound.end(),
              [](const auto *one, const auto *other) { return one->id < other->id; });
    TAVISchedTaskRemarks(sound.data(), sound.size(), nullptr, std::time(nullptr), addRemark,
                         &inspection);
}

} // namespace sched
