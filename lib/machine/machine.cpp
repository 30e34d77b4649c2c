// The table of what is looked at on a machine, and the exported functions over it.
#include "finding.h"
#include "sched_backend.h"
#include "sched_error.h"
#include "sched_guard.h"
#include "sched_handle.h"
#include "sched_text.h"
#include "tavischeduler.h"

#include <algorithm>

namespace {

using sched::Finding;
using sched::Inspection;

struct Row {
    const char *name;
    void (*inspect)(Inspection &inspection);
};

// What others build on comes first, so that repairing in this order leads to a machine in order.
constexpr Row kRows[] = {{"room", sched::inspectRoom},
                         {"folders", sched::inspectFolders},
                         {"task files", sched::inspectTaskFiles},
                         {"put aside", sched::inspectPutAside},
                         {"runner", sched::inspectRunner},
                         {"cron", sched::inspectCron},
                         {"crontab", sched::inspectCrontabFile},
                         {"sections", sched::inspectSections},
                         {"tasks", sched::inspectTasks},
                         {"power", sched::inspectPower},
                         {"lines", sched::inspectLines},
                         {"status database", sched::inspectStatusDatabase},
                         {"plug-ins", sched::inspectPlugins}};

struct Named {
    const char *name;
    Finding finding;
};

std::vector<Named> inspectAll() {
    std::vector<Named> all;
    Inspection inspection;
    for (const Row &row : kRows) {
        row.inspect(inspection);
        for (Finding &finding : inspection.findings) {
            all.push_back({row.name, std::move(finding)});
        }
        inspection.findings.clear();
    }
    return all;
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
    record->canRepair = named.finding.repair ? 1 : 0;
    record->isNote = named.finding.isNote ? 1 : 0;
    return true;
}

bool isSame(const Named &named, const TAVI_SCHED_FINDING &finding) {
    return named.finding.what.compare(0, sizeof finding.what - 1, finding.what) == 0 &&
           std::string_view(named.name) == finding.name;
}

int check(TAVI_SCHED_FINDING **findings) {
    const std::vector<Named> all = inspectAll();
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
    return sched::guarded(SCHED_SITE, [&] { return check(ppFindings); });
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
