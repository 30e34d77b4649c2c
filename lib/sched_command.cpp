// Running a task's command as the effective user. system() would not do: the run path switches the
// effective user only, and shells that see another real user, root, go back to it. So the process
// that becomes the shell first makes the effective identity its only one.
#include "sched_command.h"
#include "base/child.h"
#include "sched_handle.h"
#include "tavisdk.h"

#include <cerrno>
#include <csignal>
#include <fcntl.h>
#include <grp.h>
#include <new>
#include <string>
#include <string_view>
#include <unistd.h>
#include <vector>

namespace {

// What a command starts with: who it becomes, in which environment and where.
struct Setting {
    sched::User user; // the owner; none when the caller's identity serves as it is
    std::vector<std::string> variables; // an environment of the owner's own
    std::vector<char *> environment;    // the same for execve; empty: the caller's
};

bool isLocaleVariable(std::string_view variable) {
    return variable.starts_with("LANG=") || variable.starts_with("LC_") ||
           variable.starts_with("TZ=");
}

// Nothing of the caller's leaks into another owner's environment but language and time zone.
void addOwnersEnvironment(Setting &setting) {
    const TAVIUSER &user = *setting.user;
    const std::string name(user.szName);
    const std::string shell(*user.szShell != '\0' ? user.szShell : "/bin/sh");
    setting.variables = {"HOME=" + std::string(user.szHome), "USER=" + name, "LOGNAME=" + name,
                         "SHELL=" + shell, "PATH=/usr/local/bin:/usr/bin:/bin"};
    for (char **variable = environ; variable && *variable; ++variable) {
        if (isLocaleVariable(*variable)) {
            setting.variables.emplace_back(*variable);
        }
    }
    for (std::string &variable : setting.variables) {
        setting.environment.push_back(variable.data());
    }
    setting.environment.push_back(nullptr);
}

// Whoever made this root's process, such as cron, looked root's groups up and found no others. The
// look-up loads libraries and is a fifth of the time that a command takes to start.
bool hasRootsGroupAlone() {
    gid_t group = 1;
    return getegid() == 0 && getgroups(1, &group) == 1 && group == 0;
}

bool prepare(Setting &setting) {
    const bool ownerIsCaller = geteuid() == getuid();
    if (ownerIsCaller && (geteuid() != 0 || hasRootsGroupAlone())) {
        return true;
    }
    TAVIUSER *found = nullptr;
    if (TAVIUserGetByUID(geteuid(), &found) != 0) {
        return false;
    }
    setting.user.reset(found);
    if (!ownerIsCaller) {
        addOwnersEnvironment(setting);
    }
    return true;
}

// The signals as system() has them while it waits: SIGINT and SIGQUIT are the command's, SIGCHLD is
// held back.
class WaitingSignals {
  public:
    WaitingSignals() {
        struct sigaction ignore {};
        ignore.sa_handler = SIG_IGN;
        sigaction(SIGINT, &ignore, &interrupt_);
        sigaction(SIGQUIT, &ignore, &quit_);
    }
    ~WaitingSignals() { restore(); }
    WaitingSignals(const WaitingSignals &) = delete;
    WaitingSignals &operator=(const WaitingSignals &) = delete;

    // The caller's signals but for SIGCHLD, which the command's shell needs with its default
    // action.
    void restoreForCommand() const {
        restore();
        pthread_sigmask(SIG_SETMASK, &child_.callersMask(), nullptr);
    }

  private:
    void restore() const {
        sigaction(SIGINT, &interrupt_, nullptr);
        sigaction(SIGQUIT, &quit_, nullptr);
    }

    struct sigaction interrupt_ {};
    struct sigaction quit_ {};
    const base::ChildSignals child_;
};

// Root may have come with groups of its own; any other owner's were set when the user was switched.
// A root that may not set groups, as in a user namespace, could not have come by others either.
bool takeRootsGroups(const TAVIUSER &root) {
    return (initgroups(root.szName, root.gid) == 0 || errno == EPERM) &&
           setresgid(root.gid, root.gid, root.gid) == 0;
}

bool takeEffectiveIdentity(const TAVIUSER *owner) {
    const gid_t group = getegid();
    const uid_t user = geteuid();
    const bool grouped =
        user == 0 && owner ? takeRootsGroups(*owner) : setresgid(group, group, group) == 0;
    return grouped && setresuid(user, user, user) == 0;
}

void markInheritedDescriptors() {
    if (close_range(3, ~0U, CLOSE_RANGE_CLOEXEC) == 0) {
        return;
    }
    for (long fd = sysconf(_SC_OPEN_MAX) - 1; fd >= 3; --fd) { // a kernel that does not have it
        fcntl(static_cast<int>(fd), F_SETFD, FD_CLOEXEC);
    }
}

// In the child: becomes the shell. `report` is written to when the command must not be started.
[[noreturn]] void becomeShell(const char *command, Setting &setting, const WaitingSignals &signals,
                              int report) {
    signals.restoreForCommand();
    const bool ownEnvironment = !setting.environment.empty();
    markInheritedDescriptors();
    if (takeEffectiveIdentity(setting.user.get()) &&
        (!ownEnvironment || chdir(setting.user->szHome) == 0 || chdir("/") == 0)) {
        const char *const argv[] = {"sh", "-c", command, nullptr};
        execve("/bin/sh", const_cast<char *const *>(argv),
               ownEnvironment ? setting.environment.data() : environ);
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
    const int status = base::waitForChild(pid);
    return reported == 1 ? -1 : status;
}

int startAndWait(const char *command, Setting &setting) {
    int report[2];
    if (pipe2(report, O_CLOEXEC) != 0) {
        return -1;
    }
    const WaitingSignals signals;
    const pid_t pid = fork();
    if (pid == 0) {
        becomeShell(command, setting, signals, report[1]);
    }
    close(report[1]);
    const int status = pid == -1 ? -1 : waitForShell(pid, report[0]);
    close(report[0]);
    return status;
}

} // namespace

int sched::runCommand(const char *command) {
    try {
        Setting setting;
        return prepare(setting) ? startAndWait(command, setting) : -1;
    } catch (const std::bad_alloc &) {
        return -1;
    }
}
