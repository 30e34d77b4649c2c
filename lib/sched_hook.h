// The plug-in hooks around one change of a task: prepared when it begins, told its result when it
// ends.
#pragma once

#include "platplugin.h"
#include "sched_error.h"
#include "sched_guard.h"
#include "sched_handle.h"
#include "tavischeduler.h"

#include <optional>

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
    // The error of an operation that failed outlives its handlers' errors.
    void after(int result) {
        if (!context_) {
            return;
        }
        std::optional<KeptError> error;
        if (result < 0) {
            error.emplace();
        }
        context_->result = result;
        finish(TAVISchedTaskPlugin(TAVI_SCHED_PLUGIN_POST, context_.get()));
    }

    // The same when the tasks are gone: the handle has kept their fields since the PRE phase.
    void afterwards(int result) {
        if (context_) {
            PLATPLUGIN *const handle = context_->handle;
            finish(handle && PLATPluginSetArgByInt(handle, "RESULT", result) >= 0
                       ? PLATPluginAction(TAVI_SCHED_PLUGIN_POST, handle)
                       : -1);
        }
    }

  private:
    void finish(int told) {
        if (told < 0) {
            SCHED_LOG_FOR(site_, "Fail to execute task plugin (POST)");
        }
        TAVISchedTaskPluginExit(context_.get());
        context_.reset();
    }

    Site site_;
    Allocated<TAVI_SCHED_PLUGIN> context_;
    bool initialised_;
};

} // namespace sched
