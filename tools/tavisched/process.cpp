// What /proc tells of processes.
#include "process.h"

#include <cstdlib>
#include <fstream>
#include <string>
#include <unistd.h>

namespace tavisched {

namespace {

// 0 when there is no such process.
pid_t parentOf(pid_t process) {
    std::string line;
    std::ifstream file("/proc/" + std::to_string(process) + "/stat");
    std::getline(file, line);
    const size_t nameEnd = line.rfind(')'); // the name may hold any byte; then state and parent
    return nameEnd == std::string::npos || nameEnd + 4 > line.size()
               ? 0
               : std::atoi(line.c_str() + nameEnd + 4);
}

} // namespace

bool isAncestor(pid_t pid) {
    pid_t ancestor = getppid();
    while (ancestor > 1 && ancestor != pid) {
        ancestor = parentOf(ancestor);
    }
    return ancestor > 1;
}

} // namespace tavisched
