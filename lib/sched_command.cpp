// Running a task's command as the effective user. system() would not do: the run path switches the
// effective user only, and shells that see another real user, root, go back to it. So the process
// that becomes the shell first makes the effective identity its only one.
#include "sched_command.h"
#include "sched_handle.h"
#include "tavisdk.h"

#include <cerrno>
#include <csignal>
#include <fcntl.h>
#include <new>
#include <string>
#include <string_view>
#include <sys/wait.h>
#include <unistd.h>
#include <vector>

namespace {

// What the command starts with when its owner is not the caller: an environment of the owner's own
// and the owner's home. Nothing of the caller's leaks in but language and time zone.
struct OwnerSetting {
    std::vector<std::string> variables;
    std::string home;
};

bool isLocaleVariable(std::string_view variable) {
    return variable.starts_with("LANG=") || variable.starts_with("LC_") ||
           variable.starts_with("TZ=");
}

bool readOwnerSetting(OwnerSetting &setting) {
    TAVIUSER *found = nullptr;
    if (TAVIUserGetByUID(geteuid(), &found) != 0) {
        return false;
    }
    const sched::User user(found);
    const std::string name(user->szName);
    setting.home = user->szHome;
    setting.variables = {"HOME=" + setting.home, "USER=" + name, "LOGNAME=" + name,
                         "SHELL=" + std::string(user->szShell),
                         "PATH=/usr/local/bin:/usr/bin:/bin"};
    for (char **variable = environ; variable && *variable; ++variable) {
        if (isLocaleVariable(*variable)) {
            setting.variables.emplace_back(*variable);
        }
    }
    return true;
}

// The signals as system() has them while it waits: SIGINT and SIGQUIT are the command's, SIGCHLD is
// held back. SIGCHLD also gets its default action, or a caller that ignores it would get no status.
class WaitingSignals {
  public:
    WaitingSignals() {
        struct sigaction action {};
        action.sa_handler = SIG_IGN;
        sigaction(SIGINT, &action, &interrupt_);
        sigaction(SIGQUIT, &action, &quit_);
        action.sa_handler = SIG_DFL;
        sigset_t child;
        sigemptyset(&child);
        sigaddset(&child, SIGCHLD);
        sigprocmask(SIG_BLOCK, &child, &mask_);
        sigaction(SIGCHLD, &action, &child_);
    }
    ~WaitingSignals() {
        sigaction(SIGCHLD, &child_, nullptr);
        restoreForCommand();
    }
    WaitingSignals(const WaitingSignals &) = delete;
    WaitingSignals &operator=(const WaitingSignals &) = delete;

    // The caller's signals but for SIGCHLD, which the command's shell needs with its default
    // action.
    void restoreForCommand() const {
        sigaction(SIGINT, &interrupt_, nullptr);
        sigaction(SIGQUIT, &quit_, nullptr);
        sigprocmask(SIG_SETMASK, &mask_, nullptr);
    }

  private:
    struct sigaction interrupt_ {};
    struct sigaction quit_ {};
    struct sigaction child_ {};
    sigset_t mask_{};
};

bool takeEffectiveIdentity() {
    const gid_t group = getegid();
    const uid_t user = geteuid();
    return setresgid(group, group, group) == 0 && setresuid(user, user, user) == 0;
}

// In the child: becomes the shell. `report` is written to when the command must not be started.
[[noreturn]] void becomeShell(const char *command, const char *home, char *const *environment,
                              const WaitingSignals &signals, int report) {
    signals.restoreForCommand();
    const bool ready = takeEffectiveIdentity() && close_range(3, ~0U, CLOSE_RANGE_CLOEXEC) == 0 &&
                       (!home || chdir(home) == 0 || chdir("/") == 0);
    if (ready) {
        const char *const argv[] = {"sh", "-c", command, nullptr};
        execve("/bin/sh", const_cast<char *const *>(argv), environment);
    } else {
        const char failed = 1;
        (void)!write(report, &failed, 1);
    }
    _exit(127);
}

// Waits for the shell; -1 when the child reported that it did not become one.
int waitForShell(pid_t pid, int report) {
    char failed = 0;
    ssize_t reported = 0;
    while ((reported = read(report, &failed, 1)) == -1 && errno == EINTR) {
    }
    int status = 0;
    while (waitpid(pid, &status, 0) == -1) {
        if (errno != EINTR) {
            return -1;
        }
    }
    return reported == 1 ? -1 : status;
}

int startAndWait(const char *command, const char *home, char *const *environment) {
    int report[2];
    if (pipe2(report, O_CLOEXEC) != 0) {
        return -1;
    }
    const WaitingSignals signals;
    const pid_t pid = fork();
    if (pid == 0) {
        becomeShell(command, home, environment, signals, report[1]);
    }
    close(report[1]);
    const int status = pid == -1 ? -1 : waitForShell(pid, report[0]);
    close(report[0]);
    return status;
}

int runAsOwner(const char *command) {
    OwnerSetting setting;
    if (!readOwnerSetting(setting)) {
        return -1;
    }
    std::vector<char *> environment;
    environment.reserve(setting.variables.size() + 1);
    for (std::string &variable : setting.variables) {
        environment.push_back(variable.data());
    }
    environment.push_back(nullptr);
    return startAndWait(command, setting.home.c_str(), environment.data());
}

} // namespace

int sched::runCommand(const char *command) {
    try {
        return geteuid() == getuid() ? startAndWait(command, nullptr, environ)
                                     : runAsOwner(command);
    } catch (const std::bad_alloc &) {
        return -1;
    }
}
