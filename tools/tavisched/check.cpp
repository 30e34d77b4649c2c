// What is wrong with this machine. Each function looks at one thing and adds what it finds; those
// that others build on come first, so that mending in this order leads to a machine in order.
#include "check.h"
#include "crontab.h"
#include "paths.h"
#include "store.h"
#include "stored_form.h"
#include "task_rules.h"
#include "text.h"

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <optional>
#include <sys/stat.h>
#include <unistd.h>

namespace tavisched {

namespace {

namespace fs = std::filesystem;
using Findings = std::vector<Finding>;

std::optional<struct stat> statusOf(const char *path) {
    struct stat status {};
    return lstat(path, &status) == 0 ? std::optional(status) : std::nullopt;
}

bool isEmptyOrMissing(const char *path) {
    const auto status = statusOf(path);
    return !status || status->st_size == 0;
}

// ---- Mending ----

// Makes a file anew from another one; it appears whole or not at all, and no link is followed.
void copyOver(const char *from, const char *to) {
    std::ifstream source(from, std::ios::binary);
    const std::string text(std::istreambuf_iterator<char>(source), {});
    std::string path = std::string(to) + ".XXXXXX";
    const int fd = mkstemp(path.data()); // mode 0600
    const bool written = fd != -1 &&
                         write(fd, text.data(), text.size()) == static_cast<ssize_t>(text.size()) &&
                         fsync(fd) == 0;
    const int writeErrno = errno;
    if (fd != -1) {
        close(fd);
    }
    if (!source || !written || rename(path.c_str(), to) != 0) {
        errno = written ? errno : writeErrno;
        const std::string why = systemReason();
        unlink(path.c_str());
        throw Failure(std::string(to) + " could not be made from " + from + ": " + why);
    }
}

void makeFolder(const char *path) {
    std::error_code error;
    fs::create_directories(path, error);
    if (error || chmod(path, 0755) != 0) {
        throw Failure(std::string(path) + " could not be made");
    }
}

// The runner lies beside this program.
fs::path ownRunner() {
    return fs::canonical("/proc/self/exe").parent_path() / "tavischedtask";
}

void linkRunner() {
    if (unlink(kRunner) != 0 && errno != ENOENT) {
        throw Failure(std::string(kRunner) + " could not be removed: " + systemReason());
    }
    if (symlink(ownRunner().c_str(), kRunner) != 0) {
        throw Failure(std::string(kRunner) + " could not be made: " + systemReason());
    }
}

// ---- Files ----

void inspectFolders(Findings &findings) {
    if (access(kFolder, F_OK) != 0) {
        findings.push_back({std::string(kFolder) + ", where tasks are kept, is missing", "make it",
                            [] { makeFolder(kFolder); }});
    }
    const auto lock = statusOf(kLockFolder);
    if (!lock) {
        findings.push_back({std::string(kLockFolder) +
                                " is missing; the first user to make it could keep tasks from "
                                "running",
                            "make it as root, with mode 0755", [] { makeFolder(kLockFolder); }});
    } else if (!S_ISDIR(lock->st_mode) || lock->st_uid != 0 || (lock->st_mode & S_IWOTH) != 0) {
        findings.push_back({std::string(kLockFolder) +
                                " is not a folder of root's that nobody else may write, so that no "
                                "task runs",
                            std::string("remove it: rm -r ") + kLockFolder,
                            {}});
    }
}

bool isTrustedWorkingCopy(const struct stat &status) {
    return S_ISREG(status.st_mode) && status.st_uid == 0 && (status.st_mode & S_IWOTH) == 0;
}

// Answers whether tasks can be read at all; else everything that follows from them would look
// wrong.
bool inspectTaskFiles(Findings &findings) {
    const auto working = statusOf(kWorkingCopy);
    const auto restore = [] { copyOver(kPersistent, kWorkingCopy); };
    if (working && !isTrustedWorkingCopy(*working)) {
        findings.push_back({std::string(kWorkingCopy) +
                                " is not a file of root's that nobody else may write, so "
                                "that no task is read from it",
                            std::string("remove it, or replace it by ") + kPersistent,
                            isEmptyOrMissing(kPersistent) ? std::function<void()>() : restore});
        return false;
    }
    switch (compareCopies()) {
    case Copies::Same:
        break;
    case Copies::WorkingMissing:
        findings.push_back({std::string(kWorkingCopy) + ", from which tasks are read, is missing "
                                                        "or empty",
                            std::string("make it from ") + kPersistent, restore});
        return false;
    case Copies::PersistentMissing:
        findings.push_back({std::string(kPersistent) + " is missing, so that all tasks are lost "
                                                       "when the machine restarts",
                            std::string("make it from ") + kWorkingCopy,
                            [] { copyOver(kWorkingCopy, kPersistent); }});
        break;
    case Copies::Different:
        findings.push_back({std::string(kWorkingCopy) + ", which is in use, and " + kPersistent +
                                ", which outlives a restart, differ",
                            std::string("compare them with diff; keep what is in use: cp ") +
                                kWorkingCopy + " " + kPersistent +
                                "; or go back to what is stored: cp " + kPersistent + " " +
                                kWorkingCopy + "; then tavisched sync",
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
    struct stat status {};
    for (fs::path path = program; path != path.root_path(); path = path.parent_path()) {
        const bool othersWrite = lstat(path.c_str(), &status) != 0 || status.st_uid != 0 ||
                                 ((status.st_mode & S_IWOTH) != 0 &&
                                  !(S_ISDIR(status.st_mode) && (status.st_mode & S_ISVTX) != 0));
        if (othersWrite) {
            return true;
        }
    }
    return false;
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
    if (!fs::is_regular_file(target, error) || access(kRunner, X_OK) != 0) {
        return "is no program, so that no task runs";
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
                        canMend ? linkRunner : std::function<void()>()});
}

// ---- Tasks ----

void inspectSections(Findings &findings) {
    if (isEmptyOrMissing(kWorkingCopy)) {
        return;
    }
    const StoredForm rules;
    PLATCSZLIST *names = PLATCSzListAlloc(1);
    const int count = PLATCFileEnumSection(kWorkingCopy, &names);
    for (int i = 0; i < count; ++i) {
        const std::string name = PLATCSzListGet(names, i);
        const std::string section = "the section [" + printable(name) + "] of " + kWorkingCopy;
        Hash form;
        PLATCFileGetSection(kWorkingCopy, name.c_str(), form.address());
        if (const auto why = rules.whyUnreadable(form)) {
            findings.push_back({section + " is no task that can be read: " + *why,
                                "mend it in both task files by hand, or remove it there",
                                {}});
        } else if (form.value("id") != name) {
            findings.push_back({section + " says that its task has the id " + form.value("id"),
                                "give both the same number in both task files",
                                {}});
        }
    }
    PLATCSzListFree(names);
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
            findings.push_back({called(*task) + ": its \"" + std::string(fault->key) +
                                    "\" is wrong: " + fault->what,
                                "mend it with tavisched edit " + id,
                                {}});
        }
    }
}

// ---- cron ----

void inspectCron(Findings &findings) {
    std::ifstream file(kCronPid);
    pid_t pid = 0;
    if (!(file >> pid) || PLATCProcAlive(pid) == 0) {
        findings.push_back({"cron is not running, so that no task runs",
                            "start it: systemctl enable --now cron",
                            {}});
    }
}

void inspectForeignLines(const Crontab &crontab, Findings &findings) {
    for (size_t i = 0; i < crontab.lines.size(); ++i) {
        const CrontabLine line = parseCrontabLine(crontab.lines[i]);
        if (line.kind == CrontabLine::Kind::Rejected &&
            crontab.lines[i].find(kRunner) == std::string::npos) {
            findings.push_back({"cron ignores all of " + std::string(kCrontab) + " for its line " +
                                    std::to_string(i + 1) + ": " + printable(line.reason),
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

bool hasRejectedLine(const Tasks &tasks) {
    return std::any_of(tasks.all().begin(), tasks.all().end(),
                       [](const auto *task) { return whyCronRejects(*task).has_value(); });
}

void inspectOwnLines(const Tasks &tasks, Findings &findings) {
    const CrontabDifference difference = compareCrontab(tasks);
    const std::function<void()> sync =
        hasRejectedLine(tasks) ? std::function<void()>() : [] { TAVISchedTaskSync(); };
    for (const std::string &line : difference.missing) {
        findings.push_back(
            {std::string(kCrontab) + " lacks a task's line: " + line, "tavisched sync", sync});
    }
    for (const std::string &line : difference.surplus) {
        findings.push_back(
            {std::string(kCrontab) + " has a line that no task asks for: " + printable(line),
             "tavisched sync", sync});
    }
}

// ---- Power ----

bool anyEnabledPower(const Tasks &tasks, std::string_view arguments) {
    return std::any_of(tasks.all().begin(), tasks.all().end(),
                       [&](const auto *task) { return isEnabledPower(*task, arguments); });
}

void inspectPowerOff(const Tasks &tasks, const Crontab &crontab, Findings &findings) {
    if (!arePowerOffLinesRight(tasks, crontab)) {
        findings.push_back({"the power-off lines of " + std::string(kCrontab) +
                                " are not those of the power-off schedules",
                            "tavisched sync", [] { TAVISchedTaskSync(); }});
    }
    if (anyEnabledPower(tasks, kPowerOff) && access(kPowerOffCheck, X_OK) != 0) {
        findings.push_back({std::string(kPowerOffCheck) +
                                ", which power-off schedules run, is missing or no program",
                            "install one; a default one comes with the package",
                            {}});
    }
}

void inspectWakeAlarm(const Tasks &tasks, Findings &findings) {
    if (anyEnabledPower(tasks, kPowerOn) && access(kWakeAlarm, W_OK) != 0) {
        findings.push_back({"there are power-on schedules, but this machine has no clock that can "
                            "wake it (" +
                                std::string(kWakeAlarm) + ": " + systemReason() + ")",
                            "remove or disable them",
                            {}});
    }
}

// ---- Plug-ins ----

bool isRootsAlone(const struct stat &status) {
    return status.st_uid == 0 && (status.st_mode & (S_IWGRP | S_IWOTH)) == 0;
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
        findings.push_back({"the plug-in handler " + path.string() +
                                " is skipped, as it is not "
                                "executable",
                            "chmod 755 it",
                            {}});
    } else if (!S_ISREG(status->st_mode) || !isRootsAlone(*status)) {
        findings.push_back({"the plug-in handler " + path.string() +
                                " is skipped: it must be a file of root's that nobody else may "
                                "write",
                            "chown root it and chmod 755 it",
                            {}});
    }
}

void inspectPlugins(Findings &findings) {
    const auto folder = statusOf(kPlugins);
    if (!folder) {
        return;
    }
    if (!S_ISDIR(folder->st_mode) || !isRootsAlone(*folder)) {
        findings.push_back({std::string("all plug-in handlers are skipped: ") + kPlugins +
                                " must be a folder of root's that nobody else may write",
                            std::string("chown root ") + kPlugins + " and chmod 755 it",
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
    inspectForeignLines(*crontab, findings);
    try {
        const Tasks tasks = Tasks::read();
        inspectTasks(tasks, findings);
        inspectOwnLines(tasks, findings);
        if (tasks.lacksPower()) {
            findings.push_back(
                {"the power schedules cannot be read: " + libraryError(),
                 "mend or remove the damaged entry in " + std::string(kPowerSchedules),
                 {}});
        } else {
            inspectPowerOff(tasks, *crontab, findings);
            inspectWakeAlarm(tasks, findings);
        }
    } catch (const Failure &failure) {
        findings.push_back(
            {failure.what(), "tavisched --verbose check shows the library's log lines", {}});
    }
}

} // namespace

std::vector<Finding> inspectMachine() {
    Findings findings;
    inspectFolders(findings);
    const bool readable = inspectTaskFiles(findings);
    inspectPutAside(findings);
    inspectRunner(findings);
    inspectCron(findings);
    if (readable) {
        inspectSections(findings);
        inspectWithTasks(findings);
    }
    inspectPlugins(findings);
    return findings;
}

} // namespace tavisched
