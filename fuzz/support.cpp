// The machine of the fuzz targets: this program's own versions of what the library calls.
#include "fuzz.h"

#include <algorithm>
#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fcntl.h>
#include <filesystem>
#include <pwd.h>
#include <spawn.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <syslog.h>
#include <unistd.h>
#include <utility>

namespace fuzz {

time_t now = 1715158800; // 2024-05-08 09:00 UTC
size_t readStep = 0;

namespace {

// Of the "processes" that posix_spawn answers.
constexpr pid_t kDone = 0x3fffffff;

ssize_t writeAll(int fd, std::string_view content) {
    return fd == -1 ? -1 : write(fd, content.data(), content.size());
}

} // namespace

void fail(const char *condition, const char *file, int line) {
    std::fprintf(stderr, "%s:%d: does not hold: %s\n", file, line, condition);
    std::abort();
}

std::string readFile(const char *path) {
    const size_t step = std::exchange(readStep, 0);
    const int fd = open(path, O_RDONLY | O_CLOEXEC);
    struct stat status {};
    fstat(fd, &status);
    std::string content(static_cast<size_t>(status.st_size), '\0');
    REQUIRE(fd != -1 && read(fd, content.data(), content.size()) == status.st_size);
    close(fd);
    readStep = step;
    return content;
}

void writeFile(const char *path, std::string_view content) {
    const int fd = open(path, O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0600);
    REQUIRE(writeAll(fd, content) == static_cast<ssize_t>(content.size()));
    close(fd);
}

void storeTasks(std::string_view content) {
    writeFile(kWorking, content);
    writeFile(kPersistent, content);
}

uint32_t Input::number(size_t bytes) {
    uint32_t number = 0;
    for (; bytes > 0 && !rest_.empty(); --bytes, rest_.remove_prefix(1)) {
        number = number << 8 | static_cast<unsigned char>(rest_.front());
    }
    return number;
}

size_t Input::step() {
    const uint32_t chosen = number(1);
    return chosen % 8 == 1 ? 4 + chosen : 0;
}

std::vector<std::string> linesOf(std::string_view text) {
    std::vector<std::string> lines;
    while (!text.empty()) {
        const size_t size = std::min(text.find('\n'), text.size() - 1) + 1;
        lines.emplace_back(text.substr(0, size));
        text.remove_prefix(size);
    }
    return lines;
}

Hash hashOf(const Pairs &pairs) {
    PLATCSZHASH *hash = PLATCSzHashAlloc(64);
    for (const auto &[key, value] : pairs) {
        REQUIRE(PLATCSzHashSetValue(&hash, key.c_str(), value.c_str()) == 0);
    }
    return {hash, PLATCSzHashFree};
}

Pairs pairsOf(PLATCSZHASH *hash) {
    const List keys = newList();
    PLATCSZLIST *list = keys.get();
    REQUIRE(PLATCSzHashEnumKey(hash, &list) >= 0);
    Pairs pairs;
    for (const std::string &key : textsOf(list)) {
        const char *const value = PLATCSzHashGetValue(hash, key.c_str());
        pairs[key] = value ? value : "";
    }
    return pairs;
}

List newList() {
    return {PLATCSzListAlloc(64), PLATCSzListFree};
}

std::vector<std::string> textsOf(const PLATCSZLIST *list) {
    std::vector<std::string> texts;
    for (int i = 0; const char *const text = PLATCSzListGet(list, i); ++i) {
        texts.emplace_back(text);
    }
    return texts;
}

Task newTask() {
    return std::make_unique<TAVI_SCHED_TASK>();
}

Pairs formOf(const TAVI_SCHED_TASK &task) {
    PLATCSZHASH *hash = PLATCSzHashAlloc(64);
    REQUIRE(TAVISchedInitHashFromTask(&hash, &task) == 0);
    return pairsOf(Hash(hash, PLATCSzHashFree).get());
}

int listTasks(const std::function<void(const TAVI_SCHED_TASK &)> &onTask) {
    TAVI_SCHED_TASK *list = nullptr;
    const int count = TAVISchedTaskListGet(&list, nullptr);
    for (const TAVI_SCHED_TASK *task = list; task; task = TAVISchedTaskNext(task)) {
        onTask(*task);
    }
    TAVISchedTaskListFree(&list);
    return count;
}

} // namespace fuzz

extern "C" {

// Enters the sandbox, and makes there what a machine has.
int LLVMFuzzerInitialize(int *, char ***argv) {
    const char *const sandbox = std::getenv("TAVI_SANDBOX");
    if (!sandbox || std::strcmp(sandbox, "inside") != 0) {
        std::vector<char *> arguments(1, const_cast<char *>(SANDBOX));
        for (char **argument = *argv; *argument; ++argument) {
            arguments.push_back(*argument);
        }
        const std::string self = std::filesystem::canonical("/proc/self/exe");
        arguments[1] = const_cast<char *>(self.c_str());
        arguments.push_back(nullptr);
        execv(SANDBOX, arguments.data());
        std::perror(SANDBOX);
        std::_Exit(1);
    }
    setenv("TZ", "UTC", 1);
    REQUIRE(symlink("/bin/true", fuzz::kRunner) == 0);
    fuzz::writeFile(fuzz::kCrontab, "");
    fuzz::storeTasks("");
    return 0;
}

time_t time(time_t *result) noexcept {
    return result ? *result = fuzz::now : fuzz::now;
}

// Each line tells where it comes from.
void syslog(int priority, const char *format, ...) {
    const int savedErrno = errno; // also for %m
    REQUIRE(priority == LOG_INFO || std::strncmp(format, "%s:%d ", 6) == 0);
    char line[4096];
    va_list arguments;
    va_start(arguments, format);
    vsnprintf(line, sizeof line, format, arguments);
    va_end(arguments);
    errno = savedErrno;
}

void openlog(const char *, int, int) {}

ssize_t __interceptor_read(int fd, void *buffer, size_t size);

ssize_t read(int fd, void *buffer, size_t size) {
    return __interceptor_read(fd, buffer,
                              fuzz::readStep > 0 ? std::min(fuzz::readStep, size) : size);
}

// The machine's users, without a look at its files.
passwd *getpwuid(uid_t uid) {
    static char empty[] = "", root[] = "root", alice[] = "alice", home[] = "/", shell[] = "/bin/sh";
    static passwd users[] = {{root, empty, 0, 0, empty, home, shell},
                             {alice, empty, 1000, 1000, empty, home, shell}};
    auto *const user = std::find_if(std::begin(users), std::end(users),
                                    [uid](const passwd &row) { return row.pw_uid == uid; });
    return user == std::end(users) ? nullptr : user;
}

passwd *getpwnam(const char *name) {
    for (const uid_t uid : {0, 1000}) {
        if (std::strcmp(getpwuid(uid)->pw_name, name) == 0) {
            return getpwuid(uid);
        }
    }
    return nullptr;
}

// No program is started but cp, which is done here.
int posix_spawn(pid_t *pid, const char *path, const posix_spawn_file_actions_t *,
                const posix_spawnattr_t *, char *const argv[], char *const[]) {
    REQUIRE(std::strcmp(path, "/bin/cp") == 0 && argv[1] && argv[2] && argv[3]);
    const size_t step = std::exchange(fuzz::readStep, 0);
    fuzz::writeFile(argv[3], fuzz::readFile(argv[2]));
    fuzz::readStep = step;
    *pid = fuzz::kDone;
    return 0;
}

pid_t __interceptor_waitpid(pid_t pid, int *status, int options);

pid_t waitpid(pid_t pid, int *status, int options) {
    if (pid != fuzz::kDone) {
        return __interceptor_waitpid(pid, status, options);
    }
    *status = 0;
    return pid;
}

int system(const char *) {
    fuzz::fail("no shell is started", __FILE__, __LINE__);
}

int fsync(int) {
    return 0;
}

} // extern "C"
