// The registry of backends: a table filled once in a process from the built-in list.
#include "sched_error.h"
#include "tavischeduler.h"

TAVI_SCHED_BACKEND_RECORD SchedBackends[TAVI_SCHED_MAX_BACKENDS];
unsigned int cBackend = 0;

namespace {

using InitFunction = int (*)(const char *name, TAVI_SCHED_BACKEND_RECORD *backend);

// One step of the built-in list; the site is the list's own row. The limit is tested for equality.
bool registerBackend(int32_t id, const char *name, InitFunction init, const sched::Site &site) {
    if (cBackend == TAVI_SCHED_MAX_BACKENDS) {
        SCHED_LOG_FOR(site, "Too many backends");
        return false;
    }
    SchedBackends[cBackend].id = id;
    if (init(name, &SchedBackends[cBackend]) < 0) {
        SCHED_LOG_FOR(site, "Backend init failed on backends %s_init.", name);
        return false;
    }
    ++cBackend;
    return true;
}

bool registerBuiltIn() {
#define TAVI_SCHED_BACKEND(id, name)                                                               \
    if (!registerBackend(id, #name, name##_init, SCHED_SITE)) {                                    \
        return false;                                                                              \
    }
#include "backend.h"
#undef TAVI_SCHED_BACKEND
    return true;
}

} // namespace

int TAVISchedBackendInit() {
    static bool registered = false;
    if (registered) {
        return 0;
    }
    if (!registerBuiltIn()) {
        cBackend = 0;
        return -1;
    }
    registered = true;
    return 0;
}
