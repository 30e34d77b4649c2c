// The fixed places of the library's files.
#pragma once

namespace sched {

// Tasks: what outlives a restart, what is read, and what a change is prepared in.
constexpr const char *kFolder = "/usr/tavi/etc";
constexpr const char *kPersistent = "/usr/tavi/etc/scheduled_tasks";
constexpr const char *kPersistentCopy = "/usr/tavi/etc/scheduled_tasks.bak";
constexpr const char *kWorkingCopy = "/tmp/scheduled_tasks";
constexpr const char *kScratchStem = "/tmp/scheduled_tasks.tmp";

// One change after the other, whole or not at all.
constexpr const char *kChangeLock = "/usr/tavi/etc/scheduled_tasks.lock";
constexpr const char *kReadingLock = "/usr/tavi/etc/scheduled_tasks.reading";
constexpr const char *kRecord = "/usr/tavi/etc/scheduled_tasks.journal";
constexpr const char *kRestoring = "/usr/tavi/etc/scheduled_tasks.journal.restoring";
constexpr const char *kRecordPersistent = "/usr/tavi/etc/scheduled_tasks.journal.persistent";

// cron and what it starts.
constexpr const char *kCrontab = "/etc/crontab";
constexpr const char *kCronPid = "/var/run/crond.pid";
constexpr const char *kRunner = "/tmp/tavischedtask";

// Runs.
constexpr const char *kLockFolder = "/tmp/lock";
constexpr const char *kLockFile = "/tmp/lock/lock_sched_run";
constexpr const char *kStatusDatabase = "/tmp/sched_status.sqlite";

} // namespace sched
