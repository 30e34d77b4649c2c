// What the library finds wrong with the machine.
#pragma once

#include "tavischeduler.h"

#include <memory>
#include <string>
#include <vector>

namespace tavisched {

class Findings {
  public:
    // Everything, or what is named (TAVISchedMachineCheckOf).
    static Findings all();
    static Findings of(std::vector<const char *> names);

    const TAVI_SCHED_FINDING *first() const { return list_.get(); }
    bool any() const { return list_ != nullptr; }

  private:
    struct Release {
        void operator()(TAVI_SCHED_FINDING *head) const { TAVISchedFindingListFree(&head); }
    };
    std::unique_ptr<TAVI_SCHED_FINDING, Release> list_;
};

// "what is wrong; what to do about it", on one line.
std::string inWords(const TAVI_SCHED_FINDING &finding);

// Tells on standard error what of the named is wrong. Whether anything is.
bool warnOf(const std::vector<const char *> &names);
// What keeps every task from running.
inline bool warnWhenNothingRuns() {
    return warnOf({"runner", "cron", "crontab"});
}

} // namespace tavisched
