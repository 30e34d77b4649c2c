// The tasks of a JSON array.
#include "json/import.h"
#include "failure.h"
#include "text/utf8.h"
#include "json/json.h"
#include "json/stored_form.h"
#include "json/web.h"

#include <algorithm>

namespace tavisched {

void ImportFaults::add(const std::string &member, const std::string &what) {
    faults_.push_back("element " + std::to_string(element_) +
                      (member.empty() ? "" : ", member \"" + printable(member) + "\"") + ": " +
                      printable(what));
}

void ImportFaults::refuse() const {
    constexpr size_t kMost = 10;
    if (faults_.empty()) {
        return;
    }
    std::vector<std::string> shown(
        faults_.begin(), faults_.begin() + static_cast<ptrdiff_t>(std::min(kMost, faults_.size())));
    if (faults_.size() > kMost) {
        shown.push_back("and " + std::to_string(faults_.size() - kMost) + " more");
    }
    throw Refusal("nothing was imported; faults: " + std::to_string(faults_.size()) + "\n  " +
                  join(shown, "\n  "));
}

std::vector<Imported> parseImport(const std::string &text) {
    Json::Value root;
    if (const auto fault = parseJson(text, false, root)) {
        throw Refusal("nothing was imported: the text is no JSON: " + *fault);
    }
    if (root.isObject()) { // what "show --json" writes
        Json::Value array(Json::arrayValue);
        array.append(std::move(root));
        root = std::move(array);
    }
    ImportFaults faults;
    std::vector<Imported> tasks;
    for (const Json::Value &element : root) {
        faults.nextElement();
        if (element.isObject()) {
            tasks.push_back(isWebTask(element) ? readWeb(element, faults)
                                               : readPlain(element, faults));
        } else {
            faults.add("", "it is no object");
        }
    }
    faults.refuse();
    return tasks;
}

void requireExchangeable(const TAVI_SCHED_TASK &task) {
    const Hash form(task);
    for (const std::string &key : form.keys()) {
        if (!isUtf8(form.value(key))) {
            throw Failure(called(task) + ": its \"" + key +
                          "\" is not valid UTF-8 and would not come back from an import");
        }
    }
}

} // namespace tavisched
