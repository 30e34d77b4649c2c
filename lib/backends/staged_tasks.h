// The task sections that a batch has changed, until it ends.
#pragma once

#include "sched_handle.h"

#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <vector>

namespace sched {

class StagedTasks {
  public:
    enum class State { Untouched, Stored, Removed };

    bool any() const { return !order_.empty(); }
    State stateOf(std::string_view section) const;
    // The section's stored form; nullptr unless it is Stored.
    PLATCSZHASH *find(std::string_view section) const;
    void store(const std::string &section, int32_t id, std::unique_ptr<Hash> form);
    void remove(const std::string &section);
    // Every changed section, those that are new in the order in which they came.
    const std::vector<std::string> &order() const { return order_; }

    // The ids in use, gathered once in a batch and kept up to date.
    struct Ids {
        std::map<std::string, int32_t, std::less<>> bySection; // the id that its task says
        std::multiset<int32_t> used;                           // of names too
        void add(const std::string &section, int32_t id);
        void remove(std::string_view section);
    };
    std::optional<Ids> ids;

  private:
    std::unique_ptr<Hash> &touch(const std::string &section);

    std::map<std::string, std::unique_ptr<Hash>, std::less<>> forms_; // null: removed
    std::vector<std::string> order_;
};

// The id that a section is named by, when it is above 0.
std::optional<int32_t> idOfSection(std::string_view section);

} // namespace sched
