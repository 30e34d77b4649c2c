// The one way in which the library fails: the error state is set and one line is logged that begins
// with source name and line. Support scripts match these lines, so some sites carry a number of
// their own that does not move with the source; the _AT forms take it.
//
// The macros call syslog themselves: the compiler then checks every format against its arguments.
#pragma once

#include "platc.h"
#include "sched_text.h"
#include "tavischeduler.h"

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <memory>
#include <new>
#include <string_view>
#include <syslog.h>

namespace sched {

constexpr unsigned int kSortOutOfMemory = TAVI_SCHED_ERR_SORT_MEMORY;
constexpr unsigned int kTaskOutOfMemory = TAVI_SCHED_ERR_MEMORY;
constexpr unsigned int kLockFailed = TAVI_SCHED_ERR_LOCK;
constexpr unsigned int kUnlockFailed = TAVI_SCHED_ERR_UNLOCK;
constexpr unsigned int kOpenFailed = TAVI_SCHED_ERR_OPEN;
constexpr unsigned int kReadWriteFailed = TAVI_SCHED_ERR_READ_WRITE;
constexpr unsigned int kInvalidArgument = TAVI_SCHED_ERR_INVALID_ARGUMENT;
constexpr unsigned int kNotFound = TAVI_SCHED_ERR_NOT_FOUND;
constexpr unsigned int kStatFailed = TAVI_SCHED_ERR_FILE_STATUS;
constexpr unsigned int kRenameFailed = TAVI_SCHED_ERR_RENAME;
constexpr unsigned int kSystemCallFailed = TAVI_SCHED_ERR_SYSTEM_CALL;
constexpr unsigned int kBadFormat = TAVI_SCHED_ERR_BAD_FORMAT;

// A source's name as messages carry it: the path below lib/ or include/. Found at compile time, as
// operations name their place also when nothing fails.
consteval const char *sourceName(const char *path) {
    constexpr size_t npos = std::string_view::npos;
    const std::string_view text(path);
    size_t start = 0;
    for (const std::string_view folder : {std::string_view("lib/"), std::string_view("include/")}) {
        for (size_t at = text.find(folder); at != npos; at = text.find(folder, at + 1)) {
            if (at == 0 || text[at - 1] == '/') {
                start = std::max(start, at + folder.size());
            }
        }
    }
    return path + start;
}

// A place that messages and the error state name; helpers report for their callers with it.
struct Site {
    const char *file;
    int line;
};

// A text from outside as a log line shows it: whole up to 64 KiB, and cut beyond that with a mark,
// as the system log drops very long messages without a word. The text must outlive it.
class LogText {
  public:
    explicit LogText(const char *text) : shown_(text) {
        const size_t length = std::strlen(text);
        if (length > kMost) {
            cut(length);
        }
    }
    const char *c_str() const { return shown_; }

  private:
    static constexpr size_t kMost = 65536;
    static constexpr size_t kMarkSize = 64;

    void cut(size_t length) {
        const int savedErrno = errno; // for %m of the same message
        copy_.reset(new (std::nothrow) char[kMost + kMarkSize]);
        if (copy_) {
            std::memcpy(copy_.get(), shown_, kMost);
            std::snprintf(copy_.get() + kMost, kMarkSize, " [... %zu bytes more]", length - kMost);
        }
        shown_ = copy_ ? copy_.get() : "[... a long text, and no memory to show it]";
        errno = savedErrno;
    }

    const char *shown_;
    std::unique_ptr<char[]> copy_;
};

} // namespace sched

#define SCHED_SOURCE sched::sourceName(__FILE__)
#define SCHED_SITE                                                                                 \
    sched::Site {                                                                                  \
        SCHED_SOURCE, __LINE__                                                                     \
    }

// The three arguments of a message's "[0x%04X %s:%d]" tail.
#define SCHED_LAST_ERROR PLATCErrGet(), PLATCErrorGetFile(), PLATCErrorGetLine()

#define SCHED_LOG_FOR(site, format, ...)                                                           \
    syslog(LOG_ERR, "%s:%d " format, (site).file, (site).line __VA_OPT__(, ) __VA_ARGS__)
#define SCHED_LOG_AT(line, format, ...)                                                            \
    syslog(LOG_ERR, "%s:%d " format, SCHED_SOURCE, line __VA_OPT__(, ) __VA_ARGS__)
#define SCHED_LOG(format, ...) SCHED_LOG_AT(__LINE__, format __VA_OPT__(, ) __VA_ARGS__)

#define SCHED_SET_ERROR_AT(line, code) PLATCErrSetEx((code), SCHED_SOURCE, (line))
#define SCHED_SET_ERROR(code) SCHED_SET_ERROR_AT(__LINE__, code)

// Leaves the function with `result` when an argument is bad. `text` is the condition as the support
// scripts know it.
#define SCHED_REQUIRE_AT(line, condition, text, result)                                            \
    do {                                                                                           \
        if (!(condition)) {                                                                        \
            SCHED_LOG_AT(line, "Invaild Argument (%s)=[%d]\n", text, 0);                           \
            SCHED_SET_ERROR_AT(line, sched::kInvalidArgument);                                     \
            return result;                                                                         \
        }                                                                                          \
    } while (false)
#define SCHED_REQUIRE(condition, text, result) SCHED_REQUIRE_AT(__LINE__, condition, text, result)
