// The fixed paths of the library, each known here alone. The platform keeps its own: the power
// schedules' file, the plug-in handlers' folder and the clock's wake alarm.
#pragma once

namespace sched {

// Tasks: the persistent file, what is put aside beside it, and the working copy that is read.
inline constexpr const char *kTaskFolder = "/usr/tavi/etc";
inline constexpr const char *kPersistent = "/usr/tavi/etc/scheduled_tasks";
inline constexpr const char *kPutAside = "/usr/tavi/etc/scheduled_tasks.bak";
inline constexpr const char *kWorkingCopy = "/tmp/scheduled_tasks";
inline constexpr const char *kScratchStem = "/tmp/scheduled_tasks.tmp";

// One change after the other, whole or not at all: the locks of changing and of reading, and the
// record of a change that goes on.
inline constexpr const char *kChangeLock = "/usr/tavi/etc/scheduled_tasks.lock";
inline constexpr const char *kReadingLock = "/usr/tavi/etc/scheduled_tasks.reading";
inline constexpr const char *kRecord = "/usr/tavi/etc/scheduled_tasks.journal";
inline constexpr const char *kRestoring = "/usr/tavi/etc/scheduled_tasks.journal.restoring";
inline constexpr const char *kFinished = "/usr/tavi/etc/scheduled_tasks.journal.finished";
inline constexpr const char *kRecordPersistent = "/usr/tavi/etc/scheduled_tasks.journal.persistent";

// cron: its table, its process id, and what the tasks' lines start.
inline constexpr const char *kCrontab = "/etc/crontab";
inline constexpr const char *kCronPid = "/var/run/crond.pid";
inline constexpr const char *kRunner = "/tmp/tavischedtask";

// What a due power-off schedule runs.
inline constexpr const char *kPowerOffCheck = "/usr/tavi/bin/tavi_poweroff_feasible_check";

// Runs: their lock and how they ended.
inline constexpr const char *kRunLockFolder = "/tmp/lock";
inline constexpr const char *kRunLock = "/tmp/lock/lock_sched_run";
inline constexpr const char *kStatusDatabase = "/tmp/sched_status.sqlite";
inline constexpr const char *kStatusJournal = "/tmp/sched_status.sqlite-journal";
inline constexpr const char *kStatusWal = "/tmp/sched_status.sqlite-wal";

// What is remembered of runs, and the limits of it.
inline constexpr const char *kRecordFolder = "/var/lib/tavischeduler";
inline constexpr const char *kOutputFolder = "/var/lib/tavischeduler/output";
inline constexpr const char *kRunDatabase = "/var/lib/tavischeduler/runs.sqlite";
inline constexpr const char *kRunDatabaseWal = "/var/lib/tavischeduler/runs.sqlite-wal";
inline constexpr const char *kRunDatabaseIndex = "/var/lib/tavischeduler/runs.sqlite-shm";
inline constexpr const char *kDamagedRuns = "/var/lib/tavischeduler/runs.sqlite.damaged";
inline constexpr const char *kRunNumber = "/var/lib/tavischeduler/run_number";
inline constexpr const char *kLastLook = "/var/lib/tavischeduler/last_look";
inline constexpr const char *kRunLimits = "/usr/tavi/etc/run_records";

} // namespace sched
