// The plug-in hooks around one change of a task: prepared when it begins, told its result when it
// ends.
#pragma once

#include "sched_error.h"
#include "sched_handle.h"
#include "tavischeduler.h"

namespace sched {

class ChangeHook {
  public:
    // Failures are logged for the site, the changing operation's.
    ChangeHook(const Site &site, const char *action, const TAVI_SCHED_TASK *orgTask,
               const TAVI_SCHED_TASK *newTask)
        : site_(site),
          context_(static_cast<TAVI_SCHED_PLUGIN *>(std::calloc(1, sizeof(TAVI_SCHED_PLUGIN)))),
          initialised_(TAVISchedTaskPluginInit(context_.get(), action, orgTask, newTask) == 0) {}

    bool initialised() const { return initialised_; }

    // A hook cannot veto: its failure is only logged.
    void before() {
        if (TAVISchedTaskPlugin(TAVI_SCHED_PLUGIN_PRE, context_.get()) < 0) {
            SCHED_LOG_FOR(site_, "Fail to execute task plugin (PRE)");
        }
    }

    // Tells the handlers the result and releases the context. Nothing when it was never allocated.
    void after(int result) {
        if (!context_) {
            return;
        }
        context_->result = result;
        if (TAVISchedTaskPlugin(TAVI_SCHED_PLUGIN_POST, context_.get()) < 0) {
            SCHED_LOG_FOR(site_, "Fail to execute task plugin (POST)");
        }
        TAVISchedTaskPluginExit(context_.get());
        context_.reset();
    }

  private:
    Site site_;
    Allocated<TAVI_SCHED_PLUGIN> context_;
    bool initialised_;
};

} // namespace sched
