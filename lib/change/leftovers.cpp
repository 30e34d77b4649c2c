// What changes that were cut off leave.
#include "leftovers.h"
#include "base/file.h"
#include "change_record.h"
#include "platc.h"
#include "sched_paths.h"

#include <charconv>
#include <filesystem>
#include <string>
#include <sys/stat.h>
#include <unistd.h>

namespace {

namespace fs = std::filesystem;

constexpr size_t kRandomCharacters = 6; // of mkstemp and mkdtemp

template <typename Function> void forEachEntry(const char *folder, Function &&function) {
    std::error_code error;
    fs::directory_iterator entry(folder, error);
    for (; !error && entry != fs::directory_iterator(); entry.increment(error)) {
        function(entry->path());
    }
}

// "/tmp/scheduled_tasks.tmp.<process>", and what the platform makes beside it.
bool isScratchOfTheDead(std::string_view path) {
    const std::string_view stem(sched::kScratchStem);
    if (!path.starts_with(stem) || path.size() <= stem.size() + 1 || path[stem.size()] != '.') {
        return false;
    }
    pid_t process = 0;
    const char *const begin = path.data() + stem.size() + 1;
    const auto parsed = std::from_chars(begin, path.data() + path.size(), process);
    return parsed.ec == std::errc() && process > 0 && PLATCProcAlive(process) == 0;
}

// Made by the change that was cut off, and not by somebody who named a copy so: soon after its
// beginning. Without one nothing is.
bool isTemporaryCrontab(const fs::path &path, const timespec &since) {
    constexpr time_t kLongestChange = 120; // seconds
    const std::string stem = std::string(sched::kCrontab) + ".";
    struct stat status {};
    return path.native().starts_with(stem) &&
           path.native().size() == stem.size() + kRandomCharacters &&
           lstat(path.c_str(), &status) == 0 && S_ISREG(status.st_mode) &&
           status.st_uid == geteuid() && since.tv_sec > 0 &&
           status.st_ctim.tv_sec <= since.tv_sec + kLongestChange &&
           std::tie(status.st_mtim.tv_sec, status.st_mtim.tv_nsec) >=
               std::tie(since.tv_sec, since.tv_nsec);
}

} // namespace

std::vector<std::string> sched::findScratchFiles() {
    std::vector<std::string> paths;
    forEachEntry("/tmp", [&](const fs::path &path) {
        if (isScratchOfTheDead(path.native())) {
            paths.push_back(path.native());
        }
    });
    return paths;
}

void sched::removeLeftovers(const timespec &since) {
    for (const std::string &path : findScratchFiles()) {
        unlink(path.c_str());
    }
    base::removeLeftovers(kWorkingCopy);
    base::removeLeftovers(kRunner);
    base::removeLeftovers(kCrontab);
    forEachEntry("/etc", [&](const fs::path &path) {
        if (isTemporaryCrontab(path, since)) {
            unlink(path.c_str());
        }
    });
    unlink(kFinished);
    if (recordState() == RecordState::None) {
        unlink(kRecordPersistent);
    }
}
