// The wall that keeps C++ exceptions behind the C interface, and the error state kept over what is
// done after a failure.
#pragma once

#include "sched_error.h"

#include <array>
#include <cerrno>
#include <exception>
#include <utility>

namespace sched {

// Runs the body of an operation. The only exceptions that containers throw are about memory and
// size; they are logged for the site.
template <typename Body>
auto guarded(const Site &site, Body &&body, decltype(body()) onFailure) noexcept {
    try {
        return body();
    } catch (const std::exception &failure) {
        SCHED_LOG_FOR(site, "out of memory: %s", failure.what());
        PLATCErrSetEx(kTaskOutOfMemory, site.file, site.line);
        return onFailure;
    }
}

// The same for operations that answer -1.
template <typename Body> int guarded(const Site &site, Body &&body) noexcept {
    return guarded(site, std::forward<Body>(body), -1);
}

// The error state and errno as they were at its construction, set again at its destruction: what
// undoes or tells of a failure must not replace it.
class KeptError {
  public:
    KeptError() : errno_(errno), code_(PLATCErrGet()), line_(PLATCErrorGetLine()) {
        copyText(file_.data(), file_.size(), PLATCErrorGetFile());
    }
    ~KeptError() {
        PLATCErrSetEx(code_, file_.data(), line_);
        errno = errno_;
    }
    KeptError(const KeptError &) = delete;
    KeptError &operator=(const KeptError &) = delete;

  private:
    int errno_;
    unsigned int code_;
    int line_;
    std::array<char, 256> file_{};
};

} // namespace sched
