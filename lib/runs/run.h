// A run beside its command, in the run's own process: it is recorded, what the command prints is
// kept, and a person may stop it. Nothing of this decides whether the command runs.
#pragma once

#include "run_output.h"
#include "run_records.h"
#include "sched_command.h"

#include <string>
#include <vector>

namespace sched {

// How a run came about, as the process knows that was asked for it.
struct RunOrigin {
    int32_t mode = 0;
    int64_t due = 0;        // seconds since the epoch; 0 by hand
    uint32_t startedBy = 0; // user id
};
RunOrigin originOf(int32_t mode);

class Run final : private CommandWatch {
  public:
    Run(const TAVI_SCHED_TASK &task, const RunOrigin &origin);
    ~Run() override;
    Run(const Run &) = delete;
    Run &operator=(const Run &) = delete;

    // It met a running task, or 0 for the run lock, and is about to pause for up to so many
    // seconds.
    void waitFor(int32_t taskId);
    // A person has asked it to end. Its waits end early then.
    bool isStopped() const;
    // The task is still the one that was asked to run: its id was not given to another.
    bool isOfPresentTask();
    // The task as it has become meanwhile.
    void setTask(const TAVI_SCHED_TASK &task);

    // The next command of this process is the run's. It takes no long time.
    void beginCommand();
    // The result as it is stored, and that of a command that was asked to end.
    void end(int32_t result, int32_t number);
    // What is still to do when nobody waits for the result any more: the handlers, and what the
    // command has left behind.
    void finish();

  private:
    std::vector<std::string> variables() const override;
    bool wantsOutput() const override { return static_cast<bool>(output_); }
    void begun(pid_t process, base::Descriptor pipe) override;
    int wait(pid_t process) override;

    void countWaiting();
    bool claimNumber();
    void store(bool isLast);
    void logBegin() const;
    void logEnd() const;

    bool takeOutput(size_t most);
    void takeRest();
    void await(int milliseconds);
    bool pause(int milliseconds);
    // What is left of the run's processes.
    enum class Left { None, Others, Command };
    void listenToChildren();
    Left reap(pid_t process, int &status);
    int stopStep();
    void signalAll(int signal) const;

    RunRecord record_{};
    bool triedNumber_ = false;
    int64_t waitingFrom_ = 0; // on the clock that nobody sets, as the next one
    int64_t began_ = 0;
    OutputFile output_;
    base::Descriptor pipe_;
    base::Descriptor children_; // tells of children that end
    pid_t awaited_ = -1;        // the command's, then the handlers' process; -1 when it has ended
    bool wasStopped_ = false;
    int64_t killAt_ = 0;
    int kills_ = 0;
};

} // namespace sched
