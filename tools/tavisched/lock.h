// The lock by which changes through this program follow one another, and reading meets none of them
// half done.
#pragma once

namespace tavisched {

// Held from its construction to its destruction; waits as long as others hold it. A plug-in handler
// is started while a change holds the lock: when it uses this program, reading goes on without the
// lock, and a change fails at once, as it would wait for its own parent.
class Lock {
  public:
    enum class Kind { Reading, Changing };
    explicit Lock(Kind kind);
    ~Lock();
    Lock(const Lock &) = delete;
    Lock &operator=(const Lock &) = delete;

  private:
    void acquire(Kind kind);

    int fd_;
};

} // namespace tavisched
