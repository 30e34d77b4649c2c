// Tables and colours for the terminal.
#include "text/table.h"
#include "text/utf8.h"

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <iterator>
#include <numeric>
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

void widen(std::vector<size_t> &widths, const Row &row) {
    for (size_t i = 0; i < row.size(); ++i) {
        widths[i] = std::max(widths[i], widthOf(row[i].text));
    }
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

// What is shown of a table: places of columns, and how wide each of them is.
struct Fitting {
    std::vector<size_t> places;
    std::vector<size_t> widths;
};

// Leaves out the column that goes first. False when none may go.
bool leaveOneOut(const std::vector<Column> &columns, Fitting &shown) {
    const auto goesFirst = [&](size_t one, size_t other) {
        const int first = columns[one].leftOut;
        const int second = columns[other].leftOut;
        return first != 0 && (second == 0 || first < second);
    };
    const auto first = std::min_element(shown.places.begin(), shown.places.end(), goesFirst);
    if (columns[*first].leftOut == 0) {
        return false;
    }
    shown.widths.erase(shown.widths.begin() + (first - shown.places.begin()));
    shown.places.erase(first);
    return true;
}

template <typename Value>
std::vector<Value> picked(const std::vector<Value> &all, const std::vector<size_t> &places) {
    std::vector<Value> some;
    some.reserve(places.size());
    for (const size_t place : places) {
        some.push_back(all[place]);
    }
    return some;
}

Fitting fit(const std::vector<Column> &columns, const std::vector<size_t> &widths,
            size_t available) {
    Fitting shown{.places = std::vector<size_t>(columns.size()), .widths = widths};
    std::iota(shown.places.begin(), shown.places.end(), 0);
    for (;;) {
        std::vector<size_t> narrowed = shown.widths;
        if (narrow(picked(columns, shown.places), narrowed, available) ||
            !leaveOneOut(columns, shown)) {
            shown.widths = narrowed;
            return shown;
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

void printTable(std::vector<Column> columns, const std::vector<Row> &rows) {
    printTable(std::move(columns),
               [&](const RowReader &reader) { std::for_each(rows.begin(), rows.end(), reader); });
}

void printTable(std::vector<Column> columns, const RowSource &source) {
    Row titles;
    std::transform(columns.begin(), columns.end(), std::back_inserter(titles),
                   [](const Column &column) {
                       return Cell{column.title, Style::Strong};
                   });
    const auto width = terminalWidth();
    if (!width) {
        printBare(titles);
        source(printBare);
        return;
    }
    std::vector<size_t> widths(columns.size(), 0);
    widen(widths, titles);
    source([&](const Row &row) { widen(widths, row); });
    const Fitting shown = fit(columns, widths, *width);
    columns = picked(columns, shown.places);
    const auto print = [&](const Row &row) {
        printRow(columns, shown.widths, picked(row, shown.places));
    };
    print(titles);
    source(print);
}

} // namespace tavisched
