// The stored form of a task: the pairs of its section, which are also its members in JSON.
#pragma once

#include "platc.h"
#include "tasks.h"

#include <optional>
#include <string>
#include <vector>

namespace tavisched {

// Owner of a platform hash.
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
    bool has(const std::string &key) const;
    std::vector<std::string> keys() const;

  private:
    PLATCSZHASH *hash_;
};

// What a stored form may hold. The library itself is asked: a value is good when the library reads
// it and would write the same text.
class StoredForm {
  public:
    StoredForm();

    const std::vector<std::string> &keys() const { return keys_; }
    bool holds(const std::string &key) const;
    // Those without which no task is read.
    const std::vector<std::string> &requiredKeys() const { return required_; }
    // What is wrong with a value of a key, or nothing.
    std::optional<std::string> faultOf(const std::string &key, const std::string &value) const;
    // What is wrong with a whole form, or nothing; one that the library reads may still have values
    // that it would not write so.
    struct Faults {
        bool readable;
        std::string what;
    };
    std::optional<Faults> faultsOf(const Hash &form) const;

  private:
    Task example_;
    std::vector<std::string> keys_;
    std::vector<std::string> required_;
};

} // namespace tavisched
