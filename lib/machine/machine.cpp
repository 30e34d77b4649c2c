// The table of what is looked at on a machine, and the exported functions over it.
#include "change/change.h"
#include "finding.h"
#include "sched_backend.h"
#include "sched_error.h"
#include "sched_guard.h"
#include "sched_handle.h"
#include "sched_text.h"
#include "tavischeduler.h"

#include <algorithm>
#include <set>
#include <string_view>

namespace {

using sched::ChangeLock;
using sched::Finding;
using sched::Inspection;
using Names = std::set<std::string_view>;

struct Row {
    const char *name;
    void (*inspect)(Inspection &inspection);
};

// What others build on comes first, so that repairing in this order leads to a machine in order.
constexpr Row kRows[] = {{"room", sched::inspectRoom},
                         {"folders", sched::inspectFolders},
                         {"task files", sched::inspectTaskFiles},
                         {"missing files", sched::inspectMissingFiles},
                         {"put aside", sched::inspectPutAside},
                         {"leftovers", sched::inspectLeftovers},
                         {"runner", sched::inspectRunner},
                         {"cron", sched::inspectCron},
                         {"crontab", sched::inspectCrontabFile},
                         {"sections", sched::inspectSections},
                         {"tasks", sched::inspectTasks},
                         {"schedules", sched::inspectSchedules},
                         {"power", sched::inspectPower},
                         {"lines", sched::inspectLines},
                         {"status database", sched::inspectStatusDatabase},
                         {"record files", sched::inspectRecordFiles},
                         {"records", sched::inspectRecords},
                         {"plug-ins", sched::inspectPlugins}};

struct Named {
    const char *name;
    Finding finding;
};

// A change that goes on is not met half done, and one that was cut off is taken back.
bool settle(const ChangeLock &lock, std::vector<Named> &all) {
    if (!lock) {
        return false;
    }
    if (lock.isOutermost() && ChangeLock::isUsable() && sched::takeBackCutOffChange() != 0) {
        all.push_back({kRows[0].name,
                       {"a change was cut off and cannot be taken back, so that no other one is "
                        "possible",
                        "the system log tells why; most often the file system of the task files "
                        "has no room"}});
    }
    return true;
}

std::vector<Named> inspect(ChangeLock::Wait wait, const Names *names) {
    std::vector<Named> all;
    Inspection inspection;
    const ChangeLock lock(wait);
    inspection.isSettled = settle(lock, all);
    inspection.looksAtTasks = !names;
    for (const Row &row : kRows) {
        if (names && !names->contains(row.name)) {
            continue;
        }
        row.inspect(inspection);
        for (Finding &finding : inspection.findings) {
            all.push_back({row.name, std::move(finding)});
        }
        inspection.findings.clear();
    }
    return all;
}

std::vector<Named> inspectAll() {
    return inspect(ChangeLock::Wait::HalfAMinute, nullptr);
}

void freeFindings(TAVI_SCHED_FINDING *head) {
    TAVISchedFindingListFree(&head);
}
using FindingList = std::unique_ptr<TAVI_SCHED_FINDING, sched::Releaser<freeFindings>>;

// The record that callers see, in front of the list.
bool pushFront(FindingList &list, const Named &named) {
    auto *const record =
        static_cast<TAVI_SCHED_FINDING *>(std::calloc(1, sizeof(TAVI_SCHED_FINDING)));
    if (!record) {
        return false;
    }
    record->next = list.release();
    list.reset(record);
    sched::copyText(record->name, sizeof record->name, named.name);
    sched::copyText(record->what, sizeof record->what, named.finding.what.c_str());
    sched::copyText(record->advice, sizeof record->advice, named.finding.advice.c_str());
    sched::copyText(record->repaired, sizeof record->repaired, named.finding.repaired.c_str());
    record->canRepair = named.finding.repair ? 1 : 0;
    record->isNote = named.finding.isNote ? 1 : 0;
    record->taskId = named.finding.taskId;
    return true;
}

bool isSame(const Named &named, const TAVI_SCHED_FINDING &finding) {
    return named.finding.what.compare(0, sizeof finding.what - 1, finding.what) == 0 &&
           std::string_view(named.name) == finding.name;
}

int report(const std::vector<Named> &all, TAVI_SCHED_FINDING **findings) {
    FindingList list;
    for (auto named = all.rbegin(); named != all.rend(); ++named) {
        if (!pushFront(list, *named)) {
            SCHED_SET_ERROR(sched::kTaskOutOfMemory);
            return -1;
        }
    }
    *findings = list.release();
    return static_cast<int>(all.size());
}

bool isName(std::string_view name) {
    return std::any_of(std::begin(kRows), std::end(kRows),
                       [name](const Row &row) { return name == row.name; });
}

const Named *find(const std::vector<Named> &all, const TAVI_SCHED_FINDING &finding) {
    const auto found = std::find_if(all.begin(), all.end(),
                                    [&](const Named &named) { return isSame(named, finding); });
    return found == all.end() ? nullptr : &*found;
}

int repair(const TAVI_SCHED_FINDING &finding) {
    const std::vector<Named> all = inspectAll();
    const Named *const named = find(all, finding);
    if (!named) {
        return 0;
    }
    if (named->finding.repair) {
        named->finding.repair();
    }
    return find(inspectAll(), finding) ? -1 : 0;
}

} // namespace

int TAVISchedMachineCheck(TAVI_SCHED_FINDING **ppFindings) {
    SCHED_REQUIRE(ppFindings, "((void *)0) != ppFindings", -1);
    if (sched::initBackends(SCHED_SITE) != 0) {
        return -1;
    }
    return sched::guarded(SCHED_SITE, [&] { return report(inspectAll(), ppFindings); });
}

int TAVISchedMachineCheckOf(const char *const *rgszNames, TAVI_SCHED_FINDING **ppFindings) {
    SCHED_REQUIRE(rgszNames, "((void *)0) != rgszNames", -1);
    SCHED_REQUIRE(ppFindings, "((void *)0) != ppFindings", -1);
    if (sched::initBackends(SCHED_SITE) != 0) {
        return -1;
    }
    return sched::guarded(SCHED_SITE, [&] {
        Names names;
        for (const char *const *name = rgszNames; *name; ++name) {
            SCHED_REQUIRE(isName(*name), "name is known", -1);
            names.insert(*name);
        }
        return report(inspect(ChangeLock::Wait::No, &names), ppFindings);
    });
}

int TAVISchedFindingRepair(const TAVI_SCHED_FINDING *pFinding) {
    SCHED_REQUIRE(pFinding, "((void *)0) != pFinding", -1);
    if (sched::initBackends(SCHED_SITE) != 0) {
        return -1;
    }
    return sched::guarded(SCHED_SITE, [&] { return repair(*pFinding); });
}

void TAVISchedFindingListFree(TAVI_SCHED_FINDING **ppFindings) {
    while (ppFindings && *ppFindings) {
        TAVI_SCHED_FINDING *const finding = *ppFindings;
        *ppFindings = finding->next;
        std::free(finding);
    }
}
