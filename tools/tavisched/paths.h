// The fixed places of the scheduler's files.
#pragma once

namespace tavisched {

constexpr const char *kFolder = "/usr/tavi/etc";
constexpr const char *kPersistent = "/usr/tavi/etc/scheduled_tasks";
constexpr const char *kPutAside = "/usr/tavi/etc/scheduled_tasks.bak";
constexpr const char *kPowerSchedules = "/usr/tavi/etc/auto_power";
constexpr const char *kWorkingCopy = "/tmp/scheduled_tasks";
constexpr const char *kCrontab = "/etc/crontab";
constexpr const char *kCronPid = "/var/run/crond.pid";
constexpr const char *kRunner = "/tmp/tavischedtask";
constexpr const char *kLockFolder = "/tmp/lock";
constexpr const char *kStatusDatabase = "/tmp/sched_status.sqlite";
constexpr const char *kPlugins = "/usr/tavi/etc/plugins/task_scheduler";
constexpr const char *kPowerOffCheck = "/usr/tavi/bin/tavi_poweroff_feasible_check";
constexpr const char *kWakeAlarm = "/sys/class/rtc/rtc0/wakealarm";
constexpr const char *kChangeLock = "/run/tavisched.lock";

} // namespace tavisched
