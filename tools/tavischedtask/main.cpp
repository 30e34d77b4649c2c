// The task runner that cron starts as "/tmp/tavischedtask --run id=N". It starts the task in the
// background when it is enabled and due in this minute. At boot "--start" makes the machine ready.
#include "platc.h"
#include "tavischeduler.h"

#include <array>
#include <charconv>
#include <cstdint>
#include <cstdio>
#include <optional>
#include <string_view>

namespace {

constexpr int kExitFailed = 1;
constexpr int kExitUsage = 2;

std::optional<int32_t> parseId(std::string_view argument) {
    constexpr std::string_view kPrefix = "id=";
    if (!argument.starts_with(kPrefix)) {
        return std::nullopt;
    }
    argument.remove_prefix(kPrefix.size());
    int32_t id = 0;
    const char *const end = argument.data() + argument.size();
    const auto [parsed, error] = std::from_chars(argument.data(), end, id);
    return error == std::errc() && parsed == end ? std::optional(id) : std::nullopt;
}

int fail(const char *what) {
    std::fprintf(stderr, "tavischedtask: %s: error 0x%04X (%s:%d)\n", what, PLATCErrGet(),
                 PLATCErrorGetFile(), PLATCErrorGetLine());
    return kExitFailed;
}

int run(int32_t id) {
    if (TAVISchedTaskRun(id, 1, 1) == 0) {
        return 0;
    }
    std::array<char, 64> what{};
    std::snprintf(what.data(), what.size(), "task %ld could not be started", static_cast<long>(id));
    return fail(what.data());
}

int start() {
    return TAVISchedStart() == 0 ? 0
                                 : fail("the machine is not ready for tasks; the system log has "
                                        "more");
}

} // namespace

int main(int argc, char **argv) {
    const std::string_view form = argc > 1 ? argv[1] : "";
    if (argc == 2 && form == "--start") {
        return start();
    }
    const auto id = argc == 3 && form == "--run" ? parseId(argv[2]) : std::nullopt;
    if (!id) {
        std::fputs("usage: tavischedtask --run id=N | --start\n", stderr);
        return kExitUsage;
    }
    return run(*id);
}
