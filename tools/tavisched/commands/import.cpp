// The subcommand "import": stores the tasks of a JSON text, all or none. What becomes of each is
// decided first, so that it can be told without being done.
#include "json/import.h"
#include "commands/commands.h"
#include "failure.h"
#include "tasks/change.h"
#include "tasks/findings.h"
#include "tasks/report.h"
#include "text/utf8.h"

#include <cerrno>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <iostream>
#include <iterator>
#include <set>

namespace tavisched {

namespace {

enum class Fate { Create, CreateWithId, Replace, IsThere };

struct Planned {
    Imported imported;
    Fate fate;
    const TAVI_SCHED_TASK *present = nullptr; // that is replaced, or there
};

std::string readWhole(const std::string &file) {
    if (file == "-") {
        return {std::istreambuf_iterator<char>(std::cin), {}};
    }
    std::error_code ignored;
    std::ifstream stream(file, std::ios::binary);
    const int error = errno;
    if (!stream && error != ENOENT && error != ENOTDIR) {
        throw Failure(printable(file) + " cannot be read: " + std::strerror(error));
    }
    if (!stream || std::filesystem::is_directory(file, ignored)) {
        throw Refusal(printable(file) + " cannot be read; accepted: a file, or - for standard "
                                        "input");
    }
    return {std::istreambuf_iterator<char>(stream), {}};
}

// Decides one after the other: what an earlier one takes is not free for a later one.
class Plan {
  public:
    Plan(const Tasks &tasks, bool replaces) : tasks_(tasks), replaces_(replaces) {}

    Planned decide(Imported &&imported) {
        const TAVI_SCHED_TASK &task = *imported.task;
        if (isPower(task)) {
            requirePower(tasks_);
        }
        const TAVI_SCHED_TASK *const same = isPower(task) ? findSame(task) : nullptr;
        const TAVI_SCHED_TASK *const present = tasks_.find(task.id);
        Fate fate = Fate::Create;
        if (same) {
            fate = Fate::IsThere;
        } else if (!isPower(task) && task.id > 0 && taken_.insert(task.id).second) {
            const bool isSame =
                present && !isPower(*present) && std::string_view(present->name) == task.name;
            fate = !present              ? Fate::CreateWithId
                   : replaces_ && isSame ? Fate::Replace
                                         : Fate::Create;
        }
        power_.push_back(imported.task.get());
        return {std::move(imported), fate, same ? same : present};
    }

  private:
    // A schedule that is there already, or comes earlier, is as good as stored.
    const TAVI_SCHED_TASK *findSame(const TAVI_SCHED_TASK &task) const {
        const TAVI_SCHED_TASK *const earlier = findSameSchedule(power_, task);
        return earlier ? earlier : findSameSchedule(tasks_.all(), task);
    }

    const Tasks &tasks_;
    const bool replaces_;
    std::set<int32_t> taken_;
    TaskPointers power_;
};

std::vector<Planned> planAll(std::vector<Imported> &&imported, const Tasks &tasks, bool replaces) {
    Plan plan(tasks, replaces);
    std::vector<Planned> planned;
    planned.reserve(imported.size());
    for (Imported &each : imported) {
        planned.push_back(plan.decide(std::move(each)));
    }
    return planned;
}

// They come first, as what gets a new id would take theirs.
void storeThoseThatKeepTheirIds(Change &change, std::vector<Planned> &all) {
    for (Planned &planned : all) {
        if (planned.fate == Fate::CreateWithId && !change.createWithId(*planned.imported.task)) {
            planned.fate = Fate::Create; // a section that cannot be read has the id
        }
    }
}

void storeOther(Change &change, const Planned &planned) {
    TAVI_SCHED_TASK &task = *planned.imported.task;
    switch (planned.fate) {
    case Fate::Create:
        change.create(task);
        break;
    case Fate::CreateWithId:
        break;
    case Fate::Replace:
        change.edit(task, *planned.present);
        break;
    case Fate::IsThere:
        task.id = planned.present->id;
        break;
    }
}

std::string noteOf(const Planned &planned) {
    return planned.imported.note.empty() ? "" : "; " + planned.imported.note;
}

std::string toldBefore(const Planned &planned) {
    constexpr const char *kWords[] = {": would be stored under a new id", ": would be stored",
                                      ": would be overwritten", ": is there already"};
    return called(*planned.imported.task) + kWords[static_cast<size_t>(planned.fate)] +
           noteOf(planned);
}

std::string toldAfter(const Planned &planned, int32_t wanted) {
    const TAVI_SCHED_TASK &task = *planned.imported.task;
    const bool isOther = task.id != wanted && wanted > 0;
    return called(task) + (isOther ? ", was " + std::to_string(wanted) : "") +
           (planned.fate == Fate::Replace ? ": overwritten" : "") + noteOf(planned);
}

} // namespace

int importTasks(const ImportOptions &options) {
    const std::string text = readWhole(options.file);
    std::vector<std::string> lines;
    if (options.dryRun) {
        const Tasks tasks = Tasks::read();
        for (const Planned &planned : planAll(parseImport(text), tasks, options.replace)) {
            lines.push_back(toldBefore(planned));
        }
        print(lines);
        return 0;
    }
    {
        Change change;
        std::vector<Planned> all = planAll(parseImport(text), change.tasks(), options.replace);
        storeThoseThatKeepTheirIds(change, all);
        for (const Planned &planned : all) {
            const int32_t wanted = planned.imported.task->id;
            storeOther(change, planned);
            lines.push_back(toldAfter(planned, wanted));
        }
        change.commit();
    }
    print(lines);
    warnWhenNothingRuns();
    return 0;
}

} // namespace tavisched
