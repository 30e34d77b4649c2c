// What the library finds wrong with the machine.
#include "tasks/findings.h"
#include "failure.h"
#include "text/utf8.h"

#include <iostream>

namespace tavisched {

Findings Findings::all() {
    Findings findings;
    TAVI_SCHED_FINDING *head = nullptr;
    if (TAVISchedMachineCheck(&head) < 0) {
        throw Failure("the machine cannot be looked at: " + libraryError());
    }
    findings.list_.reset(head);
    return findings;
}

Findings Findings::of(std::vector<const char *> names) {
    Findings findings;
    TAVI_SCHED_FINDING *head = nullptr;
    names.push_back(nullptr);
    if (TAVISchedMachineCheckOf(names.data(), &head) < 0) {
        throw Failure("the machine cannot be looked at: " + libraryError());
    }
    findings.list_.reset(head);
    return findings;
}

std::string inWords(const TAVI_SCHED_FINDING &finding) {
    return printable(finding.what) + "; " +
           (finding.canRepair == 1 ? "\"tavisched check --repair\" puts that right"
                                   : printable(finding.advice));
}

bool warnOf(const std::vector<const char *> &names) {
    const Findings findings = Findings::of(names);
    for (const auto *finding = findings.first(); finding; finding = finding->next) {
        std::cerr << "tavisched: warning: " << inWords(*finding) << "\n";
    }
    return findings.any();
}

} // namespace tavisched
