// Rewriting the runner's lines of /etc/crontab through a temporary file in the same folder.
#include "crontab.h"
#include "base/child.h"
#include "base/file.h"
#include "cron/runner.h"
#include "platc.h"
#include "sched_error.h"
#include "sched_guard.h"
#include "sched_handle.h"
#include "sched_paths.h"

#include <algorithm>
#include <array>
#include <cstdio>
#include <cstdlib>
#include <fcntl.h>
#include <string_view>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

namespace {

constexpr const char *kSignalCron = "/bin/kill -HUP `/bin/cat /var/run/crond.pid` > /dev/null 2>&1";

// The rewrite reports as the backend's own source.
constexpr const char *kSource = "backends/backend_tavischedule.cpp";

int fail(unsigned int code, int line) {
    PLATCErrSetEx(code, kSource, line);
    return -1;
}

// ---- The new file ----

// Each step of the replacement has its code and its site number.
int failStep(base::Replacement::Step step) {
    using Step = base::Replacement::Step;
    switch (step) {
    case Step::Create:
        return fail(sched::kOpenFailed, 185);
    case Step::Stream:
        return fail(sched::kOpenFailed, 189);
    case Step::Write:
        return fail(sched::kReadWriteFailed, 200);
    case Step::Flush:
        return fail(sched::kReadWriteFailed, 225);
    case Step::Attributes:
        return fail(sched::kReadWriteFailed, 231);
    case Step::Close:
        return fail(sched::kReadWriteFailed, 235);
    case Step::Rename:
        return fail(sched::kRenameFailed, 240);
    default:
        return fail(sched::kReadWriteFailed, 241);
    }
}

// The id in the runner's argument of a line; "" for a line that has none.
std::string_view idInLine(std::string_view line) {
    constexpr std::string_view kArgument = " --run id=";
    const size_t at = line.find(kArgument);
    if (at == std::string_view::npos) {
        return {};
    }
    line.remove_prefix(at + kArgument.size());
    return line.substr(0, line.find_first_of(" \t\n"));
}

// The lines that stay: those that do not name the runner, and those of tasks that are there but
// cannot be read just now.
bool stays(std::string_view line, const std::vector<std::string> &unreadable) {
    return line.find(sched::kRunner) == std::string_view::npos ||
           std::find(unreadable.begin(), unreadable.end(), idInLine(line)) != unreadable.end();
}

// `endsOpen` tells that the last line copied has no line feed.
int copyLines(FILE *from, base::Replacement &to, const std::vector<std::string> &unreadable,
              bool &endsOpen) {
    char *buffer = nullptr;
    size_t capacity = 0;
    ssize_t length = 0;
    bool written = true;
    while (written && (length = getdelim(&buffer, &capacity, '\n', from)) != -1) {
        const std::string_view line(buffer, static_cast<size_t>(length));
        if (stays(line, unreadable)) {
            written = to.write(line);
            endsOpen = line.back() != '\n';
        }
    }
    std::free(buffer);
    if (!written) {
        return failStep(to.failedStep());
    }
    return std::feof(from) ? 0 : fail(sched::kReadWriteFailed, 207);
}

// system() with SIGCHLD at its default: in a caller that ignores it there would be no result.
int runSignalCommand() {
    const base::ChildSignals signals;
    return std::system(kSignalCron);
}

void signalCron() {
    if (PLATCFileExist(sched::kCronPid) && runSignalCommand() != 0) {
        syslog(LOG_ERR, "%s:%d Failed to hup crond.", kSource, 245);
    }
}

} // namespace

int sched::rewriteCrontab(const RunnerLines &lines) {
    const File old(std::fopen(kCrontab, "re"));
    if (!old) {
        return lines.openFailure == 0 ? -1 : fail(lines.openFailure, __LINE__);
    }
    struct stat status {};
    if (fstat(fileno(old.get()), &status) != 0) {
        return fail(kStatFailed, 175);
    }
    if (S_ISDIR(status.st_mode)) {
        return fail(kOpenFailed, 179);
    }
    if (!lines.text.empty()) {
        const KeptError error;
        ensureRunner();
    }
    base::Replacement crontab(kCrontab);
    bool endsOpen = false;
    if (!crontab.open()) {
        return failStep(crontab.failedStep());
    }
    if (copyLines(old.get(), crontab, lines.unreadable, endsOpen) != 0) {
        return -1;
    }
    // Write errors are found when the stream is flushed.
    crontab.write(endsOpen && !lines.text.empty() ? "\n" : "");
    crontab.write(lines.text);
    if (!crontab.commit({.like = &status, .folderToo = false, .later = true})) {
        return failStep(crontab.failedStep());
    }
    // The new file is in place: without the flush a loss of power may bring the old one back, and
    // the start of the machine writes it anew.
    if (!base::syncFolderOf(kCrontab)) {
        syslog(LOG_ERR, "%s:%d the folder of %s cannot be flushed: %m", "backends/crontab.cpp",
               __LINE__, kCrontab);
    }
    signalCron();
    return 0;
}
