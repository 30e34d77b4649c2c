// Moments and spans of time as people write them.
#include "text/moments.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <iterator>

namespace tavisched {

std::optional<time_t> parseSpan(std::string_view text) {
    constexpr struct {
        char letter;
        time_t seconds;
    } kUnits[] = {{'m', 60}, {'h', 3600}, {'d', 86400}, {'w', 7 * 86400}};
    constexpr unsigned int kMost = 100000;
    unsigned int count = 0;
    const char *const end = text.data() + text.size();
    const auto parsed = std::from_chars(text.data(), end, count);
    const auto *const unit =
        std::find_if(std::begin(kUnits), std::end(kUnits), [&](const auto &row) {
            return parsed.ptr + 1 == end && row.letter == *parsed.ptr;
        });
    return parsed.ec != std::errc() || unit == std::end(kUnits) || count > kMost
               ? std::nullopt
               : std::optional(count * unit->seconds);
}

std::optional<time_t> parseMoment(const std::string &text) {
    for (const char *const format : {"%Y-%m-%d", "%Y-%m-%d %H:%M"}) {
        tm local{};
        const char *const end = strptime(text.c_str(), format, &local);
        if (!end || *end != '\0') {
            continue;
        }
        const tm given = local;
        local.tm_isdst = -1;
        const time_t moment = mktime(&local);
        if (local.tm_mday == given.tm_mday && local.tm_mon == given.tm_mon) { // no February 30th
            return moment;
        }
    }
    return std::nullopt;
}

std::string isoTime(time_t time) {
    tm local{};
    localtime_r(&time, &local);
    std::array<char, 40> text{};
    std::strftime(text.data(), text.size(), "%Y-%m-%dT%H:%M:%S%z", &local);
    std::string iso = text.data();
    return iso.insert(iso.size() - 2, ":");
}

} // namespace tavisched
