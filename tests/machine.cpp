// A machine's task files as a whole.
#include "machine.h"

#include <chrono>
#include <cstdlib>
#include <numeric>
#include <set>
#include <sstream>

namespace support {

namespace {

namespace fs = std::filesystem;

std::vector<std::string> entriesOf(const char *folder) {
    std::vector<std::string> paths;
    for (const auto &entry : fs::directory_iterator(folder)) {
        paths.push_back(entry.path());
    }
    return paths;
}

std::vector<std::string> filesOfTasksAndRuns() {
    std::vector<std::string> paths = entriesOf("/var/lib/tavischeduler");
    for (const std::string path :
         {kWorking, kPersistent, kPower, kCrontab, "/tmp/sched_status.sqlite"}) {
        paths.push_back(path);
    }
    std::erase_if(paths, [](const std::string &path) { return !fs::is_regular_file(path); });
    return paths;
}

std::string sortedLines(const std::string &text) {
    std::istringstream stream(text);
    std::multiset<std::string> lines;
    for (std::string line; std::getline(stream, line);) {
        lines.insert(line + "\n");
    }
    return std::accumulate(lines.begin(), lines.end(), std::string());
}

} // namespace

TAVI_SCHED_RUN_FILTER ofTask(int32_t id) {
    return {.taskId = id, .failedOnly = 0, .newestOnly = 0, .limit = 0, .since = 0};
}

std::vector<TAVI_SCHED_RUN> runs(TAVI_SCHED_RUN_FILTER filter) {
    std::vector<TAVI_SCHED_RUN> found;
    const auto add = [](void *context, const TAVI_SCHED_RUN *run) {
        static_cast<std::vector<TAVI_SCHED_RUN> *>(context)->push_back(*run);
        return 0;
    };
    const int count = TAVISchedRunList(&filter, add, &found);
    EXPECT_EQ(count, static_cast<int>(found.size()));
    return found;
}

State stateNow(const std::string &list) {
    State state = {{"list", list}};
    for (const char *const path : {kWorking, kPersistent, kPower, kCrontab}) {
        state[path] = fs::exists(path) ? readFile(path) : "(none)";
    }
    state[kCrontab] = sortedLines(state[kCrontab]);
    return state;
}

std::vector<std::string> leftovers() {
    const std::string known =
        " /tmp/tavischedtask /tmp/scheduled_tasks /usr/tavi/etc/scheduled_tasks "
        "/usr/tavi/etc/auto_power /usr/tavi/etc/scheduled_tasks.lock "
        "/usr/tavi/etc/scheduled_tasks.reading /tmp/lock /tmp/sched_status.sqlite "
        "/tmp/sched_status.sqlite-journal /tmp/sched_status.sqlite-wal ";
    std::vector<std::string> found;
    for (const char *const folder : {"/tmp", "/usr/tavi/etc", "/etc"}) {
        for (const std::string &path : entriesOf(folder)) {
            const bool isMine = folder != std::string("/etc") || path.starts_with("/etc/crontab.");
            if (isMine && known.find(" " + path + " ") == std::string::npos) {
                found.push_back(path);
            }
        }
    }
    return found;
}

Snapshot::Snapshot() {
    for (const std::string &path : filesOfTasksAndRuns()) {
        files_[path] = {readFile(path), fs::last_write_time(path)};
    }
}

void Snapshot::restore() const {
    for (const std::string &path : leftovers()) {
        fs::remove_all(path);
    }
    fs::remove_all("/var/lib/tavischeduler/output");
    for (const std::string &path : filesOfTasksAndRuns()) {
        if (!files_.contains(path)) {
            unlink(path.c_str());
        }
    }
    for (const auto &[path, file] : files_) {
        writeFile(path, file.first);
        fs::last_write_time(path, file.second);
    }
    // A new crontab is later than the old one: with the same calls whatever the second is.
    fs::last_write_time(kCrontab, fs::file_time_type::clock::now() + std::chrono::minutes(1));
}

void expectNone(std::string faults, const std::string &where) {
    for (const std::string &path : leftovers()) {
        faults += " left: " + path;
    }
    EXPECT_EQ(faults, "") << where << "\n" << testing::PrintToString(logs());
}

std::vector<size_t> chosen(const std::vector<size_t> &points, size_t most) {
    const size_t step = std::getenv("TAVI_TEST_ALL") ? 1 : (points.size() + most - 1) / most;
    std::vector<size_t> taken;
    for (size_t i = most > 1 ? 0 : step / 2; i < points.size(); i += step) {
        taken.push_back(points[i]);
    }
    return taken;
}

std::vector<size_t> upTo(size_t count) {
    std::vector<size_t> numbers(count);
    std::iota(numbers.begin(), numbers.end(), 1);
    return numbers;
}

std::string listOfFreshProcess() {
    const std::string path = "/home/list"; // where there is room
    const int status = inChild([&] {
        TAVI_SCHED_TASK *list = nullptr;
        std::multiset<std::string> rows;
        if (TAVISchedTaskListGet(&list, nullptr) < 0) {
            rows.insert("failed");
        }
        for (const TAVI_SCHED_TASK *task = list; task; task = TAVISchedTaskNext(task)) {
            rows.insert(std::to_string(task->id) + " " + task->name + " " + task->command + "; ");
        }
        writeFile(path, std::accumulate(rows.begin(), rows.end(), std::string()));
        return 0;
    });
    return status == 0 ? readFile(path) : "crashed";
}

int created(const char *name, const char *command) {
    const Task task = newTask(command);
    TAVISchedCTaskSetName(task.get(), name);
    return task && TAVISchedTaskCreate(task.get()) == 0 ? 0 : 1;
}

int edited(const char *name, const char *command) {
    TAVI_SCHED_TASK task{};
    if (TAVISchedTaskGetByID(2, &task) != 0) {
        return 1;
    }
    TAVISchedCTaskSetName(&task, name);
    TAVISchedCTaskSetCommand(&task, command);
    task.runHour = 7;
    return TAVISchedTaskEdit(&task) == 0 ? 0 : 1;
}

int powerCreated(int hour) {
    const Task task = powerTask("poweroff", hour);
    return task && TAVISchedTaskCreate(task.get()) == 0 ? 0 : 1;
}

} // namespace support
