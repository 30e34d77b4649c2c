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

int makeEmpty(const char *path) {
    const int fd = open(path, O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, 0600);
    return fd == -1 ? -1 : close(fd);
}

int exchange(const std::string &ours, const char *path) {
    return renameat2(AT_FDCWD, ours.c_str(), AT_FDCWD, path, RENAME_EXCHANGE);
}

// Puts an empty file of our own in the place of what is there, in one step: were the name free for
// a moment, a user who waits for that would take it again. What was there lands in a folder that
// nobody else can enter and is removed; when another process has meanwhile made it a proper file,
// it goes back.
int putOursInPlace(const char *path) {
    std::string folder = std::string(path) + ".XXXXXX";
    if (!mkdtemp(folder.data())) {
        return -1;
    }
    const std::string ours = folder + "/file";
    const bool exchanged = makeEmpty(ours.c_str()) == 0 && exchange(ours, path) == 0;
    const int exchangeErrno = errno;
    if (exchanged && sched::checkSharedFile(ours.c_str()) == 1) {
        exchange(ours, path);
    }
    std::error_code ignored;
    std::filesystem::remove_all(folder, ignored);
    errno = exchangeErrno;
    return exchanged || exchangeErrno == ENOENT ? 0 : -1;
}

int replaceStrange(const char *path) {
    try {
        return putOursInPlace(path);
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
        const bool failed =
            found < 0 ? replaceStrange(path) != 0 : makeEmpty(path) != 0 && errno != EEXIST;
        if (failed) {
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
