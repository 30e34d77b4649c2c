// The limits of the records, from their configuration file.
#include "limits.h"
#include "platc.h"
#include "sched_error.h"
#include "sched_guard.h"
#include "sched_handle.h"
#include "sched_paths.h"

#include <charconv>
#include <string_view>

namespace {

using Faults = std::vector<std::string>;

constexpr TAVI_SCHED_RUN_LIMITS kDefaults{.runsPerTask = 50, .runs = 10000, .skipped = 0};

void readLimit(std::string_view key, std::string_view value, int32_t &limit, Faults &faults) {
    int32_t number = 0;
    const auto [end, error] = std::from_chars(value.data(), value.data() + value.size(), number);
    if (error != std::errc() || end != value.data() + value.size() || number <= 0) {
        faults.push_back(std::string(key) + " is no number above 0: " + std::string(value));
        return;
    }
    limit = number;
}

void readFlag(std::string_view key, std::string_view value, int32_t &flag, Faults &faults) {
    if (value != "0" && value != "1") {
        faults.push_back(std::string(key) + " is neither 0 nor 1: " + std::string(value));
        return;
    }
    flag = value == "1" ? 1 : 0;
}

TAVI_SCHED_RUN_LIMITS readLimits(Faults &faults) {
    TAVI_SCHED_RUN_LIMITS limits = kDefaults;
    sched::Hash section(8);
    sched::List keys(8);
    if (!section || !keys || PLATCFileExist(sched::kRunLimits) != 1) {
        return limits;
    }
    if (PLATCFileGetSection(sched::kRunLimits, "limits", section.address()) != 1) {
        faults.emplace_back("there is no section [limits]");
        return limits;
    }
    const int count = PLATCSzHashEnumKey(section.get(), keys.address());
    for (int i = 0; i < count; ++i) {
        const std::string_view key = PLATCSzListGet(keys.get(), i);
        const char *const value = PLATCSzHashGetValue(section.get(), key.data());
        if (key == "runs_per_task") {
            readLimit(key, value, limits.runsPerTask, faults);
        } else if (key == "runs") {
            readLimit(key, value, limits.runs, faults);
        } else if (key == "skipped") {
            readFlag(key, value, limits.skipped, faults);
        } else {
            faults.push_back("there is no limit of the name " + std::string(key));
        }
    }
    return limits;
}

} // namespace

TAVI_SCHED_RUN_LIMITS sched::readRunLimits() {
    Faults faults;
    const TAVI_SCHED_RUN_LIMITS limits = readLimits(faults);
    for (const std::string &fault : faults) {
        SCHED_LOG("%s: %s", kRunLimits, LogText(fault.c_str()).c_str());
    }
    return limits;
}

std::vector<std::string> sched::faultsOfRunLimits() {
    Faults faults;
    readLimits(faults);
    return faults;
}

int TAVISchedRunLimitsGet(TAVI_SCHED_RUN_LIMITS *pLimits) {
    SCHED_REQUIRE(pLimits, "((void *)0) != pLimits", -1);
    return sched::guarded(SCHED_SITE, [&] {
        *pLimits = sched::readRunLimits();
        return 0;
    });
}
