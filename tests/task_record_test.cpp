// Accessors, refused arguments, enumerations and selections.
#include "support.h"

#include <cstring>
#include <set>
#include <tuple>
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

template <typename Argument> Argument something() {
    static char room[1 << 16];
    if constexpr (std::is_pointer_v<Argument>) {
        return reinterpret_cast<Argument>(room);
    }
    return Argument(1);
}

// Functions refuse when one of their pointers, or a size, is missing, but for those in some places.
class Needs {
  public:
    explicit Needs(std::set<int> but = {}) : but_(std::move(but)) {}

    template <typename... Functions> void of(Functions... functions) const {
        (one(functions), ...);
    }

  private:
    template <typename Result, typename... Arguments>
    void one(Result (*function)(Arguments...)) const {
        std::tuple<Arguments...> given(something<Arguments>()...);
        int place = 0;
        const auto refuses = [&](auto &argument) {
            using Argument = std::remove_reference_t<decltype(argument)>;
            constexpr bool kCounts =
                std::is_pointer_v<Argument> || std::is_same_v<Argument, size_t>;
            if (kCounts && !but_.contains(place)) {
                PLATCErrSetEx(0, "", 0);
                argument = Argument();
                EXPECT_EQ(failure(static_cast<int>(std::apply(function, given))), 0x0D00U)
                    << testing::PrintToString(function) << " " << place;
                argument = something<Argument>();
            }
            ++place;
        };
        std::apply([&](auto &...each) { (refuses(each), ...); }, given);
    }

    std::set<int> but_;
};

TEST_F(TaskRecord, WhatIsNeededMustBeGiven) {
    ASSERT_EQ(TAVISchedBackendInit(), 0);
#define TAVI_SCHED_SET_INT(X, field) Needs().of(TAVISchedCTaskSet##X);
#define TAVI_SCHED_SET_FLAG TAVI_SCHED_SET_INT
#define TAVI_SCHED_SET_TYPE TAVI_SCHED_SET_INT
#define TAVI_SCHED_SET_TEXT TAVI_SCHED_SET_INT
#define TAVI_SCHED_GET_INT(X, field) Needs().of(TAVISchedCTaskGet##X);
#define TAVI_SCHED_GET_TEXT TAVI_SCHED_GET_INT
#define TAVI_SCHED_IS(X, field, value) Needs().of(TAVISchedCTaskIs##X);
#include "tavischedgetter.h"
#include "tavischedsetter.h"
    Needs().of(
        TAVISchedEnumToValue, TAVISchedInitHashFromTask, TAVISchedInitTaskFromHash,
        TAVISchedTaskCheck, TAVISchedValueCheck, TAVISchedDateGet, TAVISchedDateComp,
        TAVISchedDateParse, TAVISchedTimeParse, TAVISchedDateNormalize, TAVISchedNextTriggerTime,
        TAVISchedTaskStarts, TAVISchedTaskNextStart, TAVISchedTaskFree, TAVISchedTaskGetDefault,
        TAVISchedTaskGetByID, TAVISchedTaskLoad, TAVISchedTaskEdit, TAVISchedTaskSave,
        TAVISchedCrontabLine, TAVISchedTaskNextId, TAVISchedTaskCreateWithId, TAVISchedPowerOnCheck,
        TAVISchedTaskListSortEx, TAVISchedTaskListSort, TAVISchedDBOpenForReading, TAVISchedDBClose,
        TAVISchedDBIsTaskRunning, TAVISchedDBIsAppRunning, TAVISchedRunGet, TAVISchedRunLimitsGet,
        TAVISchedMachineCheck, TAVISchedMachineCheckOf, TAVISchedFindingRepair, tavischedule_init,
        taviautopower_init, SchedBackends[0].get_by_id, SchedBackends[0].create,
        SchedBackends[1].create, SchedBackends[0].edit, SchedBackends[1].edit, SchedBackends[0].run,
        SchedBackends[1].run, SchedBackends[0].get_default);
    Needs({1}).of(TAVISchedTaskListGet, SchedBackends[0].list_get, SchedBackends[1].list_get,
                  TAVISchedOffHours, TAVISchedCrontabLineCheck);
    Needs({2}).of(TAVISchedHashCheck, TAVISchedTaskListGetOf, TAVISchedDBAddRecord,
                  TAVISchedDBListLastStatus);
    Needs({3}).of(TAVISchedDBListStatus);
    Needs({4}).of(TAVISchedDBSetStatus, TAVISchedRunOutputRead);
    Needs({0, 2}).of(TAVISchedRunList);
    Needs({2, 3}).of(TAVISchedTaskPluginInit);
    Needs({3, 4}).of(TAVISchedDBGetStatusByStatusID);
    Needs({1, 2, 5}).of(TAVISchedTaskRemarks);
    Needs({2, 4, 5}).of(TAVISchedDBGetStatusByTaskID);
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
