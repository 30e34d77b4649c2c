// The task sections that a batch has changed.
#include "staged_tasks.h"

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
void StagedTasks::touch(const std::string &section) {
    if (stateOf(section) == State::Removed) {
        std::erase(order_, section);
    }
    if (stateOf(section) != State::Stored) {
        order_.push_back(section);
    }
}

void StagedTasks::store(const std::string &section, int32_t id, std::unique_ptr<Hash> form) {
    touch(section);
    forms_[section] = std::move(form);
    if (ids) {
        ids->remove(section);
        ids->add(section, id);
    }
}

void StagedTasks::remove(const std::string &section) {
    touch(section);
    forms_[section] = nullptr;
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
