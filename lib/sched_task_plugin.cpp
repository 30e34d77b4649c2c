// The plug-in hooks: other packages are told of a task's change with its old and new fields.
#include "platplugin.h"
#include "sched_error.h"
#include "sched_text.h"
#include "tavischeduler.h"

#include <array>
#include <cstdio>

static_assert(TAVI_SCHED_PLUGIN_PRE == PLATPLUGIN_PHASE_PRE &&
              TAVI_SCHED_PLUGIN_POST == PLATPLUGIN_PHASE_POST);

namespace {

// Sets one task's arguments until the first failure. Every value passes through 32 bytes: longer
// texts reach the handlers cut to 31 characters, and handlers rely on that bound.
class TaskArguments {
  public:
    TaskArguments(PLATPLUGIN *plugin, const char *prefix) : plugin_(plugin), prefix_(prefix) {}

    bool set(const char *suffix, int32_t value) {
        std::snprintf(value_.data(), value_.size(), "%ld", static_cast<long>(value));
        return pass(suffix);
    }
    bool set(const char *suffix, uint32_t value) {
        std::snprintf(value_.data(), value_.size(), "%u", value);
        return pass(suffix);
    }
    bool set(const char *suffix, const char *value) {
        sched::copyText(value_.data(), value_.size(), value);
        return pass(suffix);
    }

  private:
    bool pass(const char *suffix) {
        std::array<char, 32> name{};
        std::snprintf(name.data(), name.size(), "%s_%s", prefix_, suffix);
        return PLATPluginSetArg(plugin_, name.data(), value_.data()) >= 0;
    }

    PLATPLUGIN *plugin_;
    const char *prefix_;
    std::array<char, 32> value_{};
};

bool setArguments(PLATPLUGIN *plugin, const char *prefix, const TAVI_SCHED_TASK *task) {
    if (!task) {
        return true;
    }
    TaskArguments arguments(plugin, prefix);
    return arguments.set("TASK_ID", task->id) && arguments.set("BACKEND", task->backend) &&
           arguments.set("OWNER", task->owner) && arguments.set("NAME", task->name) &&
           arguments.set("STATE", task->state) && arguments.set("TYPE", task->type) &&
           arguments.set("APP", task->app) && arguments.set("YEAR", task->startYear) &&
           arguments.set("MONTH", task->startMonth) && arguments.set("DAY", task->startDay) &&
           arguments.set("HOUR", task->runHour) && arguments.set("MIN", task->runMin) &&
           arguments.set("REPEAT_HOUR", task->repeatHour) &&
           arguments.set("LAST_WORK_HOUR", task->lastWorkHour) && arguments.set("WEEK", task->week);
}

} // namespace

int TAVISchedTaskPluginInit(TAVI_SCHED_PLUGIN *pPlugin, const char *szAction,
                            const TAVI_SCHED_TASK *pOrgTask, const TAVI_SCHED_TASK *pNewTask) {
    if (!pPlugin || !szAction || (!pOrgTask && !pNewTask)) {
        SCHED_SET_ERROR(sched::kInvalidArgument);
        SCHED_LOG("Bad parameters");
        if (pPlugin) {
            pPlugin->handle = nullptr;
        }
        return -1;
    }
    *pPlugin = {.handle = nullptr, .result = 0, .orgTask = pOrgTask, .newTask = pNewTask};
    if (PLATPluginInit("task_scheduler", szAction, &pPlugin->handle) < 0) {
        SCHED_LOG("Fail to do plugin init[0x%04X %s:%d]", SCHED_LAST_ERROR);
        pPlugin->handle = nullptr;
        return -1;
    }
    return 0;
}

int TAVISchedTaskPlugin(int phase, TAVI_SCHED_PLUGIN *pPlugin) {
    if (!pPlugin || !pPlugin->handle) {
        return -1;
    }
    if (!pPlugin->orgTask && !pPlugin->newTask) {
        SCHED_SET_ERROR(sched::kInvalidArgument);
        return -1;
    }
    if (PLATPluginSetArgByInt(pPlugin->handle, "RESULT", pPlugin->result) < 0 ||
        !setArguments(pPlugin->handle, "ORG", pPlugin->orgTask) ||
        !setArguments(pPlugin->handle, "NEW", pPlugin->newTask)) {
        return -1;
    }
    return PLATPluginAction(phase, pPlugin->handle);
}

int TAVISchedTaskPluginExit(TAVI_SCHED_PLUGIN *pPlugin) {
    if (!pPlugin) {
        SCHED_SET_ERROR(sched::kInvalidArgument);
        return -1;
    }
    if (PLATPluginExit(&pPlugin->handle) < 0) {
        SCHED_LOG("Fail to do plugin exit[0x%04X %s:%d]", SCHED_LAST_ERROR);
        return -1;
    }
    return 0;
}
