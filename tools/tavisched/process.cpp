// What /proc tells of processes.
#include "process.h"

#include <fstream>
#include <sstream>
#include <unistd.h>

namespace tavisched {

Process describe(const std::string &pid) {
    std::string line;
    std::ifstream file("/proc/" + pid + "/stat");
    std::getline(file, line);
    const size_t begin = line.find('(');
    const size_t end = line.rfind(')');
    if (begin == std::string::npos || end == std::string::npos) {
        return {};
    }
    Process process{.name = line.substr(begin, end - begin)};
    std::istringstream fields(line.substr(end + 1));
    std::string skipped;
    fields >> skipped >> process.parent;
    for (int field = 5; field < 22; ++field) {
        fields >> skipped;
    }
    fields >> process.startTime;
    return process;
}

bool isAncestor(pid_t pid) {
    pid_t ancestor = getppid();
    while (ancestor > 1 && ancestor != pid) {
        ancestor = describe(std::to_string(ancestor)).parent;
    }
    return ancestor > 1;
}

} // namespace tavisched
