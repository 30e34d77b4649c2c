// Rewriting the runner's lines of /etc/crontab through a temporary file in the same folder.
#include "crontab.h"
#include "cron/cron_line.h"
#include "platc.h"
#include "sched_error.h"
#include "sched_handle.h"
#include "sched_paths.h"

#include <array>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <fcntl.h>
#include <string_view>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

namespace {

using sched::kCronPid;
using sched::kCrontab;
using sched::kRunner;
constexpr const char *kSignalCron = "/bin/kill -HUP `/bin/cat /var/run/crond.pid` > /dev/null 2>&1";

// The rewrite reports as the backend's own source.
constexpr const char *kSource = "backends/backend_tavischedule.cpp";

int fail(unsigned int code, int line) {
    PLATCErrSetEx(code, kSource, line);
    return -1;
}

// ---- The new file ----

// The new crontab until it takes the old one's place; removed unless it did.
class NewCrontab {
  public:
    NewCrontab() = default;
    ~NewCrontab() {
        if (stream_) {
            stream_.reset();
            unlink(path_.data());
        }
    }
    NewCrontab(const NewCrontab &) = delete;
    NewCrontab &operator=(const NewCrontab &) = delete;

    FILE *stream() const { return stream_.get(); }

    int open() {
        std::snprintf(path_.data(), path_.size(), "%s.XXXXXX", kCrontab);
        const int fd = mkostemp(path_.data(), O_CLOEXEC);
        if (fd == -1) {
            return fail(sched::kOpenFailed, 185);
        }
        stream_.reset(fdopen(fd, "w"));
        if (!stream_) {
            fail(sched::kOpenFailed, 189);
            close(fd);
            unlink(path_.data());
            return -1;
        }
        return 0;
    }

    int commit(const struct stat &old) {
        if (std::fflush(stream()) != 0 || std::ferror(stream())) {
            return fail(sched::kReadWriteFailed, 225);
        }
        const int fd = fileno(stream());
        if (fsync(fd) != 0 || fchown(fd, old.st_uid, old.st_gid) != 0 ||
            fchmod(fd, old.st_mode & 0xFFF) != 0 || makeLater(fd, old) != 0) {
            return fail(sched::kReadWriteFailed, 231);
        }
        if (std::fclose(stream_.release()) != 0) {
            fail(sched::kReadWriteFailed, 235);
        } else if (rename(path_.data(), kCrontab) != 0) {
            fail(sched::kRenameFailed, 240);
        } else {
            return 0;
        }
        unlink(path_.data());
        return -1;
    }

  private:
    // cron compares whole seconds: a new crontab of the old one's second would go unseen.
    static int makeLater(int fd, const struct stat &old) {
        struct stat status {};
        if (fstat(fd, &status) != 0) {
            return -1;
        }
        if (status.st_mtim.tv_sec > old.st_mtim.tv_sec) {
            return 0;
        }
        const timespec times[] = {{.tv_sec = 0, .tv_nsec = UTIME_OMIT},
                                  {.tv_sec = old.st_mtim.tv_sec + 1, .tv_nsec = 0}};
        return futimens(fd, times);
    }

    std::array<char, 4096> path_{};
    sched::File stream_;
};

// Copies every line that does not name the runner. `endsOpen` tells that the last one copied has no
// line feed.
int copyForeignLines(FILE *from, FILE *to, bool &endsOpen) {
    char *buffer = nullptr;
    size_t capacity = 0;
    ssize_t length = 0;
    bool written = true;
    while (written && (length = getdelim(&buffer, &capacity, '\n', from)) != -1) {
        const std::string_view line(buffer, static_cast<size_t>(length));
        if (line.find(kRunner) == std::string_view::npos) {
            written = std::fwrite(line.data(), 1, line.size(), to) == line.size();
            endsOpen = line.back() != '\n';
        }
    }
    std::free(buffer);
    if (!written) {
        return fail(sched::kReadWriteFailed, 200);
    }
    return std::feof(from) ? 0 : fail(sched::kReadWriteFailed, 207);
}

// Write errors are found when the stream is flushed.
void appendTasks(const TAVI_SCHED_TASK *task, FILE *to, bool endsOpen) {
    for (; task; task = task->next) {
        if (task->state == TAVI_SCHED_STATE_ENABLED) {
            std::fprintf(to, "%s%s\n", endsOpen ? "\n" : "", sched::CronLine(*task).c_str());
            endsOpen = false;
        }
    }
}

// system() with SIGCHLD at its default: in a caller that ignores it there would be no result.
int runSignalCommand() {
    struct sigaction standard {};
    struct sigaction callers {};
    standard.sa_handler = SIG_DFL;
    sigaction(SIGCHLD, &standard, &callers);
    const int result = std::system(kSignalCron);
    sigaction(SIGCHLD, &callers, nullptr);
    return result;
}

void signalCron() {
    if (PLATCFileExist(kCronPid) && runSignalCommand() != 0) {
        syslog(LOG_ERR, "%s:%d Failed to hup crond.", kSource, 245);
    }
}

} // namespace

int sched::rewriteCrontab(const TAVI_SCHED_TASK *tasks) {
    const File old(std::fopen(kCrontab, "re"));
    if (!old) {
        return -1;
    }
    struct stat status {};
    if (fstat(fileno(old.get()), &status) != 0) {
        return fail(kStatFailed, 175);
    }
    if (S_ISDIR(status.st_mode)) {
        return fail(kOpenFailed, 179);
    }
    NewCrontab crontab;
    bool endsOpen = false;
    if (crontab.open() != 0 || copyForeignLines(old.get(), crontab.stream(), endsOpen) != 0) {
        return -1;
    }
    appendTasks(tasks, crontab.stream(), endsOpen);
    if (crontab.commit(status) != 0) {
        return -1;
    }
    signalCron();
    return 0;
}
