// The program that the crontab's lines start. Its fixed name lies in a folder that anybody may
// write, so what stands there is looked at before a line that names it is written.
#pragma once

#include <string>

namespace sched {

// What is wrong with what stands at the runner's name, for behind "the runner ... "; "" for
// nothing.
std::string whyNoRunner();

// The program of this installation that the name should lead to, or "" when there is none that only
// root can replace.
std::string findRunnerProgram();

// Makes the name a link to it, in one step. 0 or -1.
int makeRunnerLink();

// Makes the link anew when it is missing or not root's. What cannot be made right is logged.
void ensureRunner();

} // namespace sched
