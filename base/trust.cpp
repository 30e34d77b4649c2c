// Which files are believed.
#include "trust.h"

#include <cerrno>
#include <fcntl.h>

namespace base {

bool isTrusted(const struct stat &status, const TrustRule &rule) {
    const bool owned = status.st_uid == 0 || (rule.callersToo && status.st_uid == geteuid());
    const mode_t forbidden = rule.groupMayWrite ? S_IWOTH : S_IWOTH | S_IWGRP;
    return (status.st_mode & S_IFMT) == rule.kind && owned && (status.st_mode & forbidden) == 0 &&
           (!rule.oneName || status.st_nlink == 1);
}

Found look(const char *path, const TrustRule &rule) {
    struct stat status {};
    if (lstat(path, &status) != 0) {
        return errno == ENOENT ? Found::Nothing : Found::Unreadable;
    }
    return isTrusted(status, rule) ? Found::Trusted : Found::Strange;
}

Opened openTrusted(const char *path, const TrustRule &rule) {
    Opened opened;
    opened.file = Descriptor(open(path, O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
    if (!opened.file) {
        opened.found = errno == ENOENT                    ? Found::Nothing
                       : errno == ELOOP || errno == ENXIO ? Found::Strange
                                                          : Found::Unreadable;
        return opened;
    }
    if (fstat(opened.file.get(), &opened.status) != 0) {
        return opened;
    }
    opened.found = isTrusted(opened.status, rule) ? Found::Trusted : Found::Strange;
    return opened;
}

} // namespace base
