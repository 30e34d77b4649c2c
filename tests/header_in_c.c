/* The public header from C: every kind of declaration is used once, and the library links. */
#include "tavischeduler.h"

#include <string.h>

_Static_assert(sizeof(TAVI_SCHED_BACKEND_RECORD) == 11 * sizeof(void *), "eleven words");
_Static_assert(offsetof(TAVI_SCHED_TASK, next) == 0, "lists are chained through the first word");
_Static_assert(offsetof(TAVI_SCHED_PLUGIN, handle) == 0, "the first word tells a usable context");
_Static_assert(sizeof(TAVI_SCHED_DATE) == 6 * 4, "six 32-bit fields");

int useHeaderFromC(void);

/* The number of uses that answered as they should. */
int useHeaderFromC(void) {
    TAVI_SCHED_TASK *list = NULL;
    char name[16];
    int good = 0;
    TAVI_SCHED_TASK *task = TAVISchedTaskAlloc();
    good += task != NULL && TAVISchedCTaskSetName(task, "from C") == 0;
    good += TAVISchedCTaskGetName(name, sizeof name, task) == 0 && strcmp(name, "from C") == 0;
    good += strcmp(TAVISchedEnumToName(TAVISchedTypeTable, TAVI_SCHED_TYPE_WEEKLY), "weekly") == 0;
    good += strcmp(TAVISchedWeekDayNames[6], "Sat") == 0 && TAVISchedBuildInApps[4] == NULL;
    good += cBackend >= 1 && SchedBackends[0].id == TAVI_SCHED_BACKEND_SCHEDULE && pfLock == NULL;
    good += TAVISchedTaskListGet(&list, NULL) == 0 && TAVISchedTaskFree(task) == 0;
    return good;
}
