/*
 * The task scheduler of the storage appliance: tasks are stored, started by cron and run as their
 * owner. This header is usable from C and C++ and needs no other library's.
 *
 * Unless a declaration says otherwise, functions return 0 on success and -1 on failure. A failure
 * sets the process's error state (PLATCErrGet, PLATCErrorGetFile and PLATCErrorGetLine of platc.h)
 * to one of TAVI_SCHED_ERR_*, or to what the platform found, and logs one line with syslog at
 * LOG_ERR. A NULL pointer or a zero size is error 0x0D00 everywhere.
 *
 * The library is made for single-threaded processes: some functions return static buffers.
 */
#ifndef TAVISCHEDULER_H
#define TAVISCHEDULER_H

#include <stddef.h>
#include <stdint.h>
#include <stdio.h>

#ifdef __cplusplus
extern "C" {
#endif

#define TAVI_SCHED_API __attribute__((visibility("default")))

/* ---- Error codes ---- */

#define TAVI_SCHED_ERR_SORT_MEMORY 0x0100      /* out of memory while sorting a list */
#define TAVI_SCHED_ERR_MEMORY 0x0200           /* out of memory */
#define TAVI_SCHED_ERR_LOCK 0x0400             /* a lock cannot be had, or not in time */
#define TAVI_SCHED_ERR_UNLOCK 0x0500           /* the run lock cannot be released */
#define TAVI_SCHED_ERR_OPEN 0x0900             /* a file cannot be opened, created or trusted */
#define TAVI_SCHED_ERR_READ_WRITE 0x0B00       /* a read, write or look-up failed */
#define TAVI_SCHED_ERR_INVALID_ARGUMENT 0x0D00 /* an argument that is not accepted */
#define TAVI_SCHED_ERR_NOT_FOUND 0x2000        /* no such task, backend, value or name */
#define TAVI_SCHED_ERR_FILE_STATUS 0x2700      /* a file's status cannot be read */
#define TAVI_SCHED_ERR_RENAME 0x2800           /* a file cannot be moved into place */
#define TAVI_SCHED_ERR_SYSTEM_CALL 0x2A00      /* a system call failed */
#define TAVI_SCHED_ERR_BAD_FORMAT 0x4000       /* a text is not of the form that is due */

/* ---- Task record ---- */

/* The backends that keep tasks. */
#define TAVI_SCHED_BACKEND_SCHEDULE (-2)
#define TAVI_SCHED_BACKEND_AUTOPOWER (-3)

#define TAVI_SCHED_STATE_DISABLED 0
#define TAVI_SCHED_STATE_ENABLED 1
#define TAVI_SCHED_STATE_NOT_EXISTED 2

#define TAVI_SCHED_TYPE_ONCE 0
#define TAVI_SCHED_TYPE_DAILY 1
#define TAVI_SCHED_TYPE_WEEKLY 2
#define TAVI_SCHED_TYPE_MONTHLY 3
#define TAVI_SCHED_TYPE_YEARLY 4

/* The longest command that can be stored, in bytes. */
#define TAVI_SCHED_MAX_COMMAND 12285

/* The number of days in a week mask and of names in TAVISchedWeekDayNames. */
#define TAVI_SCHED_WEEK_DAYS 7

/* One scheduled task. It holds no pointer but `next`, so a byte-wise copy is a full copy. Flags
 * hold 0 or 1.
 *
 * A new task (TAVISchedTaskAlloc, TAVISchedTaskGetDefault) is enabled and runs daily at 00:00 as
 * root, without a command: id -1, `week` "1111111", first day 0/0/0, no repetition, an application
 * and other texts that are empty but for `name` ("Task 7" after the next free id; "Power" in the
 * power backend, whose `appName` is "#schedule:power_on_off#") and `editDialog`. All flags are 1
 * but `canRunTaskSameTime` and `simpleEditForm`. */
typedef struct TAVI_SCHED_TASK {
    struct TAVI_SCHED_TASK *next; /* next task of a list, or NULL */
    int32_t backend;              /* id of the backend that keeps the task */
    int32_t id;                   /* id within its backend; -1 = new, kept nowhere yet */
    uint32_t owner;               /* user id that the command runs as */
    char name[4096];
    char nextTriggerTime[1024]; /* "YYYY-MM-DD hh:mm" or "N/A"; never stored: get by id and list
                                 * compute it, saving leaves it as it is */
    int32_t state;              /* TAVI_SCHED_STATE_* */
    int32_t type;               /* TAVI_SCHED_TYPE_* */
    char week[8];               /* seven characters, Sunday first: '0' = not on that day */
    uint32_t startYear;         /* first day of the schedule: four digits */
    uint32_t startMonth;        /* 1-12 */
    uint32_t startDay;          /* 1-31 */
    uint32_t runHour;           /* first run of a day: 0-23 */
    uint32_t runMin;            /* 0-59 */
    uint32_t repeatHour;        /* hours between the runs of a day; 0 = one run a day */
    uint32_t lastWorkHour;      /* last hour of the day at which a repeated run may start */
    char editDialog[1024];      /* web interface: dialog that edits the task */
    char editForm[1024];        /* web interface: form inside that dialog */
    int32_t simpleEditForm;
    int32_t listable;
    int32_t canEditName;
    int32_t canEditOwner;
    int32_t canRunAppSameTime;  /* may run while another task of its application runs */
    int32_t canRunTaskSameTime; /* may run while an earlier run of itself goes on */
    int32_t canRunFromUI;
    int32_t canDeleteFromUI;
    int32_t canEditFromUI;
    char app[1024];      /* identifier of the application that the task belongs to */
    char appName[1024];  /* its display name */
    char appArgs[8192];  /* its arguments, free text */
    char action[1024];   /* short description of what the task does */
    char command[16384]; /* shell command; TAVI_SCHED_MAX_COMMAND bytes can be stored */
} TAVI_SCHED_TASK;

#include "tavischedgetter.h"
#include "tavischedsetter.h"

/* ---- Enumerations, selections, built-in applications ---- */

/* A row of a name table; the table ends with value -1 and name NULL. */
typedef struct TAVI_SCHED_ENUM {
    int32_t value;
    const char *name;
} TAVI_SCHED_ENUM;

/* "once", "daily", "weekly", "monthly", "yearly" */
extern TAVI_SCHED_API const TAVI_SCHED_ENUM TAVISchedTypeTable[];
/* "disabled", "enabled", "NotExisted" */
extern TAVI_SCHED_API const TAVI_SCHED_ENUM TAVISchedStateTable[];
/* "Sun" to "Sat" */
extern TAVI_SCHED_API const char *const TAVISchedWeekDayNames[TAVI_SCHED_WEEK_DAYS];
/* Identifiers of the built-in applications, ended by NULL. */
extern TAVI_SCHED_API const char *const TAVISchedBuildInApps[];

/* The name of a value, or NULL with error 0x2000 (not logged) when the table has no such value. */
TAVI_SCHED_API const char *TAVISchedEnumToName(const TAVI_SCHED_ENUM *table, int32_t value);
/* The value of a name (case matters), or -1 with error 0x2000 (not logged). */
TAVI_SCHED_API int32_t TAVISchedEnumToValue(const TAVI_SCHED_ENUM *table, const char *szName);
/* Turns a comma-separated list of names (any letter case, not trimmed) into `count` characters '0'
 * or '1', one for each of `names`. Returns a static buffer of 4096 bytes that the next call
 * overwrites, or NULL (no error, no log) when an argument is NULL or 0 or the text holds no name.
 */
TAVI_SCHED_API const char *TAVISchedMultiSelectFromText(const char *szText,
                                                        const char *const *names, size_t count);
/* The other way: the names of all characters that are not '0', separated by commas. `names` has an
 * entry for every character of `szSelect`, which has at least `count`. Returns a static buffer of
 * 4096 bytes of its own, or NULL (no error, no log). */
TAVI_SCHED_API const char *TAVISchedMultiSelectToText(const char *szSelect,
                                                      const char *const *names, size_t count);
/* 1 when the task's application is a built-in one, else 0; 0 for NULL. */
TAVI_SCHED_API int TAVISchedTaskIsBuildInApp(const TAVI_SCHED_TASK *pTask);

/* ---- Hash and JSON forms ---- */

struct PLATCSZHASH;

/* Writes the task's stored form into an existing hash, whose content is discarded: a key for every
 * persistent field, line feeds as blanks, the command in base64. */
TAVI_SCHED_API int TAVISchedInitHashFromTask(struct PLATCSZHASH **ppHash,
                                             const TAVI_SCHED_TASK *pTask);
/* Fills the task from its stored form. Fields that the hash does not determine keep their values.
 * 0x4000 for a bad number; a failure leaves the task partly written. */
TAVI_SCHED_API int TAVISchedInitTaskFromHash(struct PLATCSZHASH *pHash, TAVI_SCHED_TASK *pTask);

/* Renders the task as one JSON object of its stored form; every member's text is itself a JSON
 * string. Bytes that are no UTF-8 come out as U+FFFD. `cbBuf` is at least 40960, and 160 KiB hold
 * every task; a longer text is cut silently and cannot be saved. The JSON functions log their
 * failures but set no error code of their own. */
TAVI_SCHED_API int TAVISchedTaskConvertToJson(const TAVI_SCHED_TASK *pTask, char *szBuf,
                                              size_t cbBuf);
/* The same for a stored task. */
TAVI_SCHED_API int TAVISchedTaskConvertToJsonById(int32_t id, char *szBuf, size_t cbBuf);
/* Saves a task from such a text: overwrites the stored task of that id when application and name
 * are the same, else creates a new one; `create` non-zero always creates. Returns the task's id, or
 * -1 with nothing stored. An empty object stores nothing and returns -1, the id of a new task. */
TAVI_SCHED_API int32_t TAVISchedTaskSaveFromJson(const char *szJson, int create);

/* ---- What is wrong with a task, before it is stored ----
 *
 * Create, edit and save store what they are given; these tell what would come of it. A fault is no
 * failure: nothing is logged, and the error state means nothing. */

#define TAVI_SCHED_FAULT_VALUE 1       /* a value that is not accepted, or not kept as it is */
#define TAVI_SCHED_FAULT_UNREADABLE 2  /* a stored value for which no task can be read */
#define TAVI_SCHED_FAULT_MISSING 3     /* a key without which no task can be read */
#define TAVI_SCHED_FAULT_UNKNOWN_KEY 4 /* a key that is passed over */

typedef struct TAVI_SCHED_FAULT {
    int32_t kind;     /* TAVI_SCHED_FAULT_* */
    char key[64];     /* the field's stored key; "" when no single field is at fault */
    char reason[512]; /* what is wrong and what is accepted, one line of printable UTF-8 */
} TAVI_SCHED_FAULT;

/* Looks for the first fault, in the order of the field table: numbers out of their ranges, days
 * that do not exist, an owner who does not, texts that do not survive storing or JSON, a command
 * that is too long, what a power schedule cannot be, and a line that cron would reject, whatever
 * the state. Dates and week days count as far as the type looks at them. 0 the task is sound, 1 a
 * fault was found, -1. */
TAVI_SCHED_API int TAVISchedTaskCheck(const TAVI_SCHED_TASK *pTask, TAVI_SCHED_FAULT *pFault);
/* Whether a value of the stored form comes back as it is written: 0 it does, 1 there is a fault,
 * -1. The command is base64 here. */
TAVI_SCHED_API int TAVISchedValueCheck(const char *szKey, const char *szValue,
                                       TAVI_SCHED_FAULT *pFault);
/* The same for a whole stored form, such as the members of a JSON text: writes its first `cFaults`
 * faults and returns how many there are, 0 for none, or -1. A task can be read when every fault is
 * of the kind VALUE or UNKNOWN_KEY; TAVISchedTaskCheck tells the rest of it. */
TAVI_SCHED_API int TAVISchedHashCheck(struct PLATCSZHASH *pHash, TAVI_SCHED_FAULT *rgFaults,
                                      size_t cFaults);

/* ---- Dates, local time ---- */

typedef struct TAVI_SCHED_DATE {
    uint32_t year;
    uint32_t month; /* 1-12 */
    uint32_t day;   /* 1-31 */
    uint32_t wday;  /* 0 = Sunday */
    uint32_t hour;
    uint32_t minute;
} TAVI_SCHED_DATE;

/* The current date and time. 0x2A00 when it cannot be had. */
TAVI_SCHED_API int TAVISchedDateGet(TAVI_SCHED_DATE *pDate);
/* Compares the days alone: -1 when the first is earlier, 0 for the same day, 1 when it is later;
 * also -1, with error 0x0D00, when an argument is NULL. */
TAVI_SCHED_API int TAVISchedDateComp(const TAVI_SCHED_DATE *pDate1, const TAVI_SCHED_DATE *pDate2);
/* Parses "YYYY/M/D" into year, month and day without a range check. 0x4000 for a bad text. */
TAVI_SCHED_API int TAVISchedDateParse(const char *szDateOrg, TAVI_SCHED_DATE *pDate);
/* Parses "h:m" into hour and minute without a range check. 0x4000 for a bad text. */
TAVI_SCHED_API int TAVISchedTimeParse(const char *szTimeOrg, TAVI_SCHED_DATE *pDate);
/* Carries fields that have run past their ranges and computes wday. The time is taken as standard
 * time: in a daylight-saving period it comes back an hour later. 0x2A00 when it cannot be done. */
TAVI_SCHED_API int TAVISchedDateNormalize(TAVI_SCHED_DATE *pDate);
/* Seeds rand() on the first call in the process; always 0. */
TAVI_SCHED_API int TAVISchedRandInit(void);

/* Writes the next minute at which the task will run into its `nextTriggerTime`, or "N/A". 0x2A00
 * when the date cannot be had; the text is then left as it was. */
TAVI_SCHED_API int TAVISchedNextTriggerTime(TAVI_SCHED_TASK *pTask);

/* The moments from `from` until before `until` (seconds since the epoch) at which an enabled task
 * will really be started: those at which cron takes its line and the task is then due, in the
 * process's time zone. Of an hour that daylight saving time skips there is none, of one that it
 * repeats the first. For a power schedule the moments at which the machine goes on or off: of what
 * is skipped a power-off comes at once, and a power-on as if the clock had not been changed. Writes
 * the first `cMax` of them, in rising order, and returns how many it wrote, or -1. Nothing is
 * allocated; the time it takes is linear in the days. */
TAVI_SCHED_API int TAVISchedTaskStarts(const TAVI_SCHED_TASK *pTask, int64_t from, int64_t until,
                                       int64_t *rgStarts, size_t cMax);
/* The first of them from `from` on: 1 with the moment, 0 when there is none, however long one
 * waits, or -1. */
TAVI_SCHED_API int TAVISchedTaskNextStart(const TAVI_SCHED_TASK *pTask, int64_t from,
                                          int64_t *pStart);

/* ---- What is remarkable about schedules ----
 *
 * Both take the tasks that there are as an array of pointers, of both backends, as tasks and power
 * schedules bear on each other. */

typedef struct TAVI_SCHED_SPAN {
    int64_t from;  /* seconds since the epoch */
    int64_t until; /* the first moment behind it */
} TAVI_SCHED_SPAN;

/* The hours in which the enabled power schedules among the tasks have the machine off, cut to
 * `from` and `until`: each from the first power-off until the next power-on. When there is no
 * power-on, nobody knows how long the machine is off, and there are none. Writes the first `cMax`
 * of them, in rising order, and returns how many it wrote, or -1. */
TAVI_SCHED_API int TAVISchedOffHours(const TAVI_SCHED_TASK *const *rgTasks, size_t cTasks,
                                     int64_t from, int64_t until, TAVI_SCHED_SPAN *rgSpans,
                                     size_t cMax);

#define TAVI_SCHED_REMARK_NEVER 1   /* it will never run; not said of a once task that is past */
#define TAVI_SCHED_REMARK_ONE_RUN 2 /* its interval leaves room for one run a day alone */
#define TAVI_SCHED_REMARK_SHORT_MONTHS 3 /* some months, or years, do not have its day */
#define TAVI_SCHED_REMARK_SKIPPED_HOUR 4 /* daylight saving time skips a run */
#define TAVI_SCHED_REMARK_OFF_HOURS 5    /* runs fall into hours in which the machine is off */
#define TAVI_SCHED_REMARK_SAME_MINUTE 6  /* so does another task of its application start */

typedef struct TAVI_SCHED_REMARK {
    const TAVI_SCHED_TASK *task;
    const TAVI_SCHED_TASK *other; /* SAME_MINUTE: the first one that it meets; else NULL */
    int32_t kind;                 /* TAVI_SCHED_REMARK_* */
    char text[256];               /* for people: part of a sentence about the task */
    char advice[256];             /* what can be done about it */
} TAVI_SCHED_REMARK;

/* Is handed one remark, which is gone after the call; anything but 0 ends the list. */
typedef int (*TAVI_SCHED_REMARK_READER)(void *pContext, const TAVI_SCHED_REMARK *pRemark);
/* Hands to the reader what is remarkable about the schedules of the enabled ones among the tasks,
 * task by task, in the year from `from` on, in the process's time zone. With `pOf` of that task
 * alone, which need not be stored: one among the others with its id is an earlier state of it.
 * Returns how many it was handed, or -1. */
TAVI_SCHED_API int TAVISchedTaskRemarks(const TAVI_SCHED_TASK *const *rgTasks, size_t cTasks,
                                        const TAVI_SCHED_TASK *pOf, int64_t from,
                                        TAVI_SCHED_REMARK_READER reader, void *pContext);

/* ---- Backends ---- */

/* 1 when the task is to be kept. */
typedef int (*TAVI_SCHED_FILTER)(TAVI_SCHED_TASK *pTask);

/* A backend: what it is called and what it offers; operations that it does not offer are NULL. */
typedef struct TAVI_SCHED_BACKEND_RECORD {
    int32_t id;
    const char *name;
    int (*sync)(void);
    int (*create)(TAVI_SCHED_TASK *pTask);
    int (*edit)(TAVI_SCHED_TASK *pTask);
    int (*remove)(int32_t id);
    int (*get_default)(TAVI_SCHED_TASK *pTask);
    int (*owns_id)(int32_t id);
    int (*get_by_id)(int32_t id, TAVI_SCHED_TASK *pTask); /* 1 found, 0 not there, -1 */
    int (*run)(TAVI_SCHED_TASK *pTask, int *pStatusCode, char *szComment, size_t cbComment);
    int (*list_get)(TAVI_SCHED_TASK **pTaskList,
                    TAVI_SCHED_FILTER filter); /* how many were added */
} TAVI_SCHED_BACKEND_RECORD;

#define TAVI_SCHED_MAX_BACKENDS 16

/* The registered backends, and how many rows are in use. */
extern TAVI_SCHED_API TAVI_SCHED_BACKEND_RECORD SchedBackends[TAVI_SCHED_MAX_BACKENDS];
extern TAVI_SCHED_API unsigned int cBackend;

/* Registers the built-in backends; every operation below calls it. Cheap after the first success.
 */
TAVI_SCHED_API int TAVISchedBackendInit(void);
/* Each fills its backend's row; the name must be the backend's own. */
TAVI_SCHED_API int tavischedule_init(const char *szName, TAVI_SCHED_BACKEND_RECORD *pBackend);
TAVI_SCHED_API int taviautopower_init(const char *szName, TAVI_SCHED_BACKEND_RECORD *pBackend);

/* ---- Task operations ---- */

/* A new task with the schedule backend's defaults (see the record), or NULL with error 0x0200 or
 * the failing operation's. Freed with TAVISchedTaskFree. */
TAVI_SCHED_API TAVI_SCHED_TASK *TAVISchedTaskAlloc(void);
/* Frees the one task, not what follows in a list. */
TAVI_SCHED_API int TAVISchedTaskFree(TAVI_SCHED_TASK *pTask);
/* Fills the task with the defaults of the backend in its `backend` field, which the caller sets;
 * the fields that are not stored keep their values. */
TAVI_SCHED_API int TAVISchedTaskGetDefault(TAVI_SCHED_TASK *pTask);
/* Reads a stored task and computes its next trigger time. 0x2000 when no backend keeps it. */
TAVI_SCHED_API int TAVISchedTaskGetByID(int32_t id, TAVI_SCHED_TASK *pTask);
/* Id -1: as TAVISchedTaskGetDefault (the caller sets `backend`); any other as TAVISchedTaskGetByID.
 */
TAVI_SCHED_API int TAVISchedTaskLoad(int32_t id, TAVI_SCHED_TASK *pTask);
/* Stores a new task in its backend, which sets the task's id, and its name when that is empty; its
 * next trigger time is not computed. The task must not be NULL. 0x2000 when no backend serves it.
 */
TAVI_SCHED_API int TAVISchedTaskCreate(TAVI_SCHED_TASK *pTask);
/* Replaces the stored task of the same id. Returns the backend's result. */
TAVI_SCHED_API int TAVISchedTaskEdit(TAVI_SCHED_TASK *pTask);
/* Creates a task whose id is -1, edits any other. */
TAVI_SCHED_API int TAVISchedTaskSave(TAVI_SCHED_TASK *pTask);
TAVI_SCHED_API int TAVISchedTaskRemove(int32_t id);
/* Lists the tasks of every backend that the filter keeps (NULL keeps all). Returns their number;
 * when it is above 0 the head is overwritten with a list that the caller frees. */
TAVI_SCHED_API int TAVISchedTaskListGet(TAVI_SCHED_TASK **pTaskList, TAVI_SCHED_FILTER filter);
/* The task after this one in a list, or NULL; also NULL for NULL. */
TAVI_SCHED_API TAVI_SCHED_TASK *TAVISchedTaskNext(const TAVI_SCHED_TASK *pTask);
/* Frees all tasks of a list and empties the head. */
TAVI_SCHED_API void TAVISchedTaskListFree(TAVI_SCHED_TASK **pTaskList);
/* Brings every backend's outside state (crontab) in line with its tasks. Backends that fail are
 * only logged. */
TAVI_SCHED_API int TAVISchedTaskSync(void);
/* Writes the line, without line feed, that stands for an enabled task of the schedule backend in
 * /etc/crontab. The fields are the task's as they are, also when cron would reject them. 256 bytes
 * hold every line; 0x0D00 for a smaller buffer that does not. */
TAVI_SCHED_API int TAVISchedCrontabLine(const TAVI_SCHED_TASK *pTask, char *szBuf, size_t cbBuf);

/* When an entry of the crontab is due: bit n stands for the value n. */
typedef struct TAVI_SCHED_CRON_TIMES {
    uint64_t minutes;   /* 0-59 */
    uint32_t hours;     /* 0-23 */
    uint32_t monthDays; /* 1-31 */
    uint32_t months;    /* 1-12 */
    uint32_t weekDays;  /* 0-6, 0 = Sunday */
} TAVI_SCHED_CRON_TIMES;

/* Judges a line of /etc/crontab, without its line feed, as cron does, which ignores all of the file
 * for one line that it rejects. 0 when cron takes the line, comments and variables too; 1 when it
 * does not, and the buffer, for which 512 bytes are enough, tells why; -1. The times (may be NULL)
 * are those of an entry, and zeros for any other line and for entries such as "@daily". */
TAVI_SCHED_API int TAVISchedCrontabLineCheck(const char *szLine, TAVI_SCHED_CRON_TIMES *pTimes,
                                             char *szReason, size_t cbReason);

/* The id that the schedule backend gives to its next task. */
TAVI_SCHED_API int TAVISchedTaskNextId(int32_t *pId);
/* Stores a new task under the id that it has. 0x0D00 when that is no id for the task's backend to
 * give, or not free. */
TAVI_SCHED_API int TAVISchedTaskCreateWithId(TAVI_SCHED_TASK *pTask);
/* Lists the tasks of one backend (TAVI_SCHED_BACKEND_*) as TAVISchedTaskListGet does those of all,
 * but answers -1 when the backend cannot list them. */
TAVI_SCHED_API int TAVISchedTaskListGetOf(int32_t backend, TAVI_SCHED_TASK **pTaskList,
                                          TAVI_SCHED_FILTER filter);

/* Makes the machine ready after its start, with root's rights: takes back what a change that was
 * cut off left, fills a working copy that is missing, empty or another user's from what is stored,
 * makes the lock folder and the runner's link, and synchronises, but for lines whose tasks are in
 * neither file. What fails does not keep it from the rest. "tavischedtask --start" calls it at
 * boot; it may be called at any time. 0x0D00 for anybody but root. */
TAVI_SCHED_API int TAVISchedStart(void);

/* ---- Several changes as one ---- */

/* From TAVISchedChangeBegin on, this process's creates, edits, removes and JSON saves, of both
 * backends, are kept where only this process sees them: its lists and look-ups show them, files,
 * crontab and wake alarm stay as they are, and other processes' changes wait (readers do not). The
 * PRE phase of plug-in handlers runs with each change; a handler that changes tasks itself is
 * refused, as it would wait for the process that waits for it.
 *
 * TAVISchedChangeCommit stores everything, writes the crontab once and signals cron once; 0, or -1
 * with everything as it was, also when the crontab cannot be written. TAVISchedChangeRollback drops
 * everything. Both end the batch and then run the POST phases, with the result -1 for changes that
 * were not stored. Begin within a batch and the others without one are 0x0D00; 0x0400 when another
 * change has not ended within half a minute. */
TAVI_SCHED_API int TAVISchedChangeBegin(void);
TAVI_SCHED_API int TAVISchedChangeCommit(void);
TAVI_SCHED_API int TAVISchedChangeRollback(void);
/* The process whose change this one waits for at this moment, or waited for in vain in the last
 * call that failed with 0x0400; else 0. May be called in a signal handler, so that a program can
 * say what it waits for. */
TAVI_SCHED_API int32_t TAVISchedWaitedFor(void);

/* Whether the machine has a clock that can switch it on, which an enabled power-on schedule needs:
 * 0 it has, 1 it has none, and the buffer tells why, -1. */
TAVI_SCHED_API int TAVISchedPowerOnCheck(char *szReason, size_t cbReason);

/* Sorts a list by a row of the field table, 0 to 30 (not checked). Direction 1 is ascending, any
 * other the exact reverse. Text fields order by their bytes. Number fields order by where the tasks
 * lie in memory, whatever the field: the order of crontab lines is defined by it. 0x0100 out of
 * memory, 0x0D00 for an empty list. */
TAVI_SCHED_API int TAVISchedTaskListSortEx(TAVI_SCHED_TASK **pTaskList, unsigned int row,
                                           int direction);
/* The same by the field's stored key ("name", "next trigger time", ...). An empty list is a
 * success; an unknown key is -1 without an error or a log line. */
TAVI_SCHED_API int TAVISchedTaskListSort(TAVI_SCHED_TASK **pTaskList, const char *szKey,
                                         int direction);

/* ---- Running ---- */

/* Runs a stored task in a detached child, which waits for conflicting runs, records the run, runs
 * the command as the task's owner and records the result. All of that happens after this has
 * returned: the run is not in the status database yet, and one that gives up waiting never is. Who
 * wants to know more calls TAVISchedTaskRunFollowed. Mode 1: only when it is due in this minute;
 * mode 0: at once; any other: nothing. `enabledOnly` 1 skips a disabled task. Returns 0 when the
 * task was skipped or the child was started; -1 when the task cannot be read or is marked not
 * existing (0x2000), or the date or the fork fails (0x2A00). */
TAVI_SCHED_API int TAVISchedTaskRun(int32_t id, int32_t mode, int32_t enabledOnly);
/* The same, for callers that follow the run. `pPid` is given the id of the child, which the run's
 * row bears, and `pEnd` a descriptor that reads end-of-file once the run has ended and its result
 * is stored, also when it recorded nothing; the caller waits for it with read or poll and closes
 * it. What the command left behind may keep the child longer. Both are -1 when the task was
 * skipped. */
TAVI_SCHED_API int TAVISchedTaskRunFollowed(int32_t id, int32_t mode, int32_t enabledOnly,
                                            int32_t *pPid, int *pEnd);

/* The run lock's open file while it is held, else NULL. */
extern TAVI_SCHED_API FILE *pfLock;

/* ---- Status database ---- */

#define SCHED_STATUS_CODE_NONE 0        /* no status; "any" in updates */
#define SCHED_STATUS_CODE_INTERRUPTED 1 /* reported for a running row whose process is gone */
#define SCHED_STATUS_CODE_RUNNING 2
#define SCHED_STATUS_CODE_SUCCESS 3      /* the command exited with 0 */
#define SCHED_STATUS_CODE_START_FAILED 4 /* the command could not be started */
#define SCHED_STATUS_CODE_STOPPED 5      /* stopped; the comment is the signal number */
#define SCHED_STATUS_CODE_SIGNALED 6     /* killed; the comment is the signal number */
#define SCHED_STATUS_CODE_EXIT_FAILED 7  /* exited with another code; the comment is the code */

typedef struct TAVI_SCHED_STATUS {
    int32_t found; /* 1 once a row was taken, or a live running row was found */
    int32_t pid;
    int32_t statusId;
    int32_t timestamp; /* seconds since the epoch */
    int32_t taskId;
    char app[1024];
    int32_t statusCode; /* SCHED_STATUS_CODE_* */
    char comment[1024];
} TAVI_SCHED_STATUS;

struct sqlite3; /* the functions below do with a handle all that is due; sqlite3.h is not needed */

/* Opens the status database, made when missing; the caller closes it with TAVISchedDBClose. NULL
 * with error 0x0900, or without one when the table cannot be made. A statement that meets a locked
 * database is tried up to 101 times with a pause of up to a second between. */
TAVI_SCHED_API struct sqlite3 *TAVISchedDBInit(void);
/* Opens it to read what is there and makes nothing: 1 with the handle, 0 with NULL when there were
 * no runs yet, -1 with NULL and error 0x0900. */
TAVI_SCHED_API int TAVISchedDBOpenForReading(struct sqlite3 **ppDb);
/* Closes a handle of either function. 0x0B00 when statements of the caller's own are open on it. */
TAVI_SCHED_API int TAVISchedDBClose(struct sqlite3 *db);
/* Adds a running row of this process for the task. 0x0B00 when the row is not found again. */
TAVI_SCHED_API int TAVISchedDBAddRecord(struct sqlite3 *db, const TAVI_SCHED_TASK *pTask,
                                        int32_t *pStatusId);
/* Sets code and, when given and not empty, comment of a row (id -1: of all rows), but only where
 * the present code is `orgStatusCode` unless that is 0; id -1 with code 0 is refused. */
TAVI_SCHED_API int TAVISchedDBSetStatus(struct sqlite3 *db, int32_t statusId, int32_t orgStatusCode,
                                        int32_t newStatusCode, const char *szComment);
/* The task's newest run: 1 found, 0 none (outputs untouched), -1. The start time (seconds since the
 * epoch) and the comment buffer are optional. */
TAVI_SCHED_API int TAVISchedDBGetStatusByTaskID(struct sqlite3 *db, int32_t taskId,
                                                int32_t *pTimestamp, int32_t *pStatusCode,
                                                char *szComment, size_t cbComment);
/* The same for one row. */
TAVI_SCHED_API int TAVISchedDBGetStatusByStatusID(struct sqlite3 *db, int32_t statusId,
                                                  int32_t *pStatusCode, char *szComment,
                                                  size_t cbComment);
/* Looks for a live run of the task or application; the record, which the caller has zeroed, tells
 * by `found`. */
TAVI_SCHED_API int TAVISchedDBIsTaskRunning(struct sqlite3 *db, int32_t taskId,
                                            TAVI_SCHED_STATUS *pStatus);
TAVI_SCHED_API int TAVISchedDBIsAppRunning(struct sqlite3 *db, const char *szApp,
                                           TAVI_SCHED_STATUS *pStatus);

/* Is handed one row, which is gone after the call; anything but 0 ends the list. */
typedef int (*TAVI_SCHED_STATUS_READER)(void *pContext, const TAVI_SCHED_STATUS *pStatus);
/* Hands the runs of a task, or of all tasks for -1, to the reader, the newest first, a running one
 * whose process is gone as SCHED_STATUS_CODE_INTERRUPTED. Returns how many the reader was handed.
 * The database cannot be changed meanwhile: the reader only takes down what it needs. */
TAVI_SCHED_API int TAVISchedDBListStatus(struct sqlite3 *db, int32_t taskId,
                                         TAVI_SCHED_STATUS_READER reader, void *pContext);
/* The same for the newest run of every task that has one, in the order of their ids. */
TAVI_SCHED_API int TAVISchedDBListLastStatus(struct sqlite3 *db, TAVI_SCHED_STATUS_READER reader,
                                             void *pContext);

/* ---- Records of runs: what a run did, beyond the machine's next start ----
 *
 * Every run has a record with a number that is never given again, also one that came to nothing,
 * and what its command printed is kept beside it. Records and outputs lie where only root reads
 * them; a run whose record cannot be written goes on without one. As runs end, records beyond the
 * limits go with their outputs. What conflicts is decided by the status database alone. */

/* How a run went. The first are those of the status database. */
#define TAVI_SCHED_RUN_NONE 0        /* the task's backend runs nothing */
#define TAVI_SCHED_RUN_INTERRUPTED 1 /* nobody is left to end it: a power cut, a killed runner */
#define TAVI_SCHED_RUN_RUNNING 2
#define TAVI_SCHED_RUN_SUCCESS 3
#define TAVI_SCHED_RUN_START_FAILED 4
#define TAVI_SCHED_RUN_STOPPED 5
#define TAVI_SCHED_RUN_SIGNALED 6         /* `number` is the signal */
#define TAVI_SCHED_RUN_EXIT_FAILED 7      /* `number` is the exit code */
#define TAVI_SCHED_RUN_WAITING 32         /* for the task `waitedFor`, since `waitingSince` */
#define TAVI_SCHED_RUN_STOPPED_BY_USER 33 /* TAVISchedRunStop */
#define TAVI_SCHED_RUN_GIVEN_UP 34        /* `waitedFor` was running each time */
#define TAVI_SCHED_RUN_LOCK_FAILED 35
#define TAVI_SCHED_RUN_DATABASE_FAILED 36
#define TAVI_SCHED_RUN_OWNER_UNKNOWN 37
#define TAVI_SCHED_RUN_TASK_REMOVED 38  /* while the run waited */
#define TAVI_SCHED_RUN_TASK_DISABLED 39 /* while the run waited, or when cron asked for it */
#define TAVI_SCHED_RUN_MISSED 40        /* the task was due, and cron did not start it */
#define TAVI_SCHED_RUN_NOT_DUE 41       /* when cron asked for it */

/* Times are milliseconds since the epoch, and 0 for what did not happen. */
typedef struct TAVI_SCHED_RUN {
    int64_t run; /* its number, from 1 on */
    int32_t taskId;
    int32_t isOfRemovedTask; /* 1 = the task was removed; another one may have its id now */
    uint32_t owner;
    int32_t mode;         /* 1 = by cron, 0 = by hand */
    uint32_t startedBy;   /* the user who started it by hand, whoever root is for */
    int32_t result;       /* TAVI_SCHED_RUN_* */
    int32_t number;       /* exit code or signal */
    int64_t due;          /* the minute in which cron started it, or should have */
    int64_t asked;        /* when it was started, or due when missed; it may have waited then */
    int64_t began;        /* when its command began */
    int64_t ended;        /* when its result was known */
    int64_t duration;     /* milliseconds from began to ended, whatever the clock was set to */
    int64_t waitingSince; /* when it met the first conflict */
    int32_t waited;       /* seconds spent waiting */
    int32_t waitedFor;    /* the last task that it waited for; 0 for the run lock */
    int64_t outputSize;   /* bytes that the command has printed */
    int64_t outputKept; /* those that TAVISchedRunOutputRead can give; 0 also when they are gone */
    int32_t pid;        /* of the process that waits for the command */
    char name[4096];    /* the task's name at that time */
} TAVI_SCHED_RUN;

/* Which runs to list; zeros ask for nothing in particular but for `taskId`. */
typedef struct TAVI_SCHED_RUN_FILTER {
    int32_t taskId;     /* of the task that has this id now; -1 = of all, removed ones too */
    int32_t failedOnly; /* 1 = neither success, none, running nor waiting */
    int32_t newestOnly; /* 1 = of each task that is there the newest alone */
    int32_t limit;      /* at most so many; 0 = all */
    int64_t since;      /* asked at that moment or later */
} TAVI_SCHED_RUN_FILTER;

/* Is handed one record, which is gone after the call; anything but 0 ends the list. It must start
 * no run: that would share the open database. */
typedef int (*TAVI_SCHED_RUN_READER)(void *pContext, const TAVI_SCHED_RUN *pRun);
/* Hands the runs that the filter (NULL: all) keeps to the reader, the newest first, one at a time:
 * nothing of the database is held while the reader works. Returns how many it was handed, 0 where
 * there are no records, or -1 with error 0x0900 or 0x0B00. */
TAVI_SCHED_API int TAVISchedRunList(const TAVI_SCHED_RUN_FILTER *pFilter,
                                    TAVI_SCHED_RUN_READER reader, void *pContext);
/* Records what was missed up to three minutes ago, as the start of the machine and every change of
 * tasks do. 0, or -1 with error 0x0B00 when that cannot be looked for. Root alone. */
TAVI_SCHED_API int TAVISchedMissedRunsFind(void);
/* One record. 0x2000 when there is none of that number. */
TAVI_SCHED_API int TAVISchedRunGet(int64_t run, TAVI_SCHED_RUN *pRun);

/* Of an output the first and the last TAVI_SCHED_OUTPUT_PART bytes are kept. */
#define TAVI_SCHED_OUTPUT_PART 65536

/* Reads what the run printed from `*pOffset` on, also while it goes on, as bytes that may be
 * anything. Returns how many bytes were written, 0 when there are no more (yet), or -1: 0x2000 when
 * nothing is kept of the run. `*pOffset` moves behind what was written; what was cut out before it
 * is passed over, and `*pCut` (may be NULL) tells how many bytes that were. */
TAVI_SCHED_API int64_t TAVISchedRunOutputRead(int64_t run, int64_t *pOffset, char *pBuf,
                                              size_t cbBuf, int64_t *pCut);
/* Waits, up to so many milliseconds, until the run has printed more than `offset` bytes or has
 * ended: 1, or 0 when the time is over first, or -1. */
TAVI_SCHED_API int TAVISchedRunFollow(int64_t run, int64_t offset, int32_t milliseconds);
/* Asks a run, waiting or with its command running, to end: everything that it started is sent TERM,
 * and KILL so many seconds later. Does not wait for that. 0x2000 when no such run goes on; 0x2A00
 * when it cannot be asked. */
TAVI_SCHED_API int TAVISchedRunStop(int64_t run, int32_t graceSeconds);

/* How many records are kept, of one task and of all, and whether there are records of what cron
 * asked for when the task was disabled or not due; set by "runs_per_task", "runs" and "skipped" in
 * the section [limits] of /usr/tavi/etc/run_records. */
typedef struct TAVI_SCHED_RUN_LIMITS {
    int32_t runsPerTask; /* 50 by default */
    int32_t runs;        /* 10,000 by default */
    int32_t skipped;     /* 1 or 0, which is the default */
} TAVI_SCHED_RUN_LIMITS;
/* The limits in force; a value that is none of these is passed over with a log line. */
TAVI_SCHED_API int TAVISchedRunLimitsGet(TAVI_SCHED_RUN_LIMITS *pLimits);

/* ---- What is wrong with the machine ---- */

typedef struct TAVI_SCHED_FINDING {
    struct TAVI_SCHED_FINDING *next;
    char name[32];       /* what was looked at, a stable word; see TAVISchedMachineCheckOf */
    char what[2048];     /* what is wrong; texts of tasks stand in it as they are */
    char advice[1024];   /* what to do about it */
    char repaired[1024]; /* what a repair has done about it; "" when it is for a person */
    int32_t canRepair;   /* 1 = TAVISchedFindingRepair can do it without a person */
    int32_t isNote;      /* 1 = nothing is wrong yet */
    int32_t taskId;      /* of the task that it is about, or 0 */
} TAVI_SCHED_FINDING;

/* Looks at everything that scheduled tasks need, with root's rights, when no change goes on.
 * Returns how many findings there are; the head is overwritten with a list of them, those first on
 * which others build. */
TAVI_SCHED_API int TAVISchedMachineCheck(TAVI_SCHED_FINDING **ppFindings);
/* The same, but looks only at what is named, the names ended by NULL, and waits for no change:
 *   "room" on the file systems, "folders", "task files" that are not the tasks, "missing files",
 *   "put aside" tasks, "leftovers" of dead processes, "runner", "cron", "crontab" as a file,
 *   "sections" of the working copy, "tasks", "schedules" that are remarkable, "power" schedules,
 *   "lines" of the crontab, "status database", "plug-ins".
 * 0x0D00 for another name. */
TAVI_SCHED_API int TAVISchedMachineCheckOf(const char *const *rgszNames,
                                           TAVI_SCHED_FINDING **ppFindings);
/* Repairs one: 0 when it is not found any more, else -1. Others may be gone or new afterwards. */
TAVI_SCHED_API int TAVISchedFindingRepair(const TAVI_SCHED_FINDING *pFinding);
/* Frees all findings of a list and empties the head. */
TAVI_SCHED_API void TAVISchedFindingListFree(TAVI_SCHED_FINDING **ppFindings);

/* ---- Plug-in hooks ---- */

struct PLATPLUGIN;

/* A call of the plug-in "task_scheduler". */
typedef struct TAVI_SCHED_PLUGIN {
    struct PLATPLUGIN *handle; /* NULL while the context is not usable */
    int32_t result;            /* the operation's result, handed to the handlers */
    const TAVI_SCHED_TASK *orgTask;
    const TAVI_SCHED_TASK *newTask;
} TAVI_SCHED_PLUGIN;

#define TAVI_SCHED_PLUGIN_PRE 4
#define TAVI_SCHED_PLUGIN_POST 5

/* Prepares a context for an action; one of the tasks may be NULL. */
TAVI_SCHED_API int TAVISchedTaskPluginInit(TAVI_SCHED_PLUGIN *pPlugin, const char *szAction,
                                           const TAVI_SCHED_TASK *pOrgTask,
                                           const TAVI_SCHED_TASK *pNewTask);
/* Runs the handlers for a phase. */
TAVI_SCHED_API int TAVISchedTaskPlugin(int phase, TAVI_SCHED_PLUGIN *pPlugin);
/* Releases the context's handle; the caller frees the context. */
TAVI_SCHED_API int TAVISchedTaskPluginExit(TAVI_SCHED_PLUGIN *pPlugin);

#ifdef __cplusplus
}
#endif

#endif
