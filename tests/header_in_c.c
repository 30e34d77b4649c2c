/* The public header compiles as C, and its records have the layout that other programs rely on. */
#include "tavischeduler.h"

_Static_assert(sizeof(TAVI_SCHED_BACKEND_RECORD) == 11 * sizeof(void *), "eleven words");
_Static_assert(offsetof(TAVI_SCHED_TASK, next) == 0, "lists are chained through the first word");
_Static_assert(offsetof(TAVI_SCHED_PLUGIN, handle) == 0, "the first word tells a usable context");
_Static_assert(sizeof(TAVI_SCHED_DATE) == 6 * 4, "six 32-bit fields");
