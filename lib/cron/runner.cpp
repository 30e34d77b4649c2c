// The program that the crontab's lines start.
#include "runner.h"
#include "base/file.h"
#include "base/trust.h"
#include "sched_error.h"
#include "sched_paths.h"

#include <filesystem>
#include <unistd.h>

namespace {

namespace fs = std::filesystem;

constexpr const char *kProgramName = "tavischedtask";

bool isRootsLink() {
    struct stat status {};
    return lstat(sched::kRunner, &status) == 0 && status.st_uid == 0;
}

// Whether somebody other than root could put another program in the place of this one.
bool isInForeignHands(const fs::path &program) {
    for (fs::path path = program; path != path.root_path(); path = path.parent_path()) {
        struct stat status {};
        const bool seen = lstat(path.c_str(), &status) == 0;
        const bool isSticky = seen && S_ISDIR(status.st_mode) && status.st_uid == 0 &&
                              (status.st_mode & S_ISVTX) != 0;
        const bool isRoots =
            seen && status.st_uid == 0 && (status.st_mode & (S_IWGRP | S_IWOTH)) == 0;
        if (!isRoots && !isSticky) {
            return true;
        }
    }
    return false;
}

bool isProgram(const fs::path &path) {
    std::error_code error;
    return fs::is_regular_file(path, error) && access(path.c_str(), X_OK) == 0;
}

} // namespace

std::string sched::whyNoRunner() {
    std::error_code error;
    const fs::path target = fs::canonical(kRunner, error);
    if (error) {
        return "is missing, so that no task runs";
    }
    if (!isRootsLink()) {
        return "belongs to another user than root";
    }
    if (!isProgram(target) || target.filename() != kProgramName) {
        return "is not the program tavischedtask, so that no task runs";
    }
    return isInForeignHands(target)
               ? "leads to " + target.string() + ", which others than root can replace"
               : "";
}

// Beside the program that runs, as in a build or a copied folder, or where it was installed.
std::string sched::findRunnerProgram() {
    std::error_code error;
    const fs::path beside = fs::canonical("/proc/self/exe", error).parent_path() / kProgramName;
    for (const fs::path &path : {beside, fs::path(TAVI_RUNNER_PROGRAM)}) {
        const fs::path program = fs::canonical(path, error);
        if (!error && isProgram(program) && !isInForeignHands(program)) {
            return program;
        }
    }
    return "";
}

int sched::makeRunnerLink() {
    const std::string program = findRunnerProgram();
    if (!program.empty()) {
        const base::PrivateFolder folder(kRunner);
        const std::string made = folder.path() + "/link";
        if (folder && symlink(program.c_str(), made.c_str()) == 0 &&
            base::exchange(made.c_str(), kRunner)) {
            return 0;
        }
    }
    SCHED_SET_ERROR(kOpenFailed);
    return -1;
}

void sched::ensureRunner() {
    if (isRootsLink()) {
        return;
    }
    const std::string why = whyNoRunner();
    if (makeRunnerLink() != 0) {
        SCHED_LOG("the runner %s %s; it cannot be made a link to %s", kRunner, why.c_str(),
                  kProgramName);
    }
}
