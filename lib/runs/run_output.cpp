// The files that outputs are kept in.
#include "run_output.h"
#include "sched_error.h"
#include "sched_paths.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <cinttypes>
#include <cstdio>
#include <fcntl.h>
#include <optional>
#include <sys/stat.h>
#include <unistd.h>
#include <utility>

namespace {

using sched::kOutputPart;

constexpr int64_t kWhole = 2 * kOutputPart;
constexpr int kTries = 100;
// Of a fixed width, behind the last part.
constexpr const char *kNote = "\n[left out after the first %" PRId64 " bytes: %016" PRId64
                              "; the rest begins at %05" PRId64 ", replacing %05" PRId64 "]\n";
constexpr size_t kNoteSize = 128;

bool writeAllAt(int fd, std::string_view bytes, int64_t offset) {
    while (!bytes.empty()) {
        const ssize_t written = pwrite(fd, bytes.data(), bytes.size(), offset);
        if (written == -1 && errno != EINTR) {
            return false;
        }
        if (written > 0) {
            bytes.remove_prefix(static_cast<size_t>(written));
            offset += written;
        }
    }
    return true;
}

// What a reader knows of a file at a moment.
struct Extent {
    int64_t total = 0;    // bytes printed
    int64_t start = 0;    // where the oldest byte of the last part stands in it
    int64_t replaced = 0; // how many of the oldest are being replaced

    bool isCut() const { return total > kWhole || replaced > 0; }
    // The first byte of the last part that is there.
    int64_t oldest() const { return isCut() ? total - kOutputPart + replaced : kOutputPart; }
    int64_t placeOf(int64_t offset) const {
        return isCut() && offset >= kOutputPart
                   ? kOutputPart + (start + offset - (total - kOutputPart)) % kOutputPart
                   : offset;
    }
    // Up to where bytes stand together in the file.
    int64_t endAfter(int64_t offset) const {
        if (!isCut()) {
            return total;
        }
        return offset < kOutputPart ? kOutputPart
                                    : std::min(total, offset + kWhole - placeOf(offset));
    }
    bool hasPlacesOf(const Extent &other) const {
        return isCut() == other.isCut() &&
               (!isCut() || (start - total - (other.start - other.total)) % kOutputPart == 0);
    }
};

std::optional<Extent> readExtent(int fd) {
    struct stat status {};
    if (fstat(fd, &status) != 0) {
        return std::nullopt;
    }
    if (status.st_size <= kWhole) {
        return Extent{.total = status.st_size};
    }
    std::array<char, kNoteSize + 1> note{};
    Extent extent;
    int64_t part = 0;
    int64_t cut = 0;
    if (pread(fd, note.data(), kNoteSize, kWhole) <= 0 ||
        std::sscanf(note.data(),
                    " [left out after the first %" SCNd64 " bytes: %" SCNd64
                    "; the rest begins at %" SCNd64 ", replacing %" SCNd64 "]",
                    &part, &cut, &extent.start, &extent.replaced) != 4) {
        errno = EBADMSG;
        return std::nullopt;
    }
    extent.total = kWhole + cut;
    return extent;
}

base::Descriptor openOutput(int64_t run) {
    return base::Descriptor(
        open(sched::outputPathOf(run).c_str(), O_RDONLY | O_NOFOLLOW | O_CLOEXEC));
}

} // namespace

std::string sched::outputPathOf(int64_t run) {
    return std::string(kOutputFolder) + "/" + std::to_string(run);
}

// ---- Writing ----

bool sched::OutputFile::make(int64_t run) {
    const std::string path = outputPathOf(run);
    const auto open = [&] {
        return base::Descriptor(
            ::open(path.c_str(), O_RDWR | O_CREAT | O_TRUNC | O_NOFOLLOW | O_CLOEXEC, 0600));
    };
    base::Descriptor file = open();
    if (!file && errno == ENOENT && mkdir(kOutputFolder, 0700) == 0) {
        file = open();
    }
    file_ = std::move(file);
    return static_cast<bool>(file_);
}

void sched::OutputFile::fail() {
    if (!failed_) {
        SCHED_LOG("the rest of a run's output is not kept: %m");
    }
    failed_ = true;
}

void sched::OutputFile::add(std::string_view bytes) {
    total_ += static_cast<int64_t>(bytes.size());
    if (!file_ || failed_) {
        return;
    }
    const auto room = static_cast<size_t>(std::max<int64_t>(kWhole - kept_, 0));
    const std::string_view first = bytes.substr(0, std::min(room, bytes.size()));
    if (!writeAllAt(file_.get(), first, kept_)) {
        fail();
        return;
    }
    kept_ += static_cast<int64_t>(first.size());
    bytes.remove_prefix(first.size());
    if (!bytes.empty() && !addLast(bytes)) {
        fail();
    }
}

// What is about to be replaced is told first: a reader never takes new bytes for old ones.
bool sched::OutputFile::addLast(std::string_view bytes) {
    constexpr auto kPart = static_cast<size_t>(kOutputPart);
    const auto total = kept_ + static_cast<int64_t>(bytes.size());
    bytes.remove_prefix(bytes.size() - std::min(bytes.size(), kPart));
    if (!writeNote(kept_, static_cast<int64_t>(bytes.size()))) {
        return false;
    }
    const size_t toEnd = std::min(bytes.size(), kPart - static_cast<size_t>(start_));
    if (!writeAllAt(file_.get(), bytes.substr(0, toEnd), kOutputPart + start_) ||
        !writeAllAt(file_.get(), bytes.substr(toEnd), kOutputPart)) {
        return false;
    }
    start_ = (start_ + static_cast<int64_t>(bytes.size())) % kOutputPart;
    kept_ = total;
    return writeNote(kept_, 0);
}

bool sched::OutputFile::writeNote(int64_t total, int64_t replaced) {
    std::array<char, kNoteSize> note{};
    const int length = std::snprintf(note.data(), note.size(), kNote, kOutputPart, total - kWhole,
                                     start_, replaced);
    return writeAllAt(file_.get(), {note.data(), static_cast<size_t>(length)}, kWhole);
}

void sched::OutputFile::straighten() {
    if (failed_ || kept_ <= kWhole || start_ == 0) {
        return;
    }
    std::string last(static_cast<size_t>(kOutputPart), '\0');
    if (pread(file_.get(), last.data(), last.size(), kOutputPart) != kOutputPart ||
        !writeNote(kept_, kOutputPart)) {
        return;
    }
    std::rotate(last.begin(), last.begin() + start_, last.end());
    if (!writeAllAt(file_.get(), last, kOutputPart)) {
        fail();
        return;
    }
    start_ = 0;
    writeNote(kept_, 0);
}

void sched::OutputFile::touch() {
    if (file_) {
        futimens(file_.get(), nullptr);
    }
}

// ---- Reading ----

sched::OutputPiece sched::readOutput(int64_t run, int64_t &offset, char *buffer, size_t size) {
    const base::Descriptor file = openOutput(run);
    if (!file) {
        return {.length = -1, .cut = 0};
    }
    for (int tries = 0; tries < kTries; ++tries) {
        const auto extent = readExtent(file.get());
        if (!extent) {
            continue;
        }
        const int64_t from =
            extent->isCut() && offset >= kOutputPart ? std::max(offset, extent->oldest()) : offset;
        const auto wanted = std::min(static_cast<int64_t>(size), extent->endAfter(from) - from);
        // Who was killed while it replaced bytes replaces no more.
        if (wanted <= 0 && (extent->replaced == 0 || tries + 1 == kTries)) {
            return {.length = 0, .cut = 0};
        }
        const ssize_t length =
            pread(file.get(), buffer, static_cast<size_t>(std::max<int64_t>(wanted, 0)),
                  extent->placeOf(from));
        const auto after = readExtent(file.get());
        const bool isFirstPart = from < kOutputPart || (after && !after->isCut());
        if (length > 0 && after &&
            (isFirstPart || (after->hasPlacesOf(*extent) && from >= after->oldest()))) {
            const int64_t cut = from - offset;
            offset = from + length;
            return {.length = length, .cut = cut};
        }
    }
    errno = EAGAIN;
    return {.length = -1, .cut = 0};
}

sched::OutputSize sched::outputSizeOf(int64_t run) {
    const base::Descriptor file = openOutput(run);
    const auto extent = file ? readExtent(file.get()) : std::nullopt;
    return extent ? OutputSize{.total = extent->total, .kept = std::min(extent->total, kWhole)}
                  : OutputSize{};
}
