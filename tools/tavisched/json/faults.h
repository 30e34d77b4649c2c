// What is wrong with an import, gathered while its elements are read.
#pragma once

#include <string>
#include <vector>

namespace tavisched {

class ImportFaults {
  public:
    // The element that the following faults are of.
    void nextElement() { ++element_; }
    // The member is "" when the element as a whole is at fault.
    void add(const std::string &member, const std::string &what);
    size_t count() const { return faults_.size(); }
    // Refused, with the first ten and their number, when there are any.
    void refuse() const;

  private:
    int element_ = 0;
    std::vector<std::string> faults_;
};

} // namespace tavisched
