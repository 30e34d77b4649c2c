// The registry of backends, the task operations that dispatch to them, and the plug-in hooks.
#include "machine.h"

namespace {

using namespace support;

constexpr const char *kSeen = "/tmp/hooks"; // what the handlers saw

// The registry's rows with operations replaced, put back after each test.
class Backend : public SchedTest {
  protected:
    void TearDown() override {
        std::copy(saved_.begin(), saved_.end(), SchedBackends);
        cBackend = count_;
        SchedTest::TearDown();
    }
    // One that notes its phase and some arguments.
    static void addNote(const char *name, const char *end = "", mode_t mode = 0755) {
        addHandler(name,
                   "echo ${0##*/} $1 $2 $RESULT ORG $ORG_TASK_ID $ORG_BACKEND $ORG_OWNER "
                   "$ORG_NAME $ORG_TYPE $ORG_APP $ORG_YEAR $ORG_MONTH $ORG_DAY $ORG_HOUR $ORG_MIN "
                   "$ORG_REPEAT_HOUR $ORG_LAST_WORK_HOUR $ORG_WEEK "
                   "NEW $NEW_TASK_ID $NEW_BACKEND $NEW_STATE >> /tmp/hooks\n" +
                       std::string(end),
                   mode);
    }

    TAVI_SCHED_BACKEND_RECORD &row_ = SchedBackends[0];

  private:
    [[maybe_unused]] const int ready_ = TAVISchedBackendInit();
    const std::vector<TAVI_SCHED_BACKEND_RECORD> saved_{std::begin(SchedBackends),
                                                        std::end(SchedBackends)};
    const unsigned int count_ = cBackend;
};

TEST(Registry, FailureEmptiesTheTableAndNamesAreChecked) {
    if (cBackend != 0) {
        GTEST_SKIP() << "needs a process that has not registered its backends";
    }
    cBackend = TAVI_SCHED_MAX_BACKENDS;
    EXPECT_EQ(TAVISchedBackendInit(), -1);
    EXPECT_EQ(cBackend, 0U);
    EXPECT_EQ(lastLog(true), "backend.h:2 Too many backends");
    EXPECT_EQ(TAVISchedBackendInit() + TAVISchedBackendInit(), 0);
    EXPECT_EQ(cBackend, 2U);
    for (const char *name : {"tavischedul", "tavischedule2", ""}) {
        EXPECT_EQ(tavischedule_init(name, &SchedBackends[2]), -1);
        EXPECT_THAT(lastLog(true), HasSubstr("642 backend name is mismatch for tavischedule!"));
    }
    EXPECT_EQ(SchedBackends[2].name, nullptr);
}

TEST_F(Backend, ResultsAndMessagesOfTheDispatchRules) {
    Task task = storedTask();
    // A positive result passes through; the first row that offers the operation is asked.
    row_.edit = [](TAVI_SCHED_TASK *) { return 7; };
    EXPECT_EQ(TAVISchedTaskEdit(task.get()), 7);
    EXPECT_EQ(TAVISchedTaskSave(task.get()), 0);
    row_.edit = [](TAVI_SCHED_TASK *) { return -3; };
    EXPECT_EQ(TAVISchedTaskEdit(task.get()), -3);
    EXPECT_THAT(lastLog(), HasSubstr("edit.cpp:* Failed to edit for backend [0] id:[1] [0x"));
    EXPECT_EQ(TAVISchedTaskSave(task.get()), -1);
    EXPECT_THAT(lastLog(), HasSubstr("sched_task_save.cpp:* Set task failed. [1] [0x"));
    row_.edit = nullptr;
    EXPECT_EQ(failure(TAVISchedTaskEdit(task.get())), 0x2000U);
    EXPECT_EQ(lastLog(), "sched_task_edit.cpp:* No edit backend (-2) is found for task [1] ");
    row_.remove = [](int32_t) { return 1; };
    EXPECT_EQ(TAVISchedTaskRemove(1), 0);
    row_.remove = nullptr;
    EXPECT_EQ(TAVISchedTaskRemove(1), -1);
    EXPECT_EQ(lastLog(), "sched_task_remove.cpp:* No remove backend is found for task [1] ");
    EXPECT_EQ(TAVISchedTaskRemove(5), -1);
    EXPECT_THAT(logs(), ElementsAre(HasSubstr("No get_by_id backend is found for task [5] "),
                                    "sched_task_remove.cpp:* get task failed. id:[5] "
                                    "[0x2000 sched_task_get.cpp:*]"));
    row_.owns_id = [](int32_t id) { return id == 1 ? 0 : 1; };
    EXPECT_EQ(TAVISchedTaskGetByID(1, task.get()), -1); // skipped
    row_.sync = [] { return -1; };
    EXPECT_EQ(TAVISchedTaskSync(), 0);
    EXPECT_THAT(lastLog(), HasSubstr("sched_task_sync.cpp:* Failed to sync for backend [0] ["));
    row_.get_default = [](TAVI_SCHED_TASK *) { return -1; };
    EXPECT_EQ(TAVISchedTaskAlloc(), nullptr);
    EXPECT_THAT(lastLog(), HasSubstr("sched_task_alloc.cpp:* Init task to default failed. ["));
    faults().callocFails = sizeof(TAVI_SCHED_TASK);
    EXPECT_EQ(TAVISchedTaskAlloc(), nullptr);
    EXPECT_EQ(PLATCErrGet(), 0x0200U);
}

TEST_F(Backend, ListsAddRowByRow) {
    const auto none = [](TAVI_SCHED_TASK **, TAVI_SCHED_FILTER) { return 0; };
    const auto isSecond = [](TAVI_SCHED_TASK *task) { return int{task->id == 2}; };
    storedTask();
    storedTask();
    TAVI_SCHED_TASK *list = nullptr;
    cBackend = 3;
    SchedBackends[1] = SchedBackends[2] = {};
    EXPECT_EQ(TAVISchedTaskListGet(&list, nullptr), 6); // rows without list_get add the last count
    TAVISchedTaskListFree(&list);
    SchedBackends[1].list_get = [](TAVI_SCHED_TASK **, TAVI_SCHED_FILTER) { return -1; };
    SchedBackends[2].list_get = none;
    EXPECT_EQ(TAVISchedTaskListGet(&list, isSecond), 1);
    ASSERT_NE(list, nullptr);
    EXPECT_EQ(list->id, 2);
    EXPECT_EQ(list->backend, -2);
    EXPECT_THAT(lastLog(), HasSubstr("Failed to list_get for backend [1] ["));
    TAVI_SCHED_TASK *const head = list;
    row_.list_get = none;
    EXPECT_EQ(TAVISchedTaskListGet(&list, nullptr), 0);
    EXPECT_EQ(list, head);
    TAVISchedTaskListFree(&list);
    EXPECT_EQ(list, nullptr);
}

TEST_F(Backend, HooksSeeOldAndNewFieldsAndCannotVeto) {
    Task task = taskOf({"2024-05-08 09:00", Yearly, {2031, 2, 3}, {4, 5}, 6, 7, "1000001", ""});
    TAVISchedCTaskSetName(task.get(), std::string(40, 'n').c_str());
    TAVISchedCTaskSetApp(task.get(), "a.b");
    task->owner = 8;
    for (const char *const callers : {"ORG_NAME", "NEW_STATE"}) {
        setenv(callers, "not the change's", 1);
    }
    addNote("20-ok");
    addNote("10-fails", "exit 3");
    addNote("30-writable", "", 0775);
    addNote("40-not-executable", "", 0644);
    ASSERT_EQ(TAVISchedTaskCreate(task.get()), 0);
    EXPECT_EQ(readFile(kSeen), ""); // a creation that a backend served has no hook
    TAVISchedCTaskSetState(task.get(), 0);
    EXPECT_EQ(TAVISchedTaskEdit(task.get()), 0);
    const std::string old =
        " 0 ORG 1 -2 8 " + std::string(31, 'n') + " 4 a.b 2031 2 3 4 5 6 7 1000001 NEW";
    const std::string edited = old + " 1 -2 0\n";
    EXPECT_EQ(readFile(kSeen), "10-fails task_edit pre" + edited + "20-ok task_edit pre" + edited +
                                   "10-fails task_edit post" + edited + "20-ok task_edit post" +
                                   edited);
    const auto lines = logs();
    EXPECT_THAT(lines, Contains("sched_task_edit.cpp:* Fail to execute task plugin (PRE)"));
    EXPECT_THAT(lines, Contains("sched_task_edit.cpp:* Fail to execute task plugin (POST)"));
    EXPECT_THAT(lines, Contains(HasSubstr("30-writable skipped")));
    // What goes wrong in a handler is not the error of a change that fails.
    row_.edit = nullptr;
    EXPECT_EQ(failure(TAVISchedTaskEdit(task.get())), 0x2000U);

    shell("rm /tmp/hooks /usr/tavi/etc/plugins/task_scheduler/20-ok");
    EXPECT_EQ(TAVISchedTaskRemove(1), 0);
    const std::string removed = "10-fails task_remove p";
    EXPECT_EQ(readFile(kSeen), removed + "re" + old + "\n" + removed + "ost" + old + "\n");
    chmod("/usr/tavi/etc/plugins/task_scheduler", 0777); // is as if it were not there
    ASSERT_EQ(TAVISchedTaskCreate(task.get()), 0);
    logs();
    EXPECT_EQ(TAVISchedTaskRemove(1), 0);
    const auto skipped = logs();
    EXPECT_FALSE(skipped.empty());
    EXPECT_THAT(skipped, testing::Each(HasSubstr("task_scheduler skipped")));
    chmod("/usr/tavi/etc/plugins/task_scheduler", 0755);

    // A backend of its own: the hook fires for a creation that found none, after the fact.
    shell("rm /tmp/hooks");
    logs();
    TAVISchedCTaskSetBackend(task.get(), -1);
    TAVISchedCTaskSetID(task.get(), -1);
    EXPECT_EQ(failure(TAVISchedTaskSave(task.get())), 0x2000U);
    EXPECT_EQ(readFile(kSeen), "10-fails task_create post -1 ORG NEW -1 -1 0\n");
    EXPECT_THAT(logs().front(), HasSubstr("No create backend (-1) is found for task [-1] "));
    unsetenv("ORG_NAME");
    unsetenv("NEW_STATE");
}

} // namespace
