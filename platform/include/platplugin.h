/*
 * The appliance's plug-in interface: packages register handlers for a named plug-in, and a call
 * runs all of them with named text arguments. In the portable implementation a handler is an
 * executable file in /usr/tavi/etc/plugins/<plug-in>/, started as "HANDLER <action> <pre|post>" in
 * name order with every argument in its environment and nothing on its standard input. Handlers
 * must be regular files that belong to root and that nobody else may write, in a folder of the same
 * kind; others are skipped with a log line. Functions return 0 on success, -1 on failure.
 */
#ifndef PLATPLUGIN_H
#define PLATPLUGIN_H

#include "platc.h"

#ifdef __cplusplus
extern "C" {
#endif

/* The phases of a call: before and after the operation that it is about. */
#define PLATPLUGIN_PHASE_PRE 4
#define PLATPLUGIN_PHASE_POST 5

typedef struct PLATPLUGIN PLATPLUGIN;

/* Prepares a call of the plug-in's handlers for an action; `*ppPlugin` receives the handle. */
PLATC_API int PLATPluginInit(const char *szPlugin, const char *szAction, PLATPLUGIN **ppPlugin);
/* Sets an argument of the following calls, replacing an earlier value of the same name. */
PLATC_API int PLATPluginSetArg(PLATPLUGIN *pPlugin, const char *szName, const char *szValue);
PLATC_API int PLATPluginSetArgByInt(PLATPLUGIN *pPlugin, const char *szName, int value);
/* Runs every handler once for the phase and waits for each. -1 when one could not be started or did
 * not exit with 0; the others have run all the same. No handler is a success. */
PLATC_API int PLATPluginAction(int phase, PLATPLUGIN *pPlugin);
/* Empties the list, then lists why handlers of the plug-in are skipped, a text each. Returns their
 * number, or -1. */
PLATC_API int PLATPluginCheck(const char *szPlugin, PLATCSZLIST **ppFaults);
/* Releases the handle and clears it; a handle that is NULL already is a success. */
PLATC_API int PLATPluginExit(PLATPLUGIN **ppPlugin);

#ifdef __cplusplus
}
#endif

#endif
