// Which files are believed.
#include "trust.h"

#include <cerrno>
#include <fcntl.h>

namespace base {

const char *whyNotTrusted(const struct stat &status, const TrustRule &rule) {
    if (S_ISLNK(status.st_mode)) {
        return "it is a link";
    }
    if ((status.st_mode & S_IFMT) != rule.kind) {
        return S_ISDIR(rule.kind) ? "it is no folder" : "it is no regular file";
    }
    if (rule.oneName && status.st_nlink != 1) {
        return "it has a second name";
    }
    if (rule.anybodys) {
        return nullptr;
    }
    if (status.st_uid != 0 && !(rule.callersToo && status.st_uid == geteuid())) {
        return "it belongs to another user";
    }
    if ((status.st_mode & S_IWOTH) != 0) {
        return "everybody may write it";
    }
    return !rule.groupMayWrite && (status.st_mode & S_IWGRP) != 0 ? "its group may write it"
                                                                  : nullptr;
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
    const int follow = rule.anybodys ? 0 : O_NOFOLLOW;
    opened.file = Descriptor(open(path, O_RDONLY | follow | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
    if (!opened.file) {
        if (errno == ENOENT) {
            opened.found = Found::Nothing;
        } else if ((errno == ELOOP && !rule.anybodys) || errno == ENXIO) {
            opened.found = Found::Strange;
            opened.reason = errno == ELOOP ? "it is a link" : "it is no regular file";
        }
        return opened;
    }
    if (fstat(opened.file.get(), &opened.status) == 0) {
        opened.reason = whyNotTrusted(opened.status, rule);
        opened.found = opened.reason ? Found::Strange : Found::Trusted;
    }
    return opened;
}

} // namespace base
