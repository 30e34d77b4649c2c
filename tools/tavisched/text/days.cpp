// Days of the week as people write them.
#include "text/days.h"
#include "failure.h"
#include "tavischeduler.h"
#include "text/utf8.h"

#include <algorithm>
#include <cctype>
#include <optional>

namespace tavisched {

namespace {

constexpr std::string_view kDays[] = {"sunday",   "monday", "tuesday", "wednesday",
                                      "thursday", "friday", "saturday"};
constexpr size_t kShortest = 3; // letters of a day's name

constexpr struct {
    std::string_view word, week;
} kWords[] = {{"weekdays", "0111110"},
              {"weekday", "0111110"},
              {"weekend", "1000001"},
              {"weekends", "1000001"},
              {"daily", "1111111"}};

// The number of a day whose name begins so.
std::optional<size_t> dayNamed(std::string_view name) {
    const auto *const day =
        std::find_if(std::begin(kDays), std::end(kDays), [&](std::string_view whole) {
            return name.size() >= kShortest && whole.starts_with(name);
        });
    return day == std::end(kDays) ? std::nullopt
                                  : std::optional(static_cast<size_t>(day - std::begin(kDays)));
}

// A day, or the days from one to another, also over the end of the week.
bool addDays(std::string_view part, std::string &week) {
    const auto *const word = std::find_if(std::begin(kWords), std::end(kWords),
                                          [&](const auto &row) { return row.word == part; });
    if (word != std::end(kWords)) {
        std::transform(week.begin(), week.end(), word->week.begin(), week.begin(),
                       [](char one, char other) { return std::max(one, other); });
        return true;
    }
    const size_t dash = part.find('-');
    const auto first = dayNamed(part.substr(0, dash));
    const auto last = dash == std::string_view::npos ? first : dayNamed(part.substr(dash + 1));
    if (!first || !last) {
        return false;
    }
    for (size_t day = *first;; day = (day + 1) % TAVI_SCHED_WEEK_DAYS) {
        week[day] = '1';
        if (day == *last) {
            return true;
        }
    }
}

} // namespace

std::string parseDays(std::string_view text, const char *option) {
    std::string lower(text);
    std::transform(lower.begin(), lower.end(), lower.begin(),
                   [](unsigned char letter) { return std::tolower(letter); });
    std::string week(TAVI_SCHED_WEEK_DAYS, '0');
    for (const std::string &part : split(lower, ',')) {
        const size_t begin = part.find_first_not_of(' ');
        const size_t end = part.find_last_not_of(' ');
        const std::string day =
            begin == std::string::npos ? "" : part.substr(begin, end - begin + 1);
        if (!addDays(day, week)) {
            throw Refusal(
                std::string(option) + ": \"" + printable(day) +
                    "\" is no day of the week; accepted: a list such as Mon,Fri or Mon-Fri of "
                    "Sun, Mon, Tue, Wed, Thu, Fri, Sat, and weekdays, weekend, daily",
                option + std::string_view("--").size());
        }
    }
    return week;
}

} // namespace tavisched
