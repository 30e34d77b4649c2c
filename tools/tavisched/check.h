// What is wrong with this machine, as far as scheduled tasks are concerned.
#pragma once

#include <functional>
#include <string>
#include <vector>

namespace tavisched {

struct Finding {
    std::string what;
    std::string advice;
    std::function<void()> mend; // empty when it is not safe to mend without a person
};

std::vector<Finding> inspectMachine();

} // namespace tavisched
