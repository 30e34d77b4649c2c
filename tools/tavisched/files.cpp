// Files in folders that others may write too.
#include "files.h"
#include "failure.h"

#include <array>
#include <cstdio>
#include <cstdlib>
#include <fcntl.h>
#include <filesystem>
#include <unistd.h>

namespace tavisched {

namespace {

class Descriptor {
  public:
    explicit Descriptor(int number) : number_(number) {}
    ~Descriptor() {
        if (number_ != -1) {
            close(number_);
        }
    }
    Descriptor(const Descriptor &) = delete;
    Descriptor &operator=(const Descriptor &) = delete;
    int number() const { return number_; }

  private:
    int number_;
};

// A file with a second name may be one of root's that somebody linked there.
bool isTrusted(const struct stat &status) {
    return S_ISREG(status.st_mode) && isRootsAlone(status) && status.st_nlink == 1;
}

[[noreturn]] void fail(const char *path, const char *what, const std::string &why) {
    throw Failure(std::string(path) + " could not be " + what + ": " + why);
}

// A folder that nobody else can enter, beside a file, with what is left in it.
class PrivateFolder {
  public:
    explicit PrivateFolder(const char *besides) : path_(std::string(besides) + ".XXXXXX") {
        if (!mkdtemp(path_.data())) {
            fail(besides, "made", systemReason());
        }
    }
    ~PrivateFolder() {
        std::error_code ignored;
        std::filesystem::remove_all(path_, ignored);
    }
    PrivateFolder(const PrivateFolder &) = delete;
    PrivateFolder &operator=(const PrivateFolder &) = delete;
    const std::string &path() const { return path_; }

  private:
    std::string path_;
};

// In one step, so that the name is never free for others; a folder in the way is exchanged.
void putInPlace(const std::string &made, const char *path) {
    if (rename(made.c_str(), path) != 0 &&
        (errno != EISDIR ||
         renameat2(AT_FDCWD, made.c_str(), AT_FDCWD, path, RENAME_EXCHANGE) != 0)) {
        fail(path, "put in place", systemReason());
    }
}

bool writeAll(int fd, const std::string &content) {
    size_t written = 0;
    while (written < content.size()) {
        const ssize_t count = write(fd, content.data() + written, content.size() - written);
        if (count == -1 && errno != EINTR) {
            return false;
        }
        written += count > 0 ? static_cast<size_t>(count) : 0;
    }
    return fsync(fd) == 0;
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
    const auto status = statusOf(path);
    if (!status) {
        return FileState::Missing;
    }
    return isTrusted(*status) ? FileState::Trusted : FileState::Strange;
}

std::string contentOf(const char *path) {
    const Descriptor file(open(path, O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC));
    struct stat status {};
    if (file.number() == -1 || fstat(file.number(), &status) != 0) {
        fail(path, "read", systemReason());
    }
    if (!isTrusted(status)) {
        fail(path, "read", "it is not a file of root's alone");
    }
    std::string content;
    std::array<char, 65536> part{};
    ssize_t count = 0;
    while ((count = read(file.number(), part.data(), part.size())) > 0) {
        content.append(part.data(), static_cast<size_t>(count));
    }
    if (count < 0) {
        fail(path, "read", systemReason());
    }
    return content;
}

std::optional<std::string> contentIfThere(const char *path) {
    return statusOf(path) ? std::optional(contentOf(path)) : std::nullopt;
}

void replaceFile(const char *path, const std::string &content) {
    const PrivateFolder folder(path);
    const std::string made = folder.path() + "/file";
    const Descriptor file(open(made.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, 0600));
    const auto before = statusOf(path);
    const bool keepsMode = before && S_ISREG(before->st_mode) && isRootsAlone(*before);
    if (file.number() == -1 || !writeAll(file.number(), content) ||
        (keepsMode && (fchown(file.number(), before->st_uid, before->st_gid) != 0 ||
                       fchmod(file.number(), before->st_mode & 0777) != 0))) {
        fail(path, "written", systemReason());
    }
    putInPlace(made, path);
}

void replaceByLink(const char *path, const std::string &target) {
    const PrivateFolder folder(path);
    const std::string made = folder.path() + "/link";
    if (symlink(target.c_str(), made.c_str()) != 0) {
        fail(path, "made", systemReason());
    }
    putInPlace(made, path);
}

} // namespace tavisched
