// Tables and colours for the terminal. Elsewhere the same table comes without colours and is never
// cut.
#pragma once

#include <string>
#include <vector>

namespace tavisched {

enum class Style { Plain, Strong, Faint, Good, Bad, Busy };

// The text in the style's colour when standard output is a terminal that takes colours and the
// environment's NO_COLOR is not set.
std::string styled(const std::string &text, Style style);

struct Cell {
    std::string text;
    Style style = Style::Plain;
};

struct Column {
    const char *title;
    bool isNumber = false;  // aligned to the right
    bool mayShrink = false; // cut when the terminal is too narrow
};

using Row = std::vector<Cell>;

// Prints the columns' titles and the rows, aligned and fitted to the terminal's width.
void printTable(const std::vector<Column> &columns, std::vector<Row> rows);

} // namespace tavisched
