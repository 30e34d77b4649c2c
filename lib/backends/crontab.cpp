// Rewriting the runner's lines of /etc/crontab through a temporary file in the same folder.
#include "crontab.h"
#include "platc.h"
#include "sched_calendar.h"
#include "sched_error.h"
#include "sched_handle.h"

#include <array>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fcntl.h>
#include <string_view>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

namespace {

constexpr const char *kCrontab = "/etc/crontab";
constexpr const char *kRunner = "/tmp/tavischedtask";
constexpr const char *kCronPid = "/var/run/crond.pid";
constexpr const char *kSignalCron = "/bin/kill -HUP `/bin/cat /var/run/crond.pid` > /dev/null 2>&1";

// The rewrite reports as the backend's own source.
constexpr const char *kSource = "backends/backend_tavischedule.cpp";

int fail(unsigned int code, int line) {
    PLATCErrSetEx(code, kSource, line);
    return -1;
}

// ---- Lines ----

// A comma-separated list in a bounded buffer; an entry that does not fit is left out.
template <size_t size> class NumberList {
  public:
    bool add(int number) {
        std::array<char, 16> entry{};
        const int length =
            std::snprintf(entry.data(), entry.size(), "%s%d", length_ == 0 ? "" : ",", number);
        if (length_ + static_cast<size_t>(length) >= size) {
            return false;
        }
        std::memcpy(text_.data() + length_, entry.data(), static_cast<size_t>(length));
        length_ += static_cast<size_t>(length);
        return true;
    }
    const char *c_str() const { return text_.data(); }

  private:
    std::array<char, size> text_{};
    size_t length_ = 0;
};

NumberList<128> hourList(const TAVI_SCHED_TASK &task) {
    NumberList<128> hours;
    sched::forEachRunHour(task, [&](uint64_t hour) { return hours.add(static_cast<int>(hour)); });
    return hours;
}

NumberList<16> weekDayList(const TAVI_SCHED_TASK &task) {
    NumberList<16> days;
    for (uint32_t day = 0; day < TAVI_SCHED_WEEK_DAYS; ++day) {
        if (sched::runsOnWeekDay(task, day)) {
            days.add(static_cast<int>(day));
        }
    }
    return days;
}

// The fields of a line with their tabs; values stand as they are stored.
class CrontabLine {
  public:
    explicit CrontabLine(const TAVI_SCHED_TASK &task) {
        addTime(task);
        addDate(task);
        add("root\t%s --run id=%ld", kRunner, static_cast<long>(task.id));
    }
    const char *c_str() const { return text_.data(); }
    size_t size() const { return length_; }

  private:
    [[gnu::format(printf, 2, 3)]] void add(const char *format, ...) {
        va_list arguments;
        va_start(arguments, format);
        const int length =
            std::vsnprintf(text_.data() + length_, text_.size() - length_, format, arguments);
        va_end(arguments);
        length_ += static_cast<size_t>(length);
    }

    void addTime(const TAVI_SCHED_TASK &task) {
        if (task.repeatHour == 0) {
            add("%u\t%u\t", task.runMin, task.runHour);
        } else {
            add("%u\t%s\t", task.runMin, hourList(task).c_str());
        }
    }

    // A once task gets the line of a yearly one, without its year: the due test keeps it from
    // running again, and the line stays until the task is changed.
    void addDate(const TAVI_SCHED_TASK &task) {
        switch (task.type) {
        case TAVI_SCHED_TYPE_ONCE:
        case TAVI_SCHED_TYPE_YEARLY:
            add("%u\t%u\t*\t", task.startDay, task.startMonth);
            break;
        case TAVI_SCHED_TYPE_MONTHLY:
            add("%u\t*\t*\t", task.startDay);
            break;
        case TAVI_SCHED_TYPE_WEEKLY:
            add("*\t*\t%s\t", weekDayList(task).c_str());
            break;
        default:
            add("*\t*\t*\t");
            break;
        }
    }

    std::array<char, 8192> text_{};
    size_t length_ = 0;
};

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
            std::fprintf(to, "%s%s\n", endsOpen ? "\n" : "", CrontabLine(*task).c_str());
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

int TAVISchedCrontabLine(const TAVI_SCHED_TASK *pTask, char *szBuf, size_t cbBuf) {
    SCHED_REQUIRE(pTask, "((void *)0) != pTask", -1);
    SCHED_REQUIRE(szBuf, "((void *)0) != szBuf", -1);
    const CrontabLine line(*pTask);
    SCHED_REQUIRE(cbBuf > line.size(), "length < cbBuf", -1);
    std::memcpy(szBuf, line.c_str(), line.size() + 1);
    return 0;
}
