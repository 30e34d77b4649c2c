// Whole files: reading one, making one, and putting a new one in an old one's place in one step.
// Functions that fail leave errno set; reporting is the caller's.
#pragma once

#include "descriptor.h"

#include <cstdio>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <sys/stat.h>

namespace base {

// Whether anybody may make files in the path's folder (it has the sticky bit). So it is taken to be
// when that cannot be seen.
bool isInSharedFolder(const std::string &path);

// Up to `most` bytes from the descriptor's position on; none at the end.
std::optional<std::string> readSome(int fd, size_t most);
// Everything from the descriptor's position on.
std::optional<std::string> readAll(int fd);
bool writeAll(int fd, std::string_view content);

// Flushes the entries of the path's folder to the disk.
bool syncFolderOf(const char *path) noexcept;

// Makes an empty file of mode 0600 where nothing is, not even a link.
bool makeEmpty(const char *path);

// What a new file's own name is made of, behind the name of the file that it is to replace; the
// capitals become letters and digits that no other file has.
inline constexpr std::string_view kTemporary = ".XXXXXX";
// The same with this process's id, so that what a dead one left can be told: ".123.XXXXXX".
std::string processTemporary();
// Removes the files and private folders beside the path that are named so by processes which are no
// longer there.
void removeLeftovers(const std::string &path);

// A new file that takes an old one's place by rename; until then it has a name of its own in the
// same folder, and it goes when it is not committed.
class Replacement {
  public:
    // The steps, so that a caller can tell which one failed.
    enum class Step { None, Create, Stream, Write, Flush, Attributes, Close, Rename, SyncFolder };

    explicit Replacement(std::string path, std::string_view temporary = kTemporary);
    ~Replacement();
    Replacement(const Replacement &) = delete;
    Replacement &operator=(const Replacement &) = delete;

    bool open();
    bool write(std::string_view content);

    struct Manner {
        const struct stat *like = nullptr; // owner and mode; without it mode 0600
        bool durable = true;               // content before the rename, the folder after it
        bool folderToo = true;             // flush the folder as well, or fail
        bool later = false; // by a second at least than `like`: cron compares whole seconds
    };
    // Once. When only the folder cannot be flushed, the new file is in place all the same.
    bool commit(const Manner &manner);

    Step failedStep() const { return failed_; }

  private:
    bool fail(Step step);
    bool setAttributes(int fd, const Manner &manner);

    std::string path_;
    std::string temporary_; // the pattern until it is open
    std::unique_ptr<FILE, int (*)(FILE *)> stream_;
    bool isMade_ = false;
    Step failed_ = Step::None;
};

// Puts what was made at `made` in the place of what is at `path`, whatever that is, in one step:
// the name is never free for others. Both lie in one file system. What was there is at `made` then,
// when there was anything.
bool exchange(const char *made, const char *path);

// A folder that nobody else can enter, beside a path; it goes with everything in it.
class PrivateFolder {
  public:
    explicit PrivateFolder(const std::string &besides);
    ~PrivateFolder();
    PrivateFolder(PrivateFolder &&other) noexcept : path_(std::exchange(other.path_, {})) {}
    PrivateFolder &operator=(PrivateFolder &&) = delete;
    PrivateFolder(const PrivateFolder &) = delete;
    PrivateFolder &operator=(const PrivateFolder &) = delete;

    explicit operator bool() const { return !path_.empty(); }
    const std::string &path() const { return path_; }

  private:
    std::string path_;
};

} // namespace base
