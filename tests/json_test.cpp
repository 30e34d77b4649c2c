// Tasks as JSON text.
#include "support.h"

#include <regex>

namespace {

using namespace support;

class Json : public SchedTest {
  protected:
    std::string rendered(int id) {
        EXPECT_EQ(TAVISchedTaskConvertToJsonById(id, buffer_.data(), buffer_.size()), 0);
        return buffer_.c_str();
    }
    static std::string replaced(const std::string &text, const char *from, const char *to) {
        const std::string result = std::regex_replace(text, std::regex(from), to);
        EXPECT_NE(result, text) << from;
        return result;
    }

    std::string buffer_ = std::string(163840, '\0');
};

TEST_F(Json, RoundTripOverwritesAndAnotherNameCreates) {
    Task task = newTask("echo \"1\"\necho 2");
    TAVISchedCTaskSetName(task.get(), "back\"up \xc3\xa9");
    TAVISchedCTaskSetAppArgs(task.get(), R"({"a": "b\n"})");
    TAVISchedCTaskSetAction(task.get(), "\xec\x9b\"1"); // a character that is cut off
    ASSERT_EQ(TAVISchedTaskCreate(task.get()), 0);
    const std::string json = rendered(1);
    EXPECT_THAT(json, HasSubstr(R"("action":"\"\\ufffd\\ufffd\\\"1\"\n")"));
    EXPECT_THAT(json, HasSubstr(R"("type":"\"daily\"\n")"));
    EXPECT_THAT(json, HasSubstr(R"("cmd":"\"ZWNobyAiMSIKZWNobyAy\"\n")"));
    EXPECT_EQ(json.back(), '\n');

    const std::string later = replaced(json, R"("run hour":"\\"0)", R"("run hour":"\"9)");
    EXPECT_EQ(TAVISchedTaskSaveFromJson(later.c_str(), 0), 1);
    EXPECT_EQ(TAVISchedTaskGetByID(1, task.get()), 0);
    EXPECT_EQ(task->runHour, 9U);
    EXPECT_STREQ(task->name, "back\"up \xc3\xa9");
    EXPECT_STREQ(task->command, "echo \"1\"\necho 2");
    EXPECT_STREQ(task->appArgs, R"({"a": "b\n"})");

    const std::string otherApp = replaced(json, R"("app":"\\"\\")", R"("app":"\"X\")");
    EXPECT_EQ(TAVISchedTaskSaveFromJson(replaced(json, "back", "push").c_str(), 0), 2);
    EXPECT_EQ(TAVISchedTaskSaveFromJson(otherApp.c_str(), 0), 3);
    EXPECT_EQ(TAVISchedTaskSaveFromJson(json.c_str(), 1), 4);
    EXPECT_EQ(TAVISchedTaskSaveFromJson("{}", 0), -1);
    EXPECT_THAT(listedIds(), ElementsAre(1, 2, 3, 4));
    EXPECT_THAT(readFile(kCrontab), HasSubstr("0\t9\t*\t*\t*\troot\t/tmp/tavischedtask"));
}

TEST_F(Json, BufferIsCheckedAndALongTextIsCut) {
    Task task = storedTask();
    EXPECT_EQ(TAVISchedTaskConvertToJson(task.get(), buffer_.data(), 40959), -1);
    EXPECT_EQ(TAVISchedTaskConvertToJsonById(-1, buffer_.data(), 40960), -1);
    TAVISchedCTaskSetAppArgs(task.get(), std::string(8191, '"').c_str());
    TAVISchedCTaskSetCommand(task.get(), std::string(12285, 'x').c_str());
    EXPECT_EQ(TAVISchedTaskConvertToJson(task.get(), buffer_.data(), 40960), 0);
    EXPECT_EQ(std::string(buffer_.c_str()).size(), 40959U);
}

TEST_F(Json, BadTextsStoreNothing) {
    const std::string deep(100000, '[');
    storedTask();
    const std::string good = rendered(1);
    const std::string stored = readFile(kPersistent);
    const auto expectRefused = [](const std::string &json, const std::string &message) {
        EXPECT_EQ(TAVISchedTaskSaveFromJson(json.c_str(), 1), -1);
        EXPECT_EQ(lastLog(), "sched_task_save_from_json_string.cpp:* " + message);
    };
    const auto shown = [](const std::string &text) { // whole up to 64 KiB
        const size_t more = text.size() - std::min<size_t>(text.size(), 65536);
        return text.substr(0, 65536) +
               (more > 0 ? " [... " + std::to_string(more) + " bytes more]" : "");
    };
    for (const std::string &json : std::vector<std::string>{
             "[]", "\"x\"", "null", "{\"id\":", "{\"id\":7}", "{\"id\":{}}", "{\"id\":\"[1]\"}",
             "{\"i\\u0000d\":\"7\"}", deep, deep.substr(0, 65536), "{\"id\":\"" + deep + "\"}",
             std::string(10 << 20, '!')}) {
        expectRefused(json, "parse json failed, szJson=" + shown(json));
    }
    expectRefused("", "Bad parameter");
    expectRefused(replaced(good, "\"cmd\"", "\"cmx\""), "hash to task failed, task id=1");
    expectRefused(replaced(good, R"("owner":"\\"0)", R"("owner":"\"0x)"),
                  "hash to task failed, task id=1");
    EXPECT_EQ(readFile(kPersistent), stored);
}

} // namespace
