// What every file of the portable platform shares: how it fails, and the wall that keeps C++
// exceptions behind the C interface.
#pragma once

#include "platc.h"

#include <cstring>
#include <exception>
#include <string_view>
#include <syslog.h>

namespace platform {

constexpr unsigned int kOutOfMemory = 0x0200;
constexpr unsigned int kOpenFailed = 0x0900;
constexpr unsigned int kReadWriteFailed = 0x0B00;
constexpr unsigned int kInvalidArgument = 0x0D00;
constexpr unsigned int kStatFailed = 0x2700;
constexpr unsigned int kRenameFailed = 0x2800;
constexpr unsigned int kSystemCallFailed = 0x2A00;
constexpr unsigned int kBadFormat = 0x4000;

constexpr int kWeekDays = 7;
constexpr unsigned int kEveryDay = 127; // as bits of week days

constexpr const char *baseName(const char *path) {
    const size_t slash = std::string_view(path).rfind('/');
    return slash == std::string_view::npos ? path : path + slash + 1;
}

// Records the failure and answers -1, so that a failing check reads "return PLATFORM_FAIL(code);".
#define PLATFORM_FAIL(code) platform::fail((code), platform::baseName(__FILE__), __LINE__)

// Logs one line that begins with source name and line, as every line of the system does.
#define PLATFORM_LOG(format, ...)                                                                  \
    syslog(LOG_ERR, "%s:%d " format, platform::baseName(__FILE__), __LINE__, __VA_ARGS__)

inline int fail(unsigned int code, const char *file, int line) {
    PLATCErrSetEx(code, file, line);
    return -1;
}

// Runs the body of an interface function. The only exceptions that the platform's containers throw
// are about memory and size.
template <typename Body> auto guarded(Body &&body, decltype(body()) onFailure) noexcept {
    try {
        return body();
    } catch (const std::exception &) {
        PLATFORM_FAIL(kOutOfMemory);
        return onFailure;
    }
}

} // namespace platform
