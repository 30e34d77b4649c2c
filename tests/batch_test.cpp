// Several changes as one.
#include "machine.h"
#include "tavisdk.h"

#include <array>
#include <functional>

namespace {

using namespace support;

class Batch : public SchedTest {
  protected:
    void SetUp() override {
        SchedTest::SetUp();
        storedTask();
        before_ = stateNow();
    }

    State before_;
};

TEST_F(Batch, OnlyThisProcessSeesItUntilItIsStored) {
    ASSERT_EQ(TAVISchedChangeBegin(), 0);
    EXPECT_EQ(storedTask()->id, 2);
    Task third = storedTask("echo 3");
    EXPECT_EQ(storedTask("echo 4")->id, 4);
    EXPECT_EQ(TAVISchedTaskRemove(2), 0);
    TAVISchedCTaskSetName(third.get(), "third");
    EXPECT_EQ(TAVISchedTaskEdit(third.get()), 0);
    EXPECT_EQ(TAVISchedTaskCreate(powerTask("poweroff", 22, 30).get()), 0);
    EXPECT_THAT(listedIds(), ElementsAre(1, 3, 4, 91272230));
    TAVI_SCHED_TASK back{};
    EXPECT_EQ(TAVISchedTaskGetByID(2, &back), -1);
    EXPECT_EQ(TAVISchedTaskGetByID(3, &back), 0);
    EXPECT_STREQ(back.name, "third");
    EXPECT_STREQ(newTask()->name, "Task 2");
    EXPECT_EQ(stateNow(), before_);
    EXPECT_EQ(listOfFreshProcess(), "1 Task 1 true; ");
    ASSERT_EQ(TAVISchedChangeCommit(), 0);
    EXPECT_EQ(listOfFreshProcess(),
              "1 Task 1 true; 3 third echo 3; 4 Task 4 echo 4; 91272230 PowerOff task 0 ; ");
    EXPECT_EQ(readFile(kWorking), readFile(kPersistent));
    EXPECT_THAT(readFile(kCrontab), AllOf(HasSubstr("--run id=3\n"), HasSubstr("--run id=4\n")));
    EXPECT_THAT(readFile(kCrontab), HasSubstr("tavi_poweroff_feasible_check"));
}

TEST_F(Batch, MisuseIsRefused) {
    EXPECT_EQ(failure(TAVISchedChangeCommit()), 0x0D00U);
    EXPECT_EQ(failure(TAVISchedChangeRollback()), 0x0D00U);
    ASSERT_EQ(TAVISchedChangeBegin(), 0);
    EXPECT_EQ(failure(TAVISchedChangeBegin()), 0x0D00U);
    EXPECT_EQ(TAVISchedChangeCommit(), 0); // of nothing
    EXPECT_EQ(stateNow(), before_);
}

// Neither a section that nobody can read nor ids below 1 stand in the way.
TEST_F(Batch, BesideDamagedSections) {
    for (const char *const path : {kWorking, kPersistent}) {
        writeFile(path, readFile(path) + "[7]\nid=7\n[-5]\nid=-5\nrun hour=1\nrun min=2\nname=n\n"
                                         "app=\napp name=\naction=\ncmd=\nstate=enabled\n"
                                         "type=daily\n");
    }
    writeFile(kCrontab, readFile(kCrontab) + "1 1 * * * root /tmp/tavischedtask --run id=7\n");
    ASSERT_EQ(TAVISchedChangeBegin(), 0);
    EXPECT_EQ(storedTask()->id, -4);
    EXPECT_EQ(storedTask()->id, -3);
    EXPECT_EQ(TAVISchedChangeCommit(), 0);
    EXPECT_THAT(listedIds(), ElementsAre(-5, -4, -3, 1));
    EXPECT_THAT(readFile(kCrontab), HasSubstr("root /tmp/tavischedtask --run id=7\n"));
    EXPECT_THAT(readFile(kWorking), HasSubstr("[7]\nid=7\n"));
}

TEST_F(Batch, OfMorePowerSchedulesThanAreRead) {
    for (const bool isBatch : {false, true}) {
        shell("{ echo '[power off]'; for i in $(seq 0 99); do printf '%03d=0 1 %d %d\n' $i "
              "$((i / 60)) $((i % 60)); done; } > /usr/tavi/etc/auto_power");
        EXPECT_EQ(isBatch ? TAVISchedChangeBegin() : 0, 0);
        for (int minute = 0; minute < 3; ++minute) {
            EXPECT_EQ(TAVISchedTaskCreate(powerTask("poweroff", 20, minute).get()), 0);
        }
        EXPECT_EQ(isBatch ? TAVISchedChangeCommit() : 0, 0);
        EXPECT_THAT(readFile(kPower), HasSubstr("099=0 1 1 39\n100=1 127 20 2\n"));
    }
    std::vector<TAVIAUTOPOWER> entries(200);
    EXPECT_EQ(TAVIAutoPowerConfGet(TAVI_AUTOPOWER_KIND_OFF, 200, entries.data()), 100);
}

// A handler's PRE phase runs with each change, its POST phase at the end, with the batch's result.
// Of one that is taken back nothing else shows.
TEST_F(Batch, HandlersAreToldAtTheEnd) {
    addHandler("note", "echo $1 $2 $RESULT $ORG_TASK_ID >> /tmp/told");
    for (const bool stored : {false, true}) {
        ASSERT_EQ(TAVISchedChangeBegin(), 0);
        EXPECT_EQ(TAVISchedTaskRemove(1), 0);
        EXPECT_EQ(storedTask()->id, 1);
        EXPECT_EQ(TAVISchedTaskCreate(powerTask("poweroff", 1, 2).get()), 0);
        EXPECT_EQ(readFile("/tmp/told"), "task_remove pre 0 1\n");
        EXPECT_EQ(stored ? TAVISchedChangeCommit() : TAVISchedChangeRollback(), 0);
        EXPECT_EQ(stateNow() == before_, !stored);
        EXPECT_EQ(listedIds().size(), stored ? 2U : 1U);
        EXPECT_EQ(readFile("/tmp/told"), std::string("task_remove pre 0 1\ntask_remove post ") +
                                             (stored ? "0" : "-1") + " 1\n");
        unlink("/tmp/told");
    }
}

// What the process starts would wait for it, and it for them.
TEST_F(Batch, ItsOwnChildrenAreRefusedAtOnce) {
    ASSERT_EQ(TAVISchedChangeBegin(), 0);
    const Task first = newTask();
    first->id = 1;
    const Task second = storedTask();
    const std::function<int()> changes[] = {
        [] { return TAVISchedTaskCreate(newTask().get()); },
        [&] { return TAVISchedTaskEdit(first.get()); },
        [] { return TAVISchedTaskRemove(1); },
        [] { return SchedBackends[0].sync(); },
        [] { return SchedBackends[1].sync(); },
        [] { return TAVISchedTaskCreate(powerTask("poweroff", 1, 2).get()); },
        [] { return TAVISchedChangeBegin(); },
        [] { return TAVISchedStart(); }};
    for (const auto &change : changes) {
        EXPECT_EQ(inChild([&] { return failure(change()) != 0x0400; }), 0);
        EXPECT_THAT(logs(), Contains(HasSubstr("a change waits for this process")));
    }
    // One that waits for the end of the batch changes tasks like any other process.
    std::array<int, 2> ends{};
    ASSERT_EQ(pipe(ends.data()), 0);
    const pid_t later = start([&] {
        char byte = 0;
        return read(ends[0], &byte, 1) == 1 && TAVISchedTaskCreate(newTask().get()) == 0 ? 0 : 1;
    });
    EXPECT_EQ(TAVISchedChangeCommit(), 0);
    EXPECT_EQ(write(ends[1], "x", 1), 1);
    EXPECT_EQ(exitOf(later), 0);
    EXPECT_THAT(listedIds(), ElementsAre(1, 2, 3));
    close(ends[0]);
    close(ends[1]);
}

// A filter may change what is listed.
TEST_F(Batch, ListsWhileItGrows) {
    ASSERT_EQ(TAVISchedChangeBegin(), 0);
    const Task second = storedTask();
    TAVI_SCHED_TASK *list = nullptr;
    const auto filter = [](TAVI_SCHED_TASK *task) {
        return task->id == 2 && TAVISchedTaskCreate(newTask().get()) != 0 ? 0 : 1;
    };
    EXPECT_EQ(TAVISchedTaskListGet(&list, filter), 2);
    TAVISchedTaskListFree(&list);
    EXPECT_EQ(TAVISchedChangeCommit(), 0);
    EXPECT_THAT(listedIds(), ElementsAre(1, 2, 3));
}

TEST_F(Batch, NewTasksUnderGivenIds) {
    Task task = newTask();
    for (const int id : {0, -1, 1, 70000000}) {
        task->id = id;
        EXPECT_EQ(failure(TAVISchedTaskCreateWithId(task.get())), 0x0D00U) << id;
    }
    EXPECT_EQ(stateNow(), before_);
    task->id = 40;
    EXPECT_EQ(TAVISchedTaskCreateWithId(task.get()), 0);
    EXPECT_THAT(listedIds(), ElementsAre(1, 40));
    int32_t next = 0;
    EXPECT_EQ(TAVISchedTaskNextId(&next), 0);
    EXPECT_EQ(next, 2);
    TAVI_SCHED_TASK *list = nullptr;
    EXPECT_EQ(TAVISchedTaskListGetOf(TAVI_SCHED_BACKEND_AUTOPOWER, &list, nullptr), 0);
    writeFile(kPower, "[power on]\n000=damaged\n");
    EXPECT_EQ(TAVISchedTaskListGetOf(TAVI_SCHED_BACKEND_AUTOPOWER, &list, nullptr), -1);
    EXPECT_EQ(failure(TAVISchedTaskListGetOf(-7, &list, nullptr)), 0x2000U);
}

} // namespace
