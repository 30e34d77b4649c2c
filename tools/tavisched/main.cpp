// tavisched, the command line of the task scheduler: how it begins, and what ends it without an
// answer.
#include "command_line.h"
#include "failure.h"
#include "tasks/change.h"

#include <cstdio>
#include <cstdlib>
#include <exception>
#include <new>

namespace {

using namespace tavisched;

void tellOutOfMemory() {
    std::fputs(Change::isStored() ? "tavisched: what was asked for was done, but out of memory\n"
                                  : "tavisched: out of memory\n",
               stderr);
}

// Before main() and where nothing may be thrown, nobody catches: there is no memory either for what
// the parser makes as the program is loaded.
__attribute__((constructor(101))) void tellBeforeTermination() {
    std::set_terminate([] {
        try {
            if (const auto thrown = std::current_exception()) {
                std::rethrow_exception(thrown);
            }
        } catch (const std::bad_alloc &) {
            tellOutOfMemory();
            std::_Exit(Failure::kExitStatus);
        } catch (...) {
        }
        std::abort();
    });
}

} // namespace

int main(int argc, char **argv) {
    try {
        return CommandLine().run(argc, argv);
    } catch (const std::bad_alloc &) {
        tellOutOfMemory();
    } catch (const std::exception &error) {
        std::fprintf(stderr, "tavisched: %s\n", error.what());
    }
    return Failure::kExitStatus;
}
