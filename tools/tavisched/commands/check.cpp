// The subcommand "check": prints what the library finds wrong with the machine, and has it
// repaired.
#include "commands/commands.h"
#include "tasks/findings.h"
#include "text/table.h"
#include "text/utf8.h"

#include <cstdio>
#include <set>
#include <string>

namespace tavisched {

namespace {

// One thing at a time, each time looking anew: a repair may repair or show others. Nothing is tried
// twice.
void repairAll() {
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
            std::printf("%s %s\n  %s\n", styled("repaired:", Style::Good).c_str(),
                        printable(finding->what).c_str(), printable(finding->repaired).c_str());
        }
    }
}

} // namespace

int check(bool repair) {
    if (repair) {
        repairAll();
    }
    const Findings findings = Findings::all();
    int status = 0;
    for (const auto *finding = findings.first(); finding; finding = finding->next) {
        const bool isNote = finding->isNote == 1;
        std::printf("%s %s\n  %s%s\n",
                    isNote ? styled("note:", Style::Strong).c_str()
                           : styled("problem:", Style::Bad).c_str(),
                    printable(finding->what).c_str(),
                    isNote ? "" : "to do: ", printable(finding->advice).c_str());
        status = isNote ? status : 1;
    }
    if (status == 0) {
        std::printf("All is well.\n");
    }
    return status;
}

} // namespace tavisched
