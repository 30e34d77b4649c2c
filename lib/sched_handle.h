// Owners of what the platform, SQLite and the C library hand out: released on every path.
#pragma once

#include "platc.h"
#include "tavischeduler.h"
#include "tavisdk.h"

#include <cstdio>
#include <cstdlib>
#include <memory>
#include <sqlite3.h>

namespace sched {

template <auto release> struct Releaser {
    template <typename T> void operator()(T *pointer) const { release(pointer); }
};

template <typename T> using Allocated = std::unique_ptr<T, Releaser<std::free>>;
using File = std::unique_ptr<FILE, Releaser<std::fclose>>;
using Database = std::unique_ptr<sqlite3, Releaser<sqlite3_close>>;
using SqlText = std::unique_ptr<char, Releaser<sqlite3_free>>;
using User = std::unique_ptr<TAVIUSER, Releaser<TAVIUserFree>>;

// One zero-filled task, or nothing when out of memory.
inline Allocated<TAVI_SCHED_TASK> allocateTask() {
    return Allocated<TAVI_SCHED_TASK>(
        static_cast<TAVI_SCHED_TASK *>(std::calloc(1, sizeof(TAVI_SCHED_TASK))));
}

// A platform container. The platform's operations take a pointer to its pointer, as they may move
// it.
template <typename T, auto release> class Container {
  public:
    explicit Container(T *pointer) : pointer_(pointer) {}
    ~Container() { release(pointer_); }
    Container(const Container &) = delete;
    Container &operator=(const Container &) = delete;

    explicit operator bool() const { return pointer_ != nullptr; }
    T *get() const { return pointer_; }
    T **address() { return &pointer_; }

  private:
    T *pointer_;
};

struct Hash : Container<PLATCSZHASH, PLATCSzHashFree> {
    explicit Hash(int capacity) : Container(PLATCSzHashAlloc(capacity)) {}
};

struct List : Container<PLATCSZLIST, PLATCSzListFree> {
    explicit List(int capacity) : Container(PLATCSzListAlloc(capacity)) {}
};

// A task list under construction.
class TaskList {
  public:
    TaskList() = default;
    ~TaskList() { TAVISchedTaskListFree(&head_); }
    TaskList(const TaskList &) = delete;
    TaskList &operator=(const TaskList &) = delete;

    TAVI_SCHED_TASK *head() const { return head_; }
    TAVI_SCHED_TASK **address() { return &head_; }
    void pushFront(Allocated<TAVI_SCHED_TASK> task) {
        task->next = head_;
        head_ = task.release();
    }
    // Moves all tasks to the end of the caller's list.
    void appendTo(TAVI_SCHED_TASK **list) {
        while (*list) {
            list = &(*list)->next;
        }
        *list = release();
    }
    TAVI_SCHED_TASK *release() {
        TAVI_SCHED_TASK *const head = head_;
        head_ = nullptr;
        return head;
    }

  private:
    TAVI_SCHED_TASK *head_ = nullptr;
};

} // namespace sched
