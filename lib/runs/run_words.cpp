// Results of runs in words.
#include "run_words.h"

#include <algorithm>
#include <iterator>

namespace {

constexpr struct {
    int32_t result;
    const char *word;
} kWords[] = {{TAVI_SCHED_RUN_NONE, "none"},
              {TAVI_SCHED_RUN_INTERRUPTED, "interrupted"},
              {TAVI_SCHED_RUN_RUNNING, "running"},
              {TAVI_SCHED_RUN_SUCCESS, "success"},
              {TAVI_SCHED_RUN_START_FAILED, "not-started"},
              {TAVI_SCHED_RUN_STOPPED, "stopped"},
              {TAVI_SCHED_RUN_SIGNALED, "signal"},
              {TAVI_SCHED_RUN_EXIT_FAILED, "exit"},
              {TAVI_SCHED_RUN_WAITING, "waiting"},
              {TAVI_SCHED_RUN_STOPPED_BY_USER, "stopped-by-user"},
              {TAVI_SCHED_RUN_GIVEN_UP, "given-up"},
              {TAVI_SCHED_RUN_LOCK_FAILED, "lock-failed"},
              {TAVI_SCHED_RUN_DATABASE_FAILED, "database-failed"},
              {TAVI_SCHED_RUN_OWNER_UNKNOWN, "owner-unknown"},
              {TAVI_SCHED_RUN_TASK_REMOVED, "task-removed"},
              {TAVI_SCHED_RUN_TASK_DISABLED, "task-disabled"},
              {TAVI_SCHED_RUN_MISSED, "missed"},
              {TAVI_SCHED_RUN_NOT_DUE, "not-due"}};

} // namespace

const char *sched::resultWord(int32_t result) {
    const auto *const row = std::find_if(std::begin(kWords), std::end(kWords),
                                         [&](const auto &word) { return word.result == result; });
    return row == std::end(kWords) ? "unknown" : row->word;
}

std::string sched::resultWords(const TAVI_SCHED_RUN &run) {
    std::string words = resultWord(run.result);
    switch (run.result) {
    case TAVI_SCHED_RUN_STOPPED:
    case TAVI_SCHED_RUN_SIGNALED:
    case TAVI_SCHED_RUN_EXIT_FAILED:
        return words + " " + std::to_string(run.number);
    case TAVI_SCHED_RUN_GIVEN_UP:
        return words + ", task " + std::to_string(run.waitedFor) + " was running";
    default:
        return words;
    }
}
