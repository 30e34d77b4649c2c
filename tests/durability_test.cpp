// Changes that last: what is flushed in which order, what a loss of power may leave, and file
// systems that are full.
#include "machine.h"
#include "tracer.h"

#include <sys/statvfs.h>

namespace {

using namespace support;
namespace fs = std::filesystem;

class Durability : public SchedTest {
  protected:
    void SetUp() override {
        SchedTest::SetUp();
        const std::string fat(3000, 'x');
        for (const char *const name : {"one", "two", "three"}) {
            ASSERT_EQ(created(name, fat.c_str()), 0);
        }
        ASSERT_EQ(powerCreated(5), 0);
        start_.emplace();
    }

    std::optional<Snapshot> start_;
};

// ---- Order ----

constexpr const char *kScratch = "/tmp/scheduled_tasks.tmp.";

// "new" is what was not there before.
std::string shown(const tracer::Call &call) {
    std::string path = call.path;
    for (const std::string temporary : {"/etc/crontab.", kScratch}) {
        path = path.starts_with(temporary) ? temporary + "*" : path;
    }
    return call.name.substr(0, 6) + (fs::exists(call.path) ? " " : " new ") + path;
}

TEST_F(Durability, OrderOfFlushesAndRenames) {
    std::vector<std::string> order;
    const auto note = [&](const tracer::Call &call, size_t) {
        const bool isFlush = call.name == "fsync" || call.name.starts_with("rename");
        const bool overwrites =
            call.isPrograms && call.name == "openat" &&
            (call.path == kPersistent || call.path == kWorking || call.path.starts_with(kScratch));
        if (overwrites || (isFlush && !call.path.starts_with("/tmp/"))) {
            order.push_back(shown(call));
        }
        return false;
    };
    const auto run = tracer::run([] { return created("new"); }, {.isPoint = note});
    EXPECT_EQ(run.status, 0);
    const std::string record = kRecord;
    EXPECT_THAT(order,
                ElementsAre("openat " + std::string(kScratch) + "*", "fsync " + record,
                            "fsync /usr/tavi/etc", std::string("openat ") + kPersistent,
                            std::string("fsync ") + kPersistent, std::string("openat ") + kWorking,
                            "fsync /etc/crontab.*", "rename /etc/crontab.*", "fsync /etc",
                            "rename " + record, "fsync /usr/tavi/etc"));
}

// ---- Loss of power ----

// Stops a create for good at the first call that the predicate wants.
void cutOff(const tracer::Wanted &isWanted) {
    const auto run = tracer::run([] { return created("new"); },
                                 {.act = tracer::Act::KillAll, .isPoint = isWanted});
    EXPECT_TRUE(run.acted) << "it was not cut off";
}

// A program is about to write to the path.
tracer::Wanted isCopyTo(const char *path) {
    return
        [path](const tracer::Call &call, size_t) { return call.isPrograms && call.path == path; };
}

std::string firstHalf(const std::string &text) {
    return text.substr(0, text.size() / 2);
}

TEST_F(Durability, LossOfPower) {
    const State old = stateNow(listOfFreshProcess());
    ASSERT_EQ(inChild([] { return created("new"); }), 0);
    const State stored = stateNow(listOfFreshProcess());

    const std::vector<std::pair<const char *, void (*)(const std::string &)>> losses = {
        {"kept", [](const std::string &) {}},
        {"empty", [](const std::string &path) { writeFile(path, ""); }},
        {"torn", [](const std::string &path) { writeFile(path, firstHalf(readFile(path))); }},
        {"zeros",
         [](const std::string &path) {
             writeFile(path, std::string(readFile(path).size(), '\0'));
         }},
        {"gone", [](const std::string &path) { unlink(path.c_str()); }}};
    const std::vector<std::pair<std::string, int (*)()>> nexts = {
        {"list", [] { return listOfFreshProcess() == "failed" ? 1 : 0; }},
        {"create", [] { return created("new"); }},
        {"sync", TAVISchedTaskSync},
        {"start", TAVISchedStart}};
    const std::vector<std::pair<const char *, tracer::Wanted>> moments = {
        {"before the copies", isCopyTo(kPersistent)},
        {"between the copies", isCopyTo(kWorking)},
        {"before the record goes", [](const tracer::Call &call, size_t) {
             return call.name.starts_with("rename") && call.path == kRecord;
         }}};
    size_t state = 0;
    for (const auto &[moment, isWanted] : moments) {
        for (const auto &[persistentLoss, losePersistent] : losses) {
            for (const auto &[workingLoss, loseWorking] : losses) {
                for (const auto &[name, next] : nexts) {
                    if (state++ % kStep != 0) {
                        continue;
                    }
                    start_->restore();
                    cutOff(isWanted);
                    losePersistent(kPersistent);
                    loseWorking(kWorking);
                    const int answer = inChild(next);
                    const State &wanted = name == "create" ? stored : old;
                    const std::string &list = wanted.at("list");
                    const bool isRight =
                        answer == 0 && stateNow(list) == wanted && listOfFreshProcess() == list;
                    expectNone(isRight ? "" : std::to_string(answer),
                               std::string(moment) + ", persistent file " + persistentLoss +
                                   ", working copy " + workingLoss + ", then " + name);
                }
            }
        }
    }
}

// Nothing was overwritten while the record was not whole.
TEST_F(Durability, TornRecord) {
    const State old = stateNow();
    cutOff(isCopyTo(kPersistent));
    const std::string record = readFile(kRecord);
    for (const std::string &left :
         {std::string(), firstHalf(record), record.substr(0, record.size() - 3),
          std::string(record.size(), '\0'), record + "more",
          std::string(9, '\0') + record.substr(9)}) {
        start_->restore();
        writeFile(kRecord, left);
        shell("touch /etc/crontab.cutOff; touch -d '100 seconds ago' " + std::string(kRecord));
        EXPECT_EQ(listOfFreshProcess().find("failed"), std::string::npos);
        EXPECT_EQ(stateNow(), old) << left.size();
        EXPECT_THAT(leftovers(), IsEmpty());
    }
}

// Of a file that differed there is a copy beside the record; without it nothing is put back.
TEST_F(Durability, UnreadableCopyBesideTheRecord) {
    writeFile(kPersistent, readFile(kPersistent) + "[9]\nname=of the file alone\n");
    const State old = stateNow();
    cutOff(isCopyTo(kWorking));
    const std::string copy = std::string(kPersistent) + ".journal.persistent";
    shell("mv " + copy + " /run/aside; mkdir " + copy);
    const State cut = stateNow();
    logs();
    EXPECT_EQ(listOfFreshProcess(), "91270500 PowerOff task 0 ; ");
    EXPECT_THAT(logs(), Contains(HasSubstr(copy + " cannot be read")));
    EXPECT_EQ(stateNow(), cut);
    shell("rmdir " + copy + "; mv /run/aside " + copy);
    logs();
    EXPECT_THAT(listOfFreshProcess(), HasSubstr("1 one"));
    EXPECT_EQ(stateNow(), old);
    EXPECT_THAT(logs(), Contains(testing::ContainsRegex("is taken back, process [1-9]")));
}

// What cannot be told as done is taken back.
TEST_F(Durability, RecordThatCannotGo) {
    const State old = stateNow();
    for (const char *const name : {"rename", "fsync"}) {
        bool isLast = false; // the folder is flushed before, too
        const auto run =
            tracer::run([] { return created("new"); },
                        {.calls = tracer::Calls::Failing,
                         .act = tracer::Act::Fail,
                         .isPoint =
                             [&](const tracer::Call &call, size_t) {
                                 isLast = isLast || (call.name == "rename" && call.path == kRecord);
                                 return isLast && call.name == name;
                             },
                         .error = EIO});
        EXPECT_EQ(WEXITSTATUS(run.status), run.acted ? 1 : 0) << name;
        EXPECT_THAT(listOfFreshProcess(), HasSubstr("three"));
        EXPECT_TRUE(!run.acted || stateNow() == old) << name;
    }
    // Nor does it go while a file cannot be put back.
    cutOff(isCopyTo(kWorking));
    fakes.renameFails = true;
    EXPECT_EQ(inChild([] { return failure(SchedBackends[0].sync()) != 0x2800; }), 0);
    EXPECT_TRUE(fs::exists(kRecord));
}

// ---- Full file systems ----

// A small file system over a folder, with what was in it.
class Small {
  public:
    explicit Small(std::string folder) : folder_(std::move(folder)) {
        EXPECT_EQ(shell("f=" + folder_ +
                        "; mkdir /run/aside && cp -a $f/. /run/aside && mount -n -t tmpfs -o "
                        "size=400k,nr_inodes=200,mode=$(stat -c %a $f) small $f && cd /run/aside "
                        "&& cp -a crontab* scheduled* auto* $f 2>/dev/null; rm -r /run/aside; "
                        "mountpoint -q $f"),
                  0);
    }
    ~Small() { shell("umount -n -l " + folder_); }
    Small(const Small &) = delete;
    Small &operator=(const Small &) = delete;

    // Leaves so many pages, or inodes, free.
    void fill(size_t rest, bool inodes) {
        free();
        struct statvfs status {};
        statvfs(folder_.c_str(), &status);
        if (inodes) {
            mkdir(filler().c_str(), 0700);
            for (size_t i = rest + 1; i < status.f_ffree; ++i) {
                writeFile(filler() + "/" + std::to_string(i), "");
            }
        } else if (status.f_bavail > rest) {
            writeFile(filler(), std::string((status.f_bavail - rest) * status.f_bsize, 'x'));
        }
    }
    void free() { fs::remove_all(filler()); }

  private:
    std::string filler() const { return folder_ + "/filler"; }
    std::string folder_;
};

int editedHere() {
    return edited("edited", std::string(9000, 'y').c_str());
}

int batch() {
    return TAVISchedChangeBegin() == 0 && editedHere() == 0 && powerCreated() == 0 &&
                   TAVISchedTaskRemove(1) == 0 && TAVISchedChangeCommit() == 0
               ? 0
               : 1;
}

// With less and less in the way, until the change succeeds: it is whole or not there, and the tasks
// can be listed while everything is full. Outside of a batch the crontab may stay behind.
void expectWholeChanges(const Snapshot &start, const std::string &folder, bool inodes,
                        bool isBatch) {
    int (*const operation)() = isBatch ? batch : editedHere;
    start.restore();
    const State old = stateNow(listOfFreshProcess());
    ASSERT_EQ(inChild(operation), 0);
    const State stored = stateNow(listOfFreshProcess());
    start.restore();
    Small small(folder);
    bool done = false;
    for (size_t rest = 0; rest < 60 && !done; rest += kStep) {
        small.free();
        start.restore();
        small.fill(rest, inodes);
        logs();
        const int answer = inChild(operation);
        const std::string fullList = listOfFreshProcess();
        small.free();
        State now = stateNow(listOfFreshProcess());
        done = now == stored;
        if (answer == 0 && !isBatch && now[kCrontab] == old.at(kCrontab)) {
            now[kCrontab] = stored.at(kCrontab);
        }
        const bool isRight = now == (answer == 0 ? stored : old) && fullList == now.at("list");
        expectNone(isRight ? "" : std::to_string(answer), folder + " with " + std::to_string(rest));
    }
    EXPECT_TRUE(done);
}

TEST_F(Durability, FullFileSystems) {
    for (const char *const folder : {"/usr/tavi/etc", "/tmp", "/etc"}) {
        for (const int way : {0, 1, 2, 3}) {
            expectWholeChanges(*start_, folder, way % 2 == 1, way > 1);
        }
    }
}

// What a torn copy took is room for the restored one. A working copy that cannot be restored for
// lack of room is not read, and nothing is changed.
TEST_F(Durability, TornWorkingCopyWithoutRoom) {
    const State old = stateNow(listOfFreshProcess());
    Small small("/tmp");
    const auto tear = [&](size_t size) {
        small.free();
        cutOff(isCopyTo(kWorking));
        writeFile(kWorking, std::string(size, 'x'));
        shell("rm /tmp/scheduled_tasks.tmp*"); // that would be room enough
        small.fill(0, false);
    };
    tear(100000);
    EXPECT_EQ(stateNow(listOfFreshProcess()), old);
    tear(0);
    EXPECT_EQ(listOfFreshProcess(), old.at("list"));
    EXPECT_EQ(inChild([] {
                  TAVI_SCHED_TASK task{};
                  return TAVISchedTaskGetByID(3, &task) + task.id;
              }),
              3);
    const std::string persistent = readFile(kPersistent);
    EXPECT_EQ(inChild([] { return created("new"); }), 1);
    EXPECT_EQ(readFile(kPersistent), persistent);
    EXPECT_TRUE(fs::exists(kRecord));
    small.free();
    EXPECT_EQ(stateNow(listOfFreshProcess()), old);
    EXPECT_THAT(leftovers(), IsEmpty());
}

} // namespace
