// Several changes as one: what they change is kept in memory, where only this process sees it, and
// stored together. Each backend takes part with what it stages.
#pragma once

#include "change_record.h"
#include "sched_hook.h"

namespace sched {

// A backend's part in a batch. Every function answers 0 or -1, with error and log line.
struct BatchPart {
    bool (*isTouched)();
    int (*describe)(Before &before); // adds what store() overwrites
    int (*store)();                  // the files
    int (*apply)();                  // what follows from them: crontab, wake alarm
    void (*forget)();                // drops what was staged
};

// Each backend takes part; once is enough.
void joinBatches(const BatchPart &part);

// A batch of this process goes on.
bool isBatchOpen();

// Keeps a hook until the batch ends: its POST phase runs then, with the result of its operation, or
// with -1 when the batch is rolled back.
void deferHook(ChangeHook &hook, int result);

// What follows for an id from a change that is stored: done at once, or when the batch has been
// stored; also at once when there is no memory to remember it.
void whenStored(void (*consequence)(int32_t id), int32_t id);

} // namespace sched
