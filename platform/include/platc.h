/*
 * The appliance's core platform interface: error state, string lists and hashes, section files,
 * programs and processes. C linkage, usable from C and C++. Unless a declaration says otherwise,
 * functions return 0 on success and -1 on failure and then set the error state.
 *
 * Error codes that the portable implementation sets: 0x0200 out of memory, 0x0900 a file cannot be
 * opened, created or trusted, 0x0B00 a read, write or look-up failed, 0x0D00 invalid argument,
 * 0x2700 a file's status cannot be read, 0x2800 a file cannot be moved into place,
 * 0x2A00 a system call or a started program failed.
 */
#ifndef PLATC_H
#define PLATC_H

#include <stddef.h>
#include <sys/types.h>

#ifdef __cplusplus
extern "C" {
#endif

#define PLATC_API __attribute__((visibility("default")))

/* ---- Error state: the last failure of this process. A success never clears it. ---- */

/* Records a failure: its code, source file (copied) and line. Keeps errno. */
PLATC_API void PLATCErrSetEx(unsigned int code, const char *szFile, int line);
/* The code, file and line of the last failure; 0, "" and 0 when there was none. */
PLATC_API unsigned int PLATCErrGet(void);
PLATC_API const char *PLATCErrorGetFile(void);
PLATC_API int PLATCErrorGetLine(void);

/* ---- String list ---- */

typedef struct PLATCSZLIST PLATCSZLIST;

/* A new empty list with room for `capacity` texts; it grows as needed. NULL when out of memory. */
PLATC_API PLATCSZLIST *PLATCSzListAlloc(int capacity);
PLATC_API void PLATCSzListFree(PLATCSZLIST *pList);
/* Appends a copy of the text. */
PLATC_API int PLATCSzListPush(PLATCSZLIST **ppList, const char *szText);
/* The text at `index`, valid until the list changes; NULL past the end. */
PLATC_API const char *PLATCSzListGet(const PLATCSZLIST *pList, int index);
/* Empties the list, then splits the text at every character of `szSeparators` into it; empty
 * tokens are skipped. Returns the number of tokens, or -1. */
PLATC_API int PLATCStrSep(const char *szText, const char *szSeparators, PLATCSZLIST **ppList);

/* ---- String hash: unique keys with one text each ---- */

typedef struct PLATCSZHASH PLATCSZHASH;

/* A new empty hash for about `capacity` pairs; it grows as needed. NULL when out of memory. */
PLATC_API PLATCSZHASH *PLATCSzHashAlloc(int capacity);
PLATC_API void PLATCSzHashFree(PLATCSZHASH *pHash);
PLATC_API void PLATCHashRemoveAll(PLATCSZHASH *pHash);
/* Sets key to a copy of the text, replacing what it had. */
PLATC_API int PLATCSzHashSetValue(PLATCSZHASH **ppHash, const char *szKey, const char *szValue);
/* The key's text, NULL when the key is absent. The text is the hash's own storage: the caller may
 * change its characters in place but not its length; a later set or removal invalidates it. */
PLATC_API char *PLATCSzHashGetValue(PLATCSZHASH *pHash, const char *szKey);
/* Empties the list, then lists the keys into it in byte order. Returns their number, or -1. */
PLATC_API int PLATCSzHashEnumKey(const PLATCSZHASH *pHash, PLATCSZLIST **ppList);

/* ---- Files ---- */

/* 1 when the path exists (links are followed), else 0, also when that cannot be seen. */
PLATC_API int PLATCFileExist(const char *szPath);
/* Creates the file empty, or updates the times of an existing one. */
PLATC_API int PLATCFileTouch(const char *szPath);
/* Replaces the first line that contains `szMatch` by `szLine`, or removes it when `szLine` is NULL.
 * The file is replaced atomically and keeps owner and mode. 1 changed, 0 no such line, -1. */
PLATC_API int PLATCFileSetLine(const char *szPath, const char *szMatch, const char *szLine);

/*
 * Section files: "[name]" headers, each followed by "key=value" lines. A value is everything after
 * the first "=", blanks included, and may hold any byte but a line feed; a key holds neither "="
 * nor a line feed and does not begin with "["; a name holds neither "]" nor a line feed. Other
 * lines are ignored and kept; of sections with one name only the first is read. Writers replace the
 * file atomically, keeping owner and mode, and the change is on the disk when they answer. In a
 * folder with the sticky bit it is not, as nothing there outlives a restart, and a file is refused
 * with error 0x0900 and a log line when it is a link, belongs neither to root nor to the effective
 * user, or may be written by everybody: anybody may have put there what it says. A file that cannot
 * be looked at is no missing one: every function answers -1.
 */

/* Empties the list, then lists the names of all sections in file order. Returns their number. */
PLATC_API int PLATCFileEnumSection(const char *szPath, PLATCSZLIST **ppList);
/* Reads the section's pairs into the hash, beside what it holds. 1 found, 0 no such section, -1. */
PLATC_API int PLATCFileGetSection(const char *szPath, const char *szSection, PLATCSZHASH **ppHash);
/* Hands every section to the function, in file order and as one reading shows them: its name and
 * its pairs, both valid during the call; but none with a NUL in its name, which nobody can name.
 * The function ends the pass by any other answer than 0. Returns the number of calls, or -1. */
PLATC_API int PLATCFileForEachSection(const char *szPath,
                                      int (*pfOnSection)(void *pContext, const char *szSection,
                                                         PLATCSZHASH *pHash),
                                      void *pContext);
/* Replaces the section's lines by the hash's pairs. 1 done, 0 no such section, -1. */
PLATC_API int PLATCFileSetSection(const char *szPath, const char *szSection,
                                  const PLATCSZHASH *pHash);
/* Appends a new section; the caller knows that there is none of that name. A missing file is made
 * with mode 0600. 1 done, -1. */
PLATC_API int PLATCFileAddSection(const char *szPath, const char *szSection,
                                  const PLATCSZHASH *pHash);
/* 1 removed, 0 no such section, -1. */
PLATC_API int PLATCFileRemoveSection(const char *szPath, const char *szSection);
/* Makes `count` changes at once: a section whose hash is NULL is removed if there is one, any other
 * is replaced where it stands or else appended, in the order given. The file is written once; a
 * missing one is made with mode 0600. */
PLATC_API int PLATCFileEditSections(const char *szPath, int count, const char *const *rgszSections,
                                    const PLATCSZHASH *const *rgHashes);
/* Empties the list, then lists in file order what a hand has spoilt, a text each: "line 12: damaged
 * header: [x" and "line 15: section [3] stands more than once". Returns their number, or -1. */
PLATC_API int PLATCFileCheckSections(const char *szPath, PLATCSZLIST **ppFaults);

/* ---- Programs and processes ---- */

/* Starts the program (an absolute path, no shell) with the arguments after its name, ended by NULL,
 * and /dev/null as its standard input, and waits for it. 0 when it exited with 0, its exit status
 * when that is another, -1 when it could not be started or was killed. Works in a caller that
 * ignores SIGCHLD too. */
PLATC_API int PLATCExec(const char *szProgram, const char *const *rgszArgs);
/* 1 when the process exists and is no zombie, else 0. */
PLATC_API int PLATCProcAlive(pid_t pid);
/* Forks a child that the caller does not wait for: in a session of its own, descriptors 0, 1 and 2
 * on /dev/null, never a zombie. 1 in the caller, 0 in the child, -1 when there is none. The child
 * must end with _exit. */
PLATC_API int PLATCProcForkChildNoWait(void);

#ifdef __cplusplus
}
#endif

#endif
