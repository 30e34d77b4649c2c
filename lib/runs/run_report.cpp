// The handlers of runs: executables that are started as "HANDLER task_run post".
#include "run_report.h"
#include "base/child.h"
#include "platplugin.h"
#include "run_output.h"
#include "run_words.h"
#include "sched_error.h"

#include <array>
#include <csignal>
#include <cstdio>
#include <ctime>
#include <string>
#include <unistd.h>
#include <utility>

namespace {

constexpr int64_t kLongest = 60; // seconds

// "2026-11-21T22:00:00+01:00"; "" for what did not happen.
std::string isoTime(int64_t milliseconds) {
    const auto time = static_cast<time_t>(milliseconds / 1000);
    tm local{};
    std::array<char, 64> text{};
    if (milliseconds == 0 || !localtime_r(&time, &local) ||
        std::strftime(text.data(), text.size(), "%FT%T%z", &local) == 0) {
        return "";
    }
    std::string iso(text.data());
    return iso.insert(iso.size() - 2, ":");
}

std::string seconds(int64_t milliseconds) {
    std::array<char, 32> text{};
    std::snprintf(text.data(), text.size(), "%lld.%03d",
                  static_cast<long long>(milliseconds / 1000),
                  static_cast<int>(milliseconds % 1000));
    return text.data();
}

bool setArguments(PLATPLUGIN *plugin, const TAVI_SCHED_RUN &run) {
    const std::pair<const char *, std::string> arguments[] = {
        {"TASK_ID", std::to_string(run.taskId)},
        {"TASK_NAME", run.name},
        {"TASK_OWNER", std::to_string(run.owner)},
        {"RUN_ID", std::to_string(run.run)},
        {"RUN_MODE", run.mode == 1 ? "cron" : "hand"},
        {"RUN_RESULT", sched::resultWord(run.result)},
        {"RUN_RESULT_TEXT", sched::resultWords(run)},
        {"RUN_RESULT_CODE", std::to_string(run.result)},
        {"RUN_NUMBER", std::to_string(run.number)},
        {"RUN_DUE", isoTime(run.due)},
        {"RUN_ASKED", isoTime(run.asked)},
        {"RUN_BEGAN", isoTime(run.began)},
        {"RUN_ENDED", isoTime(run.ended)},
        {"RUN_ENDED_AT", std::to_string(run.ended / 1000)},
        {"RUN_DURATION", seconds(run.duration)},
        {"RUN_WAITED", std::to_string(run.waited)},
        {"RUN_OUTPUT", run.began == 0 || run.run == 0 ? "" : sched::outputPathOf(run.run)},
        {"RUN_OUTPUT_SIZE", std::to_string(run.outputSize)},
    };
    for (const auto &[name, value] : arguments) {
        if (PLATPluginSetArg(plugin, name, value.c_str()) < 0) {
            return false;
        }
    }
    return true;
}

} // namespace

void sched::runHandlers(const TAVI_SCHED_RUN &run) {
    PLATPLUGIN *plugin = nullptr;
    if (PLATPluginInit("task_scheduler_run", "task_run", &plugin) < 0) {
        SCHED_LOG("Fail to do plugin init[0x%04X %s:%d]", SCHED_LAST_ERROR);
        return;
    }
    if (!setArguments(plugin, run) || PLATPluginAction(PLATPLUGIN_PHASE_POST, plugin) < 0) {
        SCHED_LOG("Fail to execute run plugin (POST) [0x%04X %s:%d]", SCHED_LAST_ERROR);
    }
    PLATPluginExit(&plugin);
}

void sched::endHangingHandlers(pid_t process) {
    timespec now{};
    clock_gettime(CLOCK_BOOTTIME, &now);
    const int64_t latest = (now.tv_sec - kLongest) * sysconf(_SC_CLK_TCK);
    for (const base::Process &handler : base::descendantsOf(process)) {
        if (handler.parent != process || handler.start > latest) {
            continue;
        }
        SCHED_LOG("a handler of runs is ended after %lld seconds, process %d",
                  static_cast<long long>(kLongest), static_cast<int>(handler.pid));
        for (const base::Process &started : base::descendantsOf(handler.pid)) {
            base::sendSignal(started, SIGKILL);
        }
        base::sendSignal(handler, SIGKILL);
    }
}
