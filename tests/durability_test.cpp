// Changes that last: what is flushed in which order, what a loss of power may leave, and file
// systems that are full.
#include "machine.h"
#include "tracer.h"

#include <algorithm>
#include <filesystem>
#include <functional>
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
    const auto run = tracer::run(
        [] { return created("new"); }, {},
        [&](const tracer::Call &call) {
            const bool isFlush = call.name == "fsync" || call.name.starts_with("rename");
            const bool overwrites = call.isPrograms && call.name == "openat" &&
                                    (call.path == kPersistent || call.path == kWorking ||
                                     call.path.starts_with(kScratch));
            if (overwrites || (isFlush && !call.path.starts_with("/tmp/"))) {
                order.push_back(shown(call));
            }
        });
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
void cutOff(const std::function<bool(const tracer::Call &)> &isWanted) {
    const auto run = tracer::run([] { return created("new"); },
                                 {.act = tracer::Act::KillAll, .isPoint = isWanted});
    EXPECT_TRUE(run.acted) << "it was not cut off";
}

std::string firstHalf(const std::string &text) {
    return text.substr(0, text.size() / 2);
}

TEST_F(Durability, LossOfPower) {
    const State old = stateNow();
    const std::string oldList = listOfFreshProcess();
    ASSERT_EQ(inChild([] { return created("new"); }), 0);
    const State stored = stateNow();
    const std::string storedList = listOfFreshProcess();

    using Text = std::function<std::string(const std::string &)>;
    const std::vector<std::pair<const char *, Text>> losses = {
        {"kept", [](const std::string &text) { return text; }},
        {"empty", [](const std::string &) { return ""; }},
        {"torn", firstHalf},
        {"zeros", [](const std::string &text) { return std::string(text.size(), '\0'); }}};
    const std::vector<std::pair<const char *, int (*)()>> nexts = {
        {"list", [] { return listOfFreshProcess() == "failed" ? 1 : 0; }},
        {"create", [] { return created("new"); }},
        {"sync", [] { return TAVISchedTaskSync() == 0 ? 0 : 1; }}};
    const std::vector<std::pair<const char *, std::function<bool(const tracer::Call &)>>> moments =
        {{"before the copies",
          [](const tracer::Call &call) { return call.isPrograms && call.path == kPersistent; }},
         {"before the record goes", [](const tracer::Call &call) {
              return call.name.starts_with("rename") && call.path == kRecord;
          }}};
    size_t state = 0;
    Tally tally("durability: loss of power");
    for (const auto &[moment, isWanted] : moments) {
        for (const auto &[persistentLoss, persistent] : losses) {
            for (const auto &[workingLoss, working] : losses) {
                for (const auto &[name, next] : nexts) {
                    if (state++ % kStep != 0) {
                        continue;
                    }
                    start_->restore();
                    cutOff(isWanted);
                    writeFile(kPersistent, persistent(readFile(kPersistent)));
                    writeFile(kWorking, working(readFile(kWorking)));
                    const int answer = inChild(next);
                    const bool isCreate = name == std::string("create");
                    const bool isRight = answer == 0 && stateNow() == (isCreate ? stored : old) &&
                                         listOfFreshProcess() == (isCreate ? storedList : oldList);
                    tally.add(std::string(moment) + ", persistent file " + persistentLoss +
                                  ", working copy " + workingLoss + ", then " + name,
                              isRight ? "" : std::to_string(answer));
                }
            }
        }
    }
}

// Nothing was overwritten while the record was not whole.
TEST_F(Durability, TornRecord) {
    const State old = stateNow();
    cutOff([](const tracer::Call &call) { return call.isPrograms && call.path == kPersistent; });
    const std::string record = readFile(kRecord);
    for (const std::string &left :
         {std::string(), firstHalf(record), record.substr(0, record.size() - 3),
          std::string(record.size(), '\0'), record + "more"}) {
        start_->restore();
        writeFile(kRecord, left);
        shell("touch /etc/crontab.cutOff; touch -d '100 seconds ago' " + std::string(kRecord));
        EXPECT_EQ(listOfFreshProcess().find("failed"), std::string::npos);
        EXPECT_EQ(stateNow(), old) << left.size();
        EXPECT_THAT(leftovers(), IsEmpty());
    }
}

// ---- Full file systems ----

// A small file system over a folder, with what was in it.
class Small {
  public:
    explicit Small(const char *folder) : folder_(folder) {
        const std::string path = folder_;
        EXPECT_EQ(shell("mkdir -p /run/aside && cp -a " + path +
                        "/. /run/aside && mount -n -t tmpfs -o " +
                        "size=400k,nr_inodes=200,mode=1777 small " + path +
                        " && cp -a /run/aside/crontab* /run/aside/scheduled* /run/aside/auto* " +
                        path + " 2>/dev/null; rm -r /run/aside; mountpoint -q " + path +
                        (path == "/tmp" ? "" : " && chmod 755 " + path)),
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

struct Full {
    const char *name;
    const char *folder;
    bool inodes;
    int (*operation)();
    bool isBatch;
};

int editedHere() {
    return edited("edited", std::string(9000, 'y'));
}

int batch() {
    return TAVISchedChangeBegin() == 0 && editedHere() == 0 && powerCreated() == 0 &&
                   TAVISchedTaskRemove(1) == 0 && TAVISchedChangeCommit() == 0
               ? 0
               : 1;
}

// With less and less in the way, until the change succeeds: it is whole or not there, and the tasks
// can be listed while everything is full.
TEST_F(Durability, FullFileSystems) {
    std::vector<Full> cases;
    for (const char *const folder : {"/usr/tavi/etc", "/tmp", "/etc"}) {
        for (const bool inodes : {false, true}) {
            cases.push_back({"edit", folder, inodes, editedHere, false});
            cases.push_back({"batch", folder, inodes, batch, true});
        }
    }
    const State old = stateNow();
    const std::string oldList = listOfFreshProcess();
    for (const Full &full : cases) {
        start_->restore();
        ASSERT_EQ(inChild(full.operation), 0);
        const State stored = stateNow();
        const std::string storedList = listOfFreshProcess();
        start_->restore();
        Small small(full.folder);
        Tally tally(std::string("durability: ") + full.name + " with " + full.folder + " full of " +
                    (full.inodes ? "inodes" : "bytes"));
        bool done = false;
        for (size_t rest = 0; rest < 60 && !done; rest += kStep) {
            small.free();
            start_->restore();
            small.fill(rest, full.inodes);
            logs();
            const int answer = inChild(full.operation);
            const std::string fullList = listOfFreshProcess();
            small.free();
            const std::string list = listOfFreshProcess();
            State now = stateNow();
            const bool isOld = now == old && list == oldList && fullList == list;
            done = now == stored;
            const std::string crontab = std::exchange(now[kCrontab], stored.at(kCrontab));
            const bool mayBeBehind = !full.isBatch && crontab == old.at(kCrontab);
            const bool isStored =
                now == stored && list == storedList && fullList == list && (done || mayBeBehind);
            const bool isRight = answer == 0 ? isStored : isOld;
            tally.add(std::to_string(rest) + " left", isRight ? "" : std::to_string(answer));
        }
        EXPECT_TRUE(done);
    }
}

// A working copy that cannot be restored for lack of room is not read, and nothing is changed.
TEST_F(Durability, TornWorkingCopyWithoutRoom) {
    const State old = stateNow();
    const std::string oldList = listOfFreshProcess();
    Small small("/tmp");
    cutOff([](const tracer::Call &call) { return call.isPrograms && call.path == kWorking; });
    writeFile(kWorking, "");
    shell("rm /tmp/scheduled_tasks.tmp*"); // that would be room enough
    small.fill(0, false);
    EXPECT_EQ(listOfFreshProcess(), oldList);
    EXPECT_EQ(inChild([] {
                  TAVI_SCHED_TASK task{};
                  return TAVISchedTaskGetByID(3, &task) == 0 && task.id == 3 ? 0 : 1;
              }),
              0);
    const std::string persistent = readFile(kPersistent);
    EXPECT_EQ(inChild([] { return created("new"); }), 1);
    EXPECT_EQ(readFile(kPersistent), persistent);
    EXPECT_TRUE(fs::exists(kRecord));
    small.free();
    EXPECT_EQ(listOfFreshProcess(), oldList);
    EXPECT_EQ(stateNow(), old);
    EXPECT_THAT(leftovers(), IsEmpty());
}

} // namespace
