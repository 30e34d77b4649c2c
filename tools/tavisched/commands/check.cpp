// The subcommand "check": prints what the library finds wrong with the machine, and has it
// repaired.
#include "commands/commands.h"
#include "tasks/findings.h"
#include "text/table.h"
#include "text/utf8.h"
#include "json/json.h"
#include "json/plain.h"

#include <cstdio>
#include <set>
#include <string>

namespace tavisched {

namespace {

bool isNote(const TAVI_SCHED_FINDING &finding) {
    return finding.isNote == 1;
}

void printFinding(const TAVI_SCHED_FINDING &finding) {
    std::printf("%s %s\n  %s%s\n",
                isNote(finding) ? styled("note:", Style::Strong).c_str()
                                : styled("problem:", Style::Bad).c_str(),
                printable(finding.what).c_str(),
                isNote(finding) ? "" : "to do: ", printable(finding.advice).c_str());
}

void printRepaired(const TAVI_SCHED_FINDING &finding) {
    std::printf("%s %s\n  %s\n", styled("repaired:", Style::Good).c_str(),
                printable(finding.what).c_str(), printable(finding.repaired).c_str());
}

void printFindingAsJson(const TAVI_SCHED_FINDING &finding) {
    Json::Value value;
    value["problem"] = !isNote(finding);
    value["what"] = plainText(finding.what);
    value["advice"] = plainText(finding.advice);
    value["canRepair"] = finding.canRepair == 1;
    value["task"] = finding.taskId == 0 ? Json::Value() : Json::Value(finding.taskId);
    printJsonLine(value);
}

void printRepairedAsJson(const TAVI_SCHED_FINDING &finding) {
    Json::Value value;
    value["repaired"] = plainText(finding.repaired);
    value["what"] = plainText(finding.what);
    printJsonLine(value);
}

// One thing at a time, each time looking anew: a repair may repair or show others. Nothing is tried
// twice.
void repairAll(void (*tellRepaired)(const TAVI_SCHED_FINDING &)) {
    std::set<std::string> tried;
    for (Findings findings = Findings::all();; findings = Findings::all()) {
        const TAVI_SCHED_FINDING *finding = findings.first();
        while (finding && (finding->canRepair != 1 || tried.contains(finding->what))) {
            finding = finding->next;
        }
        if (!finding) {
            return;
        }
        tried.insert(finding->what);
        if (TAVISchedFindingRepair(finding) == 0) {
            tellRepaired(*finding);
        }
    }
}

} // namespace

int check(bool repair, bool json) {
    if (repair) {
        repairAll(json ? printRepairedAsJson : printRepaired);
    }
    const Findings findings = Findings::all();
    int status = 0;
    for (const auto *finding = findings.first(); finding; finding = finding->next) {
        (json ? printFindingAsJson : printFinding)(*finding);
        status = isNote(*finding) ? status : 1;
    }
    if (status == 0 && !json) {
        std::printf("All is well.\n");
    }
    return status;
}

} // namespace tavisched
