// A run beside its command. Its process waits for nothing but events: output, children that end,
// and a person who stops it. Whatever the command starts and leaves behind comes to this process,
// which so can tell what is the run's and what is not.
#include "run.h"
#include "base/child.h"
#include "limits.h"
#include "run_report.h"
#include "run_words.h"
#include "sched_error.h"
#include "sched_text.h"
#include "stop_request.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <cinttypes>
#include <cstdlib>
#include <ctime>
#include <fcntl.h>
#include <poll.h>
#include <sys/ioctl.h>
#include <sys/prctl.h>
#include <sys/signalfd.h>
#include <sys/wait.h>
#include <unistd.h>

namespace {

constexpr size_t kBuffer = 65536;
constexpr int kKillPause = 200;         // milliseconds
constexpr int kMaxKills = 25;           // what is stuck in the kernel does not end
constexpr int kWithoutSignalFile = 100; // milliseconds
// A command that is over by then is recorded once, and one that begins is left the processor.
constexpr int kUnrecorded = 30;     // milliseconds
constexpr int kHandlerPause = 1000; // milliseconds

int64_t millisecondsOf(clockid_t clock) {
    timespec now{};
    clock_gettime(clock, &now);
    return now.tv_sec * 1000LL + now.tv_nsec / 1000000;
}
int64_t wallClock() {
    return millisecondsOf(CLOCK_REALTIME);
}
int64_t steadyClock() {
    return millisecondsOf(CLOCK_BOOTTIME);
}

std::optional<uint32_t> readLoginUser() {
    const base::Descriptor file(open("/proc/self/loginuid", O_RDONLY | O_CLOEXEC));
    std::array<char, 32> text{};
    if (!file || read(file.get(), text.data(), text.size() - 1) <= 0) {
        return std::nullopt;
    }
    const auto user = static_cast<uint32_t>(std::strtoul(text.data(), nullptr, 10));
    return user == UINT32_MAX ? std::nullopt : std::optional(user);
}

uint32_t personBehind() {
    const char *const sudo = getuid() == 0 ? std::getenv("SUDO_UID") : nullptr;
    return sudo ? static_cast<uint32_t>(std::strtoul(sudo, nullptr, 10))
                : readLoginUser().value_or(getuid());
}

// Root's rights for a while, also while the owner is the effective user.
class AsRoot {
  public:
    AsRoot() {
        if (user_ != 0) {
            (void)!seteuid(0);
            (void)!setegid(0);
        }
    }
    ~AsRoot() {
        if (user_ != 0) {
            (void)!setegid(group_);
            (void)!seteuid(user_);
        }
    }
    AsRoot(const AsRoot &) = delete;
    AsRoot &operator=(const AsRoot &) = delete;

  private:
    uid_t user_ = geteuid();
    gid_t group_ = getegid();
};

} // namespace

sched::RunOrigin sched::originOf(int32_t mode) {
    const int64_t now = std::time(nullptr);
    return {.mode = mode,
            .due = mode == 1 ? now - now % 60 : 0,
            .startedBy = mode == 1 ? getuid() : personBehind()};
}

sched::Run::Run(const TAVI_SCHED_TASK &task, const RunOrigin &origin) {
    StopRequest::listen();
    record_.taskId = task.id;
    record_.mode = origin.mode;
    record_.startedBy = origin.startedBy;
    record_.due = origin.due * 1000;
    record_.asked = wallClock();
    record_.result = TAVI_SCHED_RUN_RUNNING;
    setTask(task);
}

sched::Run::~Run() {
    watchCommands(nullptr);
}

void sched::Run::setTask(const TAVI_SCHED_TASK &task) {
    record_.owner = task.owner;
    copyText(record_.name, sizeof record_.name, task.name);
}

bool sched::Run::isStopped() const {
    return StopRequest::isMade();
}

// ---- The record ----

bool sched::Run::claimNumber() {
    if (!triedNumber_) {
        triedNumber_ = true;
        record_.run = claimRunNumber().value_or(0);
    }
    return record_.run != 0;
}

void sched::Run::store(bool isLast) {
    if (record_.run == 0) {
        return;
    }
    const AsRoot rights;
    setProcess(record_);
    RunRecords records(RunRecords::Mode::Write,
                       [this](int milliseconds) { return pause(milliseconds); });
    if (records && records.write(record_) && isLast) {
        records.prune(readRunLimits(), record_.taskId);
    }
}

// A pause may end early, and the attempts between pauses take time too: what counts is the clock.
void sched::Run::countWaiting() {
    if (waitingFrom_ != 0) {
        record_.waited = static_cast<int32_t>((steadyClock() - waitingFrom_ + 500) / 1000);
    }
}

void sched::Run::waitFor(int32_t taskId) {
    const bool isFirst = record_.waitingSince == 0;
    if (isFirst) {
        record_.waitingSince = wallClock();
        waitingFrom_ = steadyClock();
    }
    countWaiting();
    record_.result = TAVI_SCHED_RUN_WAITING;
    if ((isFirst || record_.waitedFor != taskId) && claimNumber()) {
        record_.waitedFor = taskId;
        store(false);
    }
}

bool sched::Run::isOfPresentTask() {
    if (record_.run == 0 || !hasRunRecords()) {
        return true;
    }
    RunRecords records(RunRecords::Mode::Read);
    return !records || record_.run >= records.firstRunOf(record_.taskId);
}

void sched::Run::end(int32_t result, int32_t number) {
    watchCommands(nullptr);
    if (began_ == 0) {
        countWaiting();
    }
    record_.result = wasStopped_ ? TAVI_SCHED_RUN_STOPPED_BY_USER : result;
    record_.number = number;
    record_.ended = wallClock();
    record_.duration = began_ == 0 ? 0 : steadyClock() - began_;
    record_.outputSize = output_.total();
    output_.straighten();
    claimNumber();
    store(true);
    output_.touch();
    logEnd();
}

// ---- The command ----

void sched::Run::beginCommand() {
    prctl(PR_SET_CHILD_SUBREAPER, 1);
    if (claimNumber() && !output_.make(record_.run)) {
        SCHED_LOG("%s cannot be made: %m", outputPathOf(record_.run).c_str());
    }
    watchCommands(this);
}

std::vector<std::string> sched::Run::variables() const {
    std::vector<std::string> variables{"TAVI_TASK_ID=" + std::to_string(record_.taskId),
                                       "TAVI_TASK_NAME=" + std::string(record_.name)};
    if (record_.run != 0) {
        variables.push_back("TAVI_RUN_ID=" + std::to_string(record_.run));
    }
    return variables;
}

void sched::Run::begun(pid_t process, base::Descriptor pipe) {
    awaited_ = process;
    countWaiting();
    began_ = steadyClock();
    pipe_ = std::move(pipe);
    record_.result = TAVI_SCHED_RUN_RUNNING;
    record_.began = wallClock();
    logBegin();
}

// What belongs to the result is what the command has printed by now. What it has left behind is
// neither waited for nor, as the pipe stays open, ended.
int sched::Run::wait(pid_t process) {
    listenToChildren();
    int status = -1;
    bool isStored = false;
    while (true) {
        const Left left = reap(process, status);
        const bool isStopping = wasStopped_ && kills_ < kMaxKills;
        if (left == Left::None || (left == Left::Others && !isStopping)) {
            break;
        }
        if (!isStored && steadyClock() - began_ >= kUnrecorded) {
            store(false);
            isStored = true;
        }
        const int next = stopStep();
        await(isStored || next == 0 ? next : kUnrecorded);
    }
    takeRest();
    return status;
}

// The signal is held back, and is read instead.
void sched::Run::listenToChildren() {
    sigset_t child;
    sigemptyset(&child);
    sigaddset(&child, SIGCHLD);
    children_ = base::Descriptor(signalfd(-1, &child, SFD_CLOEXEC | SFD_NONBLOCK));
}

sched::Run::Left sched::Run::reap(pid_t process, int &status) {
    signalfd_siginfo told{};
    while (children_ && read(children_.get(), &told, sizeof told) > 0) {
    }
    int ended = 0;
    pid_t pid = 0;
    while ((pid = waitpid(-1, &ended, WNOHANG)) > 0) {
        if (pid == process) {
            status = ended;
            awaited_ = -1;
        }
    }
    return pid == -1 ? Left::None : awaited_ == process ? Left::Command : Left::Others;
}

// Waits for something to happen; -1: for as long as it takes.
void sched::Run::await(int milliseconds) {
    std::array<pollfd, 3> files{{{.fd = pipe_.get(), .events = POLLIN, .revents = 0},
                                 {.fd = children_.get(), .events = POLLIN, .revents = 0},
                                 {.fd = StopRequest::file(), .events = POLLIN, .revents = 0}}};
    // Without a file that tells of children there is nothing but looking now and then.
    const int most = children_ || milliseconds >= 0 ? milliseconds : kWithoutSignalFile;
    if (poll(files.data(), files.size(), most) > 0 && files[0].revents != 0) {
        takeOutput(kBuffer);
    }
    StopRequest::take();
}

// A pause in which the command does not have to wait for its output to be taken. False when there
// is something more important to do.
bool sched::Run::pause(int milliseconds) {
    pollfd file{.fd = pipe_.get(), .events = POLLIN, .revents = 0};
    if (poll(&file, 1, milliseconds) > 0) {
        takeOutput(kBuffer);
    }
    siginfo_t child{};
    const bool hasEnded =
        awaited_ != -1 &&
        waitid(P_PID, static_cast<id_t>(awaited_), &child, WEXITED | WNOHANG | WNOWAIT) == 0 &&
        child.si_pid == awaited_;
    return !hasEnded && !(awaited_ != -1 && isStopped());
}

// Nothing is taken out of a pipe at its end but its end: nobody has it open any more.
bool sched::Run::takeOutput(size_t most) {
    std::array<char, kBuffer> buffer; // NOLINT: filled before it is read
    const ssize_t length = read(pipe_.get(), buffer.data(), std::min(most, buffer.size()));
    if (length > 0) {
        output_.add({buffer.data(), static_cast<size_t>(length)});
    } else if (length == 0 || (errno != EAGAIN && errno != EINTR)) {
        pipe_.close();
    }
    return length > 0;
}

void sched::Run::takeRest() {
    int there = 0;
    if (!pipe_ || ioctl(pipe_.get(), FIONREAD, &there) != 0) {
        return;
    }
    for (int64_t until = output_.total() + there; pipe_ && output_.total() < until;) {
        if (!takeOutput(static_cast<size_t>(until - output_.total()))) {
            break;
        }
    }
}

// Handlers have a process of their own: it does not keep what is left behind from printing.
void sched::Run::finish() {
    const base::ChildSignals signals;
    listenToChildren();
    awaited_ = fork();
    if (awaited_ == 0) {
        pipe_.close();
        pthread_sigmask(SIG_SETMASK, &signals.callersMask(), nullptr);
        runHandlers(record_);
        _exit(0);
    }
    int status = 0;
    for (int64_t lookedAt = steadyClock(); pipe_ || awaited_ != -1;) {
        await(awaited_ == -1 ? -1 : kHandlerPause);
        if (reap(awaited_, status) == Left::None) {
            awaited_ = -1;
        }
        if (awaited_ != -1 && steadyClock() - lookedAt >= kHandlerPause) {
            endHangingHandlers(awaited_);
            lookedAt = steadyClock();
        }
    }
    output_.straighten();
    output_.touch();
}

// ---- Stopping ----

// How long to wait for the next step, or -1.
int sched::Run::stopStep() {
    if (!StopRequest::isMade()) {
        return -1;
    }
    const int64_t now = steadyClock();
    if (!wasStopped_) {
        wasStopped_ = true;
        killAt_ = now + StopRequest::graceSeconds() * 1000LL;
        signalAll(SIGTERM);
        signalAll(SIGCONT);
    } else if (now >= killAt_) {
        ++kills_;
        killAt_ = now + kKillPause;
        signalAll(SIGKILL);
    }
    return static_cast<int>(std::min<int64_t>(std::max<int64_t>(killAt_ - now, 0), 60000));
}

void sched::Run::signalAll(int signal) const {
    const AsRoot rights;
    for (const base::Process &process : base::descendantsOf(getpid())) {
        base::sendSignal(process, signal);
    }
}

// ---- The system log ----

void sched::Run::logBegin() const {
    syslog(LOG_INFO, "task %ld [%s] of user %u begins, run %" PRId64,
           static_cast<long>(record_.taskId), LogText(record_.name).c_str(), record_.owner,
           record_.run);
}

void sched::Run::logEnd() const {
    syslog(LOG_INFO, "task %ld [%s] of user %u ends after %" PRId64 ".%03d s: %s, run %" PRId64,
           static_cast<long>(record_.taskId), LogText(record_.name).c_str(), record_.owner,
           record_.duration / 1000, static_cast<int>(record_.duration % 1000),
           resultWords(record_).c_str(), record_.run);
}
