// Listing all stored tasks: time and memory. The file is new to the process in every iteration, and
// the list is freed outside the time, so that every list begins with the same heap.
#include "bench_support.h"

#include <cstdlib>
#include <fstream>
#include <malloc.h>
#include <map>
#include <string_view>
#include <unistd.h>

namespace {

// Splits the pairs of the section at the front off the text. The keys stand in the map's order.
std::map<std::string, std::string> splitSection(std::string_view &text) {
    std::map<std::string, std::string> pairs;
    text.remove_prefix(text.find('\n') + 1);
    while (!text.empty() && text.front() != '[') {
        const size_t end = text.find('\n');
        const size_t equals = text.find('=');
        pairs.emplace_hint(pairs.end(), text.substr(0, equals),
                           text.substr(equals + 1, end - equals - 1));
        text.remove_prefix(end + 1);
    }
    return pairs;
}

// Reads the file once, splits each section into a map of its pairs, and has one zeroed record and
// the libc calls of a next trigger time for each; not the look-up of sections and keys, the
// conversion of values, the filling of records, nor the checks of the file's owner and times.
void readAndSplit(TAVI_SCHED_TASK **tasks) {
    const std::string content = bench::readFile(bench::kWorkingCopy);
    for (std::string_view text = content; !text.empty();) {
        benchmark::DoNotOptimize(splitSection(text).size());
        auto *task = static_cast<TAVI_SCHED_TASK *>(std::calloc(1, sizeof(TAVI_SCHED_TASK)));
        bench::require(task, "calloc");
        task->next = *tasks;
        *tasks = task;
        bench::callLibcDates();
    }
}

void listGet(TAVI_SCHED_TASK **tasks) {
    bench::require(TAVISchedTaskListGet(tasks, nullptr) > 0, "TAVISchedTaskListGet");
}

// Runs one list under a side of the comparison, which times it. Every list has its memory from the
// kernel, as the first of a process has: most of its time is that.
template <typename Side, typename List> void timeList(Side &&side, List &&list) {
    bench::makeWorkingCopyNew();
    malloc_trim(0);
    TAVI_SCHED_TASK *tasks = nullptr;
    side([&] { list(&tasks); });
    TAVISchedTaskListFree(&tasks);
}

void listOfThousand(benchmark::State &state) {
    bench::storeTasks(1000);
    bench::Comparison comparison;
    for (auto _ : state) {
        timeList([&](auto work) { comparison.product(work); }, listGet);
        timeList([&](auto work) { comparison.reference(work); }, readAndSplit);
    }
    comparison.reportTo(state, "list of 1,000 tasks, to reading and splitting them", 2.0);
}

void listOfTenThousand(benchmark::State &state) {
    bench::Comparison comparison;
    for (auto _ : state) {
        bench::storeTasks(10000);
        timeList([&](auto work) { comparison.product(work); }, listGet);
        bench::storeTasks(1000);
        timeList([&](auto work) { comparison.reference(work); }, listGet);
    }
    comparison.reportTo(state, "list of 10,000 tasks, to 1,000", 12.0);
}

long residentBytes() {
    long size = 0;
    long resident = 0;
    std::ifstream("/proc/self/statm") >> size >> resident;
    return resident * sysconf(_SC_PAGESIZE);
}

// The growth of resident memory by the list and all that comes with it: storing the tasks leaves
// nothing of them in the process.
void listMemory(benchmark::State &state) {
    bench::storeTasks(1000);
    bench::makeWorkingCopyNew();
    malloc_trim(0);
    const long before = residentBytes();
    TAVI_SCHED_TASK *tasks = nullptr;
    for (auto _ : state) {
        listGet(&tasks);
    }
    const auto growth = static_cast<double>(residentBytes() - before);
    TAVISchedTaskListFree(&tasks);
    bench::report(state, "memory of a list of 1,000 tasks, to 1,000 records",
                  growth / (1000.0 * sizeof(TAVI_SCHED_TASK)), 1.05);
}

BENCHMARK(listMemory)->Iterations(1);
BENCHMARK(listOfThousand)->Iterations(30);
BENCHMARK(listOfTenThousand)->Iterations(7);

} // namespace
