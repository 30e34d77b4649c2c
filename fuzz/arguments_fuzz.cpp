// The command line of tavisched, an argument a line: parsed and turned into a task, with the
// commands' own work left out. A task that it makes is sound, and what it says can go to a
// terminal.
#include "commands/commands.h"
#include "failure.h"
#include "fuzz.h"
#include "tasks/tasks.h"
#include "text/utf8.h"
#include "text/words.h"
#include "waiting.h"

#include <cstdio>
#include <cstdlib>
#include <iostream>
#include <utility>

int runTavisched(int argc, char **argv);

namespace tavisched {

namespace {

int change(Task task, const TaskOptions &options) {
    const bool wasSound = !findFault(*task);
    apply(options, *task);
    REQUIRE(!wasSound || !findFault(*task));
    const std::string words = scheduleInWords(*task);
    REQUIRE(words == printable(words));
    return 0;
}

} // namespace

void tellOfWaiting() {}

const std::vector<std::string> &sortFields() {
    static const std::vector<std::string> fields = {"id", "name"};
    return fields;
}

int list(const ListOptions &options) {
    REQUIRE(options.sort == "id" || options.sort == "name");
    return 0;
}
int show(int32_t, bool) {
    return 0;
}
int history(const HistoryOptions &options) {
    REQUIRE(options.limit >= 0 && options.limit <= 1000000);
    return 0;
}
int log(int32_t, std::optional<int64_t>, bool) {
    return 0;
}
int exportTasks(const Ids &, bool) {
    return 0;
}
int add(const TaskOptions &options, const Manner &) {
    return change(
        newTask(options.power ? TAVI_SCHED_BACKEND_AUTOPOWER : TAVI_SCHED_BACKEND_SCHEDULE),
        options);
}
// Of a task that repeats, on a date that has passed.
int edit(int32_t, const TaskOptions &options, const Manner &) {
    Task task = newTask(TAVI_SCHED_BACKEND_SCHEDULE);
    task->repeatHour = 4;
    task->lastWorkHour = 20;
    TAVISchedCTaskSetOnce(task.get());
    task->startYear = 2020;
    task->startMonth = task->startDay = 2;
    return change(std::move(task), options);
}
int setEnabled(const Ids &ids, bool) {
    REQUIRE(!ids.empty());
    return 0;
}
int removeTasks(const Ids &ids, bool) {
    REQUIRE(!ids.empty());
    return 0;
}
int importTasks(const ImportOptions &options) {
    REQUIRE(!options.file.empty() || !options.replace || !options.dryRun);
    return 0;
}
int run(const Ids &, const RunOptions &) {
    return 0;
}
int next(const NextOptions &) {
    return 0;
}
int calendar(const CalendarOptions &) {
    return 0;
}
int stop(const Ids &ids, int graceSeconds) {
    REQUIRE(!ids.empty() && graceSeconds >= 0 && graceSeconds <= 86400);
    return 0;
}
int syncTasks() {
    return 0;
}
int check(bool, bool) {
    return 0;
}
int completeIds() {
    return 0;
}

} // namespace tavisched

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size) {
    std::vector<std::string> lines = fuzz::linesOf(fuzz::Input(data, size).text());
    std::vector<char *> arguments = {const_cast<char *>("tavisched")};
    for (std::string &line : lines) {
        if (line.back() == '\n') {
            line.pop_back();
        }
        arguments.push_back(line.data());
    }
    arguments.push_back(nullptr);

    char *said = nullptr;
    size_t length = 0;
    FILE *const standard = stderr;
    stderr = open_memstream(&said, &length);
    std::cout.setstate(std::ios::failbit); // no help
    const int status = runTavisched(static_cast<int>(arguments.size()) - 1, arguments.data());
    std::fclose(std::exchange(stderr, standard));
    setenv("TZ", "UTC", 1);
    const std::string text = said;
    std::free(said);
    REQUIRE(status >= 0 && status <= 2);
    REQUIRE((status == 0) == text.empty());
    REQUIRE(text == tavisched::printableLines(text));
    return 0;
}
