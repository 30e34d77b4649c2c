// The string list and the string hash behind the interface's opaque types. The hash is an ordered
// map: section files come out the same for the same pairs, and no choice of keys makes it slow.
#pragma once

#include <map>
#include <string>
#include <vector>

struct PLATCSZLIST {
    std::vector<std::string> texts;
};

struct PLATCSZHASH {
    std::map<std::string, std::string, std::less<>> pairs;
};
