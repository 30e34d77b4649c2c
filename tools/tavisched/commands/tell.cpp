// How "add" and "edit" tell of the task that they have stored, or would store.
#include "commands/tell.h"
#include "tasks/report.h"
#include "json/json.h"
#include "json/plain.h"

#include <cstdio>

namespace tavisched {

namespace {

void printId(const TAVI_SCHED_TASK &task) {
    std::printf("%ld\n", static_cast<long>(task.id));
}

void printPlain(const TAVI_SCHED_TASK &task, const Tasks &stored) {
    printJson(plainTaskWithStarts(task, readLatestRunOf(task.id), notesOn(task, stored.all())));
}

} // namespace

void tellStored(const TAVI_SCHED_TASK &task, int32_t idBefore, const Manner &manner) {
    if (manner.quiet) {
        printId(task);
        return;
    }
    const Tasks stored = Tasks::read();
    if (manner.json) {
        printPlain(*asListed(task, stored), stored);
    } else {
        print(reportOf(task, idBefore, stored));
    }
}

void tellPreview(TAVI_SCHED_TASK &task, const Tasks &stored, const Manner &manner) {
    computeNextRun(task);
    if (manner.quiet) {
        printId(task);
    } else if (manner.json) {
        printPlain(task, stored);
    } else {
        print(previewOf(task, stored));
    }
}

} // namespace tavisched
