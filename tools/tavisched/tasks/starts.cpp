// When tasks will really be started.
#include "tasks/starts.h"
#include "failure.h"
#include "text/words.h"

#include <algorithm>
#include <exception>

namespace tavisched {

namespace {

constexpr size_t kComing = 5;
constexpr int64_t kFarAhead = 10000LL * 366 * 86400; // the library ends with its calendar

// No exception may pass through the library.
struct Collector {
    std::map<const TAVI_SCHED_TASK *, Notes> notes{};
    std::exception_ptr failure{};

    static int add(void *collector, const TAVI_SCHED_REMARK *remark) {
        auto &self = *static_cast<Collector *>(collector);
        try {
            self.notes[remark->task].emplace_back(remark->text);
            return 0;
        } catch (...) {
            self.failure = std::current_exception();
            return -1;
        }
    }
};

std::map<const TAVI_SCHED_TASK *, Notes> collect(const TaskPointers &tasks,
                                                 const TAVI_SCHED_TASK *of) {
    Collector found;
    const int count =
        TAVISchedTaskRemarks(tasks.data(), tasks.size(), of, time(nullptr), Collector::add, &found);
    if (found.failure) {
        std::rethrow_exception(found.failure);
    }
    if (count < 0) {
        throw Failure("the schedules cannot be looked at: " + libraryError());
    }
    return std::move(found.notes);
}

} // namespace

std::optional<time_t> nextStart(const TAVI_SCHED_TASK &task) {
    int64_t start = 0;
    return TAVISchedTaskNextStart(&task, time(nullptr), &start) == 1 ? std::optional<time_t>(start)
                                                                     : std::nullopt;
}

std::string nextStartInWords(const TAVI_SCHED_TASK &task) {
    const auto next = nextStart(task);
    return next ? localMinute(*next) : "never";
}

std::vector<time_t> startsOf(const TAVI_SCHED_TASK &task, time_t from, time_t until, size_t most) {
    std::vector<time_t> all;
    std::vector<int64_t> piece(std::min<size_t>(most, 1000));
    while (all.size() < most) {
        const size_t wanted = std::min(piece.size(), most - all.size());
        const int count = TAVISchedTaskStarts(&task, from, until, piece.data(), wanted);
        all.insert(all.end(), piece.begin(), piece.begin() + std::max(count, 0));
        if (count < static_cast<int>(wanted)) {
            break;
        }
        from = all.back() + 1;
    }
    return all;
}

std::vector<time_t> comingStarts(const TAVI_SCHED_TASK &task) {
    const auto next = nextStart(task);
    return next ? startsOf(task, *next, kFarAhead, kComing) : std::vector<time_t>();
}

Notes notesOn(const TAVI_SCHED_TASK &task, const TaskPointers &stored) {
    return collect(stored, &task)[&task];
}

std::map<const TAVI_SCHED_TASK *, Notes> notesOnAll(const TaskPointers &tasks) {
    return collect(tasks, nullptr);
}

std::vector<TAVI_SCHED_SPAN> offHours(const TaskPointers &tasks, time_t from, time_t until) {
    constexpr size_t kMostADay = 200; // schedules of each kind, and one that goes on
    const auto days = static_cast<size_t>((until - from) / 86400 + 2);
    std::vector<TAVI_SCHED_SPAN> spans(days * kMostADay);
    const int count =
        TAVISchedOffHours(tasks.data(), tasks.size(), from, until, spans.data(), spans.size());
    spans.resize(static_cast<size_t>(std::max(count, 0)));
    return spans;
}

} // namespace tavisched
