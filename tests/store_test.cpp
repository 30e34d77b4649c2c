// The schedule backend's task file.
#include "machine.h"

#include <sstream>

namespace {

using namespace support;

// Bytes that a hand-written file format often loses.
constexpr const char *kHardText = "  [x]=#;\\ \xff\xc3\xa9\t\"'\r ";
constexpr const char *kSetAside = "/usr/tavi/etc/scheduled_tasks.bak";

class Store : public SchedTest {
  protected:
    // A working copy with sections of these names, all of which convert to a task of that id.
    static void storeIds(const std::string &ids) {
        std::istringstream text(ids);
        std::string content;
        for (std::string id; text >> id;) {
            content += "[" + id + "]\nid=" + id +
                       "\nrun hour=1\nrun min=2\nname=n\napp=\napp name=\naction=\ncmd=\n"
                       "state=enabled\ntype=daily\n";
        }
        writeFile(kWorking, content);
    }
};

TEST_F(Store, HardTextsSurviveASaveAndALoad) {
    Task task = newTask(kHardText);
    TAVISchedCTaskSetName(task.get(), kHardText);
    TAVISchedCTaskSetAppArgs(task.get(), kHardText);
    TAVISchedCTaskSetAction(task.get(), "[1]\n[2]");
    ASSERT_EQ(TAVISchedTaskCreate(task.get()), 0);
    storedTask();
    TAVI_SCHED_TASK back{};
    ASSERT_EQ(TAVISchedTaskGetByID(1, &back), 0);
    for (const char *text : {back.name, back.appArgs, back.command}) {
        EXPECT_STREQ(text, kHardText);
    }
    EXPECT_STREQ(back.action, "[1] [2]");
    EXPECT_THAT(listedIds(), ElementsAre(1, 2));
    EXPECT_EQ(readFile(kWorking), readFile(kPersistent));
}

TEST_F(Store, NextIds) {
    const Texts cases = {{"", "Task 1"},      {"2 3", "Task 1"},
                         {"4 2 1", "Task 3"}, {"1 2 3", "Task 4"},
                         {"0 5", "Task 1"},   {"-1 0", "Task 1"},
                         {"1 1 3", "Task 2"}, {"-2147483648 2147483647", "Task -2147483647"}};
    for (const auto &[ids, name] : cases) {
        storeIds(ids);
        EXPECT_STREQ(newTask()->name, name);
    }
}

TEST_F(Store, UnreadableSectionsArePassedOverAndKept) {
    storeIds("2");
    const std::string bad = "[1]\nid=1\n[3]\nid=3x\nname=cut";
    writeFile(kWorking, bad + "\n" + readFile(kWorking));
    EXPECT_THAT(listedIds(), ElementsAre(2));
    EXPECT_THAT(logs(true), Contains(HasSubstr("schedule.cpp:60 Init task from hash failed. [0x")));
    TAVI_SCHED_TASK task{};
    EXPECT_EQ(TAVISchedTaskGetByID(1, &task), -1);
    EXPECT_THAT(logs(true), Contains(HasSubstr("backend_tavischedule.cpp:545 ")));
    EXPECT_EQ(task.state, TAVI_SCHED_STATE_NOT_EXISTED);
    EXPECT_EQ(storedTask()->id, 4); // 1 and 3 are in use
    EXPECT_THAT(readFile(kWorking), HasSubstr(bad + "\n[2]"));
    EXPECT_EQ(SchedBackends[0].get_by_id(2, &task), 1);
}

TEST_F(Store, WithoutAWorkingCopy) {
    TAVI_SCHED_TASK task{};
    EXPECT_THAT(listedIds(), IsEmpty());
    EXPECT_EQ(SchedBackends[0].get_by_id(1, &task), 0);
    EXPECT_EQ(task.state, TAVI_SCHED_STATE_NOT_EXISTED);
    writeFile(kPersistent, "[9]\n");
    EXPECT_EQ(SchedBackends[0].remove(1), 0);
    EXPECT_EQ(readFile(kPersistent), "[9]\n");
    // The first change would otherwise erase what the persistent file still has.
    EXPECT_EQ(storedTask()->id, 1);
    EXPECT_EQ(readFile(kSetAside), "[9]\n");
    const std::string first = readFile(kPersistent);
    EXPECT_THAT(first, testing::StartsWith("[1]\n"));
    writeFile(kWorking, ""); // as a copy that failed leaves it
    storedTask();
    EXPECT_EQ(readFile(kSetAside), first);
    EXPECT_EQ(readFile(kSetAside + std::string(".1")), "[9]\n");
    storedTask();
    EXPECT_EQ(shell("test $(ls /usr/tavi/etc | grep -Evc 'lock|reading') = 3"), 0);
}

TEST_F(Store, TheStartOfTheMachineFillsAnEmptyWorkingCopy) {
    constexpr const char *kLast = "1 1 * * * root /tmp/tavischedtask --run id=9\n";
    storeIds("1");
    const std::string tasks = readFile(kWorking);
    const struct {
        const char *arrange; // where the tasks are stored, and there is no working copy
        unsigned int error;
        std::string filled;
    } cases[] = {{"true", 0, tasks},
                 {": > /tmp/scheduled_tasks", 0, tasks},
                 {"cp scheduled_tasks /tmp; echo '[9]' > scheduled_tasks", 0, tasks},
                 {"chmod 666 scheduled_tasks", 0x0900, ""},
                 {"rm -r /usr/tavi/etc", 0, ""}};
    for (const auto &[arrange, error, filled] : cases) {
        shell("rm -rf /tmp/lock /tmp/scheduled_tasks /usr/tavi/etc; mkdir -m 755 /usr/tavi/etc");
        writeFile(kPersistent, tasks);
        shell("cd /usr/tavi/etc; chmod 600 scheduled_tasks; " + std::string(arrange));
        writeFile(kCrontab, kLast);
        logs();
        const int result = TAVISchedStart();
        EXPECT_TRUE(failure(result) == error && (result == 0) == (error == 0)) << arrange;
        EXPECT_EQ(lastLog().find("is refused: ") != std::string::npos, error > 0);
        EXPECT_EQ(statusOf("/usr/tavi/etc").st_mode, S_IFDIR | 0755U) << arrange;
        EXPECT_EQ(shell("[ -f /tmp/scheduled_tasks ] && [ -d /tmp/lock ]"), 0) << arrange;
        EXPECT_EQ(readFile(kWorking), filled) << arrange;
        // Without tasks the lines stay, as the last trace of them.
        EXPECT_THAT(readFile(kCrontab), HasSubstr(filled.empty() ? kLast : "--run id=1\n"))
            << arrange;
    }
    ASSERT_EQ(TAVISchedChangeBegin(), 0);
    EXPECT_EQ(failure(TAVISchedStart()), 0x0D00U);
    EXPECT_EQ(TAVISchedChangeRollback(), 0);
}

TEST_F(Store, ChangesOfATask) {
    Task task = newTask();
    TAVISchedCTaskSetName(task.get(), "");
    EXPECT_EQ(TAVISchedTaskSave(task.get()), 0);
    EXPECT_STREQ(task->name, "Task 1");
    TAVISchedCTaskSetID(task.get(), -2);
    EXPECT_EQ(SchedBackends[0].edit(task.get()), 0); // an unknown id is added
    EXPECT_EQ(TAVISchedTaskSave(task.get()), 0);     // -1 alone is a new task
    EXPECT_THAT(listedIds(), ElementsAre(-2, 1));
    EXPECT_EQ(failure(TAVISchedTaskLoad(-2, task.get())), 0x0D00U);
    EXPECT_EQ(failure(TAVISchedTaskLoad(7, task.get())), 0x2000U);
    EXPECT_THAT(lastLog(), HasSubstr("get task failed. [7] [0x2000 "));
    task->backend = -9;
    EXPECT_EQ(failure(TAVISchedTaskLoad(-1, task.get())), 0x2000U);
    EXPECT_THAT(lastLog(), HasSubstr("get default task failed. [0x2000 "));
    EXPECT_EQ(TAVISchedTaskRemove(1), 0);
    EXPECT_THAT(listedIds(), ElementsAre(-2));
    const std::string crontab = readFile(kCrontab);
    writeFile(kCrontab, crontab + "# later\n");
    EXPECT_EQ(SchedBackends[0].remove(1), 0);
    EXPECT_EQ(readFile(kCrontab), crontab + "# later\n"); // nothing removed, no rewrite
    EXPECT_EQ(SchedBackends[0].remove(-2), 1);
    EXPECT_EQ(readFile(kCrontab), std::string(kForeignCrontab) + "# later\n");
}

// Support scripts look for this place.
TEST_F(Store, ListsNeedMemory) {
    storeIds("1");
    faults().callocFails = sizeof(TAVI_SCHED_TASK);
    TAVI_SCHED_TASK *list = nullptr;
    EXPECT_EQ(SchedBackends[0].list_get(&list, nullptr), -1);
    EXPECT_EQ(PLATCErrorGetLine(), 56);
    EXPECT_EQ(list, nullptr);
}

// A program that says it has copied need not have.
TEST_F(Store, CopiesAreLookedAt) {
    Task task = storedTask();
    const std::string before = readFile(kWorking);
    writeFile("/run/cp", "#!/bin/sh\nhead -c 20 \"$2\" > \"$3\"\n");
    ASSERT_EQ(shell("chmod 755 /run/cp && mount -n --bind /run/cp /bin/cp"), 0);
    for (int call = 0; call < 2; ++call) {
        EXPECT_EQ(failure(TAVISchedTaskEdit(task.get())), 0x0B00U);
        shell("sed -i 's/head.*/case $2 in *.tmp.*) head -c 20 \"$2\" > \"$3\";; *) cat \"$2\" > "
              "\"$3\"; esac/' /run/cp");
    }
    shell("umount -n /bin/cp");
    EXPECT_EQ(readFile(kWorking), before);
    EXPECT_EQ(readFile(kPersistent), before);
    EXPECT_EQ(readFile(kCrontab), std::string(kForeignCrontab) + kOwnLine);
}

TEST_F(Store, StrangeWorkingCopiesAreRefused) {
    storeIds("1");
    const std::string planted = readFile(kWorking);
    Task task = newTask();
    task->id = 1;
    writeFile("/etc/target", planted);
    for (const std::string harm :
         {"chmod 666", "chmod 600 /tmp/scheduled_tasks; chown 4242", "ln -sf /etc/target"}) {
        if (shell(harm + " /tmp/scheduled_tasks") != 0) {
            continue; // there is only one user
        }
        TAVI_SCHED_TASK *list = nullptr;
        EXPECT_EQ(failure(SchedBackends[0].list_get(&list, nullptr)), 0x0900U) << harm;
        EXPECT_EQ(SchedBackends[0].get_by_id(1, task.get()), -1) << harm;
        EXPECT_EQ(SchedBackends[0].create(task.get()), -1) << harm;
        EXPECT_EQ(SchedBackends[0].edit(task.get()), -1) << harm;
        EXPECT_EQ(SchedBackends[0].remove(1), -1) << harm;
        EXPECT_EQ(readFile(kPersistent), "");
        EXPECT_EQ(readFile(kCrontab), kForeignCrontab);
    }
    EXPECT_EQ(readFile("/etc/target"), planted);
}

// What is repaired lasts as what is changed does.
TEST_F(Store, ARepairedTaskFileIsFlushed) {
    storedTask();
    unlink(kPersistent);
    const char *const names[] = {"missing files", nullptr};
    TAVI_SCHED_FINDING *finding = nullptr;
    ASSERT_EQ(TAVISchedMachineCheckOf(names, &finding), 1);
    fileCalls();
    EXPECT_EQ(TAVISchedFindingRepair(finding), 0);
    EXPECT_THAT(fileCalls(), ElementsAre(HasSubstr("fsync /usr/tavi/etc/scheduled_tasks."),
                                         HasSubstr("rename /usr/tavi/etc/scheduled_tasks."),
                                         "fsync /usr/tavi/etc"));
    TAVISchedFindingListFree(&finding);
}

TEST_F(Store, AWorkingCopyWithASecondNameIsReadAndChanged) {
    const Task task = storedTask();
    ASSERT_EQ(link(kWorking, "/tmp/second-name"), 0);
    const std::string before = readFile("/tmp/second-name");
    task->runHour = 9;
    EXPECT_EQ(TAVISchedTaskEdit(task.get()), 0);
    EXPECT_THAT(readFile(kWorking), HasSubstr("run hour=9\n"));
    EXPECT_EQ(readFile("/tmp/second-name"), before);
}

} // namespace
