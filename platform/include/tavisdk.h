/*
 * The appliance's SDK interface as the scheduler uses it: user look-up and base64.
 * Functions return 0 on success and -1 on failure and then set the error state (platc.h).
 */
#ifndef TAVISDK_H
#define TAVISDK_H

#include "platc.h"

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

#ifdef __cplusplus
}
#endif

#endif
