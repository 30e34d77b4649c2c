// Texts from outside: whether they are UTF-8, and how they may stand in a message.
#pragma once

#include <string>
#include <string_view>

namespace sched {

bool isUtf8(std::string_view text);
// The text with U+FFFD in the place of each byte that is no UTF-8.
std::string toUtf8(std::string_view text);
// The text in quotes for a message of one line: at most 60 characters of it, then an ellipsis. What
// is no UTF-8, and characters that control a terminal or the direction of writing, become U+FFFD.
std::string quoted(std::string_view text);

} // namespace sched
