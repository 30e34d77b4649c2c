// The line of a task: when it runs, in cron's fields, and the runner with the task's id.
#include "cron/cron_line.h"
#include "sched_calendar.h"
#include "sched_error.h"
#include "sched_paths.h"

#include <cstdarg>
#include <cstdio>
#include <cstring>

namespace {

// A comma-separated list in a bounded buffer; an entry that does not fit is left out.
template <size_t size> class NumberList {
  public:
    bool add(int number) {
        std::array<char, 16> entry{};
        const int length =
            std::snprintf(entry.data(), entry.size(), "%s%d", length_ == 0 ? "" : ",", number);
        if (length_ + static_cast<size_t>(length) >= size) {
            return false;
        }
        std::memcpy(text_.data() + length_, entry.data(), static_cast<size_t>(length));
        length_ += static_cast<size_t>(length);
        return true;
    }
    const char *c_str() const { return text_.data(); }

  private:
    std::array<char, size> text_{};
    size_t length_ = 0;
};

NumberList<128> hourList(const TAVI_SCHED_TASK &task) {
    NumberList<128> hours;
    sched::forEachRunHour(task, [&](uint64_t hour) { return hours.add(static_cast<int>(hour)); });
    return hours;
}

NumberList<16> weekDayList(const TAVI_SCHED_TASK &task) {
    NumberList<16> days;
    for (uint32_t day = 0; day < TAVI_SCHED_WEEK_DAYS; ++day) {
        if (sched::runsOnWeekDay(task, day)) {
            days.add(static_cast<int>(day));
        }
    }
    return days;
}

} // namespace

namespace sched {

CronLine::CronLine(const TAVI_SCHED_TASK &task) {
    addTime(task);
    addDate(task);
    add("root\t%s --run id=%ld", kRunner, static_cast<long>(task.id));
}

void CronLine::add(const char *format, ...) {
    va_list arguments;
    va_start(arguments, format);
    const int length =
        std::vsnprintf(text_.data() + length_, text_.size() - length_, format, arguments);
    va_end(arguments);
    length_ += static_cast<size_t>(length);
}

void CronLine::addTime(const TAVI_SCHED_TASK &task) {
    if (task.repeatHour == 0) {
        add("%u\t%u\t", task.runMin, task.runHour);
    } else {
        add("%u\t%s\t", task.runMin, hourList(task).c_str());
    }
}

// A once task gets the line of a yearly one, without its year: the due test keeps it from running
// again, and the line stays until the task is changed.
void CronLine::addDate(const TAVI_SCHED_TASK &task) {
    switch (task.type) {
    case TAVI_SCHED_TYPE_ONCE:
    case TAVI_SCHED_TYPE_YEARLY:
        add("%u\t%u\t*\t", task.startDay, task.startMonth);
        break;
    case TAVI_SCHED_TYPE_MONTHLY:
        add("%u\t*\t*\t", task.startDay);
        break;
    case TAVI_SCHED_TYPE_WEEKLY:
        add("*\t*\t%s\t", weekDayList(task).c_str());
        break;
    default:
        add("*\t*\t*\t");
        break;
    }
}

} // namespace sched

int TAVISchedCrontabLine(const TAVI_SCHED_TASK *pTask, char *szBuf, size_t cbBuf) {
    SCHED_REQUIRE(pTask, "((void *)0) != pTask", -1);
    SCHED_REQUIRE(szBuf, "((void *)0) != szBuf", -1);
    const sched::CronLine line(*pTask);
    SCHED_REQUIRE(cbBuf > line.size(), "length < cbBuf", -1);
    std::memcpy(szBuf, line.c_str(), line.size() + 1);
    return 0;
}
