// The field table: for each persistent field of a task its key, default and place in the record.
// The hash form, the backends' defaults and the list sort all read it.
#pragma once

#include "platc.h"
#include "sched_error.h"
#include "tavischeduler.h"

#include <array>
#include <cstddef>
#include <cstdint>
#include <type_traits>

namespace sched {

enum class FieldKind { Signed, Unsigned, Text, Enum };

struct Field {
    const char *key;
    bool enabled;  // takes part in the hash form
    bool required; // must be present when a task is read from a hash
    const char *defaultText;
    size_t offset;
    size_t size; // of a text field, with its terminator; 0 for numbers
    FieldKind kind;
    const TAVI_SCHED_ENUM *enumTable;

    int32_t &signedIn(TAVI_SCHED_TASK &task) const { return at<int32_t>(task); }
    int32_t signedIn(const TAVI_SCHED_TASK &task) const { return at<const int32_t>(task); }
    uint32_t &unsignedIn(TAVI_SCHED_TASK &task) const { return at<uint32_t>(task); }
    uint32_t unsignedIn(const TAVI_SCHED_TASK &task) const { return at<const uint32_t>(task); }
    char *textIn(TAVI_SCHED_TASK &task) const { return &at<char>(task); }
    const char *textIn(const TAVI_SCHED_TASK &task) const { return &at<const char>(task); }

    template <typename T, typename Task> T &at(Task &task) const {
        using Byte = std::conditional_t<std::is_const_v<Task>, const char, char>;
        return *reinterpret_cast<T *>(reinterpret_cast<Byte *>(&task) + offset);
    }
};

#define SCHED_NUMBER(key, field, kind, enabled, required, defaultText)                             \
    Field {                                                                                        \
        key, enabled, required, defaultText, offsetof(TAVI_SCHED_TASK, field), 0, FieldKind::kind, \
            nullptr                                                                                \
    }
#define SCHED_TEXT(key, field, enabled, required, defaultText)                                     \
    Field {                                                                                        \
        key, enabled, required, defaultText, offsetof(TAVI_SCHED_TASK, field),                     \
            sizeof(TAVI_SCHED_TASK::field), FieldKind::Text, nullptr                               \
    }
#define SCHED_ENUM(key, field, table, defaultText)                                                 \
    Field {                                                                                        \
        key, true, true, defaultText, offsetof(TAVI_SCHED_TASK, field), 0, FieldKind::Enum, table  \
    }

// Messages and the sort's callers name rows by their number here.
inline constexpr std::array<Field, 31> parm_table = {
    SCHED_NUMBER("id", id, Signed, true, true, "-1"),
    SCHED_NUMBER("backend", backend, Signed, false, false, "-1"),
    SCHED_NUMBER("can edit owner", canEditOwner, Signed, true, false, "1"),
    SCHED_NUMBER("can edit name", canEditName, Signed, true, false, "1"),
    SCHED_NUMBER("listable", listable, Signed, true, false, "1"),
    SCHED_NUMBER("can run from ui", canRunFromUI, Signed, true, false, "1"),
    SCHED_NUMBER("can delete from ui", canDeleteFromUI, Signed, true, false, "1"),
    SCHED_NUMBER("can edit from ui", canEditFromUI, Signed, true, false, "1"),
    SCHED_NUMBER("can run app same time", canRunAppSameTime, Signed, true, false, "1"),
    SCHED_NUMBER("can run task same time", canRunTaskSameTime, Signed, true, false, "0"),
    SCHED_NUMBER("simple edit form", simpleEditForm, Signed, true, false, "0"),
    SCHED_NUMBER("owner", owner, Unsigned, true, false, "0"),
    SCHED_NUMBER("start year", startYear, Unsigned, true, false, "2012"),
    SCHED_NUMBER("start month", startMonth, Unsigned, true, false, "1"),
    SCHED_NUMBER("start day", startDay, Unsigned, true, false, "1"),
    SCHED_NUMBER("run hour", runHour, Unsigned, true, true, "0"),
    SCHED_NUMBER("run min", runMin, Unsigned, true, true, "0"),
    SCHED_NUMBER("repeat hour", repeatHour, Unsigned, true, false, "0"),
    SCHED_NUMBER("last work hour", lastWorkHour, Unsigned, true, false, "0"),
    SCHED_TEXT("name", name, true, true, ""),
    SCHED_TEXT("edit form", editForm, true, false, ""),
    SCHED_TEXT("edit dialog", editDialog, true, false, "TAVI.VEX.TaskScheduler.EditDialog"),
    SCHED_TEXT("app", app, true, true, ""),
    SCHED_TEXT("app name", appName, true, true, ""),
    SCHED_TEXT("app args", appArgs, true, false, ""),
    SCHED_TEXT("action", action, true, true, ""),
    SCHED_TEXT("week", week, true, false, "1111111"),
    SCHED_TEXT("cmd", command, true, true, ""),
    SCHED_TEXT("next trigger time", nextTriggerTime, false, false, ""),
    SCHED_ENUM("state", state, TAVISchedStateTable, "enabled"),
    SCHED_ENUM("type", type, TAVISchedTypeTable, "daily"),
};

#undef SCHED_NUMBER
#undef SCHED_TEXT
#undef SCHED_ENUM

// Puts what a new task of any backend starts with into the hash; all other rows take the table's
// defaults. The start date is zeros on purpose, unlike the table's: front ends fill it in.
void setNewTaskValues(PLATCSZHASH **hash, const char *name, const char *appName);

// Fills the task row by row from the hash, the defaults standing in for absent optional keys. The
// command stays in the form that the hash has. Failures are logged for the site. 0 or -1.
int fillTaskFromHash(PLATCSZHASH *hash, TAVI_SCHED_TASK &task, const Site &site);

} // namespace sched
