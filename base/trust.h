// Which files are believed. What root is about to read, obey, overwrite or run must not be somebody
// else's to change: one rule with parameters, applied to what was opened.
#pragma once

#include "descriptor.h"

#include <sys/stat.h>
#include <sys/types.h>

namespace base {

struct TrustRule {
    mode_t kind = S_IFREG;
    bool callersToo = true; // the effective user's own serves as well as root's
    bool groupMayWrite = true;
    bool oneName = true; // no second hard link: it may be one of root's that somebody linked there
    bool anybodys = false; // neither owner nor writers matter, and links are followed
};

// Files and folders in folders that anybody may write: root's or the effective user's, and not
// writable by everybody.
inline constexpr TrustRule kSharedFile{};
inline constexpr TrustRule kSharedFolder{.kind = S_IFDIR, .oneName = false};
// The same for a file that may have further names.
inline constexpr TrustRule kSharedFileToRead{.oneName = false};
// What runs as root: root's alone to change.
inline constexpr TrustRule kRootsFile{
    .callersToo = false, .groupMayWrite = false, .oneName = false};
inline constexpr TrustRule kRootsFolder{
    .kind = S_IFDIR, .callersToo = false, .groupMayWrite = false, .oneName = false};
// A file in a folder whose owner vouches for it.
inline constexpr TrustRule kOrdinaryFile{.oneName = false, .anybodys = true};

// Why the rule does not trust it, as a clause such as "it belongs to another user"; nullptr when it
// does.
const char *whyNotTrusted(const struct stat &status, const TrustRule &rule);

inline bool isTrusted(const struct stat &status, const TrustRule &rule) {
    return whyNotTrusted(status, rule) == nullptr;
}

// Only ENOENT is Nothing; Unreadable leaves errno.
enum class Found { Nothing, Trusted, Strange, Unreadable };
// What the path itself names; links are not followed.
Found look(const char *path, const TrustRule &rule);

struct Opened {
    Found found = Found::Unreadable;
    Descriptor file; // open for reading when found is Trusted
    struct stat status {};
    const char *reason = nullptr; // why, when found is Strange
};
// Opens without waiting, unless the rule says otherwise without following a link, and looks at what
// was opened.
Opened openTrusted(const char *path, const TrustRule &rule);

} // namespace base
