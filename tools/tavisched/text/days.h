// Days of the week as people write them.
#pragma once

#include <string>
#include <string_view>

namespace tavisched {

// Turns "Mon,Fri", "Mon, Fri", "Mon-Fri", "monday", "weekdays", "weekend" or "daily" into seven
// characters '0' or '1', Sunday first. Throws a Refusal that begins with `subject` for anything
// else.
std::string parseDays(std::string_view text, const std::string &subject);

} // namespace tavisched
