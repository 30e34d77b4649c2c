// Days of the week as people write them.
#pragma once

#include <string>
#include <string_view>

namespace tavisched {

// Turns "Mon,Fri", "Mon, Fri", "Mon-Fri", "monday", "weekdays", "weekend" or "daily" into seven
// characters '0' or '1', Sunday first. Refuses anything else in the name of the option.
std::string parseDays(std::string_view text, const char *option);

} // namespace tavisched
