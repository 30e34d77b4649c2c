// The two ways in which a command ends without success. main() prints the text and exits with the
// status.
#pragma once

#include "platc.h"

#include <array>
#include <cstdio>
#include <stdexcept>
#include <string>
#include <utility>

namespace tavisched {

// The input is not accepted, and nothing was changed.
struct Refusal : std::runtime_error {
    // The option, without dashes, is the one at fault; "" for none in particular.
    explicit Refusal(const std::string &what, std::string atFault = "")
        : runtime_error(what), option(std::move(atFault)) {}
    static constexpr int kExitStatus = 2;
    std::string option;
};

// The machine did not go along.
struct Failure : std::runtime_error {
    using runtime_error::runtime_error;
    static constexpr int kExitStatus = 1;
};

// What the library's error state tells, for the end of a message.
inline std::string libraryError() {
    if (PLATCErrGet() == 0) {
        return "the system log tells why, and so does --verbose";
    }
    std::array<char, 64> code{};
    std::snprintf(code.data(), code.size(), "error 0x%04X (", PLATCErrGet());
    return code.data() + std::string(PLATCErrorGetFile()) + ":" +
           std::to_string(PLATCErrorGetLine()) + "); --verbose tells more";
}

} // namespace tavisched
