// The present, and calls that fail: the n-th of a kind, in whatever process it comes. The test
// program has the functions of this source itself, so that the shared library binds to them; a
// program that the tests start gets them from a library that is loaded before all others.
#pragma once

#include <array>
#include <atomic>
#include <cstddef>
#include <ctime>
#include <dlfcn.h>
#include <string>
#include <sys/types.h>

namespace support {

enum class Fault {
    None,
    All,    // none of them fails
    Memory, // also operator new
    Wait,   // somebody else has taken the child's result
    Spawn,
    Time, // local time
    DatabaseOpen,
    DatabaseStep, // an instruction of a statement's program
    DatabaseCommit,
    Count
};

// Shared with child processes, and with programs that are started for them.
struct Faults {
    pid_t owner; // the process that made them, in this file of its
    int file;
    std::atomic<Fault> kind;     // calls of this kind fail; while there is one, all are counted
    std::atomic<size_t> failing; // this one of them, from 1 on
    std::atomic<bool> isLasting; // and all that follow
    std::atomic<time_t> now;     // what time() answers; 0 = the clock's
    size_t callocFails;          // a calloc of at least that many bytes fails, too; 0 = none
    std::array<std::atomic<size_t>, static_cast<size_t>(Fault::Count)> calls; // by kind
};
Faults &faults();

// From here on the n-th call fails; Fault::None ends that.
void fail(Fault kind, size_t call = 1, bool isLasting = false);
// To be called in a process before it becomes a program that has these, with the path of the
// library.
void shareWithProgram(const char *library);
// The same for a program that a shell starts: what stands before its name.
std::string sharedInShell(const char *library);

// The system's own function of that name.
template <typename Function> Function original(Function, const char *name) {
    return reinterpret_cast<Function>(dlsym(RTLD_NEXT, name));
}

// What is called while it lives does not count.
class OwnAllocations {
  public:
    OwnAllocations() : kind_(faults().kind.exchange(Fault::None)) {}
    ~OwnAllocations() { faults().kind = kind_; }
    OwnAllocations(const OwnAllocations &) = delete;
    OwnAllocations &operator=(const OwnAllocations &) = delete;

  private:
    Fault kind_;
};

} // namespace support
