// Claiming files and folders at fixed names in shared folders. Processes that do so at the same
// time must not trip over each other: what one of them has just made is as good to the others.
#include "sched_shared_file.h"

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <fcntl.h>
#include <filesystem>
#include <new>
#include <string>
#include <sys/stat.h>
#include <unistd.h>

namespace {

constexpr int kAttempts = 100;

// A file with a second name may be one of root's that somebody linked there.
bool isOurs(const struct stat &status, mode_t kind) {
    return (status.st_mode & S_IFMT) == kind &&
           (status.st_uid == 0 || status.st_uid == geteuid()) && (status.st_mode & S_IWOTH) == 0 &&
           (kind == S_IFDIR || status.st_nlink == 1);
}

// Moves what is there into a folder of our own, where nobody can change it any more, and removes
// it. It may meanwhile be a proper file that another process has made: that one goes back.
int moveAwayAndRemove(const std::string &path) {
    std::string folder = path + ".XXXXXX";
    if (!mkdtemp(folder.data())) {
        return -1;
    }
    const std::string moved = folder + "/moved";
    const int result = rename(path.c_str(), moved.c_str()) == 0 || errno == ENOENT ? 0 : -1;
    const int renameErrno = errno;
    if (sched::checkSharedFile(moved.c_str()) == 1) {
        (void)!link(moved.c_str(), path.c_str());
    }
    std::error_code ignored;
    std::filesystem::remove_all(folder, ignored);
    errno = renameErrno;
    return result;
}

int removeStrange(const char *path) {
    try {
        return moveAwayAndRemove(path);
    } catch (const std::bad_alloc &) {
        errno = ENOMEM;
        return -1;
    }
}

} // namespace

// lstat alone: opening and closing a SQLite file here would drop the process's locks on it.
int sched::checkSharedFile(const char *path) {
    struct stat status {};
    if (lstat(path, &status) != 0) {
        return errno == ENOENT ? 0 : -1;
    }
    return isOurs(status, S_IFREG) ? 1 : -1;
}

int sched::claimSharedFile(const char *path) {
    for (int attempt = 0; attempt < kAttempts; ++attempt) {
        const int found = checkSharedFile(path);
        if (found == 1) {
            return 0;
        }
        if (found < 0 && removeStrange(path) != 0) {
            return -1;
        }
        const int fd = open(path, O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, 0600);
        if (fd != -1) {
            return close(fd);
        }
        if (errno != EEXIST) {
            return -1;
        }
    }
    return -1;
}

int sched::claimSharedFolder(const char *path) {
    // mkdir fails on whatever else is there, also on a folder that another process has just made.
    if (mkdir(path, 0700) == 0) {
        return chmod(path, 0755);
    }
    struct stat status {};
    return errno == EEXIST && lstat(path, &status) == 0 && isOurs(status, S_IFDIR) ? 0 : -1;
}
