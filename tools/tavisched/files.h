// Files in folders that others may write too: what can be trusted, reading without being led
// astray, and replacing in one step.
#pragma once

#include <optional>
#include <string>
#include <sys/stat.h>

namespace tavisched {

// Belongs to root, and nobody else may write it.
bool isRootsAlone(const struct stat &status);
// What is at the path itself; links are not followed. Nothing when nothing is there.
std::optional<struct stat> statusOf(const char *path);

enum class FileState { Missing, Trusted, Strange };
// Trusted is a regular file of root's alone, with one name.
FileState stateOf(const char *path);

// The content of a trusted file. Fails, and does not wait, when it is none.
std::string contentOf(const char *path);
// The same; nothing for a missing file.
std::optional<std::string> contentIfThere(const char *path);

// Puts a file with this content in the place of what is there, in one step; it has the mode of a
// trusted one that was there, else 0600.
void replaceFile(const char *path, const std::string &content);
// The same for a symbolic link.
void replaceByLink(const char *path, const std::string &target);

} // namespace tavisched
