// The task sections that a batch has changed.
#include "staged_tasks.h"

#include <algorithm>
#include <charconv>

namespace sched {

std::optional<int32_t> idOfSection(std::string_view section) {
    int32_t id = 0;
    const char *const end = section.data() + section.size();
    const auto parsed = std::from_chars(section.data(), end, id);
    const bool isId = parsed.ec == std::errc() && parsed.ptr == end && id > 0;
    return isId ? std::optional(id) : std::nullopt;
}

StagedTasks::State StagedTasks::stateOf(std::string_view section) const {
    const auto found = forms_.find(section);
    return found == forms_.end() ? State::Untouched
           : found->second       ? State::Stored
                                 : State::Removed;
}

PLATCSZHASH *StagedTasks::find(std::string_view section) const {
    const auto found = forms_.find(section);
    return found == forms_.end() || !found->second ? nullptr : found->second->get();
}

// A section that is stored again after its removal comes last.
// Whatever fails here leaves the section as it was.
std::unique_ptr<Hash> &StagedTasks::touch(const std::string &section) {
    const State state = stateOf(section);
    if (state != State::Stored) {
        order_.push_back(section);
    }
    try {
        auto &form = forms_[section];
        if (state == State::Removed) {
            order_.erase(std::find(order_.begin(), order_.end(), section));
        }
        return form;
    } catch (...) {
        order_.pop_back();
        throw;
    }
}

void StagedTasks::store(const std::string &section, int32_t id, std::unique_ptr<Hash> form) {
    auto &place = touch(section);
    place = std::move(form);
    if (ids) {
        ids->remove(section);
        ids->add(section, id);
    }
}

void StagedTasks::remove(const std::string &section) {
    touch(section) = nullptr;
    if (ids) {
        ids->remove(section);
    }
}

void StagedTasks::Ids::add(const std::string &section, int32_t id) {
    bySection.emplace(section, id);
    used.insert(id);
    if (const auto name = idOfSection(section)) {
        used.insert(*name);
    }
}

void StagedTasks::Ids::remove(std::string_view section) {
    const auto found = bySection.find(section);
    if (found == bySection.end()) {
        return;
    }
    used.erase(used.find(found->second));
    if (const auto name = idOfSection(section)) {
        used.erase(used.find(*name));
    }
    bySection.erase(found);
}

} // namespace sched
