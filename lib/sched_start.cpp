// Making the machine ready for tasks after its start: what lies in folders that a restart empties,
// and the crontab.
#include "base/file.h"
#include "base/trust.h"
#include "change/change.h"
#include "change/leftovers.h"
#include "cron/runner.h"
#include "runs/run_changes.h"
#include "sched_backend.h"
#include "sched_error.h"
#include "sched_guard.h"
#include "sched_paths.h"
#include "sched_shared_file.h"
#include "tavischeduler.h"

#include <cerrno>
#include <ctime>
#include <limits>
#include <optional>
#include <string>
#include <sys/stat.h>
#include <unistd.h>

namespace {

int fail(const char *what, const char *path) {
    SCHED_LOG("%s cannot be %s: %m", path, what);
    SCHED_SET_ERROR(sched::kOpenFailed);
    return -1;
}

int makeFolder() {
    return mkdir(sched::kTaskFolder, 0755) == 0 || errno == EEXIST
               ? 0
               : fail("made", sched::kTaskFolder);
}

// The persistent file's content, "" where there is none. Nothing when it cannot be had.
std::optional<std::string> readStored() {
    const base::Opened stored = base::openTrusted(sched::kPersistent, base::kSharedFileToRead);
    std::optional<std::string> content;
    if (stored.found == base::Found::Nothing) {
        content.emplace();
    } else if (stored.found == base::Found::Trusted) {
        content = base::readAll(stored.file.get());
    }
    if (stored.reason) {
        SCHED_LOG("%s is refused: %s", sched::kPersistent, stored.reason);
        SCHED_SET_ERROR(sched::kOpenFailed);
    } else if (!content) {
        fail("read", sched::kPersistent);
    }
    return content;
}

// A name that is there is not free for others to take: an empty working copy holds it until the
// tasks are filled in, and where there are none. One with tasks in it, which root may have made by
// hand, stays. The number of bytes that it has then, or -1.
off_t ensureWorkingCopy() {
    const base::Opened present = base::openTrusted(sched::kWorkingCopy, base::kSharedFileToRead);
    const bool isOurs = present.found == base::Found::Trusted;
    if (isOurs && present.status.st_size > 0) {
        return present.status.st_size;
    }
    const auto stored = readStored();
    const std::string content = stored.value_or("");
    const bool isRight = isOurs && content.empty();
    if (!isRight && !sched::replaceWorkingCopy(content)) {
        return fail("made", sched::kWorkingCopy);
    }
    return stored ? static_cast<off_t>(content.size()) : -1;
}

// Lines of tasks that are in neither file are the last trace of them: without tasks nothing needs
// to be written, and they stay until a change or a sync that somebody asks for.
int synchronise(bool hasTasks) {
    if (hasTasks) {
        return TAVISchedTaskSync();
    }
    const auto power =
        sched::initBackends(SCHED_SITE) == 0
            ? sched::findBackend(TAVI_SCHED_BACKEND_AUTOPOWER, &TAVI_SCHED_BACKEND_RECORD::sync)
            : std::nullopt;
    return power && SchedBackends[*power].sync() >= 0 ? 0 : -1;
}

int makeTasksReady() {
    const sched::Change change;
    if (!change) {
        return -1;
    }
    // A change that was cut off has been taken back, with its temporary crontab.
    constexpr timespec kNever{.tv_sec = std::numeric_limits<time_t>::max(), .tv_nsec = 0};
    sched::removeLeftovers(kNever);
    const off_t size = ensureWorkingCopy();
    return size >= 0 ? synchronise(size > 0) : -1;
}

int makeReady() {
    sched::ensureRunner();
    const int lockFolder = sched::ensureSharedFolder(sched::kRunLockFolder) == 0
                               ? 0
                               : fail("made", sched::kRunLockFolder);
    const int ready = makeFolder() == 0 && makeTasksReady() == 0 ? lockFolder : -1;
    sched::beginRecording();
    return ready;
}

} // namespace

int TAVISchedStart() {
    SCHED_REQUIRE(geteuid() == 0, "0 == geteuid()", -1);
    SCHED_REQUIRE(!sched::ChangeLock::isHeldHere(), "no change has begun", -1);
    return sched::guarded(SCHED_SITE, makeReady);
}
