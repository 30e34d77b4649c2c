// Several changes as one.
#include "batch.h"
#include "change.h"
#include "runs/run_changes.h"
#include "sched_backend.h"
#include "sched_guard.h"

#include <algorithm>
#include <array>
#include <memory>
#include <pthread.h>
#include <span>
#include <vector>

namespace {

struct Deferred {
    sched::ChangeHook hook;
    int result;
};

struct Consequence {
    void (*act)(int32_t id);
    int32_t id;
};

struct Batch {
    sched::Change change;
    std::vector<Deferred> hooks;
    std::vector<Consequence> consequences;
};

std::unique_ptr<Batch> batch;
std::array<sched::BatchPart, TAVI_SCHED_MAX_BACKENDS> allParts;
size_t partCount = 0;

std::span<const sched::BatchPart> parts() {
    return {allParts.data(), partCount};
}

void forgetStaged() {
    for (const sched::BatchPart &part : parts()) {
        part.forget();
    }
}

// A child has no part in its parent's batch. What it holds is the parent's to end: it is left
// alone.
void leaveInChild() {
    forgetStaged();
    [[maybe_unused]] const Batch *const parents = batch.release();
}

// What backends do from here on is done at once.
std::unique_ptr<Batch> close() {
    forgetStaged();
    return std::move(batch);
}

// The handlers are told when the lock is released: they may change tasks themselves.
void end(std::unique_ptr<Batch> ended, bool stored) {
    std::vector<Deferred> hooks = std::move(ended->hooks);
    const auto consequences = std::move(ended->consequences);
    ended.reset();
    const sched::KeptError error;
    for (const Consequence &consequence : consequences) {
        if (stored) {
            consequence.act(consequence.id);
        }
    }
    for (Deferred &deferred : hooks) {
        deferred.hook.afterwards(stored ? deferred.result : -1);
    }
}

int forEachTouched(int (*sched::BatchPart::*step)()) {
    for (const sched::BatchPart &part : parts()) {
        if (part.isTouched() && (part.*step)() != 0) {
            return -1;
        }
    }
    return 0;
}

int storeAll() {
    sched::Before before;
    bool touched = false;
    for (const sched::BatchPart &part : parts()) {
        if (part.isTouched()) {
            touched = true;
            if (part.describe(before) != 0) {
                return -1;
            }
        }
    }
    if (!touched) {
        return 0;
    }
    if (sched::Change::record(before) != 0 || forEachTouched(&sched::BatchPart::store) != 0 ||
        forEachTouched(&sched::BatchPart::apply) != 0) {
        return -1;
    }
    return 0;
}

// A program that ends without having ended its batch has not stored it.
void dropOpenBatch() {
    if (batch) {
        end(close(), false);
    }
}

} // namespace

void sched::joinBatches(const BatchPart &part) {
    const auto joined = parts();
    const bool isNew = std::none_of(joined.begin(), joined.end(), [&](const BatchPart &other) {
        return other.store == part.store;
    });
    if (isNew && partCount < allParts.size()) {
        allParts[partCount++] = part;
    }
}

bool sched::isBatchOpen() {
    return batch != nullptr;
}

void sched::deferHook(ChangeHook &hook, int result) {
    const int deferred = guarded(SCHED_SITE, [&] {
        batch->hooks.reserve(batch->hooks.size() + 1);
        return 0;
    });
    if (deferred == 0) {
        batch->hooks.push_back({std::move(hook), result});
    } else {
        hook.after(-1);
    }
}

void sched::whenStored(void (*consequence)(int32_t id), int32_t id) {
    const bool isKept = batch && guarded(
                                     SCHED_SITE,
                                     [&] {
                                         batch->consequences.push_back({consequence, id});
                                         return true;
                                     },
                                     false);
    if (!isKept) {
        consequence(id);
    }
}

int TAVISchedChangeBegin() {
    SCHED_REQUIRE(!batch, "no change has begun", -1);
    if (sched::initBackends(SCHED_SITE) != 0) {
        return -1;
    }
    sched::recordMissedRuns();
    return sched::guarded(
        SCHED_SITE,
        [] {
            auto begun = std::make_unique<Batch>();
            if (!begun->change) {
                return -1;
            }
            static const int registered =
                pthread_atfork(nullptr, nullptr, leaveInChild) + std::atexit(dropOpenBatch);
            static_cast<void>(registered);
            batch = std::move(begun);
            return 0;
        },
        -1);
}

int TAVISchedChangeCommit() {
    SCHED_REQUIRE(batch, "a change has begun", -1);
    int result = sched::guarded(SCHED_SITE, storeAll, -1);
    auto ended = close();
    if (result == 0) {
        result = ended->change.finish();
    } else {
        ended->change.rollBack();
    }
    end(std::move(ended), result == 0);
    return result;
}

int TAVISchedChangeRollback() {
    SCHED_REQUIRE(batch, "a change has begun", -1);
    end(close(), false);
    return 0;
}
