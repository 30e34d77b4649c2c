// The status database.
#include "support.h"

#include <sqlite3.h>

namespace {

using namespace support;

constexpr const char *kDatabase = "/tmp/sched_status.sqlite";

class StatusDatabase : public SchedTest {
  protected:
    void SetUp() override {
        SchedTest::SetUp();
        db_ = TAVISchedDBInit();
        ASSERT_NE(db_, nullptr);
    }
    void TearDown() override {
        sqlite3_close(db_);
        SchedTest::TearDown();
    }
    int addRow(const char *app, int id) {
        TAVI_SCHED_TASK task{};
        task.id = id;
        TAVISchedCTaskSetApp(&task, app);
        int32_t statusId = -1;
        EXPECT_EQ(TAVISchedDBAddRecord(db_, &task, &statusId), 0);
        return statusId;
    }

    sqlite3 *db_ = nullptr;
};

TEST_F(StatusDatabase, RowsFromStartToEnd) {
    faults().now = 1700000000;
    EXPECT_EQ(addRow("007", 5), 1);
    EXPECT_EQ(query("SELECT * FROM task_status"),
              "1 " + std::to_string(getpid()) + " 1700000000 7 5 2 - ");
    TAVI_SCHED_STATUS status{};
    EXPECT_EQ(TAVISchedDBIsAppRunning(db_, "007", &status), 0);
    EXPECT_EQ(status.found * 10 + status.taskId, 15);
    int32_t code = -1, since = -1;
    char comment[3] = "#";
    EXPECT_EQ(TAVISchedDBSetStatus(db_, 1, SCHED_STATUS_CODE_SUCCESS, 6, "no"), 0); // other code
    EXPECT_EQ(TAVISchedDBSetStatus(db_, 1, SCHED_STATUS_CODE_RUNNING, 7, "123"), 0);
    EXPECT_EQ(TAVISchedDBGetStatusByStatusID(db_, 1, &code, comment, sizeof comment), 1);
    EXPECT_EQ(code, 7);
    EXPECT_STREQ(comment, "12");
    faults().now = 1700000060;
    addRow("", 5);
    EXPECT_EQ(TAVISchedDBSetStatus(db_, 2, 0, 3, ""), 0);
    EXPECT_EQ(TAVISchedDBGetStatusByTaskID(db_, 5, &since, &code, comment, sizeof comment), 1);
    EXPECT_EQ(since, 1700000060);
    EXPECT_EQ(code, 3);
    EXPECT_STREQ(comment, "");
    EXPECT_EQ(TAVISchedDBGetStatusByTaskID(db_, 6, &since, &code, nullptr, 0), 0);
    EXPECT_EQ(TAVISchedDBGetStatusByStatusID(db_, 9, &code, nullptr, 0), 0);
    EXPECT_EQ(code, 3);
    EXPECT_THAT(logs(), IsEmpty());
    query("CREATE TRIGGER t AFTER INSERT ON task_status BEGIN DELETE FROM task_status; END");
    TAVI_SCHED_TASK task{};
    EXPECT_EQ(failure(TAVISchedDBAddRecord(db_, &task, nullptr)), 0x0B00U);
    sqlite3_stmt *open = nullptr;
    sqlite3_prepare_v2(db_, "SELECT 1", -1, &open, nullptr);
    EXPECT_EQ(TAVISchedDBClose(db_), -1);
    EXPECT_EQ(PLATCErrGet(), 0x0B00U);
    sqlite3_finalize(open);
}

TEST_F(StatusDatabase, QuotesStayInValues) {
    const char *const hard = "x' OR 1=1; --%s%n\"";
    const int id = addRow(hard, 1);
    addRow("other", 2);
    TAVI_SCHED_STATUS status{};
    EXPECT_EQ(TAVISchedDBIsAppRunning(db_, "x' OR '1'='1", &status), 0);
    EXPECT_EQ(status.found, 0);
    EXPECT_EQ(TAVISchedDBIsAppRunning(db_, hard, &status), 0);
    EXPECT_EQ(status.found, 1);
    EXPECT_EQ(TAVISchedDBSetStatus(db_, id, 2, 7, "', status_code=9 --"), 0);
    EXPECT_EQ(query("SELECT task_id, status_code, comment FROM task_status"),
              "1 7 ', status_code=9 -- 2 2 - ");
    // Cut, the statement would change every row.
    EXPECT_EQ(TAVISchedDBSetStatus(db_, id, 7, 3, std::string(4040, 'c').c_str()), -1);
    EXPECT_EQ(query("SELECT count(*) FROM task_status WHERE status_code=3"), "0 ");
    EXPECT_EQ(TAVISchedDBSetStatus(db_, -1, 0, 3, nullptr), -1);
    EXPECT_EQ(TAVISchedDBSetStatus(db_, -1, 2, 1, nullptr), 0);
    EXPECT_EQ(query("SELECT status_code FROM task_status"), "7 1 ");
}

TEST_F(StatusDatabase, DeadRunnersAreInterruptedAndNoConflict) {
    query("INSERT INTO task_status (pid, timestamp, task_id, status_code) VALUES (999999999, 1, 5, "
          "2), (" +
          std::to_string(getpid()) + ", 2, 6, 2), (999999998, 3, 6, 2)");
    int32_t code = 0;
    EXPECT_EQ(TAVISchedDBGetStatusByTaskID(db_, 5, nullptr, &code, nullptr, 0), 1);
    EXPECT_EQ(code, SCHED_STATUS_CODE_INTERRUPTED);
    EXPECT_EQ(TAVISchedDBGetStatusByStatusID(db_, 2, &code, nullptr, 0), 1);
    EXPECT_EQ(code, SCHED_STATUS_CODE_RUNNING);
    EXPECT_EQ(query("SELECT status_code FROM task_status"), "2 2 2 ");
    TAVI_SCHED_STATUS status{};
    EXPECT_EQ(TAVISchedDBIsTaskRunning(db_, 5, &status), 0);
    EXPECT_EQ(status.found * 10 + status.statusId, 1);
    EXPECT_EQ(TAVISchedDBIsTaskRunning(db_, 6, &status), 0);
    EXPECT_EQ(status.found * 10 + status.statusId, 12);
}

// Takes rows down as "status:task:time:code:comment"; ends the list after `most` rows.
struct Taken {
    size_t most = 100;
    std::vector<std::string> rows;

    static int take(void *context, const TAVI_SCHED_STATUS *row) {
        auto &self = *static_cast<Taken *>(context);
        self.rows.push_back(std::to_string(row->statusId) + ":" + std::to_string(row->taskId) +
                            ":" + std::to_string(row->timestamp) + ":" +
                            std::to_string(row->statusCode) + ":" + row->comment);
        return self.rows.size() == self.most;
    }
};

TEST_F(StatusDatabase, ListsOfRuns) {
    query("INSERT INTO task_status (pid, timestamp, task_id, status_code, comment) VALUES "
          "(999999999, 30, 6, 2, NULL), (1, 20, 5, 7, '3'), (1, 20, 5, 3, ''), (" +
          std::to_string(getpid()) + ", 40, 5, 2, NULL), (1, 10, 6, 6, '9')");
    const std::string gone = "1:6:30:1:", running = "4:5:40:2:";
    Taken all, one, last, first{1, {}}, none;
    EXPECT_EQ(TAVISchedDBListStatus(db_, -1, Taken::take, &all), 5);
    EXPECT_THAT(all.rows, ElementsAre(running, gone, "3:5:20:3:", "2:5:20:7:3", "5:6:10:6:9"));
    EXPECT_EQ(TAVISchedDBListStatus(db_, 6, Taken::take, &one), 2);
    EXPECT_THAT(one.rows, ElementsAre(gone, "5:6:10:6:9"));
    EXPECT_EQ(TAVISchedDBListLastStatus(db_, Taken::take, &last), 2);
    EXPECT_THAT(last.rows, ElementsAre(running, gone));
    EXPECT_EQ(TAVISchedDBListStatus(db_, -1, Taken::take, &first), 1);
    EXPECT_THAT(first.rows, ElementsAre(running));
    EXPECT_EQ(TAVISchedDBListStatus(db_, 7, Taken::take, &none), 0);
    EXPECT_THAT(logs(), IsEmpty());
}

// It is neither followed nor believed, and readers make nothing.
TEST_F(StatusDatabase, WhatOthersPutThere) {
    const struct {
        const char *found;
        int reading;             // its answer
        const char *rows = "9 "; // when a writer has added one
    } cases[] = {{":", 0},
                 {"install -m 600 /dev/null $d", 0}, // the first runner is about to fill it
                 {"ln -s victim $d; ln -s victim $d-journal; ln -s victim $d-wal", -1},
                 {"cp other $d; chmod 666 $d", -1},
                 {"cp other $d; chown 4242 $d || chmod 666 $d", -1},
                 {"mkdir -p $d/in; ln -s /tmp/keep $d/in/link", -1}, // a folder, full
                 {"ln victim $d", -1},                               // a second name
                 {"cp other $d; ln -s victim $d-journal; ln -s victim $d-wal", 1, "1 9 "}};
    addRow("a", 1);
    EXPECT_EQ(TAVISchedDBClose(db_), 0);
    shell("cd /tmp; mv sched_status.sqlite other; echo safe > victim; mkdir -p keep/it");
    for (const auto &[found, reading, rows] : cases) {
        SCOPED_TRACE(found);
        shell(std::string("cd /tmp; d=sched_status.sqlite; rm -rf $d*; ") + found +
              "; ls > before");
        EXPECT_EQ(TAVISchedDBOpenForReading(&db_), reading);
        if (reading == 1) {
            EXPECT_EQ(TAVISchedDBListStatus(db_, 5, Taken::take, nullptr), 0);
            EXPECT_EQ(TAVISchedDBClose(db_), 0);
            EXPECT_EQ(statusOf("/tmp/sched_status.sqlite-wal").st_mode, S_IFREG | 0600U);
        } else {
            EXPECT_EQ(shell("cd /tmp; ls | cmp - before"), 0);
        }
        EXPECT_EQ(query("INSERT INTO task_status (pid, timestamp, task_id, status_code) VALUES "
                        "(1, 1, 9, 3); SELECT task_id FROM task_status"),
                  rows);
        EXPECT_EQ(readFile("/tmp/victim"), "safe\n");
        // The journal stays when it is done: its name is never free.
        for (const char *const name : {kDatabase, "/tmp/sched_status.sqlite-journal"}) {
            EXPECT_EQ(statusOf(name).st_mode, S_IFREG | 0600U) << name;
        }
        EXPECT_EQ(shell("test -d /tmp/keep/it && ! ls -d /tmp/sched_status.sqlite.*"), 0);
    }
    EXPECT_THAT(logs(),
                ElementsAre(HasSubstr("Can't open database: it is a link\n"),
                            HasSubstr("everybody may write it"),
                            testing::AnyOf(HasSubstr("another user"), HasSubstr("everybody")),
                            HasSubstr("no regular file"), HasSubstr("a second name")));
    db_ = nullptr;
}

TEST_F(StatusDatabase, ALockIsWaitedForAHundredTimes) {
    sqlite3 *other = nullptr;
    sqlite3_open(kDatabase, &other);
    sqlite3_exec(other, "BEGIN EXCLUSIVE", nullptr, nullptr, nullptr);
    srand(1);
    EXPECT_EQ(TAVISchedDBSetStatus(db_, 1, 0, 3, nullptr), -1);
    auto waits = pauses();
    EXPECT_EQ(waits.size(), 100U);
    // Wrapped products, negative remainders and sums included.
    waits.resize(6);
    EXPECT_THAT(waits, ElementsAre(785408, 999999, 999999, 999999, 999999, 824832));
    EXPECT_THAT(logs(), ElementsAre(HasSubstr("SET status_code=3 WHERE status_id=1] error: "
                                              "database is locked\n")));
    EXPECT_EQ(TAVISchedDBInit(), nullptr); // the table cannot be made
    sqlite3_close(other);
    query("DROP TABLE task_status");
    pauses();
    EXPECT_EQ(TAVISchedDBSetStatus(db_, 1, 0, 3, nullptr), -1);
    EXPECT_THAT(pauses(), IsEmpty());
    EXPECT_THAT(lastLog(), HasSubstr("error: no such table: task_status\n"));
    int code = 0;
    TAVI_SCHED_STATUS status{};
    for (const int result :
         {TAVISchedDBAddRecord(db_, newTask().get(), &code),
          TAVISchedDBGetStatusByTaskID(db_, 1, nullptr, &code, nullptr, 0),
          TAVISchedDBGetStatusByStatusID(db_, 1, &code, nullptr, 0),
          TAVISchedDBIsTaskRunning(db_, 1, &status), TAVISchedDBIsAppRunning(db_, "a", &status),
          TAVISchedDBListStatus(db_, 1, Taken::take, nullptr),
          TAVISchedDBListLastStatus(db_, Taken::take, nullptr)}) {
        EXPECT_EQ(result, -1);
    }
}

// Runners that start together on a fresh machine do not trip over each other's first files.
TEST_F(StatusDatabase, ManyMayOpenItFirst) {
    sqlite3_close(db_);
    db_ = nullptr;
    fakes.pauseMicroseconds =
        20000; // without, a hundred are over while the lock's holder waits for a core
    for (int round = 0; round < 20; ++round) {
        shell("rm -f /tmp/sched_status.sqlite*");
        std::vector<pid_t> openers(8);
        for (pid_t &opener : openers) {
            opener = start([] { return TAVISchedDBInit() ? 0 : 1; });
        }
        for (const pid_t opener : openers) {
            EXPECT_EQ(exitOf(opener), 0);
        }
    }
    EXPECT_THAT(logs(), IsEmpty());
}

} // namespace
