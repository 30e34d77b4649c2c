// Sorting a task list by a row of the field table. Only links change.
#include "sched_error.h"
#include "sched_field.h"
#include "sched_handle.h"
#include "tavischeduler.h"

#include <algorithm>
#include <cstdlib>
#include <cstring>
#include <span>

namespace {

using sched::Field;
using sched::FieldKind;

// Number rows compare where the fields lie in memory, as 32-bit numbers, and not their values. This
// is kept: the order of the lists that callers show is defined by it.
template <typename Number> Number position(const Field &field, const TAVI_SCHED_TASK *task) {
    return static_cast<Number>(reinterpret_cast<uintptr_t>(task) + field.offset);
}

bool comesBefore(const Field &field, const TAVI_SCHED_TASK *left, const TAVI_SCHED_TASK *right) {
    switch (field.kind) {
    case FieldKind::Text:
        return std::strcmp(field.textIn(*left), field.textIn(*right)) < 0;
    case FieldKind::Unsigned:
        return position<uint32_t>(field, left) < position<uint32_t>(field, right);
    default:
        return position<int32_t>(field, left) < position<int32_t>(field, right);
    }
}

size_t countTasks(const TAVI_SCHED_TASK *task) {
    size_t count = 0;
    for (; task; task = task->next) {
        ++count;
    }
    return count;
}

void relink(TAVI_SCHED_TASK **list, std::span<TAVI_SCHED_TASK *> order) {
    for (TAVI_SCHED_TASK *task : order) {
        *list = task;
        list = &task->next;
    }
    *list = nullptr;
}

} // namespace

int TAVISchedTaskListSortEx(TAVI_SCHED_TASK **pTaskList, unsigned int row, int direction) {
    SCHED_REQUIRE_AT(59, pTaskList && *pTaskList, "NULL != *pTaskList", -1);
    const size_t count = countTasks(*pTaskList);
    const sched::Allocated<TAVI_SCHED_TASK *> array(
        static_cast<TAVI_SCHED_TASK **>(std::calloc(count, sizeof(TAVI_SCHED_TASK *))));
    if (!array) {
        SCHED_LOG_AT(66, "calloc [%d] failed. %m", static_cast<int>(count));
        SCHED_SET_ERROR_AT(67, sched::kSortOutOfMemory);
        return -1;
    }
    const std::span order(array.get(), count);
    size_t next = 0;
    for (TAVI_SCHED_TASK *task = *pTaskList; task; task = task->next) {
        order[next++] = task;
    }
    // Stable, so equal tasks keep their order; descending is the exact reverse and turns them
    // round.
    const Field &field = sched::parm_table[row];
    std::stable_sort(order.begin(), order.end(),
                     [&field](const TAVI_SCHED_TASK *left, const TAVI_SCHED_TASK *right) {
                         return comesBefore(field, left, right);
                     });
    if (direction != 1) {
        std::reverse(order.begin(), order.end());
    }
    relink(pTaskList, order);
    return 0;
}

int TAVISchedTaskListSort(TAVI_SCHED_TASK **pTaskList, const char *szKey, int direction) {
    SCHED_REQUIRE_AT(125, pTaskList, "((void *)0) != pTaskList", -1);
    SCHED_REQUIRE_AT(125, szKey, "NULL != szKey", -1);
    if (!*pTaskList) {
        return 0;
    }
    for (size_t row = 0; row < sched::parm_table.size(); ++row) {
        if (std::strcmp(sched::parm_table[row].key, szKey) == 0) {
            return TAVISchedTaskListSortEx(pTaskList, static_cast<unsigned int>(row), direction);
        }
    }
    return -1;
}
