// The setters and getters of a task's fields: the rows of the two accessor headers, expanded here
// to definitions. Messages name the header and the row's line, as the rows are where these expand.
#include "sched_error.h"
#include "sched_text.h"
#include "tavischeduler.h"

// String accessors test for the text or buffer first and word the task's condition differently from
// the integer setters; support scripts match both texts.

#define TAVI_SCHED_SET_INT(X, field)                                                               \
    int TAVISchedCTaskSet##X(TAVI_SCHED_TASK *pTask, int value) {                                  \
        SCHED_REQUIRE(pTask, "((void *)0) != pTask", -1);                                          \
        pTask->field = static_cast<decltype(pTask->field)>(value);                                 \
        return 0;                                                                                  \
    }
#define TAVI_SCHED_SET_FLAG(X, field)                                                              \
    int TAVISchedCTaskSet##X(TAVI_SCHED_TASK *pTask, int value) {                                  \
        SCHED_REQUIRE(pTask, "((void *)0) != pTask", -1);                                          \
        pTask->field = value == 1 ? 1 : 0;                                                         \
        return 0;                                                                                  \
    }
#define TAVI_SCHED_SET_TYPE(X, value)                                                              \
    int TAVISchedCTaskSet##X(TAVI_SCHED_TASK *pTask) {                                             \
        SCHED_REQUIRE(pTask, "((void *)0) != pTask", -1);                                          \
        pTask->type = value;                                                                       \
        return 0;                                                                                  \
    }
#define TAVI_SCHED_SET_TEXT(X, field)                                                              \
    int TAVISchedCTaskSet##X(TAVI_SCHED_TASK *pTask, const char *szVal) {                          \
        SCHED_REQUIRE(szVal, "((void *)0) != szVal", -1);                                          \
        SCHED_REQUIRE(pTask, "NULL != pTask", -1);                                                 \
        sched::copyText(pTask->field, sizeof pTask->field, szVal);                                 \
        return 0;                                                                                  \
    }
#include "tavischedsetter.h"

#define TAVI_SCHED_GET_INT(X, field)                                                               \
    int TAVISchedCTaskGet##X(int *pVal, const TAVI_SCHED_TASK *pTask) {                            \
        SCHED_REQUIRE(pVal, "((void *)0) != pVal", -1);                                            \
        SCHED_REQUIRE(pTask, "NULL != pTask", -1);                                                 \
        *pVal = static_cast<int>(pTask->field);                                                    \
        return 0;                                                                                  \
    }
#define TAVI_SCHED_GET_TEXT(X, field)                                                              \
    int TAVISchedCTaskGet##X(char *szBuf, size_t cbBuf, const TAVI_SCHED_TASK *pTask) {            \
        SCHED_REQUIRE(szBuf, "((void *)0) != szBuf", -1);                                          \
        SCHED_REQUIRE(cbBuf > 0, "0 < cbBuf", -1);                                                 \
        SCHED_REQUIRE(pTask, "NULL != pTask", -1);                                                 \
        sched::copyText(szBuf, cbBuf, pTask->field);                                               \
        return 0;                                                                                  \
    }
#define TAVI_SCHED_IS(X, field, value)                                                             \
    int TAVISchedCTaskIs##X(int *pVal, const TAVI_SCHED_TASK *pTask) {                             \
        SCHED_REQUIRE(pVal, "((void *)0) != pVal", -1);                                            \
        SCHED_REQUIRE(pTask, "NULL != pTask", -1);                                                 \
        *pVal = pTask->field == (value) ? 1 : 0;                                                   \
        return 0;                                                                                  \
    }
#include "tavischedgetter.h"
