// Tables and colours for the terminal.
#include "table.h"
#include "text.h"

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <limits>
#include <sys/ioctl.h>
#include <unistd.h>

namespace tavisched {

namespace {

constexpr size_t kGap = 2;

bool takesColours() {
    const char *const noColour = std::getenv("NO_COLOR");
    const char *const terminal = std::getenv("TERM");
    return isatty(STDOUT_FILENO) == 1 && (!noColour || *noColour == '\0') && terminal &&
           std::strcmp(terminal, "dumb") != 0;
}

size_t terminalWidth() {
    winsize size{};
    const bool known = ioctl(STDOUT_FILENO, TIOCGWINSZ, &size) == 0 && size.ws_col > 0;
    return known ? size.ws_col : std::numeric_limits<size_t>::max();
}

std::vector<size_t> naturalWidths(const std::vector<Column> &columns,
                                  const std::vector<Row> &rows) {
    std::vector<size_t> widths;
    for (size_t i = 0; i < columns.size(); ++i) {
        size_t width = widthOf(columns[i].title);
        for (const Row &row : rows) {
            width = std::max(width, widthOf(row[i].text));
        }
        widths.push_back(width);
    }
    return widths;
}

// Takes columns from the widest that may give some, one at a time, until the table fits or none is
// wider than the narrowest.
void narrow(const std::vector<Column> &columns, std::vector<size_t> &widths, size_t narrowest,
            size_t available) {
    size_t total = kGap * (widths.size() - 1);
    for (const size_t width : widths) {
        total += width;
    }
    for (; total > available; --total) {
        size_t *widest = nullptr;
        for (size_t i = 0; i < widths.size(); ++i) {
            const bool isWider = widths[i] > (widest ? *widest : narrowest);
            widest = columns[i].mayShrink && isWider ? &widths[i] : widest;
        }
        if (!widest) {
            return;
        }
        --*widest;
    }
}

void printRow(const std::vector<Column> &columns, const std::vector<size_t> &widths,
              const Row &row) {
    for (size_t i = 0; i < row.size(); ++i) {
        const std::string text = cutTo(row[i].text, widths[i]);
        const std::string padding(widths[i] - widthOf(text), ' ');
        const bool isLast = i + 1 == row.size();
        std::printf("%s%s%s%s", columns[i].isNumber ? padding.c_str() : "",
                    styled(text, row[i].style).c_str(),
                    columns[i].isNumber || isLast ? "" : padding.c_str(),
                    isLast ? "\n" : std::string(kGap, ' ').c_str());
    }
}

} // namespace

std::string styled(const std::string &text, Style style) {
    static const bool coloured = takesColours();
    if (!coloured || style == Style::Plain || text.empty()) {
        return text;
    }
    constexpr const char *kCodes[] = {"", "1", "2", "32", "31", "33"};
    return std::string("\033[") + kCodes[static_cast<size_t>(style)] + "m" + text + "\033[0m";
}

void printTable(const std::vector<Column> &columns, std::vector<Row> rows) {
    Row titles;
    for (const Column &column : columns) {
        titles.push_back({column.title, Style::Strong});
    }
    std::vector<size_t> widths = naturalWidths(columns, rows);
    for (const size_t narrowest : {8, 2}) {
        narrow(columns, widths, narrowest, terminalWidth());
    }
    rows.insert(rows.begin(), std::move(titles));
    for (const Row &row : rows) {
        printRow(columns, widths, row);
    }
}

} // namespace tavisched
