// Claiming files and folders at fixed names in shared folders. Processes that do so at the same
// time must not trip over each other: what one of them has just made is as good to the others.
#include "sched_shared_file.h"
#include "base/file.h"
#include "base/trust.h"

#include <cerrno>
#include <fcntl.h>
#include <new>
#include <string>
#include <sys/stat.h>

namespace {

constexpr int kAttempts = 100;

// Puts an empty file of our own in the place of what is there, in one step: were the name free for
// a moment, a user who waits for that would take it again. What was there lands in a folder that
// nobody else can enter and is removed; when another process has meanwhile made it a proper file,
// it goes back.
bool replaceStrange(const char *path) {
    const base::PrivateFolder folder(path);
    const std::string ours = folder.path() + "/file";
    if (!folder || !base::makeEmpty(ours.c_str())) {
        return false;
    }
    if (!base::exchange(ours.c_str(), path)) {
        return errno == EEXIST; // somebody else was faster
    }
    if (sched::checkSharedFile(ours.c_str()) == 1) {
        base::exchange(ours.c_str(), path);
    }
    return true;
}

// A folder of root's or the effective user's that everybody may write: it is that no more.
bool setRight(const char *path) {
    const base::Descriptor folder(open(path, O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
    struct stat status {};
    if (!folder || fstat(folder.get(), &status) != 0) {
        return false;
    }
    status.st_mode &= ~static_cast<mode_t>(S_IWOTH);
    return base::isTrusted(status, base::kSharedFolder) && fchmod(folder.get(), 0755) == 0;
}

bool claim(const char *path) {
    for (int attempt = 0; attempt < kAttempts; ++attempt) {
        switch (base::look(path, base::kSharedFile)) {
        case base::Found::Trusted:
            return true;
        case base::Found::Unreadable:
            return false;
        case base::Found::Strange:
            if (!replaceStrange(path)) {
                return false;
            }
            break;
        case base::Found::Nothing:
            if (!base::makeEmpty(path) && errno != EEXIST) {
                return false;
            }
            break;
        }
    }
    return false;
}

} // namespace

// The look alone: opening and closing a SQLite file here would drop the process's locks on it.
int sched::checkSharedFile(const char *path) {
    switch (base::look(path, base::kSharedFile)) {
    case base::Found::Trusted:
        return 1;
    case base::Found::Nothing:
        return 0;
    default:
        return -1;
    }
}

int sched::claimSharedFile(const char *path) {
    try {
        return claim(path) ? 0 : -1;
    } catch (const std::bad_alloc &) {
        errno = ENOMEM;
        return -1;
    }
}

int sched::claimSharedFolder(const char *path) {
    // mkdir fails on whatever else is there, also on a folder that another process has just made.
    if (mkdir(path, 0700) == 0) {
        return chmod(path, 0755);
    }
    if (errno != EEXIST) {
        return -1;
    }
    const base::Found found = base::look(path, base::kSharedFolder);
    return found == base::Found::Trusted || (found == base::Found::Strange && setRight(path)) ? 0
                                                                                              : -1;
}

int sched::ensureSharedFolder(const char *path) {
    if (claimSharedFolder(path) == 0) {
        return 0;
    }
    try {
        const base::PrivateFolder folder(path);
        const std::string made = folder.path() + "/folder";
        return folder && mkdir(made.c_str(), 0755) == 0 && chmod(made.c_str(), 0755) == 0 &&
                       base::exchange(made.c_str(), path)
                   ? 0
                   : -1;
    } catch (const std::bad_alloc &) {
        errno = ENOMEM;
        return -1;
    }
}
