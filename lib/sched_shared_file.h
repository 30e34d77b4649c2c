// Files at fixed names in folders that anybody may write. Each is made safe before it is used: what
// another user may have put there must never be written through, read or obeyed.
#pragma once

namespace sched {

// 1 when the path holds a regular file of root's or the effective user's under no other name, which
// not everybody may write; 0 when there is nothing; -1 when there is anything else.
int checkSharedFile(const char *path);

// Makes sure that such a file is there: a strange thing is exchanged for an empty file in one step,
// a missing one is made with mode 0600. 0, or -1 with errno set.
int claimSharedFile(const char *path);

// Makes sure that a folder is there that is no link, belongs to root or to the effective user and
// that not everybody may write: a missing one is made with mode 0755, which one of theirs that
// everybody may write gets too; anything else is left alone.
// 0 or -1.
int claimSharedFolder(const char *path);

// The same, but anything else is exchanged for an empty folder in one step.
int ensureSharedFolder(const char *path);

} // namespace sched
