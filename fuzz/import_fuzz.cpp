// The text that "tavisched import" reads: what it takes is sound, and comes back from both forms of
// an export; what it refuses can go to a terminal.
#include "failure.h"
#include "fuzz.h"
#include "text/utf8.h"
#include "json/import.h"
#include "json/web.h"

#include <json/writer.h>

namespace {

using tavisched::Imported;

Json::Value exported(const TAVI_SCHED_TASK &task, bool web) {
    return web ? tavisched::webTask(task) : tavisched::plainStored(task);
}

void requireSame(const std::vector<Imported> &tasks, bool web) {
    Json::Value array(Json::arrayValue);
    for (const Imported &each : tasks) {
        if (!web && !tavisched::isUtf8(each.task->command)) {
            return; // an export refuses it
        }
        array.append(exported(*each.task, web));
    }
    const auto again =
        tavisched::parseImport(Json::writeString(Json::StreamWriterBuilder(), array));
    REQUIRE(again.size() == tasks.size());
    for (size_t i = 0; i < tasks.size(); ++i) {
        REQUIRE(again[i].task->backend == tasks[i].task->backend);
        REQUIRE(fuzz::formOf(*again[i].task) == fuzz::formOf(*tasks[i].task));
    }
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size) {
    std::vector<Imported> tasks;
    try {
        tasks = tavisched::parseImport(fuzz::Input(data, size).rest());
    } catch (const tavisched::Refusal &refusal) {
        REQUIRE(refusal.what() == tavisched::printableLines(refusal.what()));
        return 0;
    }
    for (const Imported &each : tasks) {
        TAVI_SCHED_FAULT fault{};
        REQUIRE(TAVISchedTaskCheck(each.task.get(), &fault) == 0);
        tavisched::requireExchangeable(*each.task);
    }
    requireSame(tasks, false);
    requireSame(tasks, true);
    return 0;
}
