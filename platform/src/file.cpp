// Whole files: reading, atomic replacement, and the interface's operations on files of any format.
#include "file.h"
#include "platform.h"

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <fcntl.h>
#include <unistd.h>

namespace platform {

UniqueFd::~UniqueFd() {
    close();
}

bool UniqueFd::close() {
    const int fd = fd_;
    fd_ = -1;
    return fd == -1 || ::close(fd) == 0;
}

namespace {

// In a folder with the sticky bit anybody may create files; it does not outlive a reboot either.
bool isInSharedFolder(const std::string &path) {
    const size_t slash = path.rfind('/');
    const std::string folder = slash == std::string::npos ? "." : path.substr(0, slash + 1);
    struct stat status {};
    return stat(folder.c_str(), &status) == 0 && (status.st_mode & S_ISVTX) != 0;
}

bool readAll(int fd, std::string &text) {
    size_t length = 0;
    for (;;) {
        const ssize_t count = read(fd, text.data() + length, text.size() - length);
        if (count == -1 && errno == EINTR) {
            continue;
        }
        if (count <= 0) {
            text.resize(length);
            return count == 0;
        }
        length += static_cast<size_t>(count);
        if (length == text.size()) {
            text.resize(text.size() * 2);
        }
    }
}

bool writeAll(int fd, std::string_view content) {
    while (!content.empty()) {
        const ssize_t count = write(fd, content.data(), content.size());
        if (count == -1 && errno != EINTR) {
            return false;
        }
        content.remove_prefix(count > 0 ? static_cast<size_t>(count) : 0);
    }
    return true;
}

int refuse(const std::string &path, const char *reason) {
    PLATFORM_LOG("%s refused: %s", path.c_str(), reason);
    return PLATFORM_FAIL(kOpenFailed);
}

int checkOpened(const std::string &path, bool shared, const struct stat &status) {
    if (!S_ISREG(status.st_mode)) {
        return refuse(path, "it is no regular file");
    }
    if (shared && status.st_uid != 0 && status.st_uid != geteuid()) {
        return refuse(path, "it lies in a shared folder and belongs to another user");
    }
    if (shared && (status.st_mode & S_IWOTH) != 0) {
        return refuse(path, "it lies in a shared folder and everybody may write it");
    }
    return 0;
}

// How a file is replaced beyond its content.
struct Replacement {
    const struct stat *old; // owner and mode are taken from it; none for a new file
    bool durable;
    bool laterBySecond;
};

bool copyOwnerAndMode(int fd, const struct stat &old) {
    return fchown(fd, old.st_uid, old.st_gid) == 0 && fchmod(fd, old.st_mode & ALLPERMS) == 0;
}

bool makeLater(int fd, const struct stat &old) {
    struct stat status {};
    if (fstat(fd, &status) != 0) {
        return false;
    }
    if (status.st_mtim.tv_sec > old.st_mtim.tv_sec) {
        return true;
    }
    const timespec times[] = {{.tv_sec = 0, .tv_nsec = UTIME_OMIT},
                              {.tv_sec = old.st_mtim.tv_sec + 1, .tv_nsec = 0}};
    return futimens(fd, times) == 0;
}

int fillReplacement(UniqueFd &fd, std::string_view content, const Replacement &how) {
    if (!writeAll(fd.get(), content) || (how.old && !copyOwnerAndMode(fd.get(), *how.old)) ||
        (how.old && how.laterBySecond && !makeLater(fd.get(), *how.old)) ||
        (how.durable && fsync(fd.get()) != 0) || !fd.close()) {
        return PLATFORM_FAIL(kReadWriteFailed);
    }
    return 0;
}

int replace(const std::string &path, std::string_view content, bool laterBySecond) {
    struct stat old {};
    const bool exists = stat(path.c_str(), &old) == 0;
    std::string temporary = path + ".XXXXXX";
    UniqueFd fd(mkostemp(temporary.data(), O_CLOEXEC));
    if (fd.get() == -1) {
        return PLATFORM_FAIL(kOpenFailed);
    }
    const Replacement how{exists ? &old : nullptr, !isInSharedFolder(path), laterBySecond};
    int result = fillReplacement(fd, content, how);
    if (result == 0 && rename(temporary.c_str(), path.c_str()) != 0) {
        result = PLATFORM_FAIL(kRenameFailed);
    }
    if (result != 0) {
        unlink(temporary.c_str());
    }
    return result;
}

} // namespace

std::optional<FileContent> readFile(const std::string &path) {
    const bool shared = isInSharedFolder(path);
    const UniqueFd fd(
        open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | (shared ? O_NOFOLLOW : 0)));
    if (fd.get() == -1) {
        if (errno == ELOOP) {
            refuse(path, "it lies in a shared folder and is a link");
        } else {
            PLATFORM_FAIL(kOpenFailed);
        }
        return std::nullopt;
    }
    FileContent content;
    if (fstat(fd.get(), &content.status) != 0) {
        PLATFORM_FAIL(kStatFailed);
        return std::nullopt;
    }
    if (checkOpened(path, shared, content.status) != 0) {
        return std::nullopt;
    }
    // One byte more than the file has, so that the end is seen without another round.
    content.text.resize(static_cast<size_t>(content.status.st_size) + 1);
    if (!readAll(fd.get(), content.text)) {
        PLATFORM_FAIL(kReadWriteFailed);
        return std::nullopt;
    }
    return content;
}

int replaceFile(const std::string &path, std::string_view content) {
    return replace(path, content, false);
}

int replaceWatchedFile(const std::string &path, std::string_view content) {
    return replace(path, content, true);
}

} // namespace platform

int PLATCFileExist(const char *szPath) {
    return szPath && access(szPath, F_OK) == 0;
}

int PLATCFileTouch(const char *szPath) {
    if (!szPath) {
        return PLATFORM_FAIL(platform::kInvalidArgument);
    }
    platform::UniqueFd fd(
        open(szPath, O_WRONLY | O_CREAT | O_CLOEXEC | O_NOCTTY | O_NONBLOCK, 0644));
    if (fd.get() == -1) {
        return PLATFORM_FAIL(platform::kOpenFailed);
    }
    return futimens(fd.get(), nullptr) == 0 ? 0 : PLATFORM_FAIL(platform::kReadWriteFailed);
}

int PLATCFileSetLine(const char *szPath, const char *szMatch, const char *szLine) {
    if (!szPath || !szMatch || *szMatch == '\0' || (szLine && std::strchr(szLine, '\n'))) {
        return PLATFORM_FAIL(platform::kInvalidArgument);
    }
    return platform::guarded(
        [&] {
            auto content = platform::readFile(szPath);
            if (!content) {
                return -1;
            }
            std::string &text = content->text;
            const size_t match = text.find(szMatch);
            if (match == std::string::npos) {
                return 0;
            }
            const size_t begin = text.rfind('\n', match) + 1; // npos + 1 is the text's beginning
            const size_t end = text.find('\n', match);
            const size_t length = end == std::string::npos ? end : end + 1 - begin;
            text.replace(begin, length, szLine ? std::string(szLine) + "\n" : std::string());
            return platform::replaceWatchedFile(szPath, text) == 0 ? 1 : -1;
        },
        -1);
}
