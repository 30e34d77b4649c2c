// The lock by which changes through this program follow one another, and reading meets none of them
// half done.
#pragma once

namespace tavisched {

// Held from its construction to its destruction; waits as long as others hold it. A plug-in handler
// is started while a change holds the lock, and the change waits for it: when a process below the
// one that holds the lock uses this program, reading goes on without the lock, and a change fails.
class Lock {
  public:
    enum class Kind { Reading, Changing };
    explicit Lock(Kind kind);
    ~Lock();
    Lock(const Lock &) = delete;
    Lock &operator=(const Lock &) = delete;

  private:
    void acquire();
    bool isBelowHolder() const;

    Kind kind_;
    int fd_;
};

} // namespace tavisched
