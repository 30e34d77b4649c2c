// The task runner that cron starts as "/tmp/tavischedtask --run id=N". It starts the task in the
// background when it is enabled and due in this minute.
#include "platc.h"
#include "tavischeduler.h"

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

} // namespace

int main(int argc, char **argv) {
    const bool hasForm = argc == 3 && std::string_view(argv[1]) == "--run";
    const std::optional<int32_t> id = hasForm ? parseId(argv[2]) : std::nullopt;
    if (!id) {
        std::fputs("usage: tavischedtask --run id=N\n", stderr);
        return kExitUsage;
    }
    if (TAVISchedTaskRun(*id, 1, 1) != 0) {
        std::fprintf(stderr, "tavischedtask: task %ld could not be started: error 0x%04X (%s:%d)\n",
                     static_cast<long>(*id), PLATCErrGet(), PLATCErrorGetFile(),
                     PLATCErrorGetLine());
        return kExitFailed;
    }
    return 0;
}
