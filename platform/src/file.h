// Whole files: reading one that may lie in a shared folder, and replacing one atomically.
#pragma once

#include "base/trust.h"

#include <optional>
#include <string>
#include <string_view>
#include <sys/stat.h>

namespace platform {

// 1 when there is something at the path (links are followed), 0 when there is nothing, -1 with the
// error state set when that cannot be seen.
int isThere(const std::string &path);

// Opens a regular file for reading. In a folder with the sticky bit it must be no link, belong to
// root or to the effective user, and not be writable by everybody. Nothing with the error state
// set, and a log line when the file was refused.
std::optional<base::Opened> openFile(const std::string &path);

struct FileContent {
    std::string text;
    struct stat status {}; // taken before the text was read
};

// The same, read whole.
std::optional<FileContent> readFile(const std::string &path);

// Replaces the file through a temporary file in its folder, keeping owner and mode; a new file gets
// mode 0600. In a folder with the sticky bit, what is replaced must be as openFile wants it. In any
// other the change is on the disk when this answers 0, and what dead processes left there goes. 0,
// or -1 with the error state set and the old file in place, or, when only the folder could not be
// flushed, the new one.
int replaceFile(const std::string &path, std::string_view content);

// The same for a file that a daemon watches: cron compares times by whole seconds, so the new
// file's is later than the old one's by a second at least.
int replaceWatchedFile(const std::string &path, std::string_view content);

} // namespace platform
