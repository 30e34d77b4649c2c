// What the fuzz targets share: a small machine inside the sandbox, whose files are in memory, and
// on which no program is started, nothing is logged and nobody waits; and what must hold.
#pragma once

#include "files.h"
#include "platc.h"
#include "tavischeduler.h"
#include "tavisdk.h"

#include <cstdint>
#include <ctime>
#include <functional>
#include <map>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

// Ends with the condition and its line when it does not hold; the fuzzer then keeps the input.
#define REQUIRE(condition)                                                                         \
    ((condition) ? static_cast<void>(0) : fuzz::fail(#condition, __FILE__, __LINE__))

namespace fuzz {

[[noreturn]] void fail(const char *condition, const char *file, int line);

constexpr const char *kWorking = "/tmp/scheduled_tasks";
constexpr const char *kPersistent = "/usr/tavi/etc/scheduled_tasks";
constexpr const char *kCrontab = "/etc/crontab";
constexpr const char *kAutoPower = "/usr/tavi/etc/auto_power";
constexpr const char *kRunner = "/tmp/tavischedtask";

// What time() answers.
extern time_t now;

// Both task files.
void storeTasks(std::string_view content);

// The input: numbers from its front, then the rest as it is or up to its first NUL.
class Input {
  public:
    Input(const uint8_t *data, size_t size) : rest_(reinterpret_cast<const char *>(data), size) {}
    uint32_t number(size_t bytes);
    // For shortenReads; mostly 0, as many reads take time.
    size_t step();
    std::string rest() const { return std::string(rest_); }
    std::string text() const { return std::string(rest_.substr(0, rest_.find('\0'))); }

  private:
    std::string_view rest_;
};

// Every line with its line feed; the last may have none.
std::vector<std::string> linesOf(std::string_view text);

// A target's own: what must hold of this input.
void test(Input input);

using Pairs = std::map<std::string, std::string>;
using Hash = std::unique_ptr<PLATCSZHASH, decltype(&PLATCSzHashFree)>;
using List = std::unique_ptr<PLATCSZLIST, decltype(&PLATCSzListFree)>;
using Task = std::unique_ptr<TAVI_SCHED_TASK>;

Hash hashOf(const Pairs &pairs);
Pairs pairsOf(PLATCSZHASH *hash);
List newList();
std::vector<std::string> textsOf(const PLATCSZLIST *list);
// All zeros; the library would look for a free id.
Task newTask();
// The stored form.
Pairs formOf(const TAVI_SCHED_TASK &task);
// The task's line of the crontab is made, and that of a sound one is taken by cron.
void requireLine(const TAVI_SCHED_TASK &task, bool isSound);
// Calls the function with each task and answers how many the library has told of.
int listTasks(const std::function<void(const TAVI_SCHED_TASK &)> &onTask);

} // namespace fuzz
