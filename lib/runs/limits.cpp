// The limits of the records, from their configuration file.
#include "limits.h"
#include "platc.h"
#include "sched_error.h"
#include "sched_handle.h"
#include "sched_paths.h"

#include <charconv>
#include <string_view>

namespace {

constexpr TAVI_SCHED_RUN_LIMITS kDefaults{.runsPerTask = 50, .runs = 10000};

void readLimit(PLATCSZHASH *section, const char *key, int32_t &limit) {
    const char *const value = PLATCSzHashGetValue(section, key);
    if (!value) {
        return;
    }
    const std::string_view text(value);
    int32_t number = 0;
    const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
    if (error != std::errc() || end != text.data() + text.size() || number <= 0) {
        SCHED_LOG("%s: %s is no number above 0: %s", sched::kRunLimits, key,
                  sched::LogText(value).c_str());
        return;
    }
    limit = number;
}

} // namespace

TAVI_SCHED_RUN_LIMITS sched::readRunLimits() {
    TAVI_SCHED_RUN_LIMITS limits = kDefaults;
    Hash section(8);
    if (section && PLATCFileExist(kRunLimits) == 1 &&
        PLATCFileGetSection(kRunLimits, "limits", section.address()) == 1) {
        readLimit(section.get(), "runs_per_task", limits.runsPerTask);
        readLimit(section.get(), "runs", limits.runs);
    }
    return limits;
}

int TAVISchedRunLimitsGet(TAVI_SCHED_RUN_LIMITS *pLimits) {
    SCHED_REQUIRE(pLimits, "((void *)0) != pLimits", -1);
    *pLimits = sched::readRunLimits();
    return 0;
}
