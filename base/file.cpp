// Whole files.
#include "file.h"

#include <cerrno>
#include <cstdlib>
#include <fcntl.h>
#include <filesystem>

namespace base {

namespace {

std::string folderOf(const std::string &path) {
    const size_t slash = path.rfind('/');
    return slash == std::string::npos ? "." : path.substr(0, slash + 1);
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

} // namespace

bool isInSharedFolder(const std::string &path) {
    struct stat status {};
    return stat(folderOf(path).c_str(), &status) == 0 && (status.st_mode & S_ISVTX) != 0;
}

std::optional<std::string> readAll(int fd) {
    struct stat status {};
    if (fstat(fd, &status) != 0) {
        return std::nullopt;
    }
    // One byte more than the file has, so that the end is seen without another round.
    std::string text(static_cast<size_t>(status.st_size) + 1, '\0');
    size_t length = 0;
    for (;;) {
        const ssize_t count = read(fd, text.data() + length, text.size() - length);
        if (count == -1 && errno == EINTR) {
            continue;
        }
        if (count <= 0) {
            text.resize(length);
            return count == 0 ? std::optional(std::move(text)) : std::nullopt;
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

bool syncFolderOf(const std::string &path) {
    const Descriptor folder(::open(folderOf(path).c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    return folder && fsync(folder.get()) == 0;
}

bool makeEmpty(const char *path) {
    Descriptor file(::open(path, O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, 0600));
    return file && file.close();
}

// ---- Replacement ----

Replacement::Replacement(std::string path)
    : path_(std::move(path)), stream_(nullptr, std::fclose) {}

Replacement::~Replacement() {
    stream_.reset();
    if (!temporary_.empty()) {
        unlink(temporary_.c_str());
    }
}

bool Replacement::fail(Step step) {
    failed_ = step;
    return false;
}

bool Replacement::open() {
    temporary_ = path_ + ".XXXXXX";
    Descriptor file(mkostemp(temporary_.data(), O_CLOEXEC));
    if (!file) {
        temporary_.clear();
        return fail(Step::Create);
    }
    stream_.reset(fdopen(file.get(), "w"));
    if (!stream_) {
        return fail(Step::Stream);
    }
    file.release();
    return true;
}

bool Replacement::write(std::string_view content) {
    return std::fwrite(content.data(), 1, content.size(), stream_.get()) == content.size() ||
           fail(Step::Write);
}

bool Replacement::commit(const Manner &manner) {
    if (std::fflush(stream_.get()) != 0 || std::ferror(stream_.get())) {
        return fail(Step::Flush);
    }
    const int fd = fileno(stream_.get());
    const struct stat *const like = manner.like;
    if ((manner.durable && fsync(fd) != 0) ||
        (like &&
         (fchown(fd, like->st_uid, like->st_gid) != 0 ||
          fchmod(fd, like->st_mode & ALLPERMS) != 0 || (manner.later && !makeLater(fd, *like))))) {
        return fail(Step::Attributes);
    }
    if (std::fclose(stream_.release()) != 0) {
        return fail(Step::Close);
    }
    if (rename(temporary_.c_str(), path_.c_str()) != 0) {
        return fail(Step::Rename);
    }
    temporary_.clear();
    return !manner.durable || syncFolderOf(path_) || fail(Step::SyncFolder);
}

// ---- Putting in place ----

bool exchange(const char *made, const char *path) {
    return renameat2(AT_FDCWD, made, AT_FDCWD, path, RENAME_EXCHANGE) == 0 ||
           (errno == ENOENT && renameat2(AT_FDCWD, made, AT_FDCWD, path, RENAME_NOREPLACE) == 0);
}

PrivateFolder::PrivateFolder(const std::string &besides) : path_(besides + ".XXXXXX") {
    if (!mkdtemp(path_.data())) {
        path_.clear();
    }
}

PrivateFolder::~PrivateFolder() {
    const int savedErrno = errno;
    if (!path_.empty()) {
        std::error_code ignored;
        std::filesystem::remove_all(path_, ignored);
    }
    errno = savedErrno;
}

} // namespace base
