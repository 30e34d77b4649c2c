// Runs an operation in a child process, follows every process that it starts, and acts at its n-th
// system call of a kind: kills, or makes the call fail.
#pragma once

#include <functional>
#include <string>
#include <sys/types.h>

namespace tracer {

// Which calls count.
enum class Calls {
    Changing, // those that change files, folders or their attributes, and flushes
    Failing,  // of those the ones that a machine in trouble fails, and of the operation's process
              // and its forks also opens, reads and the start of programs
};

enum class Act { None, KillAll, KillCaller, KillProgram, Fail };

struct Call {
    std::string name;
    std::string path; // the first that it names, or that of its descriptor
    bool isPrograms = false;
};

// Whether to act at a call; the first that counts is 1.
using Wanted = std::function<bool(const Call &, size_t)>;
inline Wanted at(size_t point) {
    return [point](const Call &, size_t number) { return number == point; };
}

struct Plan {
    Calls calls = Calls::Changing;
    Act act = Act::None;
    Wanted isPoint{}; // sees every call that counts before it is made; the first that it wants
    int error = 0;    // for Fail
};

struct Run {
    size_t points = 0; // calls that counted
    bool acted = false;
    Call call;            // the one at the point
    int status = 0;       // wait status of the operation's process
    bool crashed = false; // some process
};

// The operation's result is its process's exit status. Returns when all processes have ended.
Run run(const std::function<int()> &operation, const Plan &plan = {});

} // namespace tracer
