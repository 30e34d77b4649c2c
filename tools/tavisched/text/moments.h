// Moments and spans of time as people write them.
#pragma once

#include <ctime>
#include <optional>
#include <string>
#include <string_view>

namespace tavisched {

// "30m", "24h", "7d" or "2w" in seconds.
std::optional<time_t> parseSpan(std::string_view text);
// "2026-12-24", its beginning, or "2026-12-24 18:00", local time.
std::optional<time_t> parseMoment(const std::string &text);
// "2026-12-24T18:00:00+01:00"
std::string isoTime(time_t time);

} // namespace tavisched
