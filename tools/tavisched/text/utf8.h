// UTF-8 on a terminal: what may be printed, how wide it is, and where it can be cut.
#pragma once

#include <string>
#include <string_view>
#include <vector>

namespace tavisched {

bool isUtf8(std::string_view text);
// Holds a control character or a line break of any kind. The text is UTF-8.
bool holdsControls(std::string_view text);
// Nothing in it takes ink. The text is UTF-8.
bool isBlank(std::string_view text);
// The text as it may go to a terminal, on one line: what controls the terminal or the direction of
// writing, and what takes no room, becomes an escape such as "\u001b"; what is no UTF-8 becomes
// U+FFFD, a tab a blank.
std::string printable(std::string_view text);
// The same for a text of several lines: line feeds stay. In JSON such an escape means the
// character.
std::string printableLines(std::string_view text);
// The columns that a printable text takes.
size_t widthOf(std::string_view text);
// A printable text in at most so many columns (1 or more), cut between characters as people see
// them.
std::string cutTo(std::string_view text, size_t width);
// A text of which others differ only in case have the same. The text is UTF-8.
std::string folded(std::string_view text);
// Split at every separator; empty parts are kept.
std::vector<std::string> split(std::string_view text, char separator);
std::string join(const std::vector<std::string> &parts, std::string_view separator);

} // namespace tavisched
