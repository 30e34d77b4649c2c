// Accessors, refused arguments, enumerations and selections.
#include "support.h"

#include <cstring>
#include <type_traits>
#include <utility>

namespace {

using namespace support;
using TaskRecord = SchedTest;

TEST_F(TaskRecord, FlagsAreZeroOrOne) {
    TAVI_SCHED_TASK task{};
    for (const int given : {1, 2, -1}) {
        TAVISchedCTaskSetListable(&task, given);
        TAVISchedCTaskSetState(&task, given);
        EXPECT_EQ(task.listable * 10 + task.state, given == 1 ? 11 : 0) << given;
    }
    int value = 1;
    task.listable = 2;
    TAVISchedCTaskIsListable(&value, &task);
    EXPECT_EQ(value, 0);
}

// A row that names another field than its accessor would show here: every text goes into its own.
TEST_F(TaskRecord, TextsAreCutToTheirOwnField) {
    const struct {
        int (*set)(TAVI_SCHED_TASK *, const char *);
        int (*get)(char *, size_t, const TAVI_SCHED_TASK *);
        size_t size;
    } rows[] = {{TAVISchedCTaskSetName, TAVISchedCTaskGetName, 4096},
                {TAVISchedCTaskSetWeek, TAVISchedCTaskGetWeek, 8},
                {TAVISchedCTaskSetEditDialog, TAVISchedCTaskGetEditDialog, 1024},
                {TAVISchedCTaskSetEditForm, TAVISchedCTaskGetEditForm, 1024},
                {TAVISchedCTaskSetApp, TAVISchedCTaskGetApp, 1024},
                {TAVISchedCTaskSetAppName, TAVISchedCTaskGetAppName, 1024},
                {TAVISchedCTaskSetAppArgs, TAVISchedCTaskGetAppArgs, 8192},
                {TAVISchedCTaskSetAction, TAVISchedCTaskGetAction, 1024},
                {TAVISchedCTaskSetCommand, TAVISchedCTaskGetCommand, 16384}};
    TAVI_SCHED_TASK task{};
    for (const auto &row : rows) {
        const char filler = static_cast<char>('a' + (&row - rows));
        EXPECT_EQ(row.set(&task, std::string(20000, filler).c_str()), 0);
    }
    for (const auto &row : rows) {
        const char filler = static_cast<char>('a' + (&row - rows));
        std::string buffer(20001, '#');
        EXPECT_EQ(row.get(buffer.data(), buffer.size(), &task), 0);
        EXPECT_EQ(buffer.c_str(), std::string(row.size - 1, filler));
    }
}

TEST_F(TaskRecord, BadArgumentsAreNamed) {
    char text[4] = "";
    EXPECT_EQ(failure(TAVISchedCTaskSetName(nullptr, nullptr)), 0x0D00U);
    EXPECT_EQ(failure(TAVISchedCTaskGetName(text, 0, nullptr)), 0x0D00U);
    EXPECT_EQ(failure(TAVISchedDateComp(nullptr, nullptr)), 0x0D00U);
    EXPECT_STREQ(PLATCErrorGetFile(), "sched_util.cpp");
    const std::string reason = ":* Invaild Argument ";
    EXPECT_THAT(logs(), ElementsAre("tavischedsetter.h" + reason + "(((void *)0) != szVal)=[0]\n",
                                    "tavischedgetter.h" + reason + "(0 < cbBuf)=[0]\n",
                                    "sched_util.cpp" + reason + "(((void *)0) != pDate1)=[0]\n"));
}

// Each pointer given and each size above 0 is one that the function needs: with any of them missing
// it refuses.
template <typename Result, typename... Parameters> struct Needs {
    Needs(Result (*function)(Parameters...), std::type_identity_t<Parameters>... given,
          int line = __builtin_LINE()) {
        const auto refuses = [&](auto &argument) {
            using Argument = std::remove_reference_t<decltype(argument)>;
            if constexpr (std::is_pointer_v<Argument> || std::is_same_v<Argument, size_t>) {
                if (const Argument kept = std::exchange(argument, Argument{})) {
                    PLATCErrSetEx(0, "", 0);
                    EXPECT_EQ(failure(static_cast<int>(function(given...))), 0x0D00U) << line;
                    argument = kept;
                }
            }
        };
        (refuses(given), ...);
    }
};
template <typename Result, typename... Parameters, typename... Given>
Needs(Result (*)(Parameters...), Given...) -> Needs<Result, Parameters...>;

TEST_F(TaskRecord, WhatIsNeededMustBeGiven) {
    char text[4] = "";
    int number = 0;
    int64_t moment = 0;
    TAVI_SCHED_TASK task{};
    TAVI_SCHED_TASK *list = &task;
    TAVI_SCHED_DATE date{};
    TAVI_SCHED_FAULT fault{};
    TAVI_SCHED_STATUS status{};
    TAVI_SCHED_FINDING *findings = nullptr;
    TAVI_SCHED_PLUGIN plugin{};
    PLATCSZHASH *hash = PLATCSzHashAlloc(16);
    sqlite3 *database = TAVISchedDBInit();
    const auto takeStatus = [](void *, const TAVI_SCHED_STATUS *) { return 0; };
    const auto takeRun = [](void *, const TAVI_SCHED_RUN *) { return 0; };
    const auto takeRemark = [](void *, const TAVI_SCHED_REMARK *) { return 0; };
    TAVI_SCHED_SPAN span{};
    TAVI_SCHED_RUN run{};
    TAVI_SCHED_RUN_LIMITS limits{};

#define TAVI_SCHED_SET_INT(X, field) Needs(TAVISchedCTaskSet##X, &task, 1);
#define TAVI_SCHED_SET_FLAG TAVI_SCHED_SET_INT
#define TAVI_SCHED_SET_TYPE(X, value) Needs(TAVISchedCTaskSet##X, &task);
#define TAVI_SCHED_SET_TEXT(X, field) Needs(TAVISchedCTaskSet##X, &task, text);
#include "tavischedsetter.h"
#define TAVI_SCHED_GET_INT(X, field) Needs(TAVISchedCTaskGet##X, &number, &task);
#define TAVI_SCHED_GET_TEXT(X, field) Needs(TAVISchedCTaskGet##X, text, 4, &task);
#define TAVI_SCHED_IS(X, field, value) Needs(TAVISchedCTaskIs##X, &number, &task);
#include "tavischedgetter.h"
    Needs(TAVISchedEnumToValue, TAVISchedStateTable, text);
    Needs(TAVISchedInitHashFromTask, &hash, &task);
    Needs(TAVISchedInitTaskFromHash, hash, &task);
    Needs(TAVISchedTaskCheck, &task, &fault);
    Needs(TAVISchedValueCheck, "id", text, &fault);
    Needs(TAVISchedHashCheck, hash, nullptr, 0);
    Needs(TAVISchedDateGet, &date);
    Needs(TAVISchedDateComp, &date, &date);
    Needs(TAVISchedDateParse, text, &date);
    Needs(TAVISchedTimeParse, text, &date);
    Needs(TAVISchedDateNormalize, &date);
    Needs(TAVISchedNextTriggerTime, &task);
    Needs(TAVISchedTaskStarts, &task, 0, 1, &moment, 1);
    Needs(TAVISchedTaskNextStart, &task, 0, &moment);
    Needs(TAVISchedOffHours, nullptr, 0, 0, 1, &span, 1);
    EXPECT_EQ(failure(TAVISchedOffHours(nullptr, 1, 0, 1, &span, 1)), 0x0D00U);
    Needs(TAVISchedTaskRemarks, nullptr, 0, nullptr, 0, takeRemark, nullptr);
    EXPECT_EQ(failure(TAVISchedTaskRemarks(nullptr, 1, nullptr, 0, takeRemark, nullptr)), 0x0D00U);
    Needs(TAVISchedTaskFree, &task);
    Needs(TAVISchedTaskGetDefault, &task);
    Needs(TAVISchedTaskGetByID, 1, &task);
    Needs(TAVISchedTaskLoad, 1, &task);
    Needs(TAVISchedTaskEdit, &task);
    Needs(TAVISchedTaskSave, &task);
    Needs(TAVISchedTaskListGet, &list, nullptr);
    Needs(TAVISchedTaskListGetOf, 1, &list, nullptr);
    Needs(TAVISchedCrontabLine, &task, text, 4);
    Needs(TAVISchedCrontabLineCheck, text, nullptr, text, 4);
    Needs(TAVISchedTaskNextId, &number);
    Needs(TAVISchedTaskCreateWithId, &task);
    Needs(TAVISchedPowerOnCheck, text, 4);
    Needs(TAVISchedTaskListSortEx, &list, 0, 1);
    Needs(TAVISchedTaskListSort, &list, "id", 1);
    Needs(TAVISchedDBOpenForReading, &database);
    Needs(TAVISchedDBClose, database);
    Needs(TAVISchedDBAddRecord, database, &task, nullptr);
    Needs(TAVISchedDBSetStatus, database, 1, 0, 3, nullptr);
    Needs(TAVISchedDBGetStatusByTaskID, database, 1, nullptr, &number, nullptr, 0);
    Needs(TAVISchedDBGetStatusByStatusID, database, 1, &number, nullptr, 0);
    Needs(TAVISchedDBIsTaskRunning, database, 1, &status);
    Needs(TAVISchedDBIsAppRunning, database, text, &status);
    Needs(TAVISchedDBListStatus, database, 1, takeStatus, nullptr);
    Needs(TAVISchedDBListLastStatus, database, takeStatus, nullptr);
    Needs(TAVISchedRunList, nullptr, takeRun, nullptr);
    Needs(TAVISchedRunGet, 1, &run);
    Needs(TAVISchedRunOutputRead, 1, &moment, text, 4, nullptr);
    Needs(TAVISchedRunLimitsGet, &limits);
    Needs(TAVISchedMachineCheck, &findings);
    Needs(TAVISchedMachineCheckOf, nullptr, &findings);
    Needs(TAVISchedTaskPluginInit, &plugin, text, &task, nullptr);
    Needs(tavischedule_init, "tavischedule", SchedBackends);
    Needs(taviautopower_init, "taviautopower", SchedBackends);
    for (const TAVI_SCHED_BACKEND_RECORD *row = SchedBackends; row->name; ++row) {
        Needs(row->list_get, &list, nullptr);
        Needs(row->get_by_id, 1, &task);
        Needs(row->create, &task);
        Needs(row->edit, &task);
        Needs(row->run, &task, &number, text, 4);
        if (row->get_default) {
            Needs(row->get_default, &task);
        }
    }
    PLATCSzHashFree(hash);
    TAVISchedDBClose(database);
}

TEST_F(TaskRecord, EnumerationsAndSelections) {
    EXPECT_STREQ(TAVISchedEnumToName(TAVISchedStateTable, 2), "NotExisted");
    EXPECT_EQ(TAVISchedEnumToName(TAVISchedTypeTable, 5), nullptr);
    EXPECT_EQ(TAVISchedEnumToName(TAVISchedTypeTable, -1), nullptr);
    EXPECT_EQ(TAVISchedEnumToValue(TAVISchedStateTable, "enabled"), 1);
    EXPECT_EQ(failure(TAVISchedEnumToValue(TAVISchedStateTable, "Enabled")), 0x2000U);
    EXPECT_THAT(logs(), IsEmpty()); // a value or name that is not found is not logged

    const auto *const names = TAVISchedWeekDayNames;
    EXPECT_STREQ(TAVISchedMultiSelectFromText("mon,SAT", names, 7), "0100001");
    EXPECT_STREQ(TAVISchedMultiSelectFromText(" Mon,,Tue", names, 7), "0010000");
    EXPECT_EQ(TAVISchedMultiSelectFromText("", names, 7), nullptr);
    const char *const selection = TAVISchedMultiSelectFromText("Sun", names, 7);
    EXPECT_STREQ(TAVISchedMultiSelectToText("10x0000", names, 7), "Sun,Tue");
    EXPECT_STREQ(selection, "1000000"); // each direction has a buffer of its own
    EXPECT_STREQ(TAVISchedMultiSelectToText("0000000", names, 7), "");
    EXPECT_EQ(TAVISchedMultiSelectToText("101", names, 7), nullptr);
    const std::vector<const char *> longNames(600, "0123456789");
    const std::string all(600, '1');
    EXPECT_EQ(std::strlen(TAVISchedMultiSelectToText(all.c_str(), longNames.data(), 600)), 4095U);

    TAVI_SCHED_TASK task{};
    TAVISchedCTaskSetApp(&task, "TAVI.VEX.TaskScheduler.Beep");
    EXPECT_EQ(TAVISchedTaskIsBuildInApp(&task), 1);
    TAVISchedCTaskSetApp(&task, "tavi.vex.taskscheduler.beep");
    EXPECT_EQ(TAVISchedTaskIsBuildInApp(&task), 0);
}

} // namespace
