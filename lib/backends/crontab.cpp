// Rewriting the runner's lines of /etc/crontab through a temporary file in the same folder.
#include "crontab.h"
#include "base/child.h"
#include "base/file.h"
#include "platc.h"
#include "sched_calendar.h"
#include "sched_error.h"
#include "sched_handle.h"
#include "sched_paths.h"

#include <algorithm>
#include <array>
#include <cstdio>
#include <cstdlib>
#include <cstring>
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
        add("root\t%s --run id=%ld", sched::kRunner, static_cast<long>(task.id));
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
        return fail(sched::kReadWriteFailed, __LINE__);
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
        return -1;
    }
    struct stat status {};
    if (fstat(fileno(old.get()), &status) != 0) {
        return fail(kStatFailed, 175);
    }
    if (S_ISDIR(status.st_mode)) {
        return fail(kOpenFailed, 179);
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
    if (!crontab.commit({.like = &status, .durable = true, .later = true})) {
        return failStep(crontab.failedStep());
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
