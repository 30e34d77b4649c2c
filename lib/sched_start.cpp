// Making the machine ready for tasks after its start: what lies in folders that a restart empties,
// and the crontab.
#include "base/file.h"
#include "base/trust.h"
#include "change/change.h"
#include "change/leftovers.h"
#include "cron/runner.h"
#include "sched_error.h"
#include "sched_guard.h"
#include "sched_paths.h"
#include "sched_shared_file.h"
#include "tavischeduler.h"

#include <cerrno>
#include <fcntl.h>
#include <optional>
#include <string>
#include <sys/stat.h>

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

// From the persistent file, or empty: a name that is there is not free for others to take.
int ensureWorkingCopy() {
    if (base::look(sched::kWorkingCopy, base::kSharedFileToRead) == base::Found::Trusted) {
        return 0;
    }
    const base::Opened stored = base::openTrusted(sched::kPersistent, base::kSharedFileToRead);
    std::optional<std::string> content;
    if (stored.found == base::Found::Nothing) {
        content.emplace();
    } else if (stored.found == base::Found::Trusted) {
        content = base::readAll(stored.file.get());
    }
    if (!content) {
        return fail("read", sched::kPersistent);
    }
    return sched::replaceWorkingCopy(*content) ? 0 : fail("made", sched::kWorkingCopy);
}

int makeReady() {
    if (makeFolder() != 0) {
        return -1;
    }
    const sched::Change change;
    if (!change || ensureWorkingCopy() != 0) {
        return -1;
    }
    sched::removeLeftovers();
    if (sched::claimSharedFolder(sched::kRunLockFolder) != 0) {
        return fail("made", sched::kRunLockFolder);
    }
    sched::ensureRunner();
    return TAVISchedTaskSync();
}

} // namespace

int TAVISchedStart() {
    SCHED_REQUIRE(!sched::ChangeLock::isHeldHere(), "no change has begun", -1);
    return sched::guarded(SCHED_SITE, makeReady);
}
