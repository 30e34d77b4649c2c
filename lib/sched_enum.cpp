// Name tables of the enumerations, selections of names as '0'/'1' texts, and the built-in
// applications.
#include "platc.h"
#include "sched_error.h"
#include "sched_handle.h"
#include "tavischeduler.h"

#include <array>
#include <cstring>
#include <strings.h>

const TAVI_SCHED_ENUM TAVISchedTypeTable[] = {
    {TAVI_SCHED_TYPE_ONCE, "once"},     {TAVI_SCHED_TYPE_DAILY, "daily"},
    {TAVI_SCHED_TYPE_WEEKLY, "weekly"}, {TAVI_SCHED_TYPE_MONTHLY, "monthly"},
    {TAVI_SCHED_TYPE_YEARLY, "yearly"}, {-1, nullptr}};

const TAVI_SCHED_ENUM TAVISchedStateTable[] = {{TAVI_SCHED_STATE_DISABLED, "disabled"},
                                               {TAVI_SCHED_STATE_ENABLED, "enabled"},
                                               {TAVI_SCHED_STATE_NOT_EXISTED, "NotExisted"},
                                               {-1, nullptr}};

const char *const TAVISchedWeekDayNames[TAVI_SCHED_WEEK_DAYS] = {"Sun", "Mon", "Tue", "Wed",
                                                                 "Thu", "Fri", "Sat"};

const char *const TAVISchedBuildInApps[] = {
    "TAVI.VEX.TaskScheduler.Script", "TAVI.VEX.TaskScheduler.Recycle",
    "TAVI.VEX.TaskScheduler.Beep", "TAVI.VEX.TaskScheduler.Service", nullptr};

namespace {

using SelectionText = std::array<char, 4096>;

bool anyTokenIs(const PLATCSZLIST *tokens, int count, const char *name) {
    for (int i = 0; i < count; ++i) {
        if (strcasecmp(PLATCSzListGet(tokens, i), name) == 0) {
            return true;
        }
    }
    return false;
}

} // namespace

const char *TAVISchedEnumToName(const TAVI_SCHED_ENUM *table, int32_t value) {
    SCHED_REQUIRE(table, "((void *)0) != enum_list", nullptr);
    for (; table->name; ++table) {
        if (table->value == value) {
            return table->name;
        }
    }
    SCHED_SET_ERROR(sched::kNotFound);
    return nullptr;
}

int32_t TAVISchedEnumToValue(const TAVI_SCHED_ENUM *table, const char *szName) {
    SCHED_REQUIRE(table, "((void *)0) != enum_list", -1);
    SCHED_REQUIRE(szName, "NULL != szName", -1);
    for (; table->name; ++table) {
        if (std::strcmp(table->name, szName) == 0) {
            return table->value;
        }
    }
    SCHED_SET_ERROR(sched::kNotFound);
    return -1;
}

const char *TAVISchedMultiSelectFromText(const char *szText, const char *const *names,
                                         size_t count) {
    static SelectionText selection;
    if (!szText || !names || count == 0) {
        return nullptr;
    }
    selection.fill('\0');
    sched::List tokens(1024);
    const int tokenCount = tokens ? PLATCStrSep(szText, ",", tokens.address()) : -1;
    if (tokenCount <= 0) {
        return nullptr;
    }
    for (size_t i = 0; i < count && i < selection.size() - 1; ++i) {
        selection[i] = anyTokenIs(tokens.get(), tokenCount, names[i]) ? '1' : '0';
    }
    return selection.data();
}

const char *TAVISchedMultiSelectToText(const char *szSelect, const char *const *names,
                                       size_t count) {
    static SelectionText text;
    if (!szSelect || !names || std::strlen(szSelect) < count) {
        return nullptr;
    }
    text.fill('\0');
    size_t length = 0;
    const char *separator = "";
    for (size_t i = 0; szSelect[i] != '\0' && length < text.size(); ++i) {
        if (szSelect[i] != '0') {
            // The length that the text would have: at the buffer's size or past it, it is full.
            length += static_cast<size_t>(std::snprintf(text.data() + length, text.size() - length,
                                                        "%s%s", separator, names[i]));
            separator = ",";
        }
    }
    return text.data();
}

int TAVISchedTaskIsBuildInApp(const TAVI_SCHED_TASK *pTask) {
    for (const char *const *app = TAVISchedBuildInApps; pTask && *app; ++app) {
        if (std::strcmp(pTask->app, *app) == 0) {
            return 1;
        }
    }
    return 0;
}
