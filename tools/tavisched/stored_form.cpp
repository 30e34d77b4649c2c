// The stored form of a task, as the library reads and writes it.
#include "stored_form.h"
#include "failure.h"
#include "task_rules.h"
#include "text.h"

#include <algorithm>
#include <new>
#include <syslog.h>

namespace tavisched {

namespace {

constexpr int kHashCapacity = 64;
constexpr const char *kCommand = "cmd";

// Conversions that are tried only to see whether they work leave no lines in the system log.
class QuietLog {
  public:
    QuietLog() : mask_(setlogmask(LOG_UPTO(LOG_CRIT))) {}
    ~QuietLog() { setlogmask(mask_); }
    QuietLog(const QuietLog &) = delete;
    QuietLog &operator=(const QuietLog &) = delete;

  private:
    int mask_;
};

std::string shown(const std::string &value) {
    constexpr size_t kColumns = 60;
    return "\"" + cutTo(printable(value), kColumns) + "\"";
}

} // namespace

Hash::Hash() : hash_(PLATCSzHashAlloc(kHashCapacity)) {
    if (!hash_) {
        throw std::bad_alloc();
    }
}

Hash::Hash(const TAVI_SCHED_TASK &task) : Hash() {
    if (TAVISchedInitHashFromTask(&hash_, &task) != 0) {
        throw Failure(called(task) + " has no stored form: " + libraryError());
    }
}

void Hash::set(const std::string &key, const std::string &value) {
    if (PLATCSzHashSetValue(&hash_, key.c_str(), value.c_str()) != 0) {
        throw std::bad_alloc();
    }
}

bool Hash::has(const std::string &key) const {
    return PLATCSzHashGetValue(hash_, key.c_str()) != nullptr;
}

std::string Hash::value(const std::string &key) const {
    const char *const text = PLATCSzHashGetValue(hash_, key.c_str());
    return text ? text : "";
}

std::vector<std::string> Hash::keys() const {
    PLATCSZLIST *list = PLATCSzListAlloc(kHashCapacity);
    std::vector<std::string> keys;
    const int count = list ? std::max(PLATCSzHashEnumKey(hash_, &list), 0) : 0;
    keys.reserve(static_cast<size_t>(count));
    for (int i = 0; i < count; ++i) {
        keys.emplace_back(PLATCSzListGet(list, i));
    }
    PLATCSzListFree(list);
    return keys;
}

StoredForm::StoredForm() : example_(newTask(TAVI_SCHED_BACKEND_SCHEDULE)) {
    const QuietLog quiet;
    const Hash whole(*example_);
    keys_ = whole.keys();
    for (const std::string &missing : keys_) {
        Hash form;
        for (const std::string &key : keys_) {
            if (key != missing) {
                form.set(key, whole.value(key));
            }
        }
        if (TAVISchedInitTaskFromHash(form.get(), copyOf(*example_).get()) != 0) {
            required_.push_back(missing);
        }
    }
}

bool StoredForm::holds(const std::string &key) const {
    return std::find(keys_.begin(), keys_.end(), key) != keys_.end();
}

std::optional<std::string> StoredForm::faultOf(const std::string &key,
                                               const std::string &value) const {
    const QuietLog quiet;
    Hash form(*example_);
    form.set(key, value);
    const Task scratch = copyOf(*example_);
    const bool converts = TAVISchedInitTaskFromHash(form.get(), scratch.get()) == 0;
    const std::string stored = converts ? Hash(*scratch).value(key) : "";
    if (converts && stored == value) {
        return std::nullopt;
    }
    if (key == kCommand) {
        return shown(value) + " is not the base64 text of a command of at most " +
               std::to_string(kMaxCommandBytes) + " bytes";
    }
    return converts ? shown(value) + " would be stored as " + shown(stored)
                    : shown(value) + " is no number that can be stored";
}

std::optional<StoredForm::Faults> StoredForm::faultsOf(const Hash &form) const {
    const QuietLog quiet;
    const Task scratch = copyOf(*example_);
    const bool readable = TAVISchedInitTaskFromHash(form.get(), scratch.get()) == 0;
    const std::optional<Hash> stored =
        readable ? std::optional<Hash>(std::in_place, *scratch) : std::nullopt;
    std::vector<std::string> faults;
    for (const std::string &key : keys_) {
        const bool isRequired =
            std::find(required_.begin(), required_.end(), key) != required_.end();
        if (!form.has(key)) {
            if (isRequired) {
                faults.push_back("\"" + key + "\" is missing");
            }
        } else if (!stored || stored->value(key) != form.value(key)) {
            if (const auto fault = faultOf(key, form.value(key))) {
                faults.push_back("\"" + key + "\": " + *fault);
            }
        }
    }
    return faults.empty() ? std::nullopt : std::optional(Faults{readable, join(faults, "; ")});
}

} // namespace tavisched
