// Whole files: reading, atomic replacement, and the interface's operations on files of any format.
#include "file.h"
#include "base/file.h"
#include "platform.h"

#include <cerrno>
#include <fcntl.h>
#include <unistd.h>

namespace platform {

namespace {

const base::TrustRule &ruleFor(bool shared) {
    return shared ? base::kSharedFileToRead : base::kOrdinaryFile;
}

int refuse(const std::string &path, bool shared, const char *reason) {
    PLATFORM_LOG("%s refused: %s%s", path.c_str(), shared ? "it lies in a shared folder and " : "",
                 reason);
    return PLATFORM_FAIL(kOpenFailed);
}

// 1 when there is a file to be replaced, 0 when there is none, -1.
int lookAtOld(const std::string &path, bool shared, struct stat &old) {
    if ((shared ? lstat(path.c_str(), &old) : stat(path.c_str(), &old)) != 0) {
        return errno == ENOENT ? 0 : PLATFORM_FAIL(kStatFailed);
    }
    const char *const reason = base::whyNotTrusted(old, ruleFor(shared));
    return reason ? refuse(path, shared, reason) : 1;
}

int failAt(base::Replacement::Step step) {
    using Step = base::Replacement::Step;
    switch (step) {
    case Step::Create:
    case Step::Stream:
        return PLATFORM_FAIL(kOpenFailed);
    case Step::Rename:
        return PLATFORM_FAIL(kRenameFailed);
    default:
        return PLATFORM_FAIL(kReadWriteFailed);
    }
}

int replace(const std::string &path, std::string_view content, bool laterBySecond) {
    const bool shared = base::isInSharedFolder(path);
    struct stat old {};
    const int exists = lookAtOld(path, shared, old);
    if (exists < 0) {
        return -1;
    }
    if (!shared) {
        base::removeLeftovers(path);
    }
    base::Replacement file(path, base::processTemporary());
    const base::Replacement::Manner manner{
        .like = exists ? &old : nullptr, .durable = !shared, .later = laterBySecond};
    return file.open() && file.write(content) && file.commit(manner) ? 0
                                                                     : failAt(file.failedStep());
}

} // namespace

int isThere(const std::string &path) {
    struct stat status {};
    if (stat(path.c_str(), &status) == 0) {
        return 1;
    }
    return errno == ENOENT ? 0 : PLATFORM_FAIL(kStatFailed);
}

std::optional<base::Opened> openFile(const std::string &path) {
    const bool shared = base::isInSharedFolder(path);
    base::Opened opened = base::openTrusted(path.c_str(), ruleFor(shared));
    if (opened.found == base::Found::Trusted) {
        return opened;
    }
    if (opened.found == base::Found::Strange) {
        refuse(path, shared, opened.reason);
    } else {
        PLATFORM_FAIL(opened.file ? kStatFailed : kOpenFailed);
    }
    return std::nullopt;
}

std::optional<FileContent> readFile(const std::string &path) {
    const auto opened = openFile(path);
    if (!opened) {
        return std::nullopt;
    }
    auto text = base::readAll(opened->file.get());
    if (!text) {
        PLATFORM_FAIL(kReadWriteFailed);
        return std::nullopt;
    }
    return FileContent{.text = *std::move(text), .status = opened->status};
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
    const base::Descriptor file(
        open(szPath, O_WRONLY | O_CREAT | O_CLOEXEC | O_NOCTTY | O_NONBLOCK, 0644));
    if (!file) {
        return PLATFORM_FAIL(platform::kOpenFailed);
    }
    return futimens(file.get(), nullptr) == 0 ? 0 : PLATFORM_FAIL(platform::kReadWriteFailed);
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
