// The machine of the fuzz targets: this program's own versions of what the library calls.
#include "files.h"
#include "fuzz.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <dlfcn.h>
#include <filesystem>
#include <pwd.h>
#include <sanitizer/asan_interface.h>
#include <spawn.h>
#include <sys/wait.h>
#include <syslog.h>
#include <unistd.h>

namespace fuzz {

time_t now = 1715158800; // 2024-05-08 09:00 UTC

namespace {

// Of the "processes" that posix_spawn answers.
constexpr pid_t kDone = 0x3fffffff;

} // namespace

void fail(const char *condition, const char *file, int line) {
    dprintf(STDERR_FILENO, "%s:%d: does not hold: %s\n", file, line, condition);
    std::abort();
}

void storeTasks(std::string_view content) {
    contentOf(kWorking) = content;
    contentOf(kPersistent) = content;
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

// At the task's own times.
void requireLine(const TAVI_SCHED_TASK &task, bool isSound) {
    std::array<char, 512> line{};
    std::array<char, 512> reason{};
    TAVI_SCHED_CRON_TIMES times{};
    REQUIRE(TAVISchedCrontabLine(&task, line.data(), line.size()) == 0);
    const int judged = TAVISchedCrontabLineCheck(line.data(), &times, reason.data(), reason.size());
    REQUIRE(judged == 0 || (judged == 1 && reason[0] != '\0'));
    if (!isSound) {
        return;
    }
    uint32_t hours = 0;
    uint32_t weekDays = 0;
    for (uint32_t hour = task.runHour; hour <= std::max(task.runHour, task.lastWorkHour);
         hour += std::max(task.repeatHour, 1U)) {
        hours |= hours == 0 || task.repeatHour > 0 ? 1U << hour : 0U;
    }
    for (unsigned int day = 0; day < TAVI_SCHED_WEEK_DAYS; ++day) {
        weekDays |= task.week[day] == '0' ? 0U : 1U << day;
    }
    const bool isOnDate = task.type == TAVI_SCHED_TYPE_ONCE || task.type == TAVI_SCHED_TYPE_YEARLY;
    REQUIRE(judged == 0 && times.minutes == uint64_t{1} << task.runMin && times.hours == hours);
    REQUIRE(times.weekDays == (task.type == TAVI_SCHED_TYPE_WEEKLY ? weekDays : 0x7fU));
    REQUIRE(times.months == (isOnDate ? 1U << task.startMonth : 0x1ffeU));
    REQUIRE(times.monthDays ==
            (isOnDate || task.type == TAVI_SCHED_TYPE_MONTHLY ? 1U << task.startDay : 0xfffffffeU));
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
    fuzz::makeFolders();
    fuzz::contentOf(fuzz::kCrontab) = "";
    fuzz::storeTasks("");
    return 0;
}

int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size) {
    fuzz::shortenReads(0);
    fuzz::test(fuzz::Input(data, size));
    fuzz::requireTidy();
    return 0;
}

// What the process changes is not the machine's time zone.
int unsetenv(const char *) noexcept {
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

// In the place of the sanitizer's own, as the fuzzer takes note of each comparison there.
int memcmp(const void *one, const void *other, size_t size) noexcept {
    static const auto compare = reinterpret_cast<decltype(&memcmp)>(dlsym(RTLD_NEXT, "memcmp"));
    for (const void *const bytes : {one, other}) {
        const auto *const begin = static_cast<const char *>(bytes);
        REQUIRE(size == 0 || (!__asan_address_is_poisoned(begin) &&
                              !__asan_address_is_poisoned(begin + size - 1)));
    }
    return compare(one, other, size);
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
    fuzz::contentOf(argv[3]) = std::string(fuzz::contentOf(argv[2]));
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

} // extern "C"
