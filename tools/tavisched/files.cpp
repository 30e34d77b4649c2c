// Files in folders that others may write too.
#include "files.h"
#include "failure.h"

#include <array>
#include <fcntl.h>
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

[[noreturn]] void fail(const char *path, const char *what, const std::string &why) {
    throw Failure(std::string(path) + " could not be " + what + ": " + why);
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
    return S_ISREG(status->st_mode) && isRootsAlone(*status) ? FileState::Trusted
                                                             : FileState::Strange;
}

std::string contentOf(const char *path) {
    const Descriptor file(open(path, O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC));
    struct stat status {};
    if (file.number() == -1 || fstat(file.number(), &status) != 0) {
        fail(path, "read", systemReason());
    }
    if (!S_ISREG(status.st_mode)) {
        fail(path, "read", "it is no file");
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
    std::string made = std::string(path) + ".XXXXXX";
    const Descriptor file(mkostemp(made.data(), O_CLOEXEC));
    if (file.number() == -1) {
        fail(path, "written", systemReason());
    }
    if (!writeAll(file.number(), content) || rename(made.c_str(), path) != 0) {
        const std::string why = systemReason();
        unlink(made.c_str());
        fail(path, "written", why);
    }
}

void replaceByLink(const char *path, const std::string &target) {
    // Made in a folder that nobody else can enter, so that the name is never free for others.
    std::string folder = std::string(path) + ".XXXXXX";
    if (!mkdtemp(folder.data())) {
        fail(path, "made", systemReason());
    }
    const std::string made = folder + "/link";
    const bool done = symlink(target.c_str(), made.c_str()) == 0 && rename(made.c_str(), path) == 0;
    const std::string why = systemReason();
    unlink(made.c_str());
    rmdir(folder.c_str());
    if (!done) {
        fail(path, "made", why);
    }
}

} // namespace tavisched
