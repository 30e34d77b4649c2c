// The registry of backends, the task operations that dispatch to them, and the plug-in hooks.
#include "support.h"

#include <sys/stat.h>

namespace {

using namespace support;

// The registry's row 0 with operations replaced, put back after each test.
class Backend : public SchedTest {
  protected:
    void SetUp() override {
        SchedTest::SetUp();
        ASSERT_EQ(TAVISchedBackendInit(), 0);
        std::copy(std::begin(SchedBackends), std::end(SchedBackends), saved_);
        count_ = cBackend;
    }
    void TearDown() override {
        std::copy(std::begin(saved_), std::end(saved_), SchedBackends);
        cBackend = count_;
        SchedTest::TearDown();
    }
    // Registers a handler that appends its phase and some arguments to /tmp/hooks.
    static void addHandler(const std::string &name, int exitStatus, mode_t mode = 0755) {
        const std::string folder = "/usr/tavi/etc/plugins/task_scheduler";
        shell("mkdir -p " + folder);
        writeFile(
            folder + "/" + name,
            "#!/bin/sh\necho $0 $1 $2 $RESULT ORG $ORG_TASK_ID $ORG_NAME $ORG_WEEK $ORG_BACKEND "
            "NEW $NEW_TASK_ID $NEW_BACKEND $NEW_STATE | sed 's,.*/,,' >> /tmp/hooks\nexit " +
                std::to_string(exitStatus) + "\n");
        chmod((folder + "/" + name).c_str(), mode);
    }

  private:
    TAVI_SCHED_BACKEND_RECORD saved_[TAVI_SCHED_MAX_BACKENDS];
    unsigned int count_ = 0;
};

TEST(Registry, FailureEmptiesTheTableAndIsTriedAgain) {
    if (cBackend != 0) {
        GTEST_SKIP() << "needs a process that has not registered its backends";
    }
    logs();
    cBackend = TAVI_SCHED_MAX_BACKENDS;
    EXPECT_EQ(TAVISchedBackendInit(), -1);
    EXPECT_EQ(cBackend, 0U);
    EXPECT_THAT(logs(true), ElementsAre("backend.h:2 Too many backends"));
    EXPECT_EQ(TAVISchedBackendInit(), 0);
    const unsigned int count = cBackend;
    EXPECT_GE(count, 1U);
    EXPECT_STREQ(SchedBackends[0].name, "tavischedule");
    EXPECT_EQ(SchedBackends[0].owns_id, nullptr);
    EXPECT_EQ(TAVISchedBackendInit(), 0);
    EXPECT_EQ(cBackend, count);
}

TEST_F(Backend, InitTakesItsOwnNameOnly) {
    TAVI_SCHED_BACKEND_RECORD row{};
    for (const char *name : {"tavischedul", "tavischedule2", ""}) {
        EXPECT_EQ(tavischedule_init(name, &row), -1);
        EXPECT_EQ(logs(true).back(),
                  "backends/backend_tavischedule.cpp:642 backend name is mismatch for "
                  "tavischedule!! [" +
                      std::string(name) + "]");
    }
    EXPECT_EQ(row.name, nullptr);
    EXPECT_EQ(tavischedule_init(nullptr, nullptr), -1);
    EXPECT_EQ(tavischedule_init("tavischedule", nullptr), -1);
    EXPECT_THAT(logs(true), ElementsAre("backends/backend_tavischedule.cpp:639 Invaild Argument "
                                        "(((void *)0) != szName)=[0]\n",
                                        "backends/backend_tavischedule.cpp:639 Invaild Argument "
                                        "(NULL != pBackend)=[0]\n"));
}

TEST_F(Backend, ResultsAndMessagesOfTheDispatchRules) {
    Task task = storedTask();
    logs();
    // A positive result passes through; the first row that offers the operation is asked.
    SchedBackends[0].edit = [](TAVI_SCHED_TASK *) { return 7; };
    EXPECT_EQ(TAVISchedTaskEdit(task.get()), 7);
    EXPECT_EQ(TAVISchedTaskSave(task.get()), 0);
    SchedBackends[0].edit = [](TAVI_SCHED_TASK *) { return -3; };
    EXPECT_EQ(TAVISchedTaskEdit(task.get()), -3);
    EXPECT_THAT(logs().back(), HasSubstr("sched_task_edit.cpp:* Failed to edit for backend [0] "
                                         "id:[1] [0x"));
    EXPECT_EQ(TAVISchedTaskSave(task.get()), -1);
    EXPECT_THAT(logs().back(), HasSubstr("sched_task_save.cpp:* Set task failed. [1] [0x"));
    SchedBackends[0].edit = nullptr;
    EXPECT_EQ(TAVISchedTaskEdit(task.get()), -1);
    EXPECT_EQ(PLATCErrGet(), 0x2000U);
    EXPECT_EQ(logs().back(), "sched_task_edit.cpp:* No edit backend (-2) is found for task [1] ");
    SchedBackends[0].remove = [](int32_t) { return 1; };
    EXPECT_EQ(TAVISchedTaskRemove(1), 0);
    SchedBackends[0].remove = nullptr;
    EXPECT_EQ(TAVISchedTaskRemove(1), -1);
    EXPECT_EQ(logs().back(), "sched_task_remove.cpp:* No remove backend is found for task [1] ");
    EXPECT_EQ(TAVISchedTaskRemove(5), -1);
    EXPECT_THAT(logs(), ElementsAre("sched_task_get.cpp:* No get_by_id backend is found for task "
                                    "[5] ",
                                    "sched_task_remove.cpp:* get task failed. id:[5] "
                                    "[0x2000 sched_task_get.cpp:*]"));
    SchedBackends[0].owns_id = [](int32_t id) { return id == 1 ? 0 : 1; };
    EXPECT_EQ(TAVISchedTaskGetByID(1, task.get()), -1); // skipped
    SchedBackends[0].sync = [] { return -1; };
    EXPECT_EQ(TAVISchedTaskSync(), 0);
    EXPECT_THAT(logs().back(), HasSubstr("sched_task_sync.cpp:* Failed to sync for backend [0] ["));
    SchedBackends[0].get_default = [](TAVI_SCHED_TASK *) { return -1; };
    EXPECT_EQ(TAVISchedTaskAlloc(), nullptr);
    EXPECT_THAT(logs().back(), HasSubstr("sched_task_alloc.cpp:* Init task to default failed. ["));
}

TEST_F(Backend, ListsAddRowByRow) {
    const auto none = [](TAVI_SCHED_TASK **, TAVI_SCHED_FILTER) { return 0; };
    storedTask();
    storedTask();
    TAVI_SCHED_TASK *list = nullptr;
    cBackend = 3;
    SchedBackends[1] = {};
    SchedBackends[2] = {};
    EXPECT_EQ(TAVISchedTaskListGet(&list, nullptr), 6); // rows without list_get add the last count
    TAVISchedTaskListFree(&list);
    SchedBackends[1].list_get = [](TAVI_SCHED_TASK **, TAVI_SCHED_FILTER) { return -1; };
    SchedBackends[2].list_get = none;
    EXPECT_EQ(TAVISchedTaskListGet(&list, [](TAVI_SCHED_TASK *task) { return int{task->id == 2}; }),
              1);
    ASSERT_NE(list, nullptr);
    EXPECT_EQ(list->id, 2);
    EXPECT_EQ(list->backend, -2);
    EXPECT_THAT(logs().back(), HasSubstr("Failed to list_get for backend [1] ["));
    TAVI_SCHED_TASK *const head = list;
    SchedBackends[0].list_get = none;
    EXPECT_EQ(TAVISchedTaskListGet(&list, nullptr), 0);
    EXPECT_EQ(list, head);
    TAVISchedTaskListFree(&list);
    EXPECT_EQ(list, nullptr);
    fakes.callocFails = sizeof(TAVI_SCHED_TASK);
    EXPECT_EQ(TAVISchedTaskAlloc(), nullptr);
    EXPECT_EQ(PLATCErrGet(), 0x0200U);
    fakes.callocFails = 0;
    EXPECT_EQ(TAVISchedTaskLoad(-2, nullptr), -1);
    EXPECT_EQ(logs().back(), "sched_task_load.cpp:* Invaild Argument (-1 <= id)=[0]\n");
}

TEST_F(Backend, HooksSeeOldAndNewFieldsAndCannotVeto) {
    Task task = newTask();
    TAVISchedCTaskSetName(task.get(), std::string(40, 'n').c_str());
    ASSERT_EQ(TAVISchedTaskCreate(task.get()), 0);
    addHandler("20-ok", 0);
    addHandler("10-fails", 3);
    addHandler("30-writable", 0, 0757);
    addHandler("40-not-executable", 0, 0644);
    EXPECT_EQ(readFile("/tmp/hooks"), ""); // a creation that a backend served has no hook
    logs();
    TAVISchedCTaskSetState(task.get(), 0);
    EXPECT_EQ(TAVISchedTaskEdit(task.get()), 0);
    const std::string old = "ORG 1 " + std::string(31, 'n') + " 1111111 -2 NEW";
    EXPECT_EQ(readFile("/tmp/hooks"), "10-fails task_edit pre 0 " + old + " 1 -2 0\n" +
                                          "20-ok task_edit pre 0 " + old + " 1 -2 0\n" +
                                          "10-fails task_edit post 0 " + old + " 1 -2 0\n" +
                                          "20-ok task_edit post 0 " + old + " 1 -2 0\n");
    const auto lines = logs();
    EXPECT_THAT(lines,
                testing::Contains("sched_task_edit.cpp:* Fail to execute task plugin (PRE)"));
    EXPECT_THAT(lines,
                testing::Contains("sched_task_edit.cpp:* Fail to execute task plugin (POST)"));
    EXPECT_THAT(lines, testing::Contains(HasSubstr("30-writable skipped")));

    shell("rm /tmp/hooks /usr/tavi/etc/plugins/task_scheduler/10-fails");
    EXPECT_EQ(TAVISchedTaskRemove(1), 0);
    EXPECT_EQ(readFile("/tmp/hooks"),
              "20-ok task_remove pre 0 " + old + "\n20-ok task_remove post 0 " + old + "\n");

    // A backend of its own: the hook fires for a creation that found none, after the fact.
    shell("rm /tmp/hooks");
    logs();
    TAVISchedCTaskSetBackend(task.get(), -1);
    TAVISchedCTaskSetID(task.get(), -1);
    EXPECT_EQ(TAVISchedTaskSave(task.get()), -1);
    EXPECT_EQ(readFile("/tmp/hooks"), "20-ok task_create post -1 ORG NEW -1 -1 0\n");
    EXPECT_EQ(PLATCErrGet(), 0x2000U);
    EXPECT_EQ(logs().front(),
              "sched_task_create.cpp:* No create backend (-1) is found for task [-1] ");
}

TEST_F(Backend, HookContextsCheckTheirArguments) {
    TAVI_SCHED_TASK task{};
    TAVI_SCHED_PLUGIN context{};
    context.handle = reinterpret_cast<struct PLATPLUGIN *>(8);
    EXPECT_EQ(TAVISchedTaskPluginInit(&context, "task_edit", nullptr, nullptr), -1);
    EXPECT_EQ(context.handle, nullptr);
    EXPECT_EQ(PLATCErrGet(), 0x0D00U);
    EXPECT_EQ(TAVISchedTaskPlugin(TAVI_SCHED_PLUGIN_PRE, &context), -1);
    EXPECT_THAT(logs(), ElementsAre("sched_task_plugin.cpp:* Bad parameters"));
    EXPECT_EQ(TAVISchedTaskPluginInit(&context, "task_edit", nullptr, &task), 0);
    EXPECT_EQ(TAVISchedTaskPlugin(7, &context), -1);
    EXPECT_EQ(TAVISchedTaskPlugin(TAVI_SCHED_PLUGIN_POST, &context), 0);
    EXPECT_EQ(TAVISchedTaskPluginExit(&context), 0);
    EXPECT_EQ(TAVISchedTaskPluginExit(nullptr), -1);
}

} // namespace
