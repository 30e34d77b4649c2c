/*
 * The appliance's SDK interface as the scheduler uses it: user look-up, base64, auto-power
 * configuration and cron schedules.
 * Functions return 0 on success and -1 on failure and then set the error state (platc.h).
 */
#ifndef TAVISDK_H
#define TAVISDK_H

#include "platc.h"

#include <stdint.h>

#ifdef __cplusplus
extern "C" {
#endif

/* ---- Users ---- */

typedef struct TAVIUSER {
    const char *szName;
    uid_t uid;
    gid_t gid;           /* the user's main group */
    const char *szHome;  /* home folder */
    const char *szShell; /* login shell */
} TAVIUSER;

/* Looks a user up; `*ppUser` is freed with TAVIUserFree. An unknown user is error 0x0B00. */
PLATC_API int TAVIUserGetByUID(uid_t uid, TAVIUSER **ppUser);
PLATC_API void TAVIUserFree(TAVIUSER *pUser);

/* ---- Base64 ---- */

/* Writes the text's base64 form, NUL-terminated and on one line, into `szBuf` of `cbBuf` bytes.
 * `urlSafe` non-zero takes the alphabet for URLs, `pad` non-zero pads with "=". -1 with error
 * 0x0D00 when the buffer is too small. */
PLATC_API int SzBase64EncodeFull(const char *szText, size_t length, char *szBuf, size_t cbBuf,
                                 int urlSafe, int pad);
/* Decodes padded standard base64. `*pcbOut` enters as the room in `pOut` and leaves as the number
 * of bytes produced; no NUL is added. Strict: a character outside the alphabet, a cut text, wrong
 * padding or too little room is -1 with error 0x4000. */
PLATC_API int TAVIEncodingBase64Decode(const char *szText, size_t length, char *pOut,
                                       size_t *pcbOut);

/* ---- Auto-power: when the machine goes on and off by itself ---- */

#define TAVI_AUTOPOWER_KIND_ON 0
#define TAVI_AUTOPOWER_KIND_OFF 1

/* How many entries of a kind are read. */
#define TAVI_AUTOPOWER_MAX_ENTRIES 100

typedef struct TAVIAUTOPOWER {
    uint8_t enabled;  /* 1 = enabled, any other = disabled */
    uint8_t weekBits; /* bit 0 = Sunday to bit 6 = Saturday */
    uint8_t hour;     /* 0-23 */
    uint8_t minute;   /* 0-59 */
} TAVIAUTOPOWER;

/* Reads a kind's entries in order, `max` and TAVI_AUTOPOWER_MAX_ENTRIES at most. Returns their
 * number, 0 also without a configuration. -1 with error 0x4000 for an entry that is missing or
 * damaged. */
PLATC_API int TAVIAutoPowerConfGet(int kind, int max, TAVIAUTOPOWER *rgEntries);
/* Replaces a kind's entries. More than TAVI_AUTOPOWER_MAX_ENTRIES are kept as well, but as they are
 * not read they last only until the kind is written again. */
PLATC_API int TAVIAutoPowerConfSet(int kind, int count, const TAVIAUTOPOWER *rgEntries);
/* Arms the real-time clock to switch the machine on at the next time of all enabled power-on
 * entries, or disarms it when there is none. -1 with error 0x0900 when there is something to arm
 * but no clock that can. */
PLATC_API int TAVIAutoPoweronSet(void);

/* Whether the machine has a clock that can switch it on: 0, or -1 with the reason in the buffer
 * (error state untouched). */
PLATC_API int TAVIAutoPoweronCheck(char *szReason, size_t cbReason);

/* A program that cron runs as root. */
typedef struct TAVISCHEDULE {
    uint32_t weekBits; /* bit 0 = Sunday to bit 6 = Saturday; 0 = never */
    int32_t hour;      /* 0-23 */
    int32_t reserved1; /* 0 */
    int32_t lastHour;  /* the same hour: one run a day */
    int32_t minute;    /* 0-59 */
    int32_t reserved2; /* 0 */
    char szCommand[1024];
} TAVISCHEDULE;

/* Adds the schedule's line to /etc/crontab, which is replaced atomically and keeps owner and mode;
 * `enable` 0 removes that line instead. A schedule without days has no line. -1 with error 0x0D00
 * for what cron would not take: it would ignore the whole file. */
PLATC_API int TAVIScheduleSet(const TAVISCHEDULE *pSchedule, int enable);
/* Removes every line of /etc/crontab that holds the program's path, unless `keepLines` is non-zero,
 * and makes cron read the file again when `tellCron` is. */
PLATC_API int TAVIUpdateCrontab(const char *szProgram, int keepLines, int tellCron);

#ifdef __cplusplus
}
#endif

#endif
