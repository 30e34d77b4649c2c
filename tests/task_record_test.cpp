// Accessors, refused arguments, enumerations and selections.
#include "support.h"

#include <cstring>

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
    static char text[4] = "";
    static int number = 0;
    static const Task someTask = newTask();
    EXPECT_EQ(failure(TAVISchedCTaskSetName(nullptr, nullptr)), 0x0D00U);
    EXPECT_EQ(failure(TAVISchedCTaskGetName(text, 0, nullptr)), 0x0D00U);
    EXPECT_EQ(failure(TAVISchedDateComp(nullptr, nullptr)), 0x0D00U);
    EXPECT_STREQ(PLATCErrorGetFile(), "sched_util.cpp");
    const std::string reason = ":* Invaild Argument ";
    EXPECT_THAT(logs(), ElementsAre("tavischedsetter.h" + reason + "(((void *)0) != szVal)=[0]\n",
                                    "tavischedgetter.h" + reason + "(0 < cbBuf)=[0]\n",
                                    "sched_util.cpp" + reason + "(((void *)0) != pDate1)=[0]\n"));
    int (*const kCalls[])() = {
        [] { return TAVISchedMachineCheck(nullptr); },
        [] { return TAVISchedMachineCheckOf(nullptr, nullptr); },
        [] { return TAVISchedTaskNextId(nullptr); },
        [] { return TAVISchedDBOpenForReading(nullptr); },
        [] { return TAVISchedDBSetStatus(nullptr, 1, 0, 3, nullptr); },
        [] { return TAVISchedDBGetStatusByTaskID(nullptr, 1, nullptr, nullptr, nullptr, 0); },
        [] { return TAVISchedDBListStatus(nullptr, 1, nullptr, nullptr); },
        [] { return TAVISchedRunGet(1, nullptr); },
        [] { return SchedBackends[0].run(someTask.get(), &number, nullptr, 1); },
        [] { return SchedBackends[1].run(someTask.get(), &number, nullptr, 1); },
        [] { return SchedBackends[1].run(someTask.get(), nullptr, text, 1); },
    };
    for (const auto &call : kCalls) {
        PLATCErrSetEx(0, "", 0);
        EXPECT_EQ(failure(call()), 0x0D00U) << &call - kCalls;
    }
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
