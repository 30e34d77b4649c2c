// Files at fixed names in folders that anybody may write. Each is made safe before it is used: what
// another user may have put there must never be written through, read or obeyed.
#pragma once

namespace sched {

// 1 when the path holds a regular file, no link, of root's or the effective user's; 0 when there is
// nothing; -1 when there is anything else.
int checkSharedFile(const char *path);

// Makes sure that such a file is there: a strange one is removed, a missing one made empty with
// mode 0600. 0, or -1 with errno set.
int claimSharedFile(const char *path);

// Removes a strange file, and leaves a proper or a missing one. 0, or -1 with errno set.
int dropStrangeFile(const char *path);

// The same for a folder, which is never removed: 0 when it is no link and belongs to root or to the
// effective user, made with mode 0755 when missing; else -1.
int claimSharedFolder(const char *path);

} // namespace sched
