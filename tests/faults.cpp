// The clock, and functions of the system that fail when they are told to.
#include "faults.h"

#include <cerrno>
#include <cstdlib>
#include <ctime>
#include <fcntl.h>
#include <new>
#include <pwd.h>
#include <spawn.h>
#include <sqlite3.h>
#include <string>
#include <sys/mman.h>
#include <sys/wait.h>
#include <unistd.h>

namespace support {

namespace {

constexpr const char *kVariable = "TAVI_TEST_FAULTS";

Faults none{}; // while the program is made ready
Faults *present = &none;

// A program that is started for the tests has theirs, but what it starts itself is another one.
__attribute__((constructor)) void begin() {
    const char *const inherited = std::getenv(kVariable);
    const int file =
        inherited ? open(inherited, O_RDWR | O_CLOEXEC) : memfd_create("faults", MFD_CLOEXEC);
    void *const memory =
        ftruncate(file, sizeof(Faults)) == 0
            ? mmap(nullptr, sizeof(Faults), PROT_READ | PROT_WRITE, MAP_SHARED, file, 0)
            : MAP_FAILED;
    if (memory == MAP_FAILED) {
        std::abort();
    }
    unsetenv(kVariable);
    unsetenv("LD_PRELOAD");
    getpwuid(0); // for which the C library crashes without memory, at first
    present = static_cast<Faults *>(memory);
    if (!inherited) {
        present->owner = getpid();
        present->file = file;
    }
}

constexpr const char *kLibrary = "/home/faults.so"; // in which there is no blank

std::string placeFor(const char *library) {
    (void)!symlink(library, kLibrary);
    return "/proc/" + std::to_string(faults().owner) + "/fd/" + std::to_string(faults().file);
}

bool fails(Fault kind) {
    Faults &all = faults();
    const Fault failing = all.kind;
    if (failing == Fault::None) {
        return false;
    }
    const size_t call = ++all.calls[static_cast<size_t>(kind)];
    return failing == kind && (all.isLasting ? call >= all.failing : call == all.failing);
}

bool isOutOfMemory(bool isTooMuch = false) {
    const bool fails = support::fails(Fault::Memory) || isTooMuch;
    errno = fails ? ENOMEM : errno;
    return fails;
}

} // namespace

Faults &faults() {
    return *present;
}

void fail(Fault kind, size_t call, bool isLasting) {
    Faults &all = faults();
    all.failing = call;
    all.isLasting = isLasting;
    all.callocFails = 0;
    for (auto &calls : all.calls) {
        calls = 0;
    }
    all.kind = kind;
}

void shareWithProgram(const char *library) {
    const OwnAllocations own;
    setenv(kVariable, placeFor(library).c_str(), 1);
    setenv("LD_PRELOAD", kLibrary, 1);
}

std::string sharedInShell(const char *library) {
    return std::string(kVariable) + "=" + placeFor(library) + " LD_PRELOAD=" + kLibrary + " ";
}

} // namespace support

using support::fails;
using support::Fault;
using support::faults;
using support::isOutOfMemory;
using support::original;

extern "C" {

#ifdef REAL_IS_INTERCEPTED
#define REAL(name) __interceptor_##name
#else
#define REAL(name) __libc_##name
#endif
void *REAL(malloc)(size_t size);
void *REAL(calloc)(size_t count, size_t size);
void *REAL(realloc)(void *memory, size_t size);

void *malloc(size_t size) noexcept {
    return isOutOfMemory() ? nullptr : REAL(malloc)(size);
}

void *realloc(void *memory, size_t size) noexcept {
    return isOutOfMemory() ? nullptr : REAL(realloc)(memory, size);
}

void *calloc(size_t count, size_t size) noexcept {
    const size_t least = faults().callocFails;
    return isOutOfMemory(least > 0 && count * size >= least) ? nullptr : REAL(calloc)(count, size);
}

pid_t waitpid(pid_t pid, int *status, int options) {
    int ended = 0;
    const pid_t result = original(waitpid, "waitpid")(pid, &ended, options);
    if (result > 0 && fails(Fault::Wait)) {
        errno = ECHILD;
        return -1;
    }
    if (status) {
        *status = ended;
    }
    return result;
}

int posix_spawn(pid_t *pid, const char *path, const posix_spawn_file_actions_t *actions,
                const posix_spawnattr_t *attributes, char *const *argv, char *const *envp) {
    return fails(Fault::Spawn)
               ? EAGAIN
               : original(posix_spawn, "posix_spawn")(pid, path, actions, attributes, argv, envp);
}

time_t time(time_t *result) noexcept {
    timespec clock{};
    clock_gettime(CLOCK_REALTIME, &clock);
    const time_t now = faults().now != 0 ? faults().now.load() : clock.tv_sec;
    return result ? *result = now : now;
}

tm *localtime_r(const time_t *time, tm *local) noexcept {
    errno = EOVERFLOW;
    return fails(Fault::Time) ? nullptr : original(localtime_r, "localtime_r")(time, local);
}

tm *localtime(const time_t *time) noexcept {
    static tm local;
    tzset();
    return localtime_r(time, &local);
}

time_t mktime(tm *local) noexcept {
    errno = EOVERFLOW;
    return fails(Fault::Time) ? -1 : original(mktime, "mktime")(local);
}

int sqlite3_open_v2(const char *path, sqlite3 **database, int flags, const char *vfs) {
    if (fails(Fault::DatabaseOpen)) {
        *database = nullptr;
        return SQLITE_CANTOPEN;
    }
    const int result = original(sqlite3_open_v2, "sqlite3_open_v2")(path, database, flags, vfs);
    if (!*database) {
        return result;
    }
    if (faults().kind == Fault::DatabaseStep || faults().kind == Fault::All) {
        sqlite3_progress_handler(
            *database, 1, [](void *) { return int{fails(Fault::DatabaseStep)}; }, nullptr);
    }
    sqlite3_commit_hook(
        *database, [](void *) { return int{fails(Fault::DatabaseCommit)}; }, nullptr);
    return result;
}

} // extern "C"

// All forms, as a sanitizer has its own of those that are left out.
void *operator new(size_t size, const std::nothrow_t &) noexcept {
    return malloc(size);
}
void *operator new(size_t size) {
    void *const memory = malloc(size);
    return memory ? memory : throw std::bad_alloc();
}
void *operator new[](size_t size) {
    return operator new(size);
}
void *operator new[](size_t size, const std::nothrow_t &) noexcept {
    return malloc(size);
}
void operator delete[](void *memory) noexcept {
    std::free(memory);
}
void operator delete[](void *memory, size_t) noexcept {
    std::free(memory);
}
void operator delete(void *memory) noexcept {
    std::free(memory);
}
void operator delete(void *memory, size_t) noexcept {
    std::free(memory);
}
