// The error state: code, file and line of the last failure of this process.
#include "platform.h"

#include <array>
#include <cerrno>
#include <cstdio>

namespace {

struct ErrorState {
    unsigned int code = 0;
    std::array<char, 256> file{};
    int line = 0;
};

ErrorState lastError;

} // namespace

void PLATCErrSetEx(unsigned int code, const char *szFile, int line) {
    const int savedErrno = errno;
    lastError.code = code;
    lastError.line = line;
    std::snprintf(lastError.file.data(), lastError.file.size(), "%s", szFile ? szFile : "");
    errno = savedErrno;
}

unsigned int PLATCErrGet() {
    return lastError.code;
}

const char *PLATCErrorGetFile() {
    return lastError.file.data();
}

int PLATCErrorGetLine() {
    return lastError.line;
}
