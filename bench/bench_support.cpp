// Stored tasks and reports for the benchmarks, and their main function.
#include "bench_support.h"

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fcntl.h>
#include <fstream>
#include <sys/stat.h>
#include <unistd.h>

void bench::require(bool condition, const char *what) {
    if (!condition) {
        std::fprintf(stderr, "benchmark: %s failed\n", what);
        _exit(1);
    }
}

std::string bench::readFile(const char *path) {
    const int fd = open(path, O_RDONLY | O_CLOEXEC);
    struct stat status {};
    require(fd != -1 && fstat(fd, &status) == 0, path);
    std::string text(static_cast<size_t>(status.st_size), '\0');
    require(read(fd, text.data(), text.size()) == status.st_size && close(fd) == 0, path);
    return text;
}

void bench::writeFile(const char *path, const std::string &text) {
    std::ofstream file(path, std::ios::binary);
    file << text << std::flush;
    require(file.good(), path);
}

double bench::privateKilobytes(int pid) {
    std::ifstream map("/proc/" + std::to_string(pid) + "/smaps_rollup");
    double kilobytes = 0;
    for (std::string key; map >> key;) {
        double value = 0;
        if ((key == "Private_Clean:" || key == "Private_Dirty:") && map >> value) {
            kilobytes += value;
        }
    }
    require(kilobytes > 0, "smaps_rollup");
    return kilobytes;
}

namespace {

// The section that the library itself writes for a task with id 1.
std::string templateSection(const char *command) {
    unlink(bench::kWorkingCopy);
    unlink(bench::kPersistent);
    TAVI_SCHED_TASK *task = TAVISchedTaskAlloc();
    bench::require(task, "TAVISchedTaskAlloc");
    TAVISchedCTaskSetApp(task, "TAVI.SDS.Backup.Application");
    TAVISchedCTaskSetAction(task, "Back up the photo share");
    TAVISchedCTaskSetCommand(task, command);
    bench::require(TAVISchedTaskCreate(task) == 0 && task->id == 1, "TAVISchedTaskCreate");
    TAVISchedTaskFree(task);
    return bench::readFile(bench::kPersistent);
}

double medianOf(std::vector<double> &times) {
    const auto middle = times.begin() + static_cast<std::ptrdiff_t>(times.size() / 2);
    std::nth_element(times.begin(), middle, times.end());
    return *middle;
}

} // namespace

void bench::storeTasks(int count, const char *command) {
    const std::string section = templateSection(command);
    const size_t idAt = section.find("\nid=1\n");
    require(section.starts_with("[1]\n") && idAt != std::string::npos, "finding the id");
    const std::string beforeId = section.substr(2, idAt + 4 - 2);
    const std::string afterId = section.substr(idAt + 5);
    std::string text;
    for (int i = 1; i <= count; ++i) {
        const std::string id = std::to_string(i);
        text.append("[").append(id).append(beforeId).append(id).append(afterId);
    }
    writeFile(kPersistent, text);
    writeFile(kWorkingCopy, text);
}

void bench::makeWorkingCopyNew() {
    require(utimensat(AT_FDCWD, kWorkingCopy, nullptr, 0) == 0, "utimensat");
    usleep(20000); // longer than a tick of the kernel's file clock
}

void bench::report(benchmark::State &state, const char *what, double ratio, double aim) {
    state.SetLabel(what);
    state.counters["ratio"] = ratio;
    state.counters["aim"] = aim;
}

void bench::Comparison::reportTo(benchmark::State &state, const char *what, double aim) {
    const double product = medianOf(product_);
    const double reference = medianOf(reference_);
    state.counters["product_us"] = product;
    state.counters["reference_us"] = reference;
    report(state, what, product / reference, aim);
}

int main(int argc, char **argv) {
    const char *sandbox = std::getenv("TAVI_SANDBOX");
    bench::require(sandbox && std::strcmp(sandbox, "inside") == 0,
                   "this program writes /etc and /tmp: starting it through scripts/sandbox");
    umask(022);
    benchmark::Initialize(&argc, argv);
    if (benchmark::ReportUnrecognizedArguments(argc, argv)) {
        return 1;
    }
    benchmark::RunSpecifiedBenchmarks();
    return 0;
}
