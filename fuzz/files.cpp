// The files of the fuzz targets' machine, in memory, as a real file system takes longer than what
// is tested: this program's own versions of the calls that the library makes. What is not below the
// machine's folders is left to the C library. Every lock is granted.
#include "files.h"
#include "fuzz.h"

#include <algorithm>
#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <cstring>
#include <dirent.h>
#include <dlfcn.h>
#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

// The C library's own function.
#define OWN(name)                                                                                  \
    ([] {                                                                                          \
        static const auto found = reinterpret_cast<decltype(&(name))>(dlsym(RTLD_NEXT, #name));    \
        return found;                                                                              \
    }())

namespace {

struct Node {
    std::string content;
    struct stat status {};
};
using NodePointer = std::shared_ptr<Node>;

struct OpenFile {
    NodePointer node;
    size_t at = 0;
};

constexpr int kFirst = 4096; // descriptor
constexpr const char *kFolders[] = {"/etc", "/tmp", "/usr/tavi/bin", "/usr/tavi/etc",
                                    "/sys/class/rtc/rtc0"};

std::map<std::string, NodePointer, std::less<>> nodes;
std::vector<OpenFile> opened;
std::vector<std::pair<FILE *, int>> streams;
size_t shortSize = 0;
int shortReads = 0; // that are still to come

int fail(int error) {
    errno = error;
    return -1;
}

bool isOurs(const char *path) {
    constexpr std::string_view kPlaces[] = {
        "/etc", "/tmp", "/usr/tavi", "/sys/class/rtc", "/var/lib/tavischeduler", "/var/run"};
    return std::any_of(std::begin(kPlaces), std::end(kPlaces), [path](std::string_view place) {
        return std::strncmp(path, place.data(), place.size()) == 0;
    });
}

bool isOurs(int fd) {
    return fd >= kFirst && static_cast<size_t>(fd - kFirst) < opened.size() &&
           opened[static_cast<size_t>(fd - kFirst)].node;
}

OpenFile &at(int fd) {
    return opened[static_cast<size_t>(fd - kFirst)];
}

NodePointer find(std::string_view path) {
    const auto found = nodes.find(path.ends_with('/') ? path.substr(0, path.size() - 1) : path);
    return found == nodes.end() ? nullptr : found->second;
}

NodePointer make(const std::string &path, mode_t mode) {
    static ino_t inodes = 0;
    auto node = std::make_shared<Node>();
    node->status.st_ino = ++inodes;
    node->status.st_mode = mode;
    node->status.st_nlink = 1;
    node->status.st_mtime = fuzz::now;
    return nodes[path] = node;
}

bool hasFolder(std::string_view path) {
    return find(path.substr(0, path.rfind('/'))) != nullptr;
}

int give(const NodePointer &node) {
    auto free =
        std::find_if(opened.begin(), opened.end(), [](const OpenFile &file) { return !file.node; });
    free = free == opened.end() ? opened.emplace(free) : free;
    *free = {.node = node};
    return kFirst + static_cast<int>(free - opened.begin());
}

int openNode(const char *path, int flags, mode_t mode) {
    NodePointer node = find(path);
    if (node && (flags & O_CREAT) != 0 && (flags & O_EXCL) != 0) {
        return fail(EEXIST);
    }
    if (node && S_ISLNK(node->status.st_mode)) {
        return fail((flags & O_NOFOLLOW) != 0 ? ELOOP : ENOENT);
    }
    if (!node && ((flags & O_CREAT) == 0 || !hasFolder(path))) {
        return fail(ENOENT);
    }
    if (node && S_ISDIR(node->status.st_mode) != ((flags & O_DIRECTORY) != 0)) {
        return fail(S_ISDIR(node->status.st_mode) ? EISDIR : ENOTDIR);
    }
    node = node ? node : make(path, S_IFREG | mode);
    if ((flags & O_TRUNC) != 0) {
        node->content.clear();
    }
    return give(node);
}

int statNode(const NodePointer &node, struct stat *status) {
    if (!node) {
        return fail(ENOENT);
    }
    *status = node->status;
    status->st_size = S_ISREG(status->st_mode) ? static_cast<off_t>(node->content.size()) : 0;
    return 0;
}

ssize_t readAt(const Node &node, size_t at, void *buffer, size_t size) {
    const size_t count = std::min(size, node.content.size() - std::min(at, node.content.size()));
    std::memcpy(buffer, node.content.data() + at, count);
    return static_cast<ssize_t>(count);
}

ssize_t writeAt(Node &node, size_t at, const void *buffer, size_t size) {
    node.content.resize(std::max(node.content.size(), at + size));
    std::memcpy(node.content.data() + at, buffer, size);
    node.status.st_mtime = fuzz::now;
    return static_cast<ssize_t>(size);
}

int cutNode(const NodePointer &node, off_t size) {
    if (!node) {
        return fail(ENOENT);
    }
    node->content.resize(static_cast<size_t>(size));
    return 0;
}

FILE *streamOf(int fd, const char *mode) {
    constexpr cookie_io_functions_t kCalls = {
        .read =
            [](void *fd, char *buffer, size_t size) {
                return read(static_cast<int>(reinterpret_cast<intptr_t>(fd)), buffer, size);
            },
        .write =
            [](void *fd, const char *buffer, size_t size) {
                return write(static_cast<int>(reinterpret_cast<intptr_t>(fd)), buffer, size);
            },
        .seek = nullptr,
        .close =
            [](void *fd) {
                const auto number = static_cast<int>(reinterpret_cast<intptr_t>(fd));
                std::erase_if(streams, [number](const auto &row) { return row.second == number; });
                return close(number);
            }};
    FILE *const stream = fopencookie(reinterpret_cast<void *>(intptr_t{fd}), mode, kCalls);
    streams.emplace_back(stream, fd);
    return stream;
}

} // namespace

void fuzz::makeFolders() {
    for (const char *const path : kFolders) {
        const bool isShared = std::strcmp(path, "/tmp") == 0;
        make(path, S_IFDIR | (isShared ? 01777 : 0755));
    }
    make(kRunner, S_IFLNK | 0777);
}

void fuzz::requireTidy() {
    REQUIRE(
        std::all_of(opened.begin(), opened.end(), [](const OpenFile &file) { return !file.node; }));
    for (const auto &[path, node] : nodes) {
        const std::string_view name = std::string_view(path).substr(path.rfind('/'));
        REQUIRE(name.find_first_of("0123456789") == std::string_view::npos ||
                S_ISDIR(node->status.st_mode));
    }
}

void fuzz::shortenReads(size_t most) {
    constexpr int kReads = 16; // more take time and show no more
    shortSize = most;
    shortReads = most > 0 ? kReads : 0;
}

std::string &fuzz::contentOf(const char *path) {
    const NodePointer node = find(path);
    return (node ? node : make(path, S_IFREG | 0600))->content;
}

extern "C" {

int open(const char *path, int flags, ...) {
    va_list arguments;
    va_start(arguments, flags);
    const mode_t mode = (flags & O_CREAT) != 0 ? va_arg(arguments, mode_t) : 0;
    va_end(arguments);
    return isOurs(path) ? openNode(path, flags, mode) : OWN(open)(path, flags, mode);
}

int close(int fd) {
    if (!isOurs(fd)) {
        return OWN(close)(fd);
    }
    at(fd) = {};
    return 0;
}

ssize_t read(int fd, void *buffer, size_t size) {
    if (!isOurs(fd)) {
        return OWN(read)(fd, buffer, size);
    }
    const size_t most = shortReads > 0 ? std::min(shortSize, size) : size;
    shortReads -= shortReads > 0 ? 1 : 0;
    const ssize_t count = readAt(*at(fd).node, at(fd).at, buffer, most);
    at(fd).at += static_cast<size_t>(count);
    return count;
}

ssize_t write(int fd, const void *buffer, size_t size) {
    if (!isOurs(fd)) {
        return OWN(write)(fd, buffer, size);
    }
    writeAt(*at(fd).node, at(fd).at, buffer, size);
    at(fd).at += size;
    return static_cast<ssize_t>(size);
}

ssize_t pread(int fd, void *buffer, size_t size, off_t from) {
    return isOurs(fd) ? readAt(*at(fd).node, static_cast<size_t>(from), buffer, size) : fail(EBADF);
}

ssize_t pwrite(int fd, const void *buffer, size_t size, off_t from) {
    return isOurs(fd) ? writeAt(*at(fd).node, static_cast<size_t>(from), buffer, size)
                      : fail(EBADF);
}

int fstat(int fd, struct stat *status) {
    return isOurs(fd) ? statNode(at(fd).node, status) : OWN(fstat)(fd, status);
}

int lstat(const char *path, struct stat *status) {
    return isOurs(path) ? statNode(find(path), status) : OWN(lstat)(path, status);
}

int stat(const char *path, struct stat *status) {
    return isOurs(path) ? statNode(find(path), status) : OWN(stat)(path, status);
}

int access(const char *path, int mode) {
    return !isOurs(path) ? OWN(access)(path, mode) : find(path) ? 0 : fail(ENOENT);
}

int rename(const char *from, const char *to) {
    return isOurs(from) ? renameat2(AT_FDCWD, from, AT_FDCWD, to, 0) : OWN(rename)(from, to);
}

int renameat2(int, const char *from, int, const char *to, unsigned int flags) {
    const NodePointer moved = find(from);
    const NodePointer present = find(to);
    const bool isExchange = (flags & RENAME_EXCHANGE) != 0;
    if (!moved || !hasFolder(to) || (isExchange && !present)) {
        return fail(ENOENT);
    }
    if (present && (flags & RENAME_NOREPLACE) != 0) {
        return fail(EEXIST);
    }
    nodes[to] = moved;
    if (isExchange) {
        nodes[from] = present;
    } else {
        nodes.erase(from);
    }
    return 0;
}

int unlink(const char *path) {
    return !isOurs(path) ? OWN(unlink)(path) : nodes.erase(path) > 0 ? 0 : fail(ENOENT);
}

int mkostemp(char *path, int flags) {
    static unsigned int made = 0;
    std::snprintf(path + std::strlen(path) - 6, 7, "%06u", ++made % 1'000'000);
    return openNode(path, flags | O_CREAT | O_EXCL, 0600);
}

int truncate(const char *path, off_t size) noexcept {
    return cutNode(find(path), size);
}

int ftruncate(int fd, off_t size) noexcept {
    return isOurs(fd) ? cutNode(at(fd).node, size) : fail(EBADF);
}

int fchmod(int fd, mode_t mode) noexcept {
    at(fd).node->status.st_mode = S_IFREG | mode;
    return 0;
}

int fchown(int fd, uid_t user, gid_t group) noexcept {
    at(fd).node->status.st_uid = user;
    at(fd).node->status.st_gid = group;
    return 0;
}

int futimens(int fd, const timespec *times) noexcept {
    at(fd).node->status.st_mtime = times ? times[1].tv_sec : fuzz::now;
    return 0;
}

int fsync(int) {
    return 0;
}

int flock(int, int) noexcept {
    return 0;
}

int fcntl(int fd, int command, ...) {
    va_list arguments;
    va_start(arguments, command);
    void *const argument = va_arg(arguments, void *);
    va_end(arguments);
    if (!isOurs(fd)) {
        return OWN(fcntl)(fd, command, argument);
    }
    if (command == F_OFD_GETLK) {
        static_cast<struct flock *>(argument)->l_type = F_UNLCK;
    }
    return 0;
}

FILE *fopen(const char *path, const char *mode) {
    if (!isOurs(path)) {
        return OWN(fopen)(path, mode);
    }
    const int fd = openNode(path, *mode == 'r' ? O_RDONLY : O_WRONLY | O_CREAT | O_TRUNC, 0666);
    return fd == -1 ? nullptr : streamOf(fd, mode);
}

FILE *fdopen(int fd, const char *mode) noexcept {
    return isOurs(fd) ? streamOf(fd, mode) : OWN(fdopen)(fd, mode);
}

int fileno(FILE *stream) noexcept {
    const auto found = std::find_if(streams.begin(), streams.end(),
                                    [stream](const auto &row) { return row.first == stream; });
    return found == streams.end() ? OWN(fileno)(stream) : found->second;
}

// What dead processes left is looked for, and there is nothing of the kind.
DIR *opendir(const char *path) {
    return isOurs(path) ? (errno = ENOENT, nullptr) : OWN(opendir)(path);
}

} // extern "C"
