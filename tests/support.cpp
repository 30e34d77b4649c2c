// The test program's own versions of system functions, helpers, and its entry into the sandbox.
#include "support.h"

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <cstdarg>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <regex>
#include <sqlite3.h>
#include <sstream>
#include <sys/mman.h>
#include <sys/prctl.h>
#include <syslog.h>
#include <utility>

namespace support {

Fakes fakes;

namespace {

// One behind the other, each with its NUL.
struct Lines {
    std::atomic<size_t> length;
    char text[4 << 20];

    void add(const char *line) {
        const size_t size = std::strlen(line) + 1;
        std::memcpy(text + length.fetch_add(size), line, size);
    }
    std::vector<std::string> take() {
        std::vector<std::string> lines;
        std::istringstream stream(std::string(text, length.exchange(0)));
        for (std::string line; std::getline(stream, line, '\0');) {
            lines.push_back(line);
        }
        return lines;
    }
};

// Shared with forked children.
struct Journal {
    Lines log, notices;
    std::atomic<size_t> pauseCount;
    long pauses[4096];
};

Journal &journal() {
    static auto *const shared = static_cast<Journal *>(
        mmap(nullptr, sizeof(Journal), PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0));
    return *shared;
}

std::vector<std::string> calledOnFiles;

void recordPause(long microseconds) {
    journal().pauses[journal().pauseCount++ % 4096] = microseconds;
    const timespec length{.tv_sec = 0, .tv_nsec = fakes.pauseMicroseconds * 1000};
    nanosleep(&length, nullptr);
}

} // namespace

std::vector<std::string> logs(bool stable) {
    static const std::regex number("(\\.(?:cpp|h)):\\d+");
    auto lines = journal().log.take();
    for (std::string &line : lines) {
        line = stable ? line : std::regex_replace(line, number, "$1:*");
    }
    return lines;
}

std::vector<std::string> notices() {
    return journal().notices.take();
}

std::string lastLog(bool stable) {
    const auto lines = logs(stable);
    return lines.empty() ? "" : lines.back();
}

std::vector<long> pauses() {
    const size_t count = std::min<size_t>(journal().pauseCount.exchange(0), 4096);
    return {journal().pauses, journal().pauses + count};
}

std::vector<std::string> fileCalls() {
    return std::exchange(calledOnFiles, {});
}

std::string readFile(const std::string &path) {
    std::ifstream file(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(file), {}};
}

void writeFile(const std::string &path, const std::string &content) {
    std::ofstream(path, std::ios::binary) << content;
}

struct stat statusOf(const char *path) {
    struct stat status {};
    lstat(path, &status);
    return status;
}

std::string query(const std::string &sql) {
    std::string result;
    const auto append = [](void *text, int columns, char **values, char **) {
        for (int i = 0; i < columns; ++i) {
            *static_cast<std::string *>(text) += std::string(values[i] ? values[i] : "-") + " ";
        }
        return 0;
    };
    sqlite3 *const db = TAVISchedDBInit();
    EXPECT_EQ(sqlite3_exec(db, sql.c_str(), append, &result, nullptr), SQLITE_OK) << sql;
    sqlite3_close(db);
    return result;
}

void recorded(const std::string &sql, bool untilKilled) {
    sqlite3 *database = nullptr;
    ASSERT_EQ(sqlite3_open("/var/lib/tavischeduler/runs.sqlite", &database), SQLITE_OK);
    EXPECT_EQ(sqlite3_exec(database, sql.c_str(), nullptr, nullptr, nullptr), SQLITE_OK) << sql;
    if (untilKilled) {
        writeFile("/tmp/held", "");
        ::pause();
    }
    sqlite3_close(database);
}

int shell(const std::string &command) {
    const int status = std::system(command.c_str());
    return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

int exitOf(pid_t pid) {
    int status = -1;
    waitpid(pid, &status, 0);
    return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

bool waitFor(const std::string &condition) {
    return shell("for i in $(seq 12000); do ! { " + condition +
                 "; } || exit 0; sleep 0.01; done; exit 1") == 0;
}

void waitForChildren() {
    while (waitpid(-1, nullptr, 0) > 0 || errno == EINTR) {
    }
}

time_t at(const char *moment) {
    tm broken{};
    strptime(moment, "%F %R", &broken);
    broken.tm_isdst = -1;
    return mktime(&broken);
}

Task newTask(const char *command) {
    const OwnAllocations own;
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

std::string resultOf(unsigned int backend, const Task &task, size_t room) {
    int code = 0;
    char comment[1024] = "";
    const int result = SchedBackends[backend].run(task.get(), &code, comment, room);
    return result == 0 ? std::to_string(code) + ":" + comment : "failed";
}

Task taskOf(const When &row) {
    faults().now = at(row.now);
    Task task = newTask();
    task->type = row.type;
    task->startYear = row.start[0];
    task->startMonth = row.start[1];
    task->startDay = row.start[2];
    task->runHour = row.run[0];
    task->runMin = row.run[1];
    task->repeatHour = row.every;
    task->lastWorkHour = row.last;
    TAVISchedCTaskSetWeek(task.get(), row.week);
    return task;
}

void SchedTest::SetUp() {
    // Never across a mount point: a checkout below /tmp is there, as it is on the machine.
    shell(
        "find /tmp /usr/tavi/etc /run /var/lib/tavischeduler -xdev -mindepth 1 -delete 2>/dev/null");
    writeFile(kCrontab, kForeignCrontab);
    symlink(RUNNER, "/tmp/tavischedtask");
    setenv("TZ", "UTC", 1);
    unlink("/etc/localtime"); // the machine's time zone, as programs have it
    symlink("/usr/share/zoneinfo/UTC", "/etc/localtime");
    logs();
    notices();
    pauses();
}

} // namespace support

using support::fakes;

extern "C" {

void syslog(int priority, const char *format, ...) {
    const int savedErrno = errno; // also for %m
    char line[80000] = "wrong priority";
    if (priority == LOG_ERR || priority == LOG_INFO) {
        va_list arguments;
        va_start(arguments, format);
        vsnprintf(line, sizeof line, format, arguments);
        va_end(arguments);
    }
    auto &journal = support::journal();
    (priority == LOG_INFO ? journal.notices : journal.log).add(line);
    errno = savedErrno;
}

long sysconf(int name) noexcept {
    return name == _SC_CLK_TCK && fakes.clockTicks > 0
               ? fakes.clockTicks
               : support::original(sysconf, "sysconf")(name);
}

unsigned int sleep(unsigned int seconds) {
    support::recordPause(seconds * 1000000L);
    return 0;
}

int usleep(useconds_t microseconds) {
    support::recordPause(microseconds);
    return 0;
}

int rename(const char *from, const char *to) noexcept {
    const support::OwnAllocations own;
    support::calledOnFiles.push_back("rename " + std::string(from) + " " + to);
    errno = EXDEV;
    return fakes.renameFails ? -1 : support::original(rename, "rename")(from, to);
}

int fsync(int fd) {
    const support::OwnAllocations own;
    std::error_code error;
    const auto path = std::filesystem::read_symlink("/proc/self/fd/" + std::to_string(fd), error);
    support::calledOnFiles.push_back("fsync " + path.string());
    const bool fails =
        fakes.fsyncFails || (fakes.folderFsyncFails && std::filesystem::is_directory(path, error));
    errno = EIO;
    return fails ? -1 : support::original(fsync, "fsync")(fd);
}

} // extern "C"

int main(int argc, char **argv) {
    // Whoever starts this may ignore signals; its processes may not.
    for (const int number : {SIGHUP, SIGINT, SIGQUIT, SIGPIPE, SIGTERM, SIGCHLD, SIGALRM}) {
        signal(number, SIG_DFL);
    }
    const char *const sandbox = std::getenv("TAVI_SANDBOX");
    if (!sandbox || std::strcmp(sandbox, "inside") != 0) {
        const std::string self = std::filesystem::canonical("/proc/self/exe");
        std::vector<const char *> arguments(argv, argv + argc + 1);
        arguments[0] = self.c_str();
        arguments.insert(arguments.begin(), SANDBOX);
        execv(SANDBOX, const_cast<char *const *>(arguments.data()));
        perror(SANDBOX);
        return 1;
    }
    prctl(PR_SET_CHILD_SUBREAPER, 1); // detached children come back here
    testing::InitGoogleMock(&argc, argv);
    return RUN_ALL_TESTS();
}
