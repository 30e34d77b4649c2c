// What the benchmark programs share: comparisons of two times, stored tasks and the libc calls that
// references stand on.
#pragma once

#include "tavischeduler.h"

#include <benchmark/benchmark.h>
#include <chrono>
#include <ctime>
#include <string>
#include <vector>

namespace bench {

inline constexpr const char *kWorkingCopy = "/tmp/scheduled_tasks";
inline constexpr const char *kPersistent = "/usr/tavi/etc/scheduled_tasks";
inline constexpr const char *kCommand = "/usr/local/bin/backup --share photo --keep 30";

// Ends the program with a message unless the condition holds: a failed step has no time.
void require(bool condition, const char *what);

std::string readFile(const char *path);
void writeFile(const char *path, const std::string &text);

// Of the process, as the kernel counts it.
double privateKilobytes(int pid);

// Stores this many tasks with the ids from 1 upward, all daily at midnight, in the persistent file
// and the working copy.
void storeTasks(int count, const char *command = kCommand);

// Makes the working copy look changed, long enough ago that its times tell: what the process
// remembers of the file is of no use, as in a process that has just started.
void makeWorkingCopyNew();

// Sets the counters that scripts/bench reads: a row of its table.
void report(benchmark::State &state, const char *what, double ratio, double aim);

// Two works whose times are compared. They take turns iteration by iteration, and the medians are
// divided, so that a machine that is busy for a while slows both.
class Comparison {
  public:
    using Clock = std::chrono::steady_clock;

    template <typename Work> void product(Work &&work) { add(product_, work); }
    template <typename Work> void reference(Work &&work) { add(reference_, work); }
    // The row of the comparison, with both medians in microseconds.
    void reportTo(benchmark::State &state, const char *what, double aim);

  private:
    using Times = std::vector<double>;

    template <typename Work> static void add(Times &times, Work &&work) {
        const auto start = Clock::now();
        work();
        times.push_back(std::chrono::duration<double, std::micro>(Clock::now() - start).count());
    }

    Times product_;
    Times reference_;
};

// The libc calls of a next trigger time that is not today: the current date and a later day's.
inline void callLibcDates() {
    const time_t now = std::time(nullptr);
    tm later = *std::localtime(&now);
    later.tm_mday += 1;
    later.tm_isdst = 0;
    const time_t then = std::mktime(&later);
    benchmark::DoNotOptimize(std::localtime(&then));
}

} // namespace bench
