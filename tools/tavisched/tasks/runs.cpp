// Runs as their records tell them.
#include "tasks/runs.h"
#include "failure.h"
#include "text/utf8.h"

#include <array>
#include <cstdio>
#include <exception>
#include <iostream>
#include <string_view>
#include <unistd.h>

namespace tavisched {

namespace {

constexpr int kAnyFailure = 1;
constexpr int kNotStarted = 127;
constexpr int kSignalBase = 128;
constexpr unsigned int kNotFound = 0x2000;
constexpr int kLongestWait = 1000; // milliseconds

// No exception may pass through the library.
struct Reader {
    const std::function<bool(const Run &)> &read;
    std::exception_ptr failure{};

    static int take(void *reader, const Run *run) {
        auto &self = *static_cast<Reader *>(reader);
        try {
            return self.read(*run) ? 0 : 1;
        } catch (...) {
            self.failure = std::current_exception();
            return -1;
        }
    }
};

// An output on its way to a person or a file.
class Printer {
  public:
    void add(std::string_view bytes) {
        if (!isTerminal_) {
            write(bytes);
            return;
        }
        held_ += bytes;
        const std::string rest = held_.substr(held_.size() - startedCharacter());
        held_.resize(held_.size() - rest.size());
        flush();
        held_ = rest;
    }
    void skip(int64_t bytes) {
        flush();
        std::fprintf(stderr, "[... %lld bytes cut out ...]\n", static_cast<long long>(bytes));
    }
    // What comes next begins on a line of its own on a terminal.
    void end() {
        flush();
        if (isTerminal_ && last_ != '\n') {
            write("\n");
        }
    }

  private:
    // Bytes at the end that are the beginning of a character.
    size_t startedCharacter() const {
        for (size_t length = 1; length <= 3 && length <= held_.size(); ++length) {
            const auto byte = static_cast<unsigned char>(held_[held_.size() - length]);
            if (byte >= 0xC0) {
                const size_t whole = byte >= 0xF0 ? 4 : byte >= 0xE0 ? 3 : 2;
                return whole > length ? length : 0;
            }
            if (byte < 0x80) {
                return 0;
            }
        }
        return 0;
    }
    void flush() {
        std::vector<std::string> parts = split(held_, '\t');
        for (std::string &part : parts) {
            part = printableLines(part);
        }
        write(join(parts, "\t"));
        held_.clear();
    }
    void write(std::string_view bytes) {
        last_ = bytes.empty() ? last_ : bytes.back();
        if (std::fwrite(bytes.data(), 1, bytes.size(), stdout) != bytes.size() ||
            std::fflush(stdout) != 0) {
            throw Failure("the output could not be written");
        }
    }

    bool isTerminal_ = isatty(STDOUT_FILENO) == 1;
    char last_ = '\n';
    std::string held_{};
};

// What there is from the offset on. False when nothing is kept.
bool printFrom(int64_t run, int64_t &offset, Printer &printer) {
    std::array<char, 16384> buffer; // NOLINT: only what was read is looked at
    for (;;) {
        int64_t cut = 0;
        const int64_t length =
            TAVISchedRunOutputRead(run, &offset, buffer.data(), buffer.size(), &cut);
        if (length < 0 && PLATCErrGet() != kNotFound) {
            throw Failure("the output of run " + std::to_string(run) +
                          " cannot be read: " + libraryError());
        }
        if (length >= 0 && cut > 0) {
            printer.skip(cut);
        }
        if (length <= 0) {
            return length == 0;
        }
        printer.add({buffer.data(), static_cast<size_t>(length)});
    }
}

} // namespace

void forEachRun(const TAVI_SCHED_RUN_FILTER &filter,
                const std::function<bool(const Run &)> &reader) {
    Reader taking{.read = reader};
    const int count = TAVISchedRunList(&filter, Reader::take, &taking);
    if (taking.failure) {
        std::rethrow_exception(taking.failure);
    }
    if (count < 0) {
        throw Failure("the records of runs cannot be read: " + libraryError() +
                      "; see \"tavisched check\"");
    }
}

std::vector<Run> readRuns(const TAVI_SCHED_RUN_FILTER &filter) {
    std::vector<Run> runs;
    forEachRun(filter, [&](const Run &run) {
        runs.push_back(run);
        return true;
    });
    return runs;
}

std::optional<Run> findNewest(const TAVI_SCHED_RUN_FILTER &filter,
                              const std::function<bool(const Run &)> &condition) {
    std::optional<Run> found;
    forEachRun(filter, [&](const Run &run) {
        if (condition(run)) {
            found = run;
        }
        return !found;
    });
    return found;
}

namespace {

LatestRuns readNewest(int32_t taskId) {
    LatestRuns latest;
    try {
        TAVI_SCHED_RUN_FILTER filter = runsOf(taskId);
        filter.newestOnly = 1;
        for (const Run &run : readRuns(filter)) {
            latest.try_emplace(run.taskId, run);
        }
    } catch (const Failure &failure) {
        std::cerr << "tavisched: warning: " << failure.what() << "\n";
    }
    return latest;
}

} // namespace

LatestRuns readLatestRuns() {
    return readNewest(-1);
}

LatestRuns readLatestRunOf(int32_t taskId) {
    return readNewest(taskId);
}

std::optional<Run> findRun(int64_t run) {
    Run found{};
    if (TAVISchedRunGet(run, &found) == 0) {
        return found;
    }
    readRuns({.taskId = -1, .failedOnly = 0, .newestOnly = 0, .limit = 1, .since = 0}); // or fails
    return std::nullopt;
}

bool hasFailed(const Run &run) {
    return run.result != TAVI_SCHED_RUN_SUCCESS && run.result != TAVI_SCHED_RUN_NONE &&
           run.result != TAVI_SCHED_RUN_NOT_DUE && !goesOn(run);
}

int exitStatusOf(const Run &run) {
    switch (run.result) {
    case TAVI_SCHED_RUN_SUCCESS:
        return 0;
    case TAVI_SCHED_RUN_START_FAILED:
    case TAVI_SCHED_RUN_OWNER_UNKNOWN:
        return kNotStarted;
    case TAVI_SCHED_RUN_EXIT_FAILED:
        return run.number;
    case TAVI_SCHED_RUN_STOPPED:
    case TAVI_SCHED_RUN_SIGNALED:
        return kSignalBase + run.number;
    default:
        return kAnyFailure;
    }
}

bool printOutput(int64_t run, bool follow) {
    Printer printer;
    int64_t offset = 0;
    bool isKept = false;
    bool isOver = !follow;
    for (;;) {
        isKept = printFrom(run, offset, printer);
        if (isOver) {
            break; // what came before the end has been read
        }
        const auto record = findRun(run);
        isOver = !record || !goesOn(*record);
        if (!isOver && TAVISchedRunFollow(run, offset, kLongestWait) < 0) {
            isOver = true; // its record is gone
        }
    }
    printer.end();
    return isKept;
}

} // namespace tavisched
