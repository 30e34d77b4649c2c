// The stored form of a task, as the library reads and writes it.
#include "json/stored_form.h"
#include "failure.h"

#include <algorithm>
#include <new>

namespace tavisched {

namespace {

constexpr int kHashCapacity = 64;

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

std::vector<TAVI_SCHED_FAULT> Hash::faults() const {
    const int count = TAVISchedHashCheck(hash_, nullptr, 0);
    std::vector<TAVI_SCHED_FAULT> faults(static_cast<size_t>(std::max(count, 0)));
    if (count < 0 || TAVISchedHashCheck(hash_, faults.data(), faults.size()) != count) {
        throw Failure("a stored form cannot be checked: " + libraryError());
    }
    return faults;
}

} // namespace tavisched
