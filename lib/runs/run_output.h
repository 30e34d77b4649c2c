// What a run's command prints, in a file of its own: the first part as it came and, of everything
// behind it, the last. The file is the output itself for as long as it fits; only one that does not
// fit ends with a line that tells what was left out, and in which order the last part stands.
#pragma once

#include "base/descriptor.h"
#include "tavischeduler.h"

#include <cstdint>
#include <string>
#include <string_view>

namespace sched {

inline constexpr int64_t kOutputPart = TAVI_SCHED_OUTPUT_PART;

std::string outputPathOf(int64_t run);

// The writing side, which is the run's process alone. What cannot be written is still counted.
class OutputFile {
  public:
    // With root's rights. False with errno set.
    bool make(int64_t run);
    explicit operator bool() const { return static_cast<bool>(file_); }

    void add(std::string_view bytes);
    // Brings the last part into its order, so that the file can be read as it is.
    void straighten();
    // Makes those who follow look again.
    void touch();

    int64_t total() const { return total_; }

  private:
    bool addLast(std::string_view bytes);
    bool writeNote(int64_t total, int64_t replaced);
    void fail();

    base::Descriptor file_;
    int64_t total_ = 0; // bytes printed
    int64_t kept_ = 0;  // of them those that this file knows of
    int64_t start_ = 0; // where the oldest byte of the last part stands in it
    bool failed_ = false;
};

struct OutputPiece {
    int64_t length; // 0: there is no more yet; -1 with errno set
    int64_t cut;    // bytes before it that were left out
};
// Reads from the offset on, which moves behind what was read.
OutputPiece readOutput(int64_t run, int64_t &offset, char *buffer, size_t size);

struct OutputSize {
    int64_t total = 0; // bytes that the file knows of
    int64_t kept = 0;
};
// Zeros when there is no such file.
OutputSize outputSizeOf(int64_t run);

} // namespace sched
