// What is wrong with this machine. Each function looks at one thing and adds what it finds; those
// that others build on come first, so that mending in this order leads to a machine in order.
#include "check.h"
#include "failure.h"
#include "files.h"
#include "paths.h"
#include "runs.h"
#include "stored_form.h"
#include "task_lines.h"
#include "tasks.h"
#include "text.h"

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <set>
#include <unistd.h>

namespace tavisched {

namespace {

namespace fs = std::filesystem;
using Findings = std::vector<Finding>;
using Mend = std::function<void()>;

constexpr const char *kNobodyElse = " must belong to root, and nobody else may write it";

bool isEmptyOrMissing(const char *path) {
    const auto status = statusOf(path);
    return !status || status->st_size == 0;
}

std::string adviseRootsAlone(const std::string &path) {
    const auto status = statusOf(path.c_str());
    return status && (S_ISREG(status->st_mode) || path == kFolder || path == kPlugins)
               ? "look who changed it; then chown root " + path + " and chmod go-w " + path
               : "remove it: rm -r " + path;
}

// ---- Files ----

void inspectFolders(Findings &findings) {
    const auto folder = statusOf(kFolder);
    if (!folder) {
        findings.push_back({std::string(kFolder) + ", where tasks are kept, is missing", "make it",
                            [] { fs::create_directories(kFolder); }});
    } else if (!S_ISDIR(folder->st_mode) || !isRootsAlone(*folder)) {
        findings.push_back({kFolder + std::string(kNobodyElse), adviseRootsAlone(kFolder), {}});
    }
    const auto lock = statusOf(kLockFolder);
    if (!lock) {
        findings.push_back({std::string(kLockFolder) +
                                " is missing; the first user to make it could keep tasks from "
                                "running",
                            "make it as root, with mode 0755", [] {
                                if (mkdir(kLockFolder, 0755) != 0) {
                                    throw Failure(std::string(kLockFolder) +
                                                  " could not be made: " + systemReason());
                                }
                            }});
    } else if (!S_ISDIR(lock->st_mode) || !isRootsAlone(*lock)) {
        findings.push_back({kLockFolder + std::string(kNobodyElse) + ", or no task runs",
                            std::string("remove it: rm -r ") + kLockFolder,
                            {}});
    }
}

void inspectStrangeFiles(Findings &findings) {
    if (stateOf(kWorkingCopy) == FileState::Strange) {
        const bool canRestore =
            stateOf(kPersistent) == FileState::Trusted && !isEmptyOrMissing(kPersistent);
        findings.push_back(
            {kWorkingCopy + std::string(kNobodyElse) + ", as root runs what it says",
             canRestore ? std::string("replace it by ") + kPersistent
                        : adviseRootsAlone(kWorkingCopy),
             canRestore ? [] { replaceFile(kWorkingCopy, contentOf(kPersistent)); } : Mend()});
    }
    for (const char *const path : {kPersistent, kPowerSchedules}) {
        if (stateOf(path) == FileState::Strange) {
            findings.push_back({path + std::string(kNobodyElse), adviseRootsAlone(path), {}});
        }
    }
}

void inspectChangeLock(Findings &findings) {
    const auto lock = statusOf(kChangeLock);
    if (lock && !S_ISREG(lock->st_mode)) {
        findings.push_back({std::string(kChangeLock) + " is no file, so that no change is possible",
                            std::string("remove it: rm -r ") + kChangeLock,
                            {}});
    }
}

// Answers whether tasks can be read at all; else everything that follows from them would look
// wrong.
bool inspectTaskFiles(Findings &findings) {
    inspectStrangeFiles(findings);
    switch (compareCopies()) {
    case Copies::Same:
        return true;
    case Copies::Strange:
        return false;
    case Copies::WorkingMissing:
        findings.push_back(
            {std::string(kWorkingCopy) + ", from which tasks are read, is missing or empty",
             std::string("make it from ") + kPersistent,
             [] { replaceFile(kWorkingCopy, contentOf(kPersistent)); }});
        return false;
    case Copies::PersistentMissing:
        findings.push_back({std::string(kPersistent) +
                                " is missing, so that all tasks are lost when the machine restarts",
                            std::string("make it from ") + kWorkingCopy,
                            [] { replaceFile(kPersistent, contentOf(kWorkingCopy)); }});
        return true;
    case Copies::Different:
        findings.push_back({std::string(kWorkingCopy) + ", which is in use, and " + kPersistent +
                                ", which outlives a restart, differ",
                            std::string("compare them with diff; keep what is in use: cp ") +
                                kWorkingCopy + " " + kPersistent +
                                "; or go back to what is stored, unless it is cut short: cp " +
                                kPersistent + " " + kWorkingCopy + "; then tavisched sync",
                            {}});
    }
    return true;
}

void inspectPutAside(Findings &findings) {
    std::error_code error;
    for (const auto &entry : fs::directory_iterator(kFolder, error)) {
        if (entry.path().string().starts_with(kPutAside)) {
            findings.push_back({"tasks were put aside in " + entry.path().string() +
                                    " when the working copy was lost",
                                "look for tasks that are missing now, then remove the file",
                                {}});
        }
    }
}

// Whether somebody other than root could put another program in the place of this one.
bool isInForeignHands(const fs::path &program) {
    for (fs::path path = program; path != path.root_path(); path = path.parent_path()) {
        const auto status = statusOf(path.c_str());
        const bool isSticky = status && S_ISDIR(status->st_mode) && status->st_uid == 0 &&
                              (status->st_mode & S_ISVTX) != 0;
        if (!status || (!isRootsAlone(*status) && !isSticky)) {
            return true;
        }
    }
    return false;
}

// The runner lies beside this program.
fs::path ownRunner() {
    return fs::canonical("/proc/self/exe").parent_path() / "tavischedtask";
}

std::string whyNoRunner() {
    const auto link = statusOf(kRunner);
    std::error_code error;
    const fs::path target = fs::canonical(kRunner, error);
    if (!link || error) {
        return "is missing, so that no task runs";
    }
    if (link->st_uid != 0) {
        return "belongs to another user than root";
    }
    if (!fs::is_regular_file(target, error) || access(kRunner, X_OK) != 0 ||
        target.filename() != ownRunner().filename()) {
        return "is not the program tavischedtask, so that no task runs";
    }
    return isInForeignHands(target)
               ? "leads to " + target.string() + ", which others than root can replace"
               : "";
}

void inspectRunner(Findings &findings) {
    const std::string why = whyNoRunner();
    if (why.empty()) {
        return;
    }
    const fs::path own = ownRunner();
    const bool canMend = access(own.c_str(), X_OK) == 0 && !isInForeignHands(own);
    findings.push_back({std::string("the runner ") + kRunner + " " + why,
                        canMend ? "make it a link to " + own.string()
                                : "make it a link to tavischedtask in a folder of root's",
                        canMend ? [own] { replaceByLink(kRunner, own); } : Mend()});
}

// ---- Tasks ----

// The headers of the working copy, as somebody who damaged it left them.
void inspectHeaders(Findings &findings) {
    std::set<std::string> names;
    for (const std::string &line : split(contentOf(kWorkingCopy), '\n')) {
        if (line.starts_with('[') && !names.insert(line).second) {
            findings.push_back({std::string(kWorkingCopy) + " has the section " + printable(line) +
                                    " more than once",
                                "give it another number in both task files by hand",
                                {}});
        } else if (line.starts_with('[') && (line.size() < 3 || !line.ends_with(']'))) {
            findings.push_back(
                {std::string(kWorkingCopy) + " has a damaged header: " + printable(line),
                 "mend it in both task files by hand",
                 {}});
        }
    }
}

// What is wrong with the values of a section; keys that no task has are passed over by readers.
std::string faultsInWords(const std::vector<TAVI_SCHED_FAULT> &faults) {
    std::vector<std::string> words;
    bool isReadable = true;
    for (const TAVI_SCHED_FAULT &fault : faults) {
        const std::string key = "\"" + std::string(fault.key) + "\"";
        if (fault.kind != TAVI_SCHED_FAULT_UNKNOWN_KEY) {
            const bool isMissing = fault.kind == TAVI_SCHED_FAULT_MISSING;
            words.push_back(isMissing ? key + " is missing" : key + ": " + fault.reason);
            isReadable = isReadable && fault.kind == TAVI_SCHED_FAULT_VALUE;
        }
    }
    return words.empty()
               ? ""
               : (isReadable ? "is not read as it is written: " : "is no task that can be read: ") +
                     join(words, "; ");
}

void inspectSection(const std::string &name, Findings &findings) {
    const std::string section = "the section [" + printable(name) + "] of " + kWorkingCopy;
    Hash form;
    PLATCFileGetSection(kWorkingCopy, name.c_str(), form.address());
    if (const std::string faults = faultsInWords(form.faults()); !faults.empty()) {
        findings.push_back(
            {section + " " + faults, "mend it in both task files by hand, or remove it there", {}});
    } else if (form.value("id") != name) {
        findings.push_back({section + " says that its task has the id " + form.value("id"),
                            "give both the same number in both task files",
                            {}});
    } else if (name.starts_with('-') || name == "0") {
        findings.push_back(
            {section + " has a number below 1", "give it another one in both task files", {}});
    }
}

void inspectSections(Findings &findings) {
    if (isEmptyOrMissing(kWorkingCopy)) {
        return;
    }
    inspectHeaders(findings);
    PLATCSZLIST *names = PLATCSzListAlloc(1);
    const int count = PLATCFileEnumSection(kWorkingCopy, &names);
    for (int i = 0; i < count; ++i) {
        inspectSection(PLATCSzListGet(names, i), findings);
    }
    PLATCSzListFree(names);
}

// Daily and weekly tasks run from their first day on, although their next run is shown before it.
bool startsLater(const TAVI_SCHED_TASK &task) {
    TAVI_SCHED_DATE now{};
    TAVI_SCHED_DATE start{};
    start.year = task.startYear;
    start.month = task.startMonth;
    start.day = task.startDay;
    const bool isByDay = task.type == TAVI_SCHED_TYPE_DAILY || task.type == TAVI_SCHED_TYPE_WEEKLY;
    return isByDay && task.state == TAVI_SCHED_STATE_ENABLED && TAVISchedDateGet(&now) == 0 &&
           TAVISchedDateComp(&now, &start) < 0;
}

void inspectTasks(const Tasks &tasks, Findings &findings) {
    for (const TAVI_SCHED_TASK *const task : tasks.all()) {
        const std::string id = std::to_string(task->id);
        if (const auto why = whyCronRejects(*task)) {
            findings.push_back(
                {"cron ignores all of " + std::string(kCrontab) + " for the line of " +
                     called(*task) + ": " + *why,
                 "mend its schedule with tavisched edit " + id + ", or tavisched disable " + id,
                 {}});
        } else if (const auto fault = findFault(*task)) {
            findings.push_back(
                {called(*task) + ": " + inWords(*fault),
                 "mend it with tavisched edit " + id + ", or where the task was made",
                 {}});
        } else if (startsLater(*task)) {
            findings.push_back({called(*task) + " does not run before its first day, whatever is "
                                                "shown as its next run",
                                "say its days anew: tavisched edit " + id + " --daily or --weekly",
                                {}});
        }
    }
}

// ---- cron ----

void inspectCron(Findings &findings) {
    std::ifstream file(kCronPid);
    pid_t pid = 0;
    std::string name;
    if (file >> pid && PLATCProcAlive(pid) == 1) {
        std::getline(std::ifstream("/proc/" + std::to_string(pid) + "/comm") >> std::ws, name);
    }
    if (name.find("cron") == std::string::npos) {
        findings.push_back({"cron is not running, so that no task runs",
                            "start it: systemctl enable --now cron",
                            {}});
    }
}

void inspectCrontabFile(const Crontab &crontab, Findings &findings) {
    const auto status = statusOf(kCrontab);
    if (!status || !S_ISREG(status->st_mode) || !isRootsAlone(*status) || status->st_nlink != 1) {
        findings.push_back({"cron ignores " + std::string(kCrontab) +
                                ", which must be a file of root's with one name, and writable by "
                                "nobody else",
                            adviseRootsAlone(kCrontab),
                            {}});
    }
    for (size_t i = 0; i < crontab.lines.size(); ++i) {
        const auto why = whyCronRejects(crontab.lines[i]);
        if (why && crontab.lines[i].find(kRunner) == std::string::npos) {
            findings.push_back({"cron ignores all of " + std::string(kCrontab) + " for its line " +
                                    std::to_string(i + 1) + ": " + *why,
                                "mend the line by hand",
                                {}});
        }
    }
    if (!crontab.endsWithLineFeed) {
        findings.push_back(
            {"cron ignores all of " + std::string(kCrontab) + ", as its last line has no line feed",
             "add one at the end of the file",
             {}});
    }
}

// Lines of sections that cannot be read, or that cron would reject, are for a person to mend.
void inspectLines(const Tasks &tasks, bool canMend, Findings &findings) {
    const CrontabDifference difference = compareCrontab(tasks);
    const Mend sync = canMend && !anyRejected(tasks) ? syncCrontab : Mend();
    std::vector<std::string> differences;
    for (const std::string &line : difference.missing) {
        differences.push_back("lacks a task's line: " + printable(line));
    }
    for (const std::string &line : difference.surplus) {
        differences.push_back("has a line that no task asks for: " + printable(line));
    }
    if (!tasks.lacksPower() && !arePowerOffLinesRight(tasks)) {
        differences.emplace_back("has other power-off lines than the power-off schedules ask for");
    }
    if (!differences.empty()) {
        findings.push_back(
            {std::string(kCrontab) + " " + join(differences, "\n  and "), "tavisched sync", sync});
    }
}

// ---- Power ----

bool anyEnabledPower(const Tasks &tasks, std::string_view arguments) {
    return std::any_of(tasks.all().begin(), tasks.all().end(),
                       [&](const auto *task) { return isEnabledPower(*task, arguments); });
}

void inspectTwins(const Tasks &tasks, Findings &findings) {
    for (const TAVI_SCHED_TASK *const task : tasks.all()) {
        if (isPower(*task) && tasks.findSameSchedule(*task) != task) {
            findings.push_back({called(*task) + " is there more than once, and a change by its id "
                                                "finds only one of them",
                                "remove one of them",
                                [id = task->id] { TAVISchedTaskRemove(id); }});
        }
    }
}

void inspectPower(const Tasks &tasks, Findings &findings) {
    if (tasks.lacksPower()) {
        findings.push_back({"the power schedules cannot be read: " + libraryError(),
                            "mend or remove the damaged entry in " + std::string(kPowerSchedules) +
                                ", four numbers each: enabled, week bits, hour, minute",
                            {}});
        return;
    }
    inspectTwins(tasks, findings);
    if (anyEnabledPower(tasks, kPowerOff) && access(kPowerOffCheck, X_OK) != 0) {
        findings.push_back({std::string(kPowerOffCheck) +
                                ", which power-off schedules run, is missing or no program",
                            "install one; a default one comes with the package",
                            {}});
    }
    if (anyEnabledPower(tasks, kPowerOn) && access(kWakeAlarm, W_OK) != 0) {
        findings.push_back({"there are power-on schedules, but this machine has no clock that can "
                            "wake it (" +
                                std::string(kWakeAlarm) + ": " + systemReason() + ")",
                            "remove or disable them",
                            {}});
    }
}

// ---- Results and plug-ins ----

void inspectStatusDatabase(Findings &findings) {
    try {
        readRuns();
    } catch (const Failure &failure) {
        findings.push_back(
            {std::string("no task runs without its status database: ") + failure.what(),
             std::string("remove ") + kStatusDatabase +
                 ", which the next run makes anew; how earlier runs ended is lost",
             [] { unlink(kStatusDatabase); }});
    }
}

// A file that was meant as a handler begins as a script or a program does.
bool looksLikeProgram(const fs::path &path) {
    std::ifstream file(path, std::ios::binary);
    std::string start(4, '\0');
    file.read(start.data(), static_cast<std::streamsize>(start.size()));
    return start.starts_with("#!") || start == "\177ELF";
}

void inspectHandler(const fs::path &path, Findings &findings) {
    const auto status = statusOf(path.c_str());
    const bool executable = access(path.c_str(), X_OK) == 0;
    if (!status || S_ISDIR(status->st_mode) || (!executable && !looksLikeProgram(path))) {
        return;
    }
    if (!executable) {
        findings.push_back(
            {"the plug-in handler " + path.string() + " is skipped, as it is not executable",
             "chmod 755 it",
             {}});
    } else if (stateOf(path.c_str()) == FileState::Strange) {
        findings.push_back({"the plug-in handler " + path.string() +
                                " is skipped: it must be a file of root's that nobody else may "
                                "write",
                            adviseRootsAlone(path),
                            {}});
    }
}

void inspectPlugins(Findings &findings) {
    const auto folder = statusOf(kPlugins);
    if (!folder) {
        return;
    }
    if (!S_ISDIR(folder->st_mode) || !isRootsAlone(*folder)) {
        findings.push_back(
            {std::string("all plug-in handlers are skipped: ") + kPlugins + kNobodyElse,
             adviseRootsAlone(kPlugins),
             {}});
        return;
    }
    std::error_code error;
    for (const auto &entry : fs::directory_iterator(kPlugins, error)) {
        inspectHandler(entry.path(), findings);
    }
}

// What can only be seen when the tasks can be read.
void inspectWithTasks(Findings &findings) {
    const auto crontab = readCrontab();
    if (!crontab) {
        findings.push_back({std::string(kCrontab) + " cannot be read: " + systemReason(),
                            "make it; an empty file is enough",
                            {}});
        return;
    }
    inspectCrontabFile(*crontab, findings);
    const size_t before = findings.size();
    inspectSections(findings);
    const bool allSectionsGood = findings.size() == before;
    try {
        const Tasks tasks = Tasks::read();
        inspectTasks(tasks, findings);
        inspectLines(tasks, allSectionsGood, findings);
        inspectPower(tasks, findings);
    } catch (const Failure &failure) {
        findings.push_back(
            {failure.what(), "tavisched --verbose check shows the library's log lines", {}});
    }
}

} // namespace

std::vector<Finding> inspectMachine() {
    Findings findings;
    inspectFolders(findings);
    inspectChangeLock(findings);
    const bool readable = inspectTaskFiles(findings);
    inspectPutAside(findings);
    inspectRunner(findings);
    inspectCron(findings);
    if (readable) {
        inspectWithTasks(findings);
    }
    inspectStatusDatabase(findings);
    inspectPlugins(findings);
    return findings;
}

} // namespace tavisched
