// Whole files: reading one that may lie in a shared folder, and replacing one atomically.
#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <sys/stat.h>

namespace platform {

// A descriptor closed at the end of its scope.
class UniqueFd {
  public:
    explicit UniqueFd(int fd) : fd_(fd) {}
    ~UniqueFd();
    UniqueFd(const UniqueFd &) = delete;
    UniqueFd &operator=(const UniqueFd &) = delete;

    int get() const { return fd_; }
    // Closes it now; false when the close failed.
    bool close();

  private:
    int fd_;
};

struct FileContent {
    std::string text;
    struct stat status {}; // taken before the text was read
};

// Reads a regular file. In a folder with the sticky bit it must be no link, belong to root or to
// the effective user, and not be writable by everybody. Nothing with the error state set, and a log
// line when the file was refused.
std::optional<FileContent> readFile(const std::string &path);

// Replaces the file through a temporary file in its folder, keeping owner and mode; a new file gets
// mode 0600. 0, or -1 with the error state set and the old file in place.
int replaceFile(const std::string &path, std::string_view content);

// The same for a file that a daemon watches: cron compares times by whole seconds, so the new
// file's is later than the old one's by a second at least.
int replaceWatchedFile(const std::string &path, std::string_view content);

} // namespace platform
