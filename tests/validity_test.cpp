// What is wrong with a task before it is stored.
#include "machine.h"

#include <cstring>
#include <pwd.h>

namespace {

using namespace support;

bool noUserHasAName = false;

// "key: reason" of the task's first fault, or "".
std::string faultOf(const TAVI_SCHED_TASK &task) {
    TAVI_SCHED_FAULT fault{};
    const int found = TAVISchedTaskCheck(&task, &fault);
    EXPECT_EQ(found, fault.kind == TAVI_SCHED_FAULT_VALUE ? 1 : 0);
    return found == 1 ? std::string(fault.key) + ": " + fault.reason : "";
}

using Validity = SchedTest;
using T = TAVI_SCHED_TASK;

void setDate(TAVI_SCHED_TASK &task, int type, uint32_t year, uint32_t month, uint32_t day) {
    task.type = type;
    task.startYear = year;
    task.startMonth = month;
    task.startDay = day;
}

TEST_F(Validity, OfTasks) {
    // A change of a sound task, and the front of the text of the fault that comes of it, if any.
    const struct {
        void (*change)(T &);
        const char *fault;
        bool isPower = false;
    } cases[] = {
        {[](T &) {}, ""},
        {[](T &t) { t.backend = -1; }, "backend: -1; accepted: -3 or -2"},
        {[](T &t) { t.canEditName = 2; }, "can edit name: 2; accepted: 0 or 1"},
        {[](T &t) { t.simpleEditForm = -1; }, "simple edit form: -1; accepted: 0 or 1"},
        {[](T &t) { t.owner = 54321; }, "owner: there is no user with the id 54321"},
        {[](T &t) { setDate(t, Once, 2024, 2, 29); }, ""},
        {[](T &t) { setDate(t, Once, 2023, 2, 29); }, "start day: 29; accepted: 1 to 28"},
        {[](T &t) { setDate(t, Once, 1969, 1, 1); }, "start year: 1969; accepted: 1970 to 9999"},
        {[](T &t) { setDate(t, Once, 4294967295, 1, 1); }, "start year: 4294967295;"},
        {[](T &t) { setDate(t, Once, 2024, 13, 1); }, "start month: 13; accepted: 1 to 12"},
        {[](T &t) { setDate(t, Yearly, 0, 2, 29); }, ""},
        {[](T &t) { setDate(t, Yearly, 0, 4, 31); }, "start day: 31; accepted: 1 to 30"},
        {[](T &t) { setDate(t, Yearly, 0, 0, 1); }, "start month: 0;"},
        {[](T &t) { setDate(t, Monthly, 0, 77, 31); }, ""},
        {[](T &t) { setDate(t, Monthly, 0, 0, 32); }, "start day: 32; accepted: 1 to 31"},
        {[](T &t) { setDate(t, Weekly, 99999, 77, 99); }, ""},
        {[](T &t) { t.runHour = t.lastWorkHour = t.repeatHour = 23, t.runMin = 59; }, ""},
        {[](T &t) { t.runHour = 24; }, "run hour: 24; accepted: 0 to 23"},
        {[](T &t) { t.runMin = 60; }, "run min: 60; accepted: 0 to 59"},
        {[](T &t) { t.repeatHour = 24; }, "repeat hour: 24;"},
        {[](T &t) { t.lastWorkHour = 24; }, "last work hour: 24;"},
        {[](T &t) { memset(t.name, 'x', sizeof t.name); }, "name: it does not end; accepted: at"},
        {[](T &t) { TAVISchedCTaskSetAppArgs(&t, "a\n"); }, "app args: it holds a line break"},
        {[](T &t) { TAVISchedCTaskSetAction(&t, "a\t\x1b"); }, ""},
        {[](T &t) { memset(t.nextTriggerTime, '\xff', sizeof t.nextTriggerTime); }, ""},
        {[](T &t) { TAVISchedCTaskSetWeek(&t, "11"); }, "week: \"11\"; accepted: seven"},
        {[](T &t) { TAVISchedCTaskSetWeek(&t, "111111x"); }, "week: \"111111x\"; accepted"},
        {[](T &t) { memset(t.week, '1', sizeof t.week); }, "week: it does not end"},
        {[](T &t) { TAVISchedCTaskSetWeek(&t, "0000000"); }, ""},
        {[](T &t) { TAVISchedCTaskSetWeek(&t, "0000000"), t.type = Weekly; }, "week: no day"},
        {[](T &t) { memset(t.command, '\n', 12285); }, ""},
        {[](T &t) { memset(t.command, '\xff', 12286); },
         "cmd: 12286 bytes; accepted: at most 12285"},
        {[](T &t) { memset(t.command, 'x', sizeof t.command); }, "cmd: it does not end"},
        {[](T &t) { t.state = 2; }, "state: 2; accepted: disabled, enabled"},
        {[](T &t) { t.type = 5; }, "type: 5; accepted: once, daily, weekly, monthly, yearly"},
        {[](T &t) { t.type = -1; }, "type: -1;"},
        {[](T &) {}, "", true},
        {[](T &t) { TAVISchedCTaskSetAppArgs(&t, "poweron"); }, "", true},
        {[](T &t) { TAVISchedCTaskSetAppArgs(&t, "PowerOn"); },
         "app args: \"PowerOn\"; accepted for a power schedule: poweron, poweroff", true},
        {[](T &t) { t.repeatHour = 4; }, "repeat hour: 4; accepted for a power schedule: 0", true},
        {[](T &t) { t.runHour = 24; }, "run hour: 24; accepted: 0 to 23", true},
        {[](T &t) { setDate(t, Monthly, 0, 1, 1); },
         "type: accepted for a power schedule: daily, weekly", true},
        {[](T &t) { TAVISchedCTaskSetWeek(&t, "0111110"); },
         "week: \"0111110\"; accepted for a daily power schedule: 1111111", true},
        {[](T &t) { TAVISchedCTaskSetWeek(&t, "0111110"), t.type = Weekly; }, "", true},
    };
    for (const auto &row : cases) {
        const Task task = row.isPower ? powerTask("poweroff") : newTask();
        row.change(*task);
        const std::string fault = faultOf(*task);
        EXPECT_EQ(*row.fault == '\0' ? fault : fault.substr(0, std::strlen(row.fault)), row.fault);
    }
    EXPECT_THAT(logs(), IsEmpty());
}

TEST_F(Validity, OfTextsForJson) {
    const Task task = newTask();
    for (const char *const good : {"\x7f\xc2\x80\xdf\xbf", "\xe0\xa0\x80\xed\x9f\xbf\xee\x80\x80",
                                   "\xf0\x90\x80\x80\xf4\x8f\xbf\xbf"}) {
        TAVISchedCTaskSetEditForm(task.get(), good);
        EXPECT_EQ(faultOf(*task), "");
    }
    for (const char *const bad : {"\x80", "\xc1\xbf", "\xe0\x9f\xbf", "\xf0\x8f\xbf\xbf",
                                  "\xed\xa0\x80", "\xf4\x90\x80\x80", "\xf8\x88\x80\x80\x80",
                                  "\xc3", "\xe2\x82", "\xc3(", "\xf0\x90\x80\xc0", "\xff"}) {
        TAVISchedCTaskSetEditForm(task.get(), bad);
        EXPECT_EQ(faultOf(*task), "edit form: it is not valid UTF-8; accepted: one line of UTF-8")
            << testing::PrintToString(bad);
    }
}

// Every task that is sound has a line that cron takes, which needs root to be a user.
TEST_F(Validity, OfLinesForCron) {
    noUserHasAName = true;
    EXPECT_EQ(faultOf(*newTask()), ": cron would reject its line: there is no user \"root\"");
    EXPECT_EQ(faultOf(*powerTask("poweron")), "");
    noUserHasAName = false;
}

} // namespace

// The library binds to this one.
extern "C" passwd *getpwnam(const char *name) {
    return noUserHasAName ? nullptr : support::original(getpwnam, "getpwnam")(name);
}
