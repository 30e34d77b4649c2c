// A machine's task files as a whole: what they hold, what does not belong beside them, and the same
// machine again for the next try.
#pragma once

#include "support.h"

#include <map>

namespace support {

// Tests of many points take each, or, where a fork costs many times as much, one of so many.
#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
constexpr size_t kStep = 9;
#else
constexpr size_t kStep = 1;
#endif

constexpr const char *kPower = "/usr/tavi/etc/auto_power";
constexpr const char *kStatus = "/tmp/sched_status.sqlite";
constexpr const char *kRecord = "/usr/tavi/etc/scheduled_tasks.journal";

// By path; a file that is not there is "(none)", and the crontab's lines are sorted: they may
// change places.
using State = std::map<std::string, std::string>;
State stateNow();

// What is in the folders of these files and does not belong there.
std::vector<std::string> leftovers();

// The files as they are when it is made, also those of runs, to start again from.
class Snapshot {
  public:
    Snapshot();
    void restore() const;

  private:
    struct File {
        std::string content;
        timespec time;
    };
    std::map<std::string, File> files_;
};

// So many of something were tried, and how many held; told and checked when it ends.
class Tally {
  public:
    explicit Tally(std::string what) : what_(std::move(what)) {}
    ~Tally();
    Tally(const Tally &) = delete;
    Tally &operator=(const Tally &) = delete;
    // "" when it held and left nothing; of others a few are shown, with what the library logged.
    void add(const std::string &where, std::string fault);

  private:
    std::string what_;
    size_t tried_ = 0, held_ = 0;
};

// Of these points those that a test takes: all with TAVI_TEST_ALL, else at most so many.
std::vector<size_t> chosen(const std::vector<size_t> &points, size_t most);
// 1 to so many.
std::vector<size_t> upTo(size_t count);

// What a process that has just started lists: "id name command; ...", or "failed".
std::string listOfFreshProcess();

// Stores a task of that name, a power-off schedule: 0 or 1.
int created(const char *name, const char *command = "true");
// Task 2 with another name, and a command when there is one.
int edited(const char *name, const std::string &command = "");
int powerCreated(uint32_t hour = 22);

// The result of a function in a process of its own, its exit status.
template <typename Function> int inChild(Function &&function) {
    const pid_t pid = fork();
    if (pid == 0) {
        _exit(function());
    }
    int status = -1;
    waitpid(pid, &status, 0);
    return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

} // namespace support
