// Showing what runs did, and stopping one.
#include "base/child.h"
#include "runs/run_changes.h"
#include "runs/run_output.h"
#include "runs/run_records.h"
#include "runs/stop_request.h"
#include "sched_error.h"
#include "sched_guard.h"
#include "sched_paths.h"
#include "tavischeduler.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <ctime>
#include <poll.h>
#include <sys/inotify.h>
#include <unistd.h>

namespace {

constexpr int64_t kLongestWait = 1000; // milliseconds until a run's process is looked for

int fail(unsigned int code, const char *what, int64_t run) {
    SCHED_LOG("run %lld %s", static_cast<long long>(run), what);
    SCHED_SET_ERROR(code);
    return -1;
}

std::optional<sched::RunRecord> findRun(int64_t run) {
    sched::RunRecords records(sched::RunRecords::Mode::Read);
    auto record = records ? records.find(run) : std::nullopt;
    if (!record) {
        fail(sched::kNotFound, "has no record", run);
    }
    return record;
}

int64_t now() {
    timespec time{};
    clock_gettime(CLOCK_MONOTONIC, &time);
    return time.tv_sec * 1000LL + time.tv_nsec / 1000000;
}

// 1 there is more or the run has ended, 0 neither, -1.
int hasNews(int64_t run, int64_t offset) {
    if (sched::outputSizeOf(run).total > offset) {
        return 1;
    }
    const auto record = findRun(run);
    return !record ? -1
           : record->result == TAVI_SCHED_RUN_RUNNING || record->result == TAVI_SCHED_RUN_WAITING
               ? 0
               : 1;
}

// A run that waits has no output yet: then the folder tells.
int follow(int64_t run, int64_t offset, int32_t milliseconds) {
    const base::Descriptor events(inotify_init1(IN_CLOEXEC | IN_NONBLOCK));
    const std::string path = sched::outputPathOf(run);
    const int64_t end = now() + milliseconds;
    for (;;) {
        if (inotify_add_watch(events.get(), path.c_str(), IN_MODIFY | IN_ATTRIB) == -1) {
            inotify_add_watch(events.get(), sched::kOutputFolder, IN_CREATE);
        }
        const int news = hasNews(run, offset);
        const int64_t left = end - now();
        if (news != 0 || left <= 0) {
            return news;
        }
        pollfd file{.fd = events.get(), .events = POLLIN, .revents = 0};
        poll(&file, 1, static_cast<int>(std::min(left, kLongestWait)));
        std::array<char, 4096> told; // NOLINT: nothing of it matters
        while (read(events.get(), told.data(), told.size()) > 0) {
        }
    }
}

int list(const TAVI_SCHED_RUN_FILTER &filter, TAVI_SCHED_RUN_READER reader, void *context) {
    sched::RunRecords records(sched::RunRecords::Mode::Read);
    if (records.isMissing()) {
        return 0;
    }
    if (!records) {
        SCHED_SET_ERROR(sched::kOpenFailed);
        return -1;
    }
    const int count = records.list(
        filter, [&](const sched::RunRecord &record) { return reader(context, &record) == 0; });
    if (count < 0) {
        SCHED_SET_ERROR(sched::kReadWriteFailed);
    }
    return count;
}

} // namespace

int TAVISchedRunList(const TAVI_SCHED_RUN_FILTER *pFilter, TAVI_SCHED_RUN_READER reader,
                     void *pContext) {
    SCHED_REQUIRE(reader, "NULL != reader", -1);
    const TAVI_SCHED_RUN_FILTER all{
        .taskId = -1, .failedOnly = 0, .newestOnly = 0, .limit = 0, .since = 0};
    return sched::guarded(SCHED_SITE,
                          [&] { return list(pFilter ? *pFilter : all, reader, pContext); });
}

int TAVISchedMissedRunsFind() {
    SCHED_REQUIRE(geteuid() == 0, "0 == geteuid()", -1);
    if (sched::findMissedRuns() != 0) {
        SCHED_SET_ERROR(sched::kReadWriteFailed);
        return -1;
    }
    return 0;
}

int TAVISchedRunGet(int64_t run, TAVI_SCHED_RUN *pRun) {
    SCHED_REQUIRE(pRun, "((void *)0) != pRun", -1);
    return sched::guarded(SCHED_SITE, [&] {
        const auto record = findRun(run);
        if (record) {
            *pRun = *record;
        }
        return record ? 0 : -1;
    });
}

int64_t TAVISchedRunOutputRead(int64_t run, int64_t *pOffset, char *pBuf, size_t cbBuf,
                               int64_t *pCut) {
    SCHED_REQUIRE(pOffset, "((void *)0) != pOffset", -1);
    SCHED_REQUIRE(pBuf, "((void *)0) != pBuf", -1);
    SCHED_REQUIRE(cbBuf > 0, "0 < cbBuf", -1);
    SCHED_REQUIRE(*pOffset >= 0, "0 <= *pOffset", -1);
    return sched::guarded(
        SCHED_SITE,
        [&]() -> int64_t {
            const sched::OutputPiece piece = sched::readOutput(run, *pOffset, pBuf, cbBuf);
            if (pCut) {
                *pCut = piece.cut;
            }
            return piece.length >= 0 ? piece.length
                   : errno == ENOENT
                       ? fail(sched::kNotFound, "has no output any more", run)
                       : fail(sched::kReadWriteFailed, "has an output that cannot be read", run);
        },
        int64_t{-1});
}

int TAVISchedRunFollow(int64_t run, int64_t offset, int32_t milliseconds) {
    SCHED_REQUIRE(offset >= 0, "0 <= offset", -1);
    return sched::guarded(SCHED_SITE, [&] { return follow(run, offset, milliseconds); });
}

int TAVISchedRunStop(int64_t run, int32_t graceSeconds) {
    SCHED_REQUIRE(graceSeconds >= 0 && graceSeconds <= sched::StopRequest::kLongestGrace,
                  "0 <= graceSeconds", -1);
    return sched::guarded(SCHED_SITE, [&] {
        const auto record = findRun(run);
        if (!record) {
            return -1;
        }
        if (!sched::goesOn(*record)) {
            return fail(sched::kNotFound, "does not go on", run);
        }
        const base::Process process{
            .pid = record->pid, .parent = -1, .start = record->processStart};
        if (base::sendSignal(process, sched::StopRequest::signal(),
                             sched::StopRequest::valueOf(graceSeconds))) {
            return 0;
        }
        return errno == ESRCH ? fail(sched::kNotFound, "does not go on", run)
                              : fail(sched::kSystemCallFailed, "cannot be asked to end", run);
    });
}
