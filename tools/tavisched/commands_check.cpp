// The subcommand "check": prints what inspectMachine() finds and mends what is safe to mend.
#include "check.h"
#include "commands.h"
#include "failure.h"
#include "store.h"
#include "table.h"

#include <algorithm>
#include <cstdio>
#include <set>
#include <unistd.h>

namespace tavisched {

namespace {

// One thing at a time, each time looking anew: mending one thing may mend or show others. Nothing
// is tried twice.
void mendAll() {
    std::set<std::string> tried;
    while (true) {
        const std::vector<Finding> findings = inspectMachine();
        const auto next =
            std::find_if(findings.begin(), findings.end(), [&](const Finding &finding) {
                return finding.mend && !tried.contains(finding.what);
            });
        if (next == findings.end()) {
            return;
        }
        tried.insert(next->what);
        next->mend();
        std::printf("%s %s\n  done: %s\n", styled("mended:", Style::Good).c_str(),
                    next->what.c_str(), next->advice.c_str());
    }
}

} // namespace

int check(bool repair) {
    if (geteuid() != 0) {
        throw Failure("check looks at files that only root may read; it must be run by root");
    }
    if (repair) {
        const ChangeLock lock(ChangeLock::Expecting::Anything);
        mendAll();
    }
    const std::vector<Finding> findings = inspectMachine();
    for (const Finding &finding : findings) {
        std::printf("%s %s\n  to do: %s\n", styled("problem:", Style::Bad).c_str(),
                    finding.what.c_str(), finding.advice.c_str());
    }
    if (findings.empty()) {
        std::printf("All is well.\n");
    }
    return findings.empty() ? 0 : 1;
}

} // namespace tavisched
