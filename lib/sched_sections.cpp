// Reading all sections of a file: at once where the platform can, else by their names.
#include "sched_sections.h"
#include "sched_handle.h"

#include <exception>

#pragma weak PLATCFileForEachSection // an appliance's own platform may lack it

namespace {

using OnSection = std::function<bool(const char *name, PLATCSZHASH *pairs)>;

struct Pass {
    const OnSection &onSection;
    std::exception_ptr failure; // it does not go through the platform
};

int handOver(void *context, const char *name, PLATCSZHASH *pairs) {
    auto &pass = *static_cast<Pass *>(context);
    try {
        return pass.onSection(name, pairs) ? 0 : 1;
    } catch (...) {
        pass.failure = std::current_exception();
        return 1;
    }
}

int readAtOnce(const char *path, const OnSection &onSection) {
    Pass pass{onSection, nullptr};
    const int calls = PLATCFileForEachSection(path, handOver, &pass);
    if (pass.failure) {
        std::rethrow_exception(pass.failure);
    }
    return calls < 0 ? -1 : 0;
}

int readByName(const char *path, const OnSection &onSection) {
    sched::List names(1024);
    sched::Hash pairs(64);
    const int count = names && pairs ? PLATCFileEnumSection(path, names.address()) : -1;
    for (int i = 0; i < count; ++i) {
        const char *const name = PLATCSzListGet(names.get(), i);
        PLATCHashRemoveAll(pairs.get());
        const int found = PLATCFileGetSection(path, name, pairs.address());
        if (!onSection(name, found > 0 ? pairs.get() : nullptr)) {
            return 0;
        }
    }
    return count < 0 ? -1 : 0;
}

} // namespace

int sched::forEachSection(const char *path, const OnSection &onSection) {
    return PLATCFileForEachSection ? readAtOnce(path, onSection) : readByName(path, onSection);
}
