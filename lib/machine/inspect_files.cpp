// The task files, the folders that runs need, the runner, and room for all of it.
#include "base/file.h"
#include "base/trust.h"
#include "change/change.h"
#include "change/leftovers.h"
#include "cron/runner.h"
#include "finding.h"
#include "sched_paths.h"
#include "sched_shared_file.h"
#include "tavischeduler.h"

#include <array>
#include <filesystem>
#include <optional>
#include <set>
#include <sys/stat.h>
#include <sys/statvfs.h>

namespace sched {

namespace {

namespace fs = std::filesystem;

constexpr const char *kNobodyElse = " must belong to root, and nobody else may write it";

std::string adviseRootsAlone(const std::string &path) {
    struct stat status {};
    const bool isOwn =
        lstat(path.c_str(), &status) == 0 && (S_ISREG(status.st_mode) || path == kTaskFolder);
    return isOwn ? "look who changed it; then chown root " + path + " and chmod go-w " + path
                 : "remove it: rm -r " + path;
}

// A task file as a change would meet it.
struct TaskFile {
    base::Found found = base::Found::Nothing;
    std::optional<std::string> content;
    bool isEmpty() const { return !content || content->empty(); }
    bool isStrange() const {
        return found != base::Found::Trusted && found != base::Found::Nothing;
    }
};

TaskFile readTaskFile(const char *path, bool isRootsAlone) {
    base::TrustRule rule = base::kSharedFileToRead;
    if (isRootsAlone) {
        rule = base::kRootsFile;
    }
    const base::Opened opened = base::openTrusted(path, rule);
    TaskFile file{opened.found, {}};
    if (opened.found == base::Found::Trusted) {
        file.content = base::readAll(opened.file.get());
        file.found = file.content ? file.found : base::Found::Unreadable;
    }
    return file;
}

// The working copy anew, within a change: nobody else writes meanwhile.
bool makeWorkingCopy() {
    const Change change;
    const TaskFile stored = readTaskFile(kPersistent, false);
    const bool isUsable =
        stored.found == base::Found::Trusted || stored.found == base::Found::Nothing;
    return change && isUsable && replaceWorkingCopy(stored.content.value_or(""));
}

bool makePersistent() {
    const Change change;
    const TaskFile working = readTaskFile(kWorkingCopy, false);
    base::Replacement file(kPersistent);
    return change && working.content && file.open() && file.write(*working.content) &&
           file.commit({});
}

bool makeLockFolder() {
    return ensureSharedFolder(kRunLockFolder) == 0;
}

// A change and a run need another copy of the largest file that they write there.
struct Room {
    const char *folder;
    const char *file;
    const char *consequence;
};

void inspectRoomIn(const Room &room, Inspection &inspection) {
    constexpr uintmax_t kMore = 4096; // bytes
    struct statvfs status {};
    std::error_code error;
    const uintmax_t size = fs::file_size(room.file, error);
    if (statvfs(room.folder, &status) != 0) {
        return;
    }
    const bool lacksBytes = status.f_bavail * status.f_frsize < kMore + (error ? 0 : size);
    const bool lacksInodes = status.f_files > 0 && status.f_favail == 0;
    if (!lacksBytes && !lacksInodes) {
        return;
    }
    inspection.hasRoom = false;
    inspection.add(std::string("the file system of ") + room.folder + " has no room left (" +
                       (lacksBytes ? "bytes" : "inodes") + "), so that " + room.consequence,
                   std::string("make room; ") + (lacksBytes ? "du -x " : "du -x --inodes ") +
                       room.folder + " shows what takes it");
}

} // namespace

void inspectRoom(Inspection &inspection) {
    constexpr const char *kNoTask = "no task can be changed or run";
    constexpr std::array<Room, 4> kRooms = {{{"/tmp", kWorkingCopy, kNoTask},
                                             {kTaskFolder, kPersistent, kNoTask},
                                             {"/etc", kCrontab, kNoTask},
                                             {kRecordFolder, kRunNumber, "runs are not recorded"}}};
    std::set<dev_t> seen;
    for (const Room &room : kRooms) {
        struct stat status {};
        if (stat(room.folder, &status) == 0 && seen.insert(status.st_dev).second) {
            inspectRoomIn(room, inspection);
        }
    }
}

void inspectFolders(Inspection &inspection) {
    switch (base::look(kTaskFolder, base::kRootsFolder)) {
    case base::Found::Nothing:
        inspection.add({std::string(kTaskFolder) + ", where tasks are kept, is missing",
                        "make it as root, with mode 0755",
                        [] {
                            std::error_code error;
                            fs::create_directories(kTaskFolder, error);
                            return !error;
                        },
                        "it was made, with mode 0755"});
        break;
    case base::Found::Trusted:
        break;
    default:
        inspection.add(kTaskFolder + std::string(kNobodyElse), adviseRootsAlone(kTaskFolder));
    }
    switch (base::look(kRunLockFolder, base::kRootsFolder)) {
    case base::Found::Nothing:
        inspection.add({std::string(kRunLockFolder) +
                            " is missing; the first user to make it could keep tasks from running",
                        "make it as root, with mode 0755", makeLockFolder,
                        "it was made, with mode 0755"});
        break;
    case base::Found::Trusted:
        break;
    default:
        inspection.add({kRunLockFolder + std::string(kNobodyElse) + ", or no task runs",
                        "put a folder of root's in its place", makeLockFolder,
                        "a folder of root's was put in its place"});
    }
}

// What stands there is not the tasks, or only perhaps: a change would make that worse.
void inspectTaskFiles(Inspection &inspection) {
    const TaskFile working = readTaskFile(kWorkingCopy, true);
    const TaskFile stored = readTaskFile(kPersistent, true);
    inspection.areCopiesSame = inspection.isSettled && (working.content == stored.content ||
                                                        (working.isEmpty() && stored.isEmpty()));
    if (stored.isStrange()) {
        inspection.canReadTasks = working.found == base::Found::Trusted;
        inspection.add(kPersistent + std::string(kNobodyElse), adviseRootsAlone(kPersistent));
    } else if (working.isStrange()) {
        inspection.canReadTasks = false;
        inspection.add({kWorkingCopy + std::string(kNobodyElse) + ", as root runs what it says",
                        std::string("put what ") + kPersistent + " says in its place",
                        makeWorkingCopy,
                        std::string("what ") + kPersistent + " says was put in its place"});
    } else if (working.isEmpty() && !stored.isEmpty()) {
        inspection.canReadTasks = false;
        inspection.add(
            {std::string(kWorkingCopy) + ", from which tasks are read, is missing or empty",
             std::string("make it from ") + kPersistent, makeWorkingCopy,
             std::string("it was made from ") + kPersistent});
    } else if (!stored.isEmpty() && working.content != stored.content && inspection.isSettled) {
        inspection.add(std::string(kWorkingCopy) + ", which is in use, and " + kPersistent +
                           ", which outlives a restart, differ",
                       std::string("compare them with diff; keep what is in use: cp ") +
                           kWorkingCopy + " " + kPersistent +
                           "; or go back to what is stored, unless it is cut short: cp " +
                           kPersistent + " " + kWorkingCopy + "; then tavisched sync");
    }
}

// The next change makes them.
void inspectMissingFiles(Inspection &inspection) {
    const TaskFile working = readTaskFile(kWorkingCopy, true);
    const TaskFile stored = readTaskFile(kPersistent, true);
    if (working.found == base::Found::Nothing && stored.isEmpty() && !stored.isStrange()) {
        inspection.add(
            {std::string(kWorkingCopy) + " is missing, and any user could put one of his own there",
             "make it, empty", makeWorkingCopy, "it was made, empty"});
    } else if (stored.isEmpty() && !stored.isStrange() && !working.isEmpty() &&
               inspection.isSettled) {
        inspection.add({std::string(kPersistent) + " is missing or empty, so that all tasks are "
                                                   "lost when the machine restarts",
                        std::string("make it from ") + kWorkingCopy, makePersistent,
                        std::string("it was made from ") + kWorkingCopy});
    }
}

void inspectLeftovers(Inspection &inspection) {
    const std::vector<std::string> files = findScratchFiles();
    if (!files.empty()) {
        inspection.add(
            {files.front() +
                 (files.size() == 1 ? " was"
                                    : " and " + std::to_string(files.size() - 1) + " more were") +
                 " left by a change whose process is gone",
             "remove it",
             [] {
                 for (const std::string &path : findScratchFiles()) {
                     unlink(path.c_str());
                 }
                 return findScratchFiles().empty();
             },
             "what was left was removed"});
    }
}

void inspectPutAside(Inspection &inspection) {
    std::error_code error;
    fs::directory_iterator entry(kTaskFolder, error);
    for (; !error && entry != fs::directory_iterator(); entry.increment(error)) {
        if (entry->path().native().starts_with(kPutAside)) {
            inspection.add("tasks were put aside in " + entry->path().string() +
                               " when the working copy was lost",
                           "look for tasks that are missing now, then remove the file");
        }
    }
}

void inspectRunner(Inspection &inspection) {
    const std::string why = whyNoRunner();
    if (why.empty()) {
        return;
    }
    const std::string program = findRunnerProgram();
    Finding finding{.what = std::string("the runner ") + kRunner + " " + why,
                    .advice = "make it a link to tavischedtask in a folder of root's"};
    if (!program.empty()) {
        finding.advice = "make it a link to " + program;
        finding.repair = [] { return makeRunnerLink() == 0; };
        finding.repaired = "it was made a link to " + program;
    }
    inspection.add(std::move(finding));
}

} // namespace sched
