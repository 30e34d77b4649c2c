// Whole files.
#include "file.h"
#include "child.h"

#include <algorithm>
#include <cctype>
#include <cerrno>
#include <charconv>
#include <cstdlib>
#include <dirent.h>
#include <fcntl.h>
#include <filesystem>
#include <new>

namespace base {

namespace {

std::string folderOf(const std::string &path) {
    const size_t slash = path.rfind('/');
    return slash == std::string::npos ? "." : path.substr(0, slash + 1);
}

Descriptor openFolder(const std::string &folder) {
    return Descriptor(::open(folder.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
}

// A file system that cannot flush a folder says EINVAL; it has nothing to flush then.
bool syncFolder(const Descriptor &folder) {
    return folder && (fsync(folder.get()) == 0 || errno == EINVAL);
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
    return stat(folderOf(path).c_str(), &status) != 0 || (status.st_mode & S_ISVTX) != 0;
}

namespace {

ssize_t readInto(int fd, char *buffer, size_t size) {
    ssize_t count = 0;
    do {
        count = read(fd, buffer, size);
    } while (count == -1 && errno == EINTR);
    return count;
}

} // namespace

std::optional<std::string> readSome(int fd, size_t most) {
    std::string text(most, '\0');
    const ssize_t count = readInto(fd, text.data(), most);
    text.resize(count > 0 ? static_cast<size_t>(count) : 0);
    return count < 0 ? std::nullopt : std::optional(std::move(text));
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
        const ssize_t count = readInto(fd, text.data() + length, text.size() - length);
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

bool syncFolderOf(const char *path) noexcept {
    try {
        return syncFolder(openFolder(folderOf(path)));
    } catch (const std::bad_alloc &) {
        errno = ENOMEM;
        return false;
    }
}

bool makeEmpty(const char *path) {
    Descriptor file(::open(path, O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, 0600));
    return file && file.close();
}

// ---- Leftovers ----

std::string processTemporary() {
    return "." + std::to_string(getpid()) + std::string(kTemporary);
}

namespace {

// The process whose temporary file an entry's name is, behind the file's name; 0 for other names.
pid_t makerOf(std::string_view behind) {
    const char *const end = behind.data() + behind.size();
    pid_t pid = 0;
    if (!behind.starts_with('.')) {
        return 0;
    }
    const auto parsed = std::from_chars(behind.data() + 1, end, pid);
    const std::string_view rest(parsed.ptr, static_cast<size_t>(end - parsed.ptr));
    const bool isTemporary = parsed.ec == std::errc() && rest.size() == kTemporary.size() &&
                             rest.front() == '.' &&
                             std::all_of(rest.begin() + 1, rest.end(),
                                         [](unsigned char letter) { return std::isalnum(letter); });
    return isTemporary ? pid : 0;
}

// Nobody else can put another one in the place of a folder of ours.
void removeOwnFolder(const std::string &path) {
    struct stat status {};
    std::error_code ignored;
    if (lstat(path.c_str(), &status) == 0 && S_ISDIR(status.st_mode) &&
        status.st_uid == geteuid()) {
        std::filesystem::remove_all(path, ignored);
    }
}

} // namespace

void removeLeftovers(const std::string &path) {
    const std::string folder = folderOf(path);
    const std::string_view name = std::string_view(path).substr(path.rfind('/') + 1);
    const std::unique_ptr<DIR, int (*)(DIR *)> entries(opendir(folder.c_str()), closedir);
    if (!entries) {
        return;
    }
    while (const dirent *const entry = readdir(entries.get())) {
        const std::string_view found(entry->d_name);
        if (!found.starts_with(name)) {
            continue;
        }
        const pid_t maker = makerOf(found.substr(name.size()));
        if (maker > 0 && !isAlive(maker) && unlinkat(dirfd(entries.get()), entry->d_name, 0) != 0) {
            removeOwnFolder(folder + entry->d_name);
        }
    }
}

// ---- Replacement ----

Replacement::Replacement(std::string path, std::string_view temporary)
    : path_(std::move(path)), temporary_(path_ + std::string(temporary)),
      stream_(nullptr, std::fclose) {}

Replacement::~Replacement() {
    const int savedErrno = errno;
    stream_.reset();
    if (isMade_) {
        unlink(temporary_.c_str());
    }
    errno = savedErrno;
}

bool Replacement::fail(Step step) {
    failed_ = step;
    return false;
}

bool Replacement::open() {
    Descriptor file(mkostemp(temporary_.data(), O_CLOEXEC));
    if (!file) {
        return fail(Step::Create);
    }
    isMade_ = true;
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

bool Replacement::setAttributes(int fd, const Manner &manner) {
    const struct stat *const like = manner.like;
    return !like ||
           (fchown(fd, like->st_uid, like->st_gid) == 0 &&
            fchmod(fd, like->st_mode & ALLPERMS) == 0 && (!manner.later || makeLater(fd, *like)));
}

bool Replacement::commit(const Manner &manner) {
    if (std::fflush(stream_.get()) != 0 || std::ferror(stream_.get())) {
        return fail(Step::Flush);
    }
    const int fd = fileno(stream_.get());
    if (!setAttributes(fd, manner) || (manner.durable && fsync(fd) != 0)) {
        return fail(Step::Attributes);
    }
    // Before the rename: what can fail before it leaves the old file in place.
    const bool syncsFolder = manner.durable && manner.folderToo;
    const Descriptor folder = syncsFolder ? openFolder(folderOf(path_)) : Descriptor();
    if (syncsFolder && !folder) {
        return fail(Step::SyncFolder);
    }
    if (std::fclose(stream_.release()) != 0) {
        return fail(Step::Close);
    }
    if (rename(temporary_.c_str(), path_.c_str()) != 0) {
        return fail(Step::Rename);
    }
    isMade_ = false;
    return !syncsFolder || syncFolder(folder) || fail(Step::SyncFolder);
}

// ---- Putting in place ----

bool exchange(const char *made, const char *path) {
    return renameat2(AT_FDCWD, made, AT_FDCWD, path, RENAME_EXCHANGE) == 0 ||
           (errno == ENOENT && renameat2(AT_FDCWD, made, AT_FDCWD, path, RENAME_NOREPLACE) == 0);
}

PrivateFolder::PrivateFolder(const std::string &besides) : path_(besides + processTemporary()) {
    if (!mkdtemp(path_.data())) {
        path_.clear();
    }
}

PrivateFolder::~PrivateFolder() {
    const int savedErrno = errno;
    try {
        std::error_code ignored;
        if (!path_.empty()) {
            std::filesystem::remove_all(path_, ignored);
        }
    } catch (const std::bad_alloc &) { // what could not be removed stays
    }
    errno = savedErrno;
}

} // namespace base
