// The subcommand "check": prints what inspectMachine() finds and mends what is safe to mend.
#include "check.h"
#include "commands.h"
#include "failure.h"
#include "lock.h"
#include "table.h"

#include <algorithm>
#include <cstdio>
#include <iostream>
#include <set>
#include <unistd.h>

namespace tavisched {

namespace {

bool isFound(const std::vector<Finding> &findings, const std::string &what) {
    return std::any_of(findings.begin(), findings.end(),
                       [&](const Finding &finding) { return finding.what == what; });
}

// Tries one thing; it is mended when it is not found any more.
void mend(const Finding &finding) {
    try {
        finding.mend();
    } catch (const std::exception &failure) {
        std::cerr << "tavisched: " << failure.what() << "\n";
    }
    if (!isFound(inspectMachine(), finding.what)) {
        std::printf("%s %s\n  done: %s\n", styled("mended:", Style::Good).c_str(),
                    finding.what.c_str(), finding.advice.c_str());
    }
}

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
        mend(*next);
    }
}

// With the lock, so that no change is met half done.
std::vector<Finding> inspect(bool repair) {
    const Lock lock(repair ? Lock::Kind::Changing : Lock::Kind::Reading);
    if (repair) {
        mendAll();
    }
    return inspectMachine();
}

} // namespace

int check(bool repair) {
    if (geteuid() != 0) {
        throw Failure("check looks at files that only root may read; it must be run by root");
    }
    const std::vector<Finding> findings = inspect(repair);
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
