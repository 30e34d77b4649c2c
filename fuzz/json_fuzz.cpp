// JSON text through save: what is stored comes back, and what is refused leaves everything as it
// was.
#include "fuzz.h"
#include "json/json.h"

#include <algorithm>

namespace {

// Two tasks; the first has the default schedule, as what is saved over it begins with that.
constexpr const char *kStored =
    "[1]\naction=\napp=a\napp name=\ncmd=dHJ1ZQ==\nid=1\nname=n\nrun hour=0\nrun min=0\n"
    "state=enabled\ntype=daily\n"
    "[3]\naction=\napp=\napp name=\ncmd=\nid=3\nname=m\nrun hour=23\nrun min=59\n"
    "state=disabled\ntype=weekly\nweek=0000001\n";

std::string jsonOf(int32_t id) {
    static std::string text(160 * 1024, '\0');
    REQUIRE(TAVISchedTaskConvertToJsonById(id, text.data(), text.size()) == 0);
    return text.c_str();
}

int count() {
    return fuzz::listTasks([](const TAVI_SCHED_TASK &) {});
}

// What the text gives a task, when nothing is wrong with it but line breaks.
fuzz::Pairs givenBy(const std::string &text) {
    fuzz::Pairs pairs;
    Json::Value root;
    if (tavisched::parseJson(text, false, root) || !root.isObject()) {
        return {};
    }
    for (const std::string &key : root.getMemberNames()) {
        Json::Value value;
        if (!root[key].isString() || tavisched::parseJson(root[key].asString(), true, value) ||
            !value.isString() || value.asString().find('\0') != std::string::npos) {
            return {};
        }
        pairs[key] = value.asString();
        std::replace(pairs[key].begin(), pairs[key].end(), '\n', ' ');
    }
    const bool isSound = TAVISchedHashCheck(fuzz::hashOf(pairs).get(), nullptr, 0) == 0;
    return isSound ? pairs : fuzz::Pairs();
}

constexpr int32_t kNextId = 2;

// A text that names one of the two tasks by id, application and name is that task's.
int32_t idFor(const fuzz::Pairs &given, bool create) {
    const auto isOf = [&](const char *id, const char *app, const char *name) {
        return !create && given.at("id") == id && given.at("app") == app &&
               given.at("name") == name;
    };
    return isOf("1", "a", "n") ? 1 : isOf("3", "", "m") ? 3 : kNextId;
}

void save(const std::string &text, bool create) {
    const int32_t id = TAVISchedTaskSaveFromJson(text.c_str(), create);
    const fuzz::Pairs given = givenBy(text);
    REQUIRE(id == (given.empty() ? id : idFor(given, create)));
    REQUIRE(text.size() % 4 != 0 || count() == (id == kNextId ? 3 : 2));
    if (id == -1) {
        return;
    }
    const fuzz::Task task = fuzz::newTask();
    REQUIRE(TAVISchedTaskGetByID(id, task.get()) == 0 && task->id == id);
    const fuzz::Pairs form = fuzz::formOf(*task);
    for (const auto &[key, value] : given) {
        REQUIRE(key == "id" || form.at(key) == value);
    }
    // Once more, it is the same task, but for U+FFFD, which takes more room than what it stands
    // for.
    const std::string stored = jsonOf(id);
    const int32_t again = TAVISchedTaskSaveFromJson(stored.c_str(), 0);
    REQUIRE(again != -1);
    REQUIRE((again == id && jsonOf(id) == stored) || stored.find("\\ufffd") != std::string::npos);
}

} // namespace

void fuzz::test(Input input) {
    const uint32_t mode = input.number(1);
    const std::string text = input.text();
    if (fuzz::contentOf(fuzz::kWorking) != kStored) {
        fuzz::storeTasks(kStored);
    }
    // Mostly within a batch that comes to nothing, as that writes no file.
    const bool isBatch = mode % 16 != 0;
    REQUIRE(!isBatch || TAVISchedChangeBegin() == 0);
    save(text, (mode & 0x80) != 0);
    REQUIRE(!isBatch || TAVISchedChangeRollback() == 0);
    REQUIRE(!isBatch || fuzz::contentOf(fuzz::kWorking) == kStored);
    const fuzz::Task task = fuzz::newTask();
    REQUIRE(!isBatch || (TAVISchedTaskGetByID(1, task.get()) == 0 && task->runHour == 0));
    REQUIRE(!isBatch || TAVISchedTaskGetByID(2, task.get()) == -1);
    REQUIRE(fuzz::contentOf(fuzz::kPersistent) == fuzz::contentOf(fuzz::kWorking));
}
