// Files in folders that others may write too.
#include "files.h"
#include "base/file.h"
#include "base/trust.h"
#include "failure.h"

#include <fcntl.h>
#include <unistd.h>

namespace tavisched {

namespace {

// A file with a second name may be one of root's that somebody linked there.
constexpr base::TrustRule kRootsAlone{.callersToo = false, .groupMayWrite = false};

[[noreturn]] void fail(const char *path, const char *what, const std::string &why) {
    throw Failure(std::string(path) + " could not be " + what + ": " + why);
}

base::PrivateFolder folderBeside(const char *path) {
    base::PrivateFolder folder(path);
    if (!folder) {
        fail(path, "made", systemReason());
    }
    return folder;
}

void putInPlace(const std::string &made, const char *path) {
    if (!base::exchange(made.c_str(), path)) {
        fail(path, "put in place", systemReason());
    }
}

} // namespace

bool isRootsAlone(const struct stat &status) {
    return status.st_uid == 0 && (status.st_mode & (S_IWGRP | S_IWOTH)) == 0;
}

std::optional<struct stat> statusOf(const char *path) {
    struct stat status {};
    return lstat(path, &status) == 0 ? std::optional(status) : std::nullopt;
}

FileState stateOf(const char *path) {
    switch (base::look(path, kRootsAlone)) {
    case base::Found::Nothing:
        return FileState::Missing;
    case base::Found::Trusted:
        return FileState::Trusted;
    default:
        return FileState::Strange;
    }
}

std::optional<std::string> contentIfThere(const char *path) {
    const base::Opened opened = base::openTrusted(path, kRootsAlone);
    if (opened.found == base::Found::Nothing) {
        return std::nullopt;
    }
    if (opened.found == base::Found::Strange) {
        fail(path, "read", "it is not a file of root's alone");
    }
    auto content =
        opened.found == base::Found::Trusted ? base::readAll(opened.file.get()) : std::nullopt;
    if (!content) {
        fail(path, "read", systemReason());
    }
    return content;
}

std::string contentOf(const char *path) {
    auto content = contentIfThere(path);
    if (!content) {
        fail(path, "read", systemReason());
    }
    return *std::move(content);
}

void replaceFile(const char *path, const std::string &content) {
    const base::PrivateFolder folder = folderBeside(path);
    const std::string made = folder.path() + "/file";
    const base::Descriptor file(open(made.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, 0600));
    const auto before = statusOf(path);
    const bool keepsMode = before && S_ISREG(before->st_mode) && isRootsAlone(*before);
    if (!file || !base::writeAll(file.get(), content) ||
        (keepsMode && (fchown(file.get(), before->st_uid, before->st_gid) != 0 ||
                       fchmod(file.get(), before->st_mode & 0777) != 0)) ||
        fsync(file.get()) != 0) {
        fail(path, "written", systemReason());
    }
    putInPlace(made, path);
    if (!base::syncFolderOf(path)) {
        fail(path, "flushed to the disk", systemReason());
    }
}

void replaceByLink(const char *path, const std::string &target) {
    const base::PrivateFolder folder = folderBeside(path);
    const std::string made = folder.path() + "/link";
    if (symlink(target.c_str(), made.c_str()) != 0) {
        fail(path, "made", systemReason());
    }
    putInPlace(made, path);
}

} // namespace tavisched
