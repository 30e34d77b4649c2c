/*
 * The getters and tests of a task's fields, one row each. tavischeduler.h includes this file to
 * declare them and the library includes it once more to define them, so it has no include guard.
 *
 * A name is a form's and, for <X>, a row's first word: TAVISchedCTaskGetRunHour is found by looking
 * for "(RunHour,". All return 0, or -1 with error 0x0D00 when an argument is NULL or a size is 0.
 *   TAVI_SCHED_GET_INT   TAVISchedCTaskGet<X>(value, task): the field.
 *   TAVI_SCHED_GET_TEXT  TAVISchedCTaskGet<X>(buffer, size, task): the text, cut to size - 1 bytes.
 *   TAVI_SCHED_IS        TAVISchedCTaskIs<X>(value, task): 1 when the field has the row's value,
 *                        else 0.
 */
#ifndef TAVI_SCHED_GET_INT
#include "tavischeduler.h"
#define TAVI_SCHED_GET_INT(X, field)                                                               \
    TAVI_SCHED_API int TAVISchedCTaskGet##X(int *pVal, const TAVI_SCHED_TASK *pTask);
#define TAVI_SCHED_GET_TEXT(X, field)                                                              \
    TAVI_SCHED_API int TAVISchedCTaskGet##X(char *szBuf, size_t cbBuf,                             \
                                            const TAVI_SCHED_TASK *pTask);
#define TAVI_SCHED_IS(X, field, value)                                                             \
    TAVI_SCHED_API int TAVISchedCTaskIs##X(int *pVal, const TAVI_SCHED_TASK *pTask);
#endif

TAVI_SCHED_GET_INT(Backend, backend)
TAVI_SCHED_GET_INT(ID, id)
TAVI_SCHED_IS(New, id, -1)
TAVI_SCHED_GET_INT(Owner, owner)
TAVI_SCHED_GET_INT(StartYear, startYear)
TAVI_SCHED_GET_INT(StartMonth, startMonth)
TAVI_SCHED_GET_INT(StartDay, startDay)
TAVI_SCHED_GET_INT(RunHour, runHour)
TAVI_SCHED_GET_INT(RunMin, runMin)
TAVI_SCHED_GET_INT(RepeatHour, repeatHour)
TAVI_SCHED_GET_INT(LastWorkHour, lastWorkHour)
TAVI_SCHED_IS(Enabled, state, TAVI_SCHED_STATE_ENABLED)
TAVI_SCHED_IS(Once, type, TAVI_SCHED_TYPE_ONCE)
TAVI_SCHED_IS(Daily, type, TAVI_SCHED_TYPE_DAILY)
TAVI_SCHED_IS(Weekly, type, TAVI_SCHED_TYPE_WEEKLY)
TAVI_SCHED_IS(Monthly, type, TAVI_SCHED_TYPE_MONTHLY)
TAVI_SCHED_IS(Yearly, type, TAVI_SCHED_TYPE_YEARLY)
TAVI_SCHED_IS(SimpleEditForm, simpleEditForm, 1)
TAVI_SCHED_IS(Listable, listable, 1)
TAVI_SCHED_IS(CanEditName, canEditName, 1)
TAVI_SCHED_IS(CanEditOwner, canEditOwner, 1)
TAVI_SCHED_IS(CanRunAppSameTime, canRunAppSameTime, 1)
TAVI_SCHED_IS(CanRunTaskSameTime, canRunTaskSameTime, 1)
TAVI_SCHED_IS(CanRunFromUI, canRunFromUI, 1)
TAVI_SCHED_IS(CanDeleteFromUI, canDeleteFromUI, 1)
TAVI_SCHED_IS(CanEditFromUI, canEditFromUI, 1)
TAVI_SCHED_GET_TEXT(Name, name)
TAVI_SCHED_GET_TEXT(NextTriggerTime, nextTriggerTime)
TAVI_SCHED_GET_TEXT(Week, week)
TAVI_SCHED_GET_TEXT(EditDialog, editDialog)
TAVI_SCHED_GET_TEXT(EditForm, editForm)
TAVI_SCHED_GET_TEXT(App, app)
TAVI_SCHED_GET_TEXT(AppName, appName)
TAVI_SCHED_GET_TEXT(AppArgs, appArgs)
TAVI_SCHED_GET_TEXT(Action, action)
TAVI_SCHED_GET_TEXT(Command, command)

#undef TAVI_SCHED_GET_INT
#undef TAVI_SCHED_GET_TEXT
#undef TAVI_SCHED_IS
