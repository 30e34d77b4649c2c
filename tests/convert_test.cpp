// A task's hash form, and the list sort, which reads the same field table.
#include "support.h"

#include <cstring>
#include <sstream>
#include <utility>

namespace {

using namespace support;

class Convert : public SchedTest {
  protected:
    Convert() : hash_(PLATCSzHashAlloc(64)) {}
    ~Convert() override { PLATCSzHashFree(hash_); }

    // The texts of these keys, each followed by a semicolon.
    std::string values(const std::vector<const char *> &keys) {
        std::string result;
        for (const char *key : keys) {
            const char *const text = PLATCSzHashGetValue(hash_, key);
            result += (text ? text : "(none)") + std::string(";");
        }
        return result;
    }
    // Sets values from a text of the form "key=value;key=value;".
    void set(const std::string &text) {
        std::istringstream pairs(text);
        for (std::string key, value; getline(pairs, key, '=') && getline(pairs, value, ';');) {
            PLATCSzHashSetValue(&hash_, key.c_str(), value.c_str());
        }
    }
    void setRequired() {
        set("name=;app=;app name=;action=;cmd=;type=;id=0;run hour=0;run min=0;state=disabled;");
    }

    PLATCSZHASH *hash_;
};

TEST_F(Convert, HashHoldsEveryPersistentFieldOnOneLine) {
    Task task = newTask("echo 1\necho 2");
    TAVISchedCTaskSetName(task.get(), "a\nb");
    TAVISchedCTaskSetAppArgs(task.get(), "{\n}\n");
    task->owner = 4294967295;
    task->id = -5;
    set("left over=x;");
    EXPECT_EQ(TAVISchedInitHashFromTask(&hash_, task.get()), 0);
    EXPECT_EQ(values({"name", "app args", "owner", "id", "cmd", "type", "state"}),
              "a b;{ } ;4294967295;-5;ZWNobyAxCmVjaG8gMg==;daily;enabled;");
    EXPECT_EQ(values({"left over", "backend", "next trigger time"}), "(none);(none);(none);");
    TAVI_SCHED_TASK back{};
    EXPECT_EQ(TAVISchedInitTaskFromHash(hash_, &back), 0);
    EXPECT_STREQ(back.command, "echo 1\necho 2");
    EXPECT_EQ(back.owner, 4294967295);

    task->state = 5; // has no name, so its key is left out
    EXPECT_EQ(TAVISchedInitHashFromTask(&hash_, task.get()), 0);
    EXPECT_EQ(values({"state"}), "(none);");
    EXPECT_EQ(TAVISchedInitTaskFromHash(hash_, &back), -1);
    EXPECT_THAT(lastLog(), HasSubstr("Get hash value failed. key:[state]. [0x"));
}

TEST_F(Convert, TaskTakesDefaultsClampsNumbersAndIgnoresStrangers) {
    setRequired();
    set("backend=-3;next trigger time=now;can edit name=2x;type=hour;start month=;id=99999999999;");
    TAVI_SCHED_TASK task{};
    task.backend = -2;
    task.type = Monthly;
    EXPECT_EQ(TAVISchedInitTaskFromHash(hash_, &task), 0);
    EXPECT_EQ(task.backend, -2);
    EXPECT_STREQ(task.nextTriggerTime, "");
    EXPECT_EQ(TAVISchedInitHashFromTask(&hash_, &task), 0);
    EXPECT_EQ(values({"week", "edit dialog", "start year", "start month", "can edit name",
                      "can run task same time", "type", "id"}),
              "1111111;TAVI.VEX.TaskScheduler.EditDialog;2012;0;2;0;monthly;2147483647;");
    // A number that is no user's becomes nobody's, never root's or another's.
    for (const char *owner :
         {"-1", "4294967296", "-4294967296", "-18446744073709551615", "99999999999999999999"}) {
        set("owner=" + std::string(owner) + ";");
        EXPECT_EQ(TAVISchedInitTaskFromHash(hash_, &task), 0);
        EXPECT_EQ(task.owner, 4294967295) << owner;
    }
    EXPECT_THAT(logs(), IsEmpty());
}

// Whichever allocation fails: what comes of a conversion is whole, or it has failed.
TEST_F(Convert, WithoutMemory) {
    const Task task = newTask();
    ASSERT_EQ(TAVISchedInitHashFromTask(&hash_, task.get()), 0);
    const auto keys = [&] {
        PLATCSZLIST *list = PLATCSzListAlloc(64);
        const int count = PLATCSzHashEnumKey(hash_, &list);
        PLATCSzListFree(list);
        return count;
    };
    const int whole = keys();
    size_t failures = 0;
    for (bool failed = true; failed;) {
        PLATCSZHASH *const stored = std::exchange(hash_, nullptr);
        TAVI_SCHED_TASK back{};
        fail(Fault::Memory, ++failures);
        hash_ = PLATCSzHashAlloc(4);
        const bool made = hash_ && TAVISchedInitHashFromTask(&hash_, task.get()) == 0;
        const bool taken = TAVISchedInitTaskFromHash(stored, &back) == 0;
        failed = faults().calls[static_cast<size_t>(Fault::Memory)] >= failures;
        fail(Fault::None);
        EXPECT_EQ(made, hash_ && keys() == whole) << failures;
        EXPECT_EQ(taken, std::strcmp(back.command, task->command) == 0) << failures;
        PLATCSzHashFree(hash_);
        hash_ = stored;
    }
    EXPECT_GT(failures, 20U);
}

// The conversion is the judge: what has no fault comes back as it was, and nothing else does.
TEST_F(Convert, ChecksForeseeWhatComesBack) {
    constexpr int Value = TAVI_SCHED_FAULT_VALUE;
    constexpr int Unreadable = TAVI_SCHED_FAULT_UNREADABLE;
    const struct {
        std::string pairs;
        int kind;
        const char *key, *reason;
    } kCases[] = {
        {"", 0, "", ""},
        {"id=-2147483648;owner=4294967295;state=NotExisted;app args=\x1b;", 0, "", ""},
        {"id=007;", Value, "id", "\"007\" would be stored as \"7\""},
        {"id=-0;", Value, "id", "\"-0\" would be stored as \"0\""},
        {"id=99999999999;", Value, "id", "would be stored as \"2147483647\""},
        {"listable=x;", Value, "listable", "\"x\" would be stored as \"0\""},
        {"owner=-1;", Value, "owner", "\"-1\" would be stored as \"4294967295\""},
        {"owner=\x1b[2J\xff\u202e;", Unreadable, "owner",
         "\"\uFFFD[2J\uFFFD\uFFFD\" is no number that can be stored"},
        {"start year=2013x;", Unreadable, "start year", "is no number"},
        {"run min= 5;", Value, "run min", "\" 5\" would be stored as \"5\""},
        {"type=Daily;", Value, "type",
         "\"Daily\" would be stored as \"daily\"; accepted: once, daily, weekly, monthly, yearly"},
        {"state=on;", Value, "state", "stored as \"enabled\"; accepted: disabled, enabled"},
        {"week=12345678;", Value, "week", "8 bytes; accepted: at most 7"},
        {"name=a\nb;", Value, "name", "it holds a line break"},
        {"cmd=" + std::string(16380, 'e') + ";", 0, "", ""},
        {"cmd=" + std::string(16384, 'e') + ";", Unreadable, "cmd",
         "eeeeeeee…\" is not the base64 text "
         "of a command of at most 12285 bytes"},
        {"cmd=dHJ1ZQ=;", Unreadable, "cmd", "\"dHJ1ZQ=\" is not the base64"},
        {"cmd=dHJ1 ZQ==;", Unreadable, "cmd", "is not the base64"},
        {"cmd=YQBi;", Value, "cmd", "\"YQBi\" is not the base64"},
        {"typ=x;", TAVI_SCHED_FAULT_UNKNOWN_KEY, "typ", "no task has it; accepted: id, can edit"},
        {"backend=x;", TAVI_SCHED_FAULT_UNKNOWN_KEY, "backend", "no task has it"},
    };
    for (const auto &c : kCases) {
        SCOPED_TRACE(c.pairs.substr(0, 80));
        PLATCHashRemoveAll(hash_);
        setRequired();
        set("type=daily;" + c.pairs);
        TAVI_SCHED_FAULT faults[2] = {};
        EXPECT_EQ(TAVISchedHashCheck(hash_, faults, 2), c.kind == 0 ? 0 : 1);
        EXPECT_EQ(faults[0].kind, c.kind);
        EXPECT_STREQ(faults[0].key, c.key);
        EXPECT_THAT(faults[0].reason, HasSubstr(c.reason));
        const std::string key = c.pairs.substr(0, c.pairs.find('='));
        const std::string value = values({key.c_str()});
        TAVI_SCHED_FAULT fault{};
        EXPECT_EQ(
            TAVISchedValueCheck(key.c_str(), value.substr(0, value.size() - 1).c_str(), &fault),
            c.kind == 0 && !key.empty() ? 0 : 1);
        EXPECT_TRUE(key.empty() || std::string(fault.reason) == faults[0].reason);
        EXPECT_THAT(logs(), IsEmpty());

        Task task = newTask();
        EXPECT_EQ(failure(TAVISchedInitTaskFromHash(hash_, task.get())),
                  c.kind == Unreadable ? 0x4000U : 0U);
        EXPECT_EQ(TAVISchedInitHashFromTask(&hash_, task.get()), 0);
        EXPECT_TRUE((values({key.c_str()}) == value) == (c.kind == 0) || key.empty());
        // Cut at the field's end a text must fail: a shortened command must never run.
        const std::string failed = key == "cmd" ? "Base64 decoding failed. [" + value.substr(0, 4)
                                                : "].fnFromHashStr failed.";
        EXPECT_THAT(lastLog(), HasSubstr(c.kind == Unreadable ? failed : ""));
    }
    PLATCHashRemoveAll(hash_);
    set("id=x;zz=;aa=;");
    TAVI_SCHED_FAULT faults[12] = {};
    faults[3].kind = -1;
    EXPECT_EQ(TAVISchedHashCheck(hash_, faults, 3), 12);
    EXPECT_EQ(faults[3].kind, -1); // there was no room for it
    EXPECT_EQ(TAVISchedHashCheck(hash_, faults, 12), 12);
    EXPECT_STREQ(faults[1].key, "run hour");
    EXPECT_EQ(faults[1].kind, TAVI_SCHED_FAULT_MISSING);
    EXPECT_STREQ(faults[10].key, "aa");
    EXPECT_EQ(TAVISchedHashCheck(hash_, nullptr, 0), 12);
    EXPECT_EQ(failure(TAVISchedHashCheck(hash_, nullptr, 1)), 0x0D00U);
}

using Sort = SchedTest;

// Sorts three tasks that lie in memory in this order, listed back to front; their names.
std::string sorted(const char *key, int direction) {
    std::vector<TAVI_SCHED_TASK> tasks(3);
    const char *const names[] = {"b", "B", "b"};
    for (int i = 0; i < 3; ++i) {
        tasks[i].id = 10 - i;
        TAVISchedCTaskSetName(&tasks[i], names[i]);
        tasks[i].next = i == 0 ? nullptr : &tasks[i - 1];
    }
    TAVI_SCHED_TASK *list = &tasks[2];
    std::string order = TAVISchedTaskListSort(&list, key, direction) == 0 ? "" : "failed: ";
    for (const TAVI_SCHED_TASK *task = list; task; task = task->next) {
        order += std::to_string(task->id) + task->name + " ";
    }
    return order;
}

TEST_F(Sort, TextsByBytesStableAndNumbersByPlace) {
    EXPECT_EQ(sorted("name", 1), "9B 8b 10b ");
    EXPECT_EQ(sorted("name", 2), "10b 8b 9B ");
    for (const char *key : {"id", "owner", "type"}) {
        EXPECT_EQ(sorted(key, 1), "10b 9B 8b ") << key;
        EXPECT_EQ(sorted(key, 0), "8b 9B 10b ") << key;
    }
    EXPECT_EQ(sorted("Id", 1), "failed: 8b 9B 10b ");
    TAVI_SCHED_TASK *none = nullptr;
    EXPECT_EQ(TAVISchedTaskListSort(&none, "Id", 1), 0);
    EXPECT_THAT(logs(), IsEmpty());
    EXPECT_EQ(failure(TAVISchedTaskListSortEx(&none, 0, 1)), 0x0D00U);
}

TEST_F(Sort, OutOfMemoryLeavesTheListAlone) {
    faults().callocFails = 3 * sizeof(void *);
    EXPECT_EQ(sorted("name", 1), "failed: 8b 9B 10b ");
    EXPECT_EQ(PLATCErrGet(), 0x0100U);
    EXPECT_EQ(PLATCErrorGetLine(), 67);
    EXPECT_THAT(lastLog(true), HasSubstr("cpp:66 calloc [3] failed. Cannot allocate memory"));
}

} // namespace
