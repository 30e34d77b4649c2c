// The test program's own versions of system functions, helpers, and its entry into the sandbox.
#include "support.h"

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <cstdarg>
#include <cstdlib>
#include <cstring>
#include <dlfcn.h>
#include <filesystem>
#include <fstream>
#include <regex>
#include <sstream>
#include <sys/mman.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <syslog.h>
#include <unistd.h>

namespace support {

Fakes fakes;

namespace {

// Shared with forked children.
struct Journal {
    std::atomic<size_t> logLength;
    std::atomic<size_t> pauseCount;
    std::atomic<int> systemCalls;
    long pauses[4096];
    char log[4 << 20];
};

Journal &journal() {
    static auto *const shared = static_cast<Journal *>(
        mmap(nullptr, sizeof(Journal), PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0));
    return *shared;
}

template <typename Function> Function next(const char *name) {
    return reinterpret_cast<Function>(dlsym(RTLD_NEXT, name));
}

void recordPause(long microseconds) {
    journal().pauses[journal().pauseCount++ % 4096] = microseconds;
    const timespec length{.tv_sec = 0, .tv_nsec = fakes.pauseMicroseconds * 1000};
    nanosleep(&length, nullptr);
}

} // namespace

std::vector<std::string> logs(bool stable) {
    std::vector<std::string> lines;
    const size_t length = journal().logLength.exchange(0);
    std::istringstream text(std::string(journal().log, length));
    for (std::string line; std::getline(text, line, '\0');) {
        static const std::regex number("(\\.(?:cpp|h)):\\d+");
        lines.push_back(stable ? line : std::regex_replace(line, number, "$1:*"));
    }
    return lines;
}

std::vector<long> pauses() {
    const size_t count = std::min<size_t>(journal().pauseCount.exchange(0), 4096);
    return {journal().pauses, journal().pauses + count};
}

int systemCalls() {
    return journal().systemCalls.exchange(0);
}

std::string readFile(const std::string &path) {
    std::ifstream file(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(file), {}};
}

void writeFile(const std::string &path, const std::string &content) {
    std::ofstream(path, std::ios::binary) << content;
}

int shell(const std::string &command) {
    const int status = next<int (*)(const char *)>("system")(command.c_str());
    return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

void waitForChildren() {
    while (waitpid(-1, nullptr, 0) > 0 || errno == EINTR) {
    }
}

time_t localTime(int year, int month, int day, int hour, int minute) {
    tm broken{};
    broken.tm_year = year - 1900;
    broken.tm_mon = month - 1;
    broken.tm_mday = day;
    broken.tm_hour = hour;
    broken.tm_min = minute;
    broken.tm_isdst = -1;
    return mktime(&broken);
}

Task newTask(const char *command) {
    Task task(TAVISchedTaskAlloc(), TAVISchedTaskFree);
    TAVISchedCTaskSetCommand(task.get(), command);
    return task;
}

Task storedTask(const char *command) {
    Task task = newTask(command);
    EXPECT_EQ(TAVISchedTaskCreate(task.get()), 0);
    return task;
}

std::vector<int> listedIds() {
    std::vector<int> ids;
    TAVI_SCHED_TASK *list = nullptr;
    EXPECT_GE(TAVISchedTaskListGet(&list, nullptr), 0);
    for (const TAVI_SCHED_TASK *task = list; task; task = TAVISchedTaskNext(task)) {
        ids.push_back(task->id);
    }
    TAVISchedTaskListFree(&list);
    std::sort(ids.begin(), ids.end());
    return ids;
}

void SchedTest::SetUp() {
    // Never across a mount point: a checkout below /tmp is there, as it is on the machine.
    shell("find /tmp /usr/tavi/etc /run -xdev -mindepth 1 -delete 2>/dev/null");
    writeFile("/etc/crontab", kForeignCrontab);
    fakes = {};
    logs();
    pauses();
    systemCalls();
}

} // namespace support

using support::fakes;

extern "C" {

time_t time(time_t *result) noexcept {
    timespec clock{};
    clock_gettime(CLOCK_REALTIME, &clock);
    const time_t now = fakes.now.value_or(clock.tv_sec);
    if (result) {
        *result = now;
    }
    return now;
}

tm *localtime(const time_t *time) noexcept {
    static tm local;
    errno = EOVERFLOW;
    tzset();
    return fakes.localtimeFails ? nullptr : localtime_r(time, &local);
}

void syslog(int priority, const char *format, ...) {
    const int savedErrno = errno;
    char line[16384];
    va_list arguments;
    va_start(arguments, format);
    errno = savedErrno; // for %m
    int length = vsnprintf(line, sizeof line, format, arguments);
    va_end(arguments);
    length = std::min<int>(length, sizeof line - 1);
    if (priority != LOG_ERR) {
        std::strcpy(line, "wrong priority");
        length = static_cast<int>(std::strlen(line));
    }
    auto &journal = support::journal();
    std::memcpy(journal.log + journal.logLength.fetch_add(static_cast<size_t>(length) + 1), line,
                static_cast<size_t>(length) + 1);
    errno = savedErrno;
}

unsigned int sleep(unsigned int seconds) {
    support::recordPause(seconds * 1000000L);
    return 0;
}

int usleep(useconds_t microseconds) {
    support::recordPause(microseconds);
    return 0;
}

#ifdef __SANITIZE_ADDRESS__
void *__interceptor_calloc(size_t count, size_t size);
#define REAL_CALLOC __interceptor_calloc
#else
void *__libc_calloc(size_t count, size_t size);
#define REAL_CALLOC __libc_calloc
#endif

void *calloc(size_t count, size_t size) noexcept {
    if (fakes.callocFails > 0 && count * size >= fakes.callocFails) {
        errno = ENOMEM;
        return nullptr;
    }
    return REAL_CALLOC(count, size);
}

int rename(const char *from, const char *to) noexcept {
    if (fakes.renameFails) {
        errno = EXDEV;
        return -1;
    }
    return support::next<int (*)(const char *, const char *)>("rename")(from, to);
}

int fsync(int fd) {
    if (fakes.fsyncFails) {
        errno = EIO;
        return -1;
    }
    return support::next<int (*)(int)>("fsync")(fd);
}

int system(const char *command) {
    if (fakes.systemIsCounted) {
        ++support::journal().systemCalls;
        return fakes.systemResult;
    }
    return support::next<int (*)(const char *)>("system")(command);
}

} // extern "C"

int main(int argc, char **argv) {
    const char *const sandbox = std::getenv("TAVI_SANDBOX");
    const bool onlyList = std::any_of(argv + 1, argv + argc, [](const char *argument) {
        return std::strncmp(argument, "--gtest_list_tests", 18) == 0;
    });
    if (!onlyList && (!sandbox || std::strcmp(sandbox, "inside") != 0)) {
        std::vector<char *> arguments{const_cast<char *>(SANDBOX)};
        const std::string self = std::filesystem::canonical("/proc/self/exe");
        arguments.push_back(const_cast<char *>(self.c_str()));
        arguments.insert(arguments.end(), argv + 1, argv + argc + 1);
        execv(SANDBOX, arguments.data());
        perror(SANDBOX);
        return 1;
    }
    prctl(PR_SET_CHILD_SUBREAPER, 1); // detached children come back here
    testing::InitGoogleMock(&argc, argv);
    return RUN_ALL_TESTS();
}
