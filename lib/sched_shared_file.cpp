// Claiming files and folders at fixed names in shared folders.
#include "sched_shared_file.h"

#include <cerrno>
#include <cstdio>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace {

bool isOurs(const struct stat &status, mode_t kind) {
    return (status.st_mode & S_IFMT) == kind && (status.st_uid == 0 || status.st_uid == geteuid());
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

int sched::dropStrangeFile(const char *path) {
    return checkSharedFile(path) >= 0 ? 0 : std::remove(path);
}

int sched::claimSharedFile(const char *path) {
    if (dropStrangeFile(path) != 0) {
        return -1;
    }
    if (checkSharedFile(path) == 1) {
        return 0;
    }
    const int fd = open(path, O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, 0600);
    return fd == -1 ? -1 : close(fd);
}

int sched::claimSharedFolder(const char *path) {
    struct stat status {};
    if (lstat(path, &status) == 0 && S_ISDIR(status.st_mode)) {
        return isOurs(status, S_IFDIR) ? 0 : -1;
    }
    // mkdir fails on whatever else is there.
    return mkdir(path, 0700) == 0 && chmod(path, 0755) == 0 ? 0 : -1;
}
