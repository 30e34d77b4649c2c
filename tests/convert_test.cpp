// A task's hash form, and the list sort, which reads the same field table.
#include "support.h"

namespace {

using namespace support;

class Convert : public SchedTest {
  protected:
    Convert() : hash_(PLATCSzHashAlloc(64)) {}
    ~Convert() override { PLATCSzHashFree(hash_); }

    std::string value(const char *key) {
        const char *const text = PLATCSzHashGetValue(hash_, key);
        return text ? text : "(none)";
    }
    void set(const char *key, const char *text) { PLATCSzHashSetValue(&hash_, key, text); }
    // A hash with every required key.
    void fill() {
        for (const char *key : {"name", "app", "app name", "action", "cmd", "type"}) {
            set(key, "");
        }
        for (const char *key : {"id", "run hour", "run min"}) {
            set(key, "0");
        }
        set("state", "disabled");
    }

    PLATCSZHASH *hash_;
};

TEST_F(Convert, HashHoldsEveryPersistentFieldOnOneLine) {
    Task task = newTask("echo 1\necho 2");
    TAVISchedCTaskSetName(task.get(), "a\nb");
    TAVISchedCTaskSetAppArgs(task.get(), "{\n}\n");
    task->owner = 4294967295;
    task->id = -5;
    set("left over", "x");
    EXPECT_EQ(TAVISchedInitHashFromTask(&hash_, task.get()), 0);
    EXPECT_EQ(value("name"), "a b");
    EXPECT_EQ(value("app args"), "{ } ");
    EXPECT_EQ(value("owner"), "4294967295");
    EXPECT_EQ(value("id"), "-5");
    EXPECT_EQ(value("cmd"), "ZWNobyAxCmVjaG8gMg==");
    EXPECT_EQ(value("type") + value("state"), "dailyenabled");
    for (const char *key : {"left over", "backend", "next trigger time"}) {
        EXPECT_EQ(value(key), "(none)") << key;
    }
    TAVI_SCHED_TASK back{};
    EXPECT_EQ(TAVISchedInitTaskFromHash(hash_, &back), 0);
    EXPECT_STREQ(back.command, "echo 1\necho 2");
    EXPECT_EQ(back.owner, 4294967295);

    task->state = 5; // has no name, so its key is left out
    EXPECT_EQ(TAVISchedInitHashFromTask(&hash_, task.get()), 0);
    EXPECT_EQ(value("state"), "(none)");
    EXPECT_EQ(TAVISchedInitTaskFromHash(hash_, &back), -1);
    EXPECT_THAT(logs().back(), HasSubstr("Get hash value failed. key:[state]. [0x"));
}

TEST_F(Convert, TaskTakesDefaultsClampsNumbersAndIgnoresStrangers) {
    fill();
    set("backend", "-3");
    set("next trigger time", "soon");
    set("can edit name", "2x");
    set("type", "hourly");
    set("start month", "");
    set("id", "99999999999");
    TAVI_SCHED_TASK task{};
    task.backend = -2;
    task.type = TAVI_SCHED_TYPE_MONTHLY;
    EXPECT_EQ(TAVISchedInitTaskFromHash(hash_, &task), 0);
    EXPECT_STREQ(task.week, "1111111");
    EXPECT_STREQ(task.editDialog, "TAVI.VEX.TaskScheduler.EditDialog");
    EXPECT_STREQ(task.nextTriggerTime, "");
    EXPECT_EQ(task.startYear, 2012U);
    EXPECT_EQ(task.startMonth, 0U);
    EXPECT_EQ(task.canEditName, 2);
    EXPECT_EQ(task.canRunTaskSameTime, 0);
    EXPECT_EQ(task.type, TAVI_SCHED_TYPE_MONTHLY);
    EXPECT_EQ(task.backend, -2);
    EXPECT_EQ(task.id, 2147483647);
    for (const auto &[text, owner] :
         std::vector<std::pair<const char *, uint32_t>>{{"1000", 1000},
                                                        {"-1", 4294967295},
                                                        {"4294967296", 4294967295},
                                                        {"-4294967296", 4294967295},
                                                        {"-18446744073709551615", 4294967295},
                                                        {"99999999999999999999", 4294967295}}) {
        set("owner", text);
        EXPECT_EQ(TAVISchedInitTaskFromHash(hash_, &task), 0);
        EXPECT_EQ(task.owner, owner) << text;
    }
    EXPECT_THAT(logs(), IsEmpty());
}

TEST_F(Convert, FailuresAreReported) {
    TAVI_SCHED_TASK task{};
    PLATCSZHASH *none = nullptr;
    EXPECT_EQ(TAVISchedInitHashFromTask(nullptr, nullptr), -1);
    EXPECT_EQ(TAVISchedInitHashFromTask(&none, nullptr), -1);
    EXPECT_EQ(TAVISchedInitHashFromTask(&hash_, nullptr), -1);
    EXPECT_EQ(TAVISchedInitTaskFromHash(nullptr, &task), -1);
    EXPECT_THAT(
        logs(),
        ElementsAre("sched_task_convert.cpp:* Invaild Argument (((void *)0) != ppHash)=[0]\n",
                    "sched_task_convert.cpp:* Invaild Argument (((void *)0) != *ppHash)=[0]\n",
                    "sched_task_convert.cpp:* Invaild Argument (NULL != pTask)=[0]\n",
                    "sched_task_convert.cpp:* Invaild Argument (((void *)0) != pHash)=[0]\n"));
    fill();
    set("start year", "2013x");
    EXPECT_EQ(TAVISchedInitTaskFromHash(hash_, &task), -1);
    EXPECT_EQ(PLATCErrGet(), 0x4000U);
    EXPECT_THAT(logs(),
                ElementsAre("sched_task_convert.cpp:* parm_table[12].fnFromHashStr failed."));
    set("start year", "2013");
    // Cut at the field's end a text must fail: a shortened command must never run.
    for (const std::string &bad :
         {std::string("dHJ1ZQ="), std::string("dHJ1 ZQ=="), std::string(16384, 'A')}) {
        set("cmd", bad.c_str());
        EXPECT_EQ(TAVISchedInitTaskFromHash(hash_, &task), -1);
        EXPECT_THAT(logs(), ElementsAre(HasSubstr("Base64 decoding failed. [" + bad.substr(0, 4))));
    }
}

class Sort : public SchedTest {
  protected:
    // Sorts three tasks that lie in memory in this order, listed back to front; their names.
    std::string sorted(const char *key, int direction) {
        const char *const names[] = {"b", "B", "b"};
        for (int i = 0; i < 3; ++i) {
            tasks_[i].id = 10 - i;
            TAVISchedCTaskSetName(&tasks_[i], names[i]);
            tasks_[i].next = i == 0 ? nullptr : &tasks_[i - 1];
        }
        TAVI_SCHED_TASK *list = &tasks_[2];
        result_ = TAVISchedTaskListSort(&list, key, direction);
        std::string order;
        for (const TAVI_SCHED_TASK *task = list; task; task = task->next) {
            order += std::to_string(task->id) + task->name + " ";
        }
        return order;
    }

    std::vector<TAVI_SCHED_TASK> tasks_{3};
    int result_ = 0;
};

TEST_F(Sort, TextsByBytesStableAndNumbersByPlace) {
    EXPECT_EQ(sorted("name", 1), "9B 8b 10b ");
    EXPECT_EQ(sorted("name", 2), "10b 8b 9B ");
    for (const char *key : {"id", "owner", "type"}) {
        EXPECT_EQ(sorted(key, 1), "10b 9B 8b ") << key;
        EXPECT_EQ(sorted(key, 0), "8b 9B 10b ") << key;
    }
    EXPECT_EQ(result_, 0);
    EXPECT_EQ(sorted("Id", 1), "8b 9B 10b ");
    EXPECT_EQ(result_, -1);
    EXPECT_THAT(logs(), IsEmpty());
}

TEST_F(Sort, FailuresLeaveTheListAlone) {
    TAVI_SCHED_TASK *list = nullptr;
    EXPECT_EQ(TAVISchedTaskListSort(&list, "id", 1), 0);
    EXPECT_EQ(TAVISchedTaskListSortEx(&list, 0, 1), -1);
    EXPECT_EQ(PLATCErrGet(), 0x0D00U);
    EXPECT_EQ(TAVISchedTaskListSort(nullptr, nullptr, 1), -1);
    EXPECT_EQ(TAVISchedTaskListSort(&list, nullptr, 1), -1);
    fakes.callocFails = 3 * sizeof(void *);
    EXPECT_EQ(sorted("name", 1), "8b 9B 10b ");
    EXPECT_EQ(result_, -1);
    EXPECT_EQ(PLATCErrGet(), 0x0100U);
    EXPECT_EQ(PLATCErrorGetLine(), 67);
    fakes.callocFails = 0;
    const std::string source = "sched_task_list_sort.cpp";
    EXPECT_THAT(logs(true),
                ElementsAre(source + ":59 Invaild Argument (NULL != *pTaskList)=[0]\n",
                            source + ":125 Invaild Argument (((void *)0) != pTaskList)=[0]\n",
                            source + ":125 Invaild Argument (NULL != szKey)=[0]\n",
                            source + ":66 calloc [3] failed. Cannot allocate memory"));
}

} // namespace
