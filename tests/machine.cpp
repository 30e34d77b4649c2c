// A machine's task files as a whole.
#include "machine.h"

#include <algorithm>
#include <array>
#include <cstdio>
#include <cstdlib>
#include <fcntl.h>
#include <filesystem>
#include <numeric>
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

std::string sortedLines(const std::string &text) {
    std::vector<std::string> lines;
    std::istringstream stream(text);
    for (std::string line; std::getline(stream, line);) {
        lines.push_back(line);
    }
    std::sort(lines.begin(), lines.end());
    std::string sorted;
    for (const std::string &line : lines) {
        sorted += line + "\n";
    }
    return sorted;
}

} // namespace

State stateNow() {
    State state;
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

namespace {

std::vector<std::string> filesOfTasksAndRuns() {
    std::vector<std::string> paths = entriesOf("/var/lib/tavischeduler");
    for (const std::string path : {kWorking, kPersistent, kPower, kCrontab, kStatus}) {
        paths.push_back(path);
    }
    std::erase_if(paths, [](const std::string &path) { return !fs::is_regular_file(path); });
    return paths;
}

} // namespace

Snapshot::Snapshot() {
    for (const std::string &path : filesOfTasksAndRuns()) {
        files_[path] = {readFile(path), statusOf(path.c_str()).st_mtim};
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
        writeFile(path, file.content);
        const std::array<timespec, 2> times = {file.time, file.time};
        utimensat(AT_FDCWD, path.c_str(), times.data(), 0);
    }
    // A new crontab is later than the old one: with the same calls whatever the second is.
    const std::array<timespec, 2> later = {
        {{.tv_sec = 0, .tv_nsec = UTIME_OMIT}, {.tv_sec = time(nullptr) + 60, .tv_nsec = 0}}};
    utimensat(AT_FDCWD, kCrontab, later.data(), 0);
}

Tally::~Tally() {
    std::printf("%s: %zu tried, %zu held\n", what_.c_str(), tried_, held_);
    EXPECT_EQ(tried_, held_);
}

void Tally::add(const std::string &where, std::string fault) {
    for (const std::string &path : leftovers()) {
        fault += " left: " + path;
    }
    const auto lines = logs();
    ++tried_;
    held_ += fault.empty() ? 1 : 0;
    if (!fault.empty() && tried_ - held_ <= 5) {
        ADD_FAILURE() << what_ << ", " << where << ": " << fault << "\n"
                      << testing::PrintToString(lines);
    }
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
    std::array<int, 2> ends{};
    if (pipe(ends.data()) != 0) {
        return "no pipe";
    }
    const pid_t pid = fork();
    if (pid == 0) {
        TAVI_SCHED_TASK *list = nullptr;
        std::vector<std::string> rows;
        const bool listed = TAVISchedTaskListGet(&list, nullptr) >= 0;
        for (const TAVI_SCHED_TASK *task = list; task; task = TAVISchedTaskNext(task)) {
            rows.push_back(std::to_string(task->id) + " " + task->name + " " + task->command);
        }
        std::sort(rows.begin(), rows.end());
        std::string text = listed ? "" : "failed";
        for (const std::string &row : rows) {
            text += row + "; ";
        }
        _exit(write(ends[1], text.data(), text.size()) == static_cast<ssize_t>(text.size()) ? 0
                                                                                            : 1);
    }
    close(ends[1]);
    std::string text;
    std::array<char, 4096> buffer{};
    for (ssize_t count = 0; (count = read(ends[0], buffer.data(), buffer.size())) > 0;) {
        text.append(buffer.data(), static_cast<size_t>(count));
    }
    close(ends[0]);
    int status = -1;
    waitpid(pid, &status, 0);
    return status == 0 ? text : text + " (list: wait status " + std::to_string(status) + ")";
}

int created(const char *name, const char *command) {
    const Task task = newTask(command);
    if (!task) {
        return 1;
    }
    TAVISchedCTaskSetName(task.get(), name);
    return TAVISchedTaskCreate(task.get()) == 0 ? 0 : 1;
}

int edited(const char *name, const std::string &command) {
    TAVI_SCHED_TASK task{};
    if (TAVISchedTaskGetByID(2, &task) != 0) {
        return 1;
    }
    TAVISchedCTaskSetName(&task, name);
    task.runHour = 7;
    if (!command.empty()) {
        TAVISchedCTaskSetCommand(&task, command.c_str());
    }
    return TAVISchedTaskEdit(&task) == 0 ? 0 : 1;
}

int powerCreated(uint32_t hour) {
    const Task task = newTask();
    if (!task) {
        return 1;
    }
    task->backend = TAVI_SCHED_BACKEND_AUTOPOWER;
    {
        const OwnAllocations own;
        TAVISchedTaskGetDefault(task.get());
    }
    TAVISchedCTaskSetAppArgs(task.get(), "poweroff");
    task->runHour = hour;
    return TAVISchedTaskCreate(task.get()) == 0 ? 0 : 1;
}

} // namespace support
