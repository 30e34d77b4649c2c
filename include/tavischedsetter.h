/*
 * The setters of a task's fields, one row each. tavischeduler.h includes this file to declare them
 * and the library includes it once more to define them, so it has no include guard.
 *
 * A name is TAVISchedCTaskSet and a row's first word, the <X> below: TAVISchedCTaskSetRunHour is
 * found by looking for "(RunHour,".
 * All return 0, or -1 with error 0x0D00 when an argument is NULL.
 *   TAVI_SCHED_SET_INT   TAVISchedCTaskSet<X>(task, value): stores the value as given, no check.
 *   TAVI_SCHED_SET_FLAG  TAVISchedCTaskSet<X>(task, value): stores 1 when value is 1, else 0.
 *   TAVI_SCHED_SET_TYPE  TAVISchedCTaskSet<X>(task): sets the schedule type.
 *   TAVI_SCHED_SET_TEXT  TAVISchedCTaskSet<X>(task, text): copies it, cut to the field's size.
 */
#ifndef TAVI_SCHED_SET_INT
#include "tavischeduler.h"
#define TAVI_SCHED_SET_INT(X, field)                                                               \
    TAVI_SCHED_API int TAVISchedCTaskSet##X(TAVI_SCHED_TASK *pTask, int value);
#define TAVI_SCHED_SET_FLAG(X, field)                                                              \
    TAVI_SCHED_API int TAVISchedCTaskSet##X(TAVI_SCHED_TASK *pTask, int value);
#define TAVI_SCHED_SET_TYPE(X, type)                                                               \
    TAVI_SCHED_API int TAVISchedCTaskSet##X(TAVI_SCHED_TASK *pTask);
#define TAVI_SCHED_SET_TEXT(X, field)                                                              \
    TAVI_SCHED_API int TAVISchedCTaskSet##X(TAVI_SCHED_TASK *pTask, const char *szVal);
#endif

TAVI_SCHED_SET_INT(Backend, backend)
TAVI_SCHED_SET_INT(ID, id)
TAVI_SCHED_SET_INT(Owner, owner)
TAVI_SCHED_SET_INT(StartYear, startYear)
TAVI_SCHED_SET_INT(StartMonth, startMonth)
TAVI_SCHED_SET_INT(StartDay, startDay)
TAVI_SCHED_SET_INT(RunHour, runHour)
TAVI_SCHED_SET_INT(RunMin, runMin)
TAVI_SCHED_SET_INT(RepeatHour, repeatHour)
TAVI_SCHED_SET_INT(LastWorkHour, lastWorkHour)
TAVI_SCHED_SET_FLAG(State, state)
TAVI_SCHED_SET_TYPE(Once, TAVI_SCHED_TYPE_ONCE)
TAVI_SCHED_SET_TYPE(Daily, TAVI_SCHED_TYPE_DAILY)
TAVI_SCHED_SET_TYPE(Weekly, TAVI_SCHED_TYPE_WEEKLY)
TAVI_SCHED_SET_TYPE(Monthly, TAVI_SCHED_TYPE_MONTHLY)
TAVI_SCHED_SET_TYPE(Yearly, TAVI_SCHED_TYPE_YEARLY)
TAVI_SCHED_SET_FLAG(SimpleEditForm, simpleEditForm)
TAVI_SCHED_SET_FLAG(Listable, listable)
TAVI_SCHED_SET_FLAG(CanEditName, canEditName)
TAVI_SCHED_SET_FLAG(CanEditOwner, canEditOwner)
TAVI_SCHED_SET_FLAG(CanRunAppSameTime, canRunAppSameTime)
TAVI_SCHED_SET_FLAG(CanRunTaskSameTime, canRunTaskSameTime)
TAVI_SCHED_SET_FLAG(CanRunFromUI, canRunFromUI)
TAVI_SCHED_SET_FLAG(CanDeleteFromUI, canDeleteFromUI)
TAVI_SCHED_SET_FLAG(CanEditFromUI, canEditFromUI)
TAVI_SCHED_SET_TEXT(Name, name)
TAVI_SCHED_SET_TEXT(Week, week)
TAVI_SCHED_SET_TEXT(EditDialog, editDialog)
TAVI_SCHED_SET_TEXT(EditForm, editForm)
TAVI_SCHED_SET_TEXT(App, app)
TAVI_SCHED_SET_TEXT(AppName, appName)
TAVI_SCHED_SET_TEXT(AppArgs, appArgs)
TAVI_SCHED_SET_TEXT(Action, action)
TAVI_SCHED_SET_TEXT(Command, command)

#undef TAVI_SCHED_SET_INT
#undef TAVI_SCHED_SET_FLAG
#undef TAVI_SCHED_SET_TYPE
#undef TAVI_SCHED_SET_TEXT
