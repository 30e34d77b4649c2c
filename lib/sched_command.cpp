// Running a task's command as the effective user. system() would not do: the run path switches the
// effective user only, and shells that see another real user, root, go back to it. So the process
// that becomes the shell first makes the effective identity its only one.
#include "sched_command.h"
#include "base/child.h"
#include "sched_handle.h"
#include "tavisdk.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <csignal>
#include <fcntl.h>
#include <grp.h>
#include <new>
#include <string>
#include <string_view>
#include <unistd.h>
#include <utility>
#include <vector>

namespace {

// What a command starts with: who it becomes, in which environment and where.
struct Setting {
    sched::User user;      // the owner; none when the caller's identity serves as it is
    bool isOwners = false; // home and environment are the owner's own
    std::vector<std::string> variables;
    std::vector<char *> environment; // for execve; empty: the caller's
};

sched::CommandWatch *watching = nullptr;

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
    setting.isOwners = true;
}

bool hasName(std::string_view variable, std::string_view other) {
    const size_t length = other.find('=') + 1;
    return variable.substr(0, length) == other.substr(0, length);
}

// Variables of the watch's own, in the place of the caller's of the same names.
void addWatchsVariables(Setting &setting) {
    const std::vector<std::string> own = watching->variables();
    for (char **variable = environ; variable && *variable && !setting.isOwners; ++variable) {
        if (std::none_of(own.begin(), own.end(),
                         [&](const std::string &name) { return hasName(*variable, name); })) {
            setting.variables.emplace_back(*variable);
        }
    }
    setting.variables.insert(setting.variables.end(), own.begin(), own.end());
}

void pointAtVariables(Setting &setting) {
    for (std::string &variable : setting.variables) {
        setting.environment.push_back(variable.data());
    }
    if (!setting.environment.empty()) {
        setting.environment.push_back(nullptr);
    }
}

// Whoever made this root's process, such as cron, looked root's groups up and found no others. The
// look-up loads libraries and is a fifth of the time that a command takes to start.
bool hasRootsGroupAlone() {
    gid_t group = 1;
    return getegid() == 0 && getgroups(1, &group) == 1 && group == 0;
}

bool findOwner(Setting &setting) {
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

bool prepare(Setting &setting) {
    if (!findOwner(setting)) {
        return false;
    }
    if (watching) {
        addWatchsVariables(setting);
    }
    pointAtVariables(setting);
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

// A pipe that is the effective user's, so that the command may open /dev/stdout by name. Only the
// end that is read does not wait.
struct Output {
    base::Descriptor reading;
    base::Descriptor writing;

    void make() {
        std::array<int, 2> ends{};
        if (pipe2(ends.data(), O_CLOEXEC) == 0) {
            reading = base::Descriptor(ends[0]);
            writing = base::Descriptor(ends[1]);
            fcntl(ends[0], F_SETFL, O_NONBLOCK);
        }
    }
    // In the child.
    bool use() const {
        return !writing || (dup2(writing.get(), STDOUT_FILENO) != -1 &&
                            dup2(writing.get(), STDERR_FILENO) != -1);
    }
};

// In the child: becomes the shell. `report` is written to when the command must not be started. A
// command that is watched has a process group, so that one that signals its own spares the watch.
[[noreturn]] void becomeShell(const char *command, Setting &setting, const WaitingSignals &signals,
                              const Output &output, int report) {
    signals.restoreForCommand();
    const bool grouped = !watching || setpgid(0, 0) == 0;
    const bool used = output.use();
    markInheritedDescriptors();
    if (grouped && used && takeEffectiveIdentity(setting.user.get()) &&
        (!setting.isOwners || chdir(setting.user->szHome) == 0 || chdir("/") == 0)) {
        const char *const argv[] = {"sh", "-c", command, nullptr};
        execve("/bin/sh", const_cast<char *const *>(argv),
               setting.environment.empty() ? environ : setting.environment.data());
    } else {
        const char failed = 1;
        (void)!write(report, &failed, 1);
    }
    _exit(127);
}

// Waits for the shell; -1 when the child reported that it did not become one. What the watch does
// comes after the shell's start, which it would delay.
int waitForShell(pid_t pid, Output &output, int report) {
    char failed = 0;
    ssize_t reported = 0;
    while ((reported = read(report, &failed, 1)) == -1 && errno == EINTR) {
    }
    if (!watching) {
        const int status = base::waitForChild(pid);
        return reported == 1 ? -1 : status;
    }
    int status = -1;
    try {
        watching->begun(pid, std::move(output.reading));
        status = watching->wait(pid);
    } catch (const std::bad_alloc &) { // the command runs on, unwatched
        status = base::waitForChild(pid);
    }
    return reported == 1 ? -1 : status;
}

int startAndWait(const char *command, Setting &setting) {
    int report[2];
    if (pipe2(report, O_CLOEXEC) != 0) {
        return -1;
    }
    Output output;
    if (watching && watching->wantsOutput()) {
        output.make();
    }
    const WaitingSignals signals;
    const pid_t pid = fork();
    if (pid == 0) {
        becomeShell(command, setting, signals, output, report[1]);
    }
    close(report[1]);
    output.writing.close();
    const int status = pid == -1 ? -1 : waitForShell(pid, output, report[0]);
    close(report[0]);
    return status;
}

} // namespace

void sched::watchCommands(CommandWatch *watch) {
    watching = watch;
}

int sched::runCommand(const char *command) {
    try {
        Setting setting;
        return prepare(setting) ? startAndWait(command, setting) : -1;
    } catch (const std::bad_alloc &) {
        return -1;
    }
}
