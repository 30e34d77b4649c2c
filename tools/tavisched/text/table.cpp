// Tables and colours for the terminal.
#include "text/table.h"
#include "text/utf8.h"

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <cstring>
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
// wider than the narrowest. Whether it fits.
bool narrow(const std::vector<Column> &columns, std::vector<size_t> &widths, size_t available) {
    constexpr size_t kNarrowest = 8;
    size_t total = kGap * (widths.size() - 1);
    for (const size_t width : widths) {
        total += width;
    }
    for (; total > available; --total) {
        size_t *widest = nullptr;
        for (size_t i = 0; i < widths.size(); ++i) {
            const bool isWider = widths[i] > (widest ? *widest : kNarrowest);
            widest = columns[i].mayShrink && isWider ? &widths[i] : widest;
        }
        if (!widest) {
            return false;
        }
        --*widest;
    }
    return true;
}

// Leaves out the column that goes first. False when none may go.
bool leaveOneOut(std::vector<Column> &columns, std::vector<Row> &rows) {
    size_t first = columns.size();
    for (size_t i = 0; i < columns.size(); ++i) {
        const bool isEarlier =
            first == columns.size() || columns[i].leftOut < columns[first].leftOut;
        first = columns[i].leftOut > 0 && isEarlier ? i : first;
    }
    if (first == columns.size()) {
        return false;
    }
    columns.erase(columns.begin() + static_cast<ptrdiff_t>(first));
    for (Row &row : rows) {
        row.erase(row.begin() + static_cast<ptrdiff_t>(first));
    }
    return true;
}

std::vector<size_t> fit(std::vector<Column> &columns, std::vector<Row> &rows, size_t available) {
    for (;;) {
        std::vector<size_t> widths = naturalWidths(columns, rows);
        if (narrow(columns, widths, available) || !leaveOneOut(columns, rows)) {
            return widths;
        }
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

void printBare(const Row &row) {
    for (size_t i = 0; i < row.size(); ++i) {
        std::printf("%s%s", i == 0 ? "" : std::string(kGap, ' ').c_str(), row[i].text.c_str());
    }
    std::printf("\n");
}

} // namespace

std::optional<size_t> terminalWidth() {
    winsize size{};
    const bool known = ioctl(STDOUT_FILENO, TIOCGWINSZ, &size) == 0 && size.ws_col > 0;
    return known ? std::optional<size_t>(size.ws_col) : std::nullopt;
}

std::string styled(const std::string &text, Style style) {
    static const bool coloured = takesColours();
    if (!coloured || style == Style::Plain || text.empty()) {
        return text;
    }
    constexpr const char *kCodes[] = {"", "1", "2", "32", "31", "33"};
    return std::string("\033[") + kCodes[static_cast<size_t>(style)] + "m" + text + "\033[0m";
}

void printTable(std::vector<Column> columns, std::vector<Row> rows) {
    const auto width = terminalWidth();
    std::vector<size_t> widths(columns.size(), 0);
    if (width) {
        widths = fit(columns, rows, *width);
    }
    Row titles;
    for (const Column &column : columns) {
        titles.push_back({column.title, Style::Strong});
    }
    rows.insert(rows.begin(), std::move(titles));
    for (const Row &row : rows) {
        if (width) {
            printRow(columns, widths, row);
        } else {
            printBare(row);
        }
    }
}

} // namespace tavisched
