// Local time.
#include "schedule/clock.h"

namespace sched {

int64_t findChange(int64_t before, int64_t after) {
    const int64_t offset = offsetAt(before);
    while (after - before > 1) {
        const int64_t middle = before + (after - before) / 2;
        (offsetAt(middle) == offset ? before : after) = middle;
    }
    return after;
}

void Clock::moveTo(Day day) {
    const bool follows = day == day_ + std::chrono::days(1);
    day_ = day;
    if (!follows || !hasOffset_ || offsetAt(utcOf(kHours, 0, offset_)) != offset_) {
        findOffset();
    }
}

void Clock::findOffset() {
    offset_ = offsetAt(utcOf(0, 0, offsetAt(utcOf(0, 0, 0))));
    hasOffset_ =
        offsetAt(utcOf(0, 0, offset_)) == offset_ && offsetAt(utcOf(kHours, 0, offset_)) == offset_;
}

std::optional<int64_t> Clock::at(unsigned int hour, unsigned int minute) const {
    const int64_t ordinary = utcOf(hour, minute, offset_);
    if (hasOffset_) {
        return ordinary;
    }
    // The offset before a change of it is that of the first time.
    for (const int64_t offset : {offsetAt(ordinary - kDay), offsetAt(ordinary + kDay)}) {
        const int64_t moment = utcOf(hour, minute, offset);
        if (offsetAt(moment) == offset) {
            return moment;
        }
    }
    return std::nullopt;
}

int64_t Clock::changeAt(unsigned int hour, unsigned int minute) const {
    const int64_t ordinary = utcOf(hour, minute, offset_);
    return findChange(ordinary - kDay, ordinary + kDay);
}

int64_t Clock::asIfUnchanged(unsigned int hour, unsigned int minute) const {
    return utcOf(hour, minute, offsetAt(utcOf(hour, minute, offset_) - kDay));
}

std::vector<Gap> findGaps(int64_t from, int64_t until) {
    std::vector<Gap> gaps;
    int64_t before = offsetAt(from);
    for (int64_t moment = from + kDay; moment < until + kDay; moment += kDay) {
        const int64_t after = offsetAt(moment);
        if (after > before) {
            const int64_t change = findChange(moment - kDay, moment);
            gaps.push_back({.begin = change + before, .end = change + after});
        }
        before = after;
    }
    return gaps;
}

} // namespace sched
