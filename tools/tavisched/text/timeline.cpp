// A calendar as a timeline of characters.
#include "text/timeline.h"
#include "text/table.h"
#include "text/utf8.h"
#include "text/words.h"

#include <algorithm>
#include <array>
#include <cstdio>
#include <iterator>
#include <set>

namespace tavisched {

namespace {

constexpr size_t kMinutesOfDay = 1440;
constexpr size_t kWidthElsewhere = 80; // than on a terminal
constexpr std::string_view kDate = "YYYY-MM-DD";
constexpr size_t kNumber = 2;         // digits of a day, and of an hour
constexpr size_t kRoom = kNumber + 1; // with a blank

size_t width() {
    return terminalWidth().value_or(kWidthElsewhere);
}

// ---- What stands in a column ----

// In the order of the legend.
enum class Mark { Start, Several, Ok, Failed, Missed, Busy, WhileOff, Off, Day, Empty };

struct Look {
    const char *symbol;
    Style style;
    const char *legend; // "" for what needs none
};

Look lookOf(Mark mark) {
    constexpr std::array<Look, 10> kLooks = {{{"o", Style::Strong, "o start"},
                                              {"#", Style::Strong, "2 several, # ten or more"},
                                              {"+", Style::Good, "+ ok"},
                                              {"x", Style::Bad, "x failed"},
                                              {"?", Style::Bad, "? missed"},
                                              {">", Style::Busy, "> running"},
                                              {"!", Style::Bad, "! start while the machine is off"},
                                              {"░", Style::Faint, "░ machine off"},
                                              {"│", Style::Faint, ""},
                                              {" ", Style::Plain, ""}}};
    return kLooks[static_cast<size_t>(mark)];
}

// A column of a row.
struct Field {
    Mark mark = Mark::Empty;
    int starts = 0;

    // What a person must know goes before the rest.
    void add(const Run &run) {
        const Mark told = goesOn(run)                           ? Mark::Busy
                          : run.result == TAVI_SCHED_RUN_MISSED ? Mark::Missed
                          : hasFailed(run)                      ? Mark::Failed
                                                                : Mark::Ok;
        const bool isBad = mark == Mark::Failed || mark == Mark::Missed;
        mark = isBad && told != Mark::Busy ? mark : told;
    }
    void addStart(bool isOff) {
        ++starts;
        if (mark > Mark::Ok && mark < Mark::WhileOff) {
            return; // of runs, those that need a person
        }
        mark = isOff || mark == Mark::WhileOff ? Mark::WhileOff
               : starts > 1                    ? Mark::Several
                                               : Mark::Start;
    }
    std::string symbol() const {
        constexpr int kOneDigit = 9;
        return mark == Mark::Several && starts <= kOneDigit ? std::to_string(starts)
                                                            : lookOf(mark).symbol;
    }
};
using Fields = std::vector<Field>;

// ---- Columns ----

struct Grid {
    size_t minutes; // of a column
    size_t columns; // of all days
    size_t part;    // columns that stand beside each other

    size_t perDay() const { return kMinutesOfDay / minutes; }
};

// The finest one that fits.
Grid gridFor(size_t days, size_t room, bool hours) {
    constexpr std::array<size_t, 13> kSteps = {5,   10,  15,  20,  30,  60,  120,
                                               180, 240, 360, 480, 720, 1440};
    const size_t longest = hours ? 60 : kMinutesOfDay;
    const auto *const step = std::find_if(kSteps.begin(), kSteps.end(), [&](size_t minutes) {
        return minutes >= longest || days * (kMinutesOfDay / minutes) <= room;
    });
    Grid grid{.minutes = *step, .columns = days * (kMinutesOfDay / *step), .part = 0};
    const size_t wholeDays = room / grid.perDay() * grid.perDay();
    grid.part = std::min(grid.columns, wholeDays > 0 ? wholeDays : std::max<size_t>(room, 1));
    return grid;
}

class Columns {
  public:
    Columns(const Calendar &calendar, const Grid &grid) : days_(calendar.days), grid_(grid) {}

    size_t of(time_t time) const {
        tm local{};
        localtime_r(&time, &local);
        const auto day = std::upper_bound(days_.begin(), days_.end(), time) - days_.begin() - 1;
        const auto minute =
            static_cast<size_t>(local.tm_hour) * 60 + static_cast<size_t>(local.tm_min);
        return static_cast<size_t>(day) * grid_.perDay() + minute / grid_.minutes;
    }
    // The moment at which a column begins, also the one behind the last.
    time_t beginOf(size_t column) const {
        const time_t day = days_[std::min(column / grid_.perDay(), days_.size() - 1)];
        tm local{};
        localtime_r(&day, &local);
        local.tm_min += static_cast<int>((column - dayOf(day) * grid_.perDay()) * grid_.minutes);
        local.tm_isdst = -1;
        return mktime(&local);
    }

  private:
    size_t dayOf(time_t day) const {
        return static_cast<size_t>(std::find(days_.begin(), days_.end(), day) - days_.begin());
    }

    const std::vector<time_t> &days_;
    Grid grid_;
};

// What a row has where nothing happens: hours in which the machine is off for the most part, and
// where days begin.
Fields background(const Calendar &calendar, const Grid &grid, const Columns &columns) {
    Fields fields(grid.columns);
    for (size_t column = 0; column < grid.columns; ++column) {
        const time_t begin = columns.beginOf(column);
        const time_t end = columns.beginOf(column + 1);
        time_t off = 0;
        for (const TAVI_SCHED_SPAN &span : calendar.off) {
            off += std::max<time_t>(0, std::min(span.until, end) - std::max(span.from, begin));
        }
        const bool isOff = off > 0 && 2 * off >= end - begin;
        const bool isDay = grid.perDay() > 1 && column % grid.perDay() == 0;
        fields[column].mark = isOff ? Mark::Off : isDay ? Mark::Day : Mark::Empty;
    }
    return fields;
}

// cron comes too late for the minute in which the machine goes on.
bool isOffAt(const Calendar &calendar, time_t time) {
    return std::any_of(
        calendar.off.begin(), calendar.off.end(),
        [time](const TAVI_SCHED_SPAN &span) { return time >= span.from && time <= span.until; });
}

Fields fieldsOf(const Calendar::Entry &entry, const Calendar &calendar, const Columns &columns,
                Fields fields) {
    for (const Run &run : entry.runs) {
        fields[columns.of(startOf(run))].add(run);
    }
    for (const time_t start : entry.starts) {
        const bool isOff = !isPower(*entry.task) && isOffAt(calendar, start);
        fields[columns.of(start)].addStart(isOff);
    }
    return fields;
}

// ---- Lines ----

void printLabel(const std::string &text, size_t width, Style style = Style::Plain) {
    const std::string label = cutTo(text, width);
    std::printf("%s%s ", styled(label, style).c_str(),
                std::string(width - widthOf(label), ' ').c_str());
}

// Neighbours of one style are written as one.
void printFields(const Fields &fields, size_t begin, size_t end) {
    std::string text;
    for (size_t i = begin; i < end; ++i) {
        const Style style = lookOf(fields[i].mark).style;
        text += fields[i].symbol();
        if (i + 1 == end || lookOf(fields[i + 1].mark).style != style) {
            std::printf("%s", styled(text, style).c_str());
            text.clear();
        }
    }
    std::printf("\n");
}

// A line of texts at columns. What does not fit at its end is left out: a part of a number
// misleads.
void printTitles(const std::map<size_t, std::string> &titles, size_t begin, size_t end,
                 Style style) {
    std::string line;
    for (const auto &[column, title] : titles) {
        if (column == begin || (column > begin && column + title.size() <= end)) {
            line.resize(column - begin, ' ');
            line += title.substr(0, std::max(end - column, kNumber));
        }
    }
    std::printf("%s\n", styled(line, style).c_str());
}

// As much of a day as there is room for, with a blank behind it; of narrow days not every one.
std::map<size_t, std::string> dayTitles(const Calendar &calendar, const Grid &grid, size_t begin) {
    const size_t width = grid.perDay();
    std::map<size_t, std::string> titles;
    for (size_t day = begin / width; day < calendar.days.size();
         day += (kRoom + width - 1) / width) {
        const std::string name = weekDayOf(calendar.days[day]);
        const std::string date = localMinute(calendar.days[day]).substr(0, kDate.size());
        const std::string number = date.substr(kDate.find("DD"));
        titles[std::max(day * width, begin)] =
            width > name.size() + 1 + date.size()     ? name + " " + date
            : width > name.size() + 1 + number.size() ? name + " " + number
            : width > number.size() + 3               ? name.substr(0, 2) + " " + number
                                                      : number;
    }
    return titles;
}

// Empty when the columns are too long for it.
std::map<size_t, std::string> hourTitles(const Grid &grid) {
    std::map<size_t, std::string> titles;
    for (const size_t hours : {1, 2, 3, 6, 12}) {
        const size_t step = hours * 60 / grid.minutes;
        if (step < kRoom) {
            continue;
        }
        for (size_t column = 0; column < grid.columns; column += step) {
            titles[column] = std::to_string(column % grid.perDay() * grid.minutes / 60);
        }
        break;
    }
    return titles;
}

std::string columnInWords(const Grid &grid) {
    return grid.minutes < 60 ? std::to_string(grid.minutes) + " min"
                             : std::to_string(grid.minutes / 60) + " h";
}

void printLegend(const Grid &grid, const std::set<Mark> &used) {
    std::string line = "A column is " + columnInWords(grid) + ".";
    for (const Mark mark : used) {
        const std::string legend = lookOf(mark).legend;
        if (!legend.empty() && widthOf(line) + 2 + widthOf(legend) > width()) {
            std::printf("%s\n", line.c_str());
            line = legend;
        } else if (!legend.empty()) {
            line += "  " + legend;
        }
    }
    std::printf("%s\n", line.c_str());
}

void printBusyMinutes(const Calendar &calendar) {
    constexpr size_t kMost = 3;
    for (size_t i = 0; i < std::min(kMost, calendar.busy.size()); ++i) {
        const Calendar::Minute &minute = calendar.busy[i];
        std::string line =
            "Same minute: " + weekDayOf(minute.time) + " " + localMinute(minute.time) + ", tasks";
        for (const int32_t id : minute.tasks) {
            line += " " + std::to_string(id);
        }
        std::printf("%s\n", cutTo(line, width()).c_str());
    }
    if (calendar.busy.size() > kMost) {
        std::printf("and %zu more, which --json lists\n", calendar.busy.size() - kMost);
    }
}

// ---- All of it ----

class Timeline {
  public:
    Timeline(const Calendar &calendar, bool hours)
        : calendar_(calendar), width_(labelWidth()),
          grid_(gridFor(calendar.days.size(), room(), hours)), columns_(calendar, grid_) {
        const Fields empty = background(calendar, grid_, columns_);
        for (const Calendar::Entry &entry : calendar.entries) {
            rows_.push_back(fieldsOf(entry, calendar, columns_, empty));
        }
    }

    void print() const {
        for (size_t begin = 0; begin < grid_.columns; begin += grid_.part) {
            printPart(begin, std::min(begin + grid_.part, grid_.columns));
        }
        std::set<Mark> used;
        for (const Fields &row : rows_) {
            for (const Field &field : row) {
                used.insert(field.mark);
            }
        }
        printLegend(grid_, used);
        printBusyMinutes(calendar_);
    }

  private:
    static std::string labelOf(const Calendar::Entry &entry) {
        return std::to_string(entry.task->id) + " " + printable(entry.task->name);
    }
    size_t labelWidth() const {
        size_t widest = sizeof "same minute" - 1;
        for (const Calendar::Entry &entry : calendar_.entries) {
            widest = std::max(widest, widthOf(labelOf(entry)));
        }
        return std::min(widest, std::max<size_t>(width() / 4, 8));
    }
    size_t room() const { return width() > width_ + 2 ? width() - width_ - 1 : 1; }

    void printPart(size_t begin, size_t end) const {
        printLabel("", width_);
        printTitles(dayTitles(calendar_, grid_, begin), begin, end, Style::Strong);
        if (const auto hours = hourTitles(grid_); !hours.empty()) {
            printLabel("", width_);
            printTitles(hours, begin, end, Style::Faint);
        }
        const size_t now = columns_.of(calendar_.now);
        if (now >= begin && now < end) {
            printLabel("now", width_, Style::Faint);
            std::printf("%sv\n", std::string(now - begin, ' ').c_str());
        }
        for (size_t i = 0; i < rows_.size(); ++i) {
            printLabel(labelOf(calendar_.entries[i]), width_);
            printFields(rows_[i], begin, end);
        }
        printBusyColumns(begin, end);
        std::printf("\n");
    }

    void printBusyColumns(size_t begin, size_t end) const {
        std::string line(end - begin, ' ');
        for (const Calendar::Minute &minute : calendar_.busy) {
            const size_t column = columns_.of(minute.time);
            if (column >= begin && column < end) {
                line[column - begin] = '*';
            }
        }
        if (line.find('*') != std::string::npos) {
            printLabel("same minute", width_, Style::Faint);
            std::printf("%s\n", line.substr(0, line.find_last_of('*') + 1).c_str());
        }
    }

    const Calendar &calendar_;
    size_t width_; // of the labels
    Grid grid_;
    Columns columns_;
    std::vector<Fields> rows_;
};

} // namespace

void printTimeline(const Calendar &calendar, bool hours) {
    Timeline(calendar, hours).print();
}

} // namespace tavisched
