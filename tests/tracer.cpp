// Following system calls: a filter in the traced processes stops them at the calls that count.
#include "tracer.h"

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <elf.h>
#include <fcntl.h>
#include <filesystem>
#include <fstream>
#include <linux/filter.h>
#include <linux/seccomp.h>
#include <map>
#include <set>
#include <sys/prctl.h>
#include <sys/ptrace.h>
#include <sys/syscall.h>
#include <sys/uio.h>
#include <sys/user.h>
#include <sys/wait.h>
#include <unistd.h>
#include <vector>

namespace tracer {

namespace {

namespace fs = std::filesystem;

constexpr int kNone = -1;

// Calls that have the same in the same places.
struct Kind {
    int path = kNone;       // the argument that is a path
    int descriptor = kNone; // or a descriptor
    int flags = kNone;      // an open's flags
    bool onlyFailing = false;
    std::map<long, const char *> names{}; // by number
};

#define CALL(name)                                                                                 \
    { __NR_##name, #name }
// Not every machine has the older ones.
const std::vector<Kind> kKinds = {
#ifdef __NR_open
    {.path = 0, .flags = 1, .names = {CALL(open)}},
    {.path = 0,
     .names = {CALL(creat), CALL(rename), CALL(link), CALL(unlink), CALL(mkdir), CALL(rmdir),
               CALL(chmod), CALL(chown)}},
    {.path = 1, .names = {CALL(symlink)}},
    {.path = 0, .onlyFailing = true, .names = {CALL(access)}},
    {.onlyFailing = true, .names = {CALL(fork), CALL(vfork)}},
#endif
#ifdef __NR_renameat
    {.path = 1, .names = {CALL(renameat)}},
#endif
    {.path = 1, .flags = 2, .names = {CALL(openat)}},
    {.path = 1,
     .names = {CALL(renameat2), CALL(linkat), CALL(unlinkat), CALL(mkdirat), CALL(fchmodat),
               CALL(fchownat)}},
    {.path = 2, .names = {CALL(symlinkat)}},
    {.path = 0, .names = {CALL(truncate)}},
    {.descriptor = 0,
     .names = {CALL(write), CALL(pwrite64), CALL(sendfile), CALL(writev), CALL(fallocate),
               CALL(ftruncate), CALL(fchmod), CALL(fchown), CALL(utimensat), CALL(fsync),
               CALL(fdatasync)}},
    {.descriptor = 2, .names = {CALL(copy_file_range)}},
    {.descriptor = 0,
     .onlyFailing = true,
     .names = {CALL(read), CALL(pread64), CALL(fstat), CALL(getdents64), CALL(flock)}},
    {.path = 1, .descriptor = 0, .onlyFailing = true, .names = {CALL(newfstatat), CALL(faccessat)}},
#ifndef __SANITIZE_ADDRESS__ // which itself looks with it whether memory is there
    {.onlyFailing = true, .names = {CALL(pipe2)}},
#endif
    {.onlyFailing = true, .names = {CALL(clone), CALL(clone3)}},
};
#undef CALL

// ---- The filter ----

void installFilter() {
    std::vector<sock_filter> program = {
        BPF_STMT(BPF_LD | BPF_W | BPF_ABS, offsetof(seccomp_data, nr))};
    for (const Kind &kind : kKinds) {
        for (const auto &[number, name] : kind.names) {
            program.push_back(
                BPF_JUMP(BPF_JMP | BPF_JEQ | BPF_K, static_cast<unsigned>(number), 0, 1));
            program.push_back(BPF_STMT(BPF_RET | BPF_K, SECCOMP_RET_TRACE));
        }
    }
    program.push_back(BPF_STMT(BPF_RET | BPF_K, SECCOMP_RET_ALLOW));
    const sock_fprog filter{.len = static_cast<unsigned short>(program.size()),
                            .filter = program.data()};
    if (prctl(PR_SET_SECCOMP, SECCOMP_MODE_FILTER, &filter) != 0) {
        _exit(99);
    }
}

// ---- A stopped process ----

using Info = __ptrace_syscall_info;

std::string readText(pid_t pid, uint64_t address) {
    std::ifstream memory("/proc/" + std::to_string(pid) + "/mem");
    memory.seekg(static_cast<std::streamoff>(address));
    std::string text;
    std::getline(memory, text, '\0');
    return text;
}

std::string pathOfDescriptor(pid_t pid, uint64_t number) {
    std::error_code error;
    return fs::read_symlink(
        "/proc/" + std::to_string(pid) + "/fd/" + std::to_string(static_cast<int>(number)), error);
}

#if defined(__x86_64__)
bool failCall(pid_t pid, int error) {
    return ptrace(PTRACE_POKEUSER, pid, offsetof(user, regs.orig_rax), -1L) == 0 &&
           ptrace(PTRACE_POKEUSER, pid, offsetof(user, regs.rax), -static_cast<long>(error)) == 0;
}
#elif defined(__aarch64__)
bool failCall(pid_t pid, int error) {
    int none = -1;
    iovec number{&none, sizeof none};
    user_regs_struct registers{};
    iovec all{&registers, sizeof registers};
    if (ptrace(PTRACE_SETREGSET, pid, NT_ARM_SYSTEM_CALL, &number) != 0 ||
        ptrace(PTRACE_GETREGSET, pid, NT_PRSTATUS, &all) != 0) {
        return false;
    }
    registers.regs[0] = static_cast<uint64_t>(-static_cast<int64_t>(error));
    return ptrace(PTRACE_SETREGSET, pid, NT_PRSTATUS, &all) == 0;
}
#else // kills alone work here
bool failCall(pid_t, int) {
    return false;
}
#endif

// ---- Following ----

class Following {
  public:
    Following(pid_t caller, const Plan &plan) : caller_(caller), plan_(plan), processes_{caller} {}

    Run follow() {
        int status = 0;
        pid_t pid = 0;
        while (!processes_.empty() && (pid = waitpid(-1, &status, __WALL)) > 0) {
            if (!WIFSTOPPED(status)) {
                processes_.erase(pid);
                run_.status = pid == caller_ ? status : run_.status;
                run_.crashed = run_.crashed || (WIFSIGNALED(status) && WTERMSIG(status) != SIGKILL);
            } else {
                const int signal = onStop(pid, status);
                ptrace(PTRACE_CONT, pid, nullptr, static_cast<long>(signal));
            }
        }
        return run_;
    }

  private:
    // The signal to go on with.
    int onStop(pid_t pid, int status) {
        const int event = status >> 16;
        processes_.insert(pid);
        if (event == PTRACE_EVENT_SECCOMP) {
            onCall(pid);
        } else if (event == PTRACE_EVENT_EXEC && pid != caller_) {
            programs_.insert(pid);
        } else if (event == PTRACE_EVENT_FORK || event == PTRACE_EVENT_VFORK ||
                   event == PTRACE_EVENT_CLONE) {
            unsigned long child = 0;
            ptrace(PTRACE_GETEVENTMSG, pid, nullptr, &child);
            processes_.insert(static_cast<pid_t>(child));
            if (programs_.contains(pid)) {
                programs_.insert(static_cast<pid_t>(child));
            }
        } else if (event == 0) {
            return WSTOPSIG(status);
        }
        return 0;
    }

    void onCall(pid_t pid) {
        Info info{};
        const bool known = ptrace(static_cast<__ptrace_request>(PTRACE_GET_SYSCALL_INFO), pid,
                                  sizeof info, &info) > 0;
        const auto kind = std::find_if(kKinds.begin(), kKinds.end(), [&](const Kind &one) {
            return one.names.contains(static_cast<long>(info.seccomp.nr));
        });
        if (!known || kind == kKinds.end() || !counts(*kind, pid, info)) {
            return;
        }
        const Call call = describe(*kind, pid, info);
        if (plan_.calls == Calls::Failing && call.path.starts_with("/dev/")) {
            return;
        }
        ++run_.points;
        if (plan_.isPoint && plan_.isPoint(call, run_.points) && !run_.acted) {
            run_.call = call;
            act(pid);
        }
    }

    bool counts(const Kind &kind, pid_t pid, const Info &info) const {
        const bool changes =
            !kind.onlyFailing &&
            (kind.flags == kNone || (info.seccomp.args[kind.flags] & (O_CREAT | O_TRUNC)) != 0);
        return changes || (plan_.calls == Calls::Failing && !programs_.contains(pid));
    }

    Call describe(const Kind &kind, pid_t pid, const Info &info) const {
        const uint64_t *const arguments = info.seccomp.args;
        std::string path = kind.path != kNone ? readText(pid, arguments[kind.path]) : "";
        if (path.empty() && kind.descriptor != kNone) {
            path = pathOfDescriptor(pid, arguments[kind.descriptor]);
        }
        return {.name = kind.names.at(static_cast<long>(info.seccomp.nr)),
                .path = std::move(path),
                .isPrograms = programs_.contains(pid)};
    }

    void act(pid_t pid) {
        run_.acted = true;
        if (plan_.act == Act::KillAll) {
            kill(processes_);
        } else if (plan_.act == Act::KillCaller || plan_.act == Act::KillProgram) {
            kill({plan_.act == Act::KillCaller ? caller_ : pid});
        } else if (plan_.act == Act::Fail) {
            run_.acted = failCall(pid, plan_.error);
        }
    }

    static void kill(const std::set<pid_t> &processes) {
        for (const pid_t pid : processes) {
            ::kill(pid, SIGKILL);
        }
    }

    pid_t caller_;
    const Plan &plan_;
    std::set<pid_t> processes_;
    std::set<pid_t> programs_; // started by the caller, not forks of it
    Run run_;
};

} // namespace

Run run(const std::function<int()> &operation, const Plan &plan) {
    const pid_t caller = fork();
    if (caller == 0) {
        raise(SIGSTOP); // until it is followed
        installFilter();
        _exit(operation());
    }
    waitpid(caller, nullptr, WUNTRACED);
    if (ptrace(PTRACE_SEIZE, caller, nullptr,
               static_cast<long>(PTRACE_O_TRACEFORK | PTRACE_O_TRACEVFORK | PTRACE_O_TRACECLONE |
                                 PTRACE_O_TRACEEXEC | PTRACE_O_TRACESECCOMP | PTRACE_O_EXITKILL)) !=
        0) {
        std::abort();
    }
    kill(caller, SIGCONT);
    return Following(caller, plan).follow();
}

} // namespace tracer
