// The stored form of a task: the pairs of its section, which are also its members in JSON.
#pragma once

#include "platc.h"
#include "tasks/tasks.h"

#include <string>
#include <vector>

namespace tavisched {

inline constexpr const char *kBackend =
    "backend"; // a member of JSON that the stored form does not have

// Owner of a platform hash with a stored form.
class Hash {
  public:
    Hash();
    explicit Hash(const TAVI_SCHED_TASK &task); // the task's stored form
    ~Hash() { PLATCSzHashFree(hash_); }
    Hash(const Hash &) = delete;
    Hash &operator=(const Hash &) = delete;

    PLATCSZHASH *get() const { return hash_; }
    PLATCSZHASH **address() { return &hash_; }
    void set(const std::string &key, const std::string &value);
    std::string value(const std::string &key) const; // "" for a missing key
    std::vector<std::string> keys() const;
    // Everything that is wrong with the form.
    std::vector<TAVI_SCHED_FAULT> faults() const;

  private:
    PLATCSZHASH *hash_;
};

} // namespace tavisched
