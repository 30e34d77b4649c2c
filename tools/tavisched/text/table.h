// Tables and colours for the terminal. Elsewhere the same cells come without colours, neither cut
// nor padded, two blanks between them.
#pragma once

#include <functional>
#include <optional>
#include <string>
#include <vector>

namespace tavisched {

enum class Style { Plain, Strong, Faint, Good, Bad, Busy };

// The text in the style's colour when standard output is a terminal that takes colours and the
// environment's NO_COLOR is not set.
std::string styled(const std::string &text, Style style);

// Nothing where there is no terminal.
std::optional<size_t> terminalWidth();

struct Cell {
    std::string text;
    Style style = Style::Plain;
};

struct Column {
    const char *title;
    bool isNumber = false;  // aligned to the right
    bool mayShrink = false; // cut when the terminal is too narrow
    int leftOut = 0;        // when that is not enough: 1 is left out first, 0 never
};

using Row = std::vector<Cell>;

// Prints the columns' titles and the rows, aligned and fitted to the terminal's width.
void printTable(std::vector<Column> columns, const std::vector<Row> &rows);

// The same for rows that are not kept: the source hands each of them over, a second time for a
// terminal, whose columns' widths are found first.
using RowReader = std::function<void(const Row &row)>;
using RowSource = std::function<void(const RowReader &reader)>;
void printTable(std::vector<Column> columns, const RowSource &source);

} // namespace tavisched
