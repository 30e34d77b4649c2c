// The field table: for each persistent field of a task its key, default, place in the record and
// range. The hash form, the backends' defaults, the list sort and the check of a task all read it.
#pragma once

#include "platc.h"
#include "sched_error.h"
#include "tavischeduler.h"

#include <array>
#include <cstddef>
#include <cstdint>
#include <limits>
#include <optional>
#include <type_traits>

namespace sched {

enum class FieldKind { Signed, Unsigned, Text, Enum };

// What a number may be.
struct Range {
    int64_t low, high;
};
inline constexpr Range kAnySigned = {std::numeric_limits<int32_t>::min(),
                                     std::numeric_limits<int32_t>::max()};
inline constexpr Range kAnyUnsigned = {0, std::numeric_limits<uint32_t>::max()};

struct Field {
    const char *key;
    bool enabled;  // takes part in the hash form
    bool required; // must be present when a task is read from a hash
    const char *defaultText;
    size_t offset;
    size_t size; // of a text field, with its terminator; 0 for numbers
    FieldKind kind;
    const TAVI_SCHED_ENUM *enumTable;
    Range range; // of numbers and of the values that have names; {} for texts

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

#define SCHED_NUMBER(key, field, kind, enabled, required, defaultText, ...)                        \
    Field {                                                                                        \
        key, enabled, required, defaultText, offsetof(TAVI_SCHED_TASK, field), 0, FieldKind::kind, \
            nullptr, Range __VA_ARGS__                                                             \
    }
#define SCHED_FLAG(key, field, defaultText)                                                        \
    SCHED_NUMBER(key, field, Signed, true, false, defaultText, {0, 1})
#define SCHED_TEXT(key, field, enabled, required, defaultText)                                     \
    Field {                                                                                        \
        key, enabled, required, defaultText, offsetof(TAVI_SCHED_TASK, field),                     \
            sizeof(TAVI_SCHED_TASK::field), FieldKind::Text, nullptr, {}                           \
    }
#define SCHED_ENUM(key, field, table, defaultText, ...)                                            \
    Field {                                                                                        \
        key, true, true, defaultText, offsetof(TAVI_SCHED_TASK, field), 0, FieldKind::Enum, table, \
            Range __VA_ARGS__                                                                      \
    }

// Messages and the sort's callers name rows by their number here. Ranges are for the check of a
// task alone: what is stored is stored as given.
inline constexpr std::array<Field, 31> parm_table = {
    SCHED_NUMBER("id", id, Signed, true, true, "-1", {kAnySigned}),
    SCHED_NUMBER("backend", backend, Signed, false, false, "-1",
                 {TAVI_SCHED_BACKEND_AUTOPOWER, TAVI_SCHED_BACKEND_SCHEDULE}),
    SCHED_FLAG("can edit owner", canEditOwner, "1"),
    SCHED_FLAG("can edit name", canEditName, "1"),
    SCHED_FLAG("listable", listable, "1"),
    SCHED_FLAG("can run from ui", canRunFromUI, "1"),
    SCHED_FLAG("can delete from ui", canDeleteFromUI, "1"),
    SCHED_FLAG("can edit from ui", canEditFromUI, "1"),
    SCHED_FLAG("can run app same time", canRunAppSameTime, "1"),
    SCHED_FLAG("can run task same time", canRunTaskSameTime, "0"),
    SCHED_FLAG("simple edit form", simpleEditForm, "0"),
    SCHED_NUMBER("owner", owner, Unsigned, true, false, "0", {kAnyUnsigned}),
    SCHED_NUMBER("start year", startYear, Unsigned, true, false, "2012", {1970, 9999}),
    SCHED_NUMBER("start month", startMonth, Unsigned, true, false, "1", {1, 12}),
    SCHED_NUMBER("start day", startDay, Unsigned, true, false, "1", {1, 31}),
    SCHED_NUMBER("run hour", runHour, Unsigned, true, true, "0", {0, 23}),
    SCHED_NUMBER("run min", runMin, Unsigned, true, true, "0", {0, 59}),
    SCHED_NUMBER("repeat hour", repeatHour, Unsigned, true, false, "0", {0, 23}),
    SCHED_NUMBER("last work hour", lastWorkHour, Unsigned, true, false, "0", {0, 23}),
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
    SCHED_ENUM("state", state, TAVISchedStateTable, "enabled",
               {TAVI_SCHED_STATE_DISABLED, TAVI_SCHED_STATE_ENABLED}),
    SCHED_ENUM("type", type, TAVISchedTypeTable, "daily",
               {TAVI_SCHED_TYPE_ONCE, TAVI_SCHED_TYPE_YEARLY}),
};

#undef SCHED_NUMBER
#undef SCHED_FLAG
#undef SCHED_TEXT
#undef SCHED_ENUM

// Puts what a new task of any backend starts with into the hash; all other rows take the table's
// defaults. The start date is zeros on purpose, unlike the table's: front ends fill it in.
void setNewTaskValues(PLATCSZHASH **hash, const char *name, const char *appName);

// Fills the task row by row from the hash, the defaults standing in for absent optional keys. The
// command stays in the form that the hash has. Failures are logged for the site. 0 or -1.
int fillTaskFromHash(PLATCSZHASH *hash, TAVI_SCHED_TASK &task, const Site &site);

// The number that a stored text stands for: digits at its front, and what lies beyond the field's
// 32 bits is clamped, as an owner of 4294967296 must not become root.
int32_t signedFromText(const char *text);
// The same; a negative number counts as the largest. Nothing when anything follows the digits.
std::optional<uint32_t> unsignedFromText(const char *text);

} // namespace sched
