// What runs need besides their tasks, and the plug-in handlers.
#include "finding.h"
#include "platplugin.h"
#include "sched_handle.h"
#include "sched_paths.h"
#include "tavischeduler.h"

#include <unistd.h>

#pragma weak PLATPluginCheck // an appliance's own platform may lack it

namespace sched {

namespace {

int ignoreRow(void *, const TAVI_SCHED_STATUS *) {
    return 0;
}

bool isDatabaseReadable() {
    sqlite3 *handle = nullptr;
    const int opened = TAVISchedDBOpenForReading(&handle);
    const Database database(handle);
    return opened == 0 ||
           (opened == 1 && TAVISchedDBListLastStatus(handle, ignoreRow, nullptr) >= 0);
}

} // namespace

// A full file system is no reason to give the results of earlier runs up.
void inspectStatusDatabase(Inspection &inspection) {
    if (inspection.hasRoom && !isDatabaseReadable()) {
        inspection.add({std::string("no task runs without its status database ") + kStatusDatabase +
                            ", which cannot be read",
                        std::string("remove ") + kStatusDatabase +
                            ", which the next run makes anew; how earlier runs ended is lost",
                        [] { return unlink(kStatusDatabase) == 0; }, "it was removed"});
    }
}

void inspectPlugins(Inspection &inspection) {
    List faults(16);
    const int count =
        PLATPluginCheck && faults ? PLATPluginCheck("task_scheduler", faults.address()) : 0;
    for (int i = 0; i < count; ++i) {
        inspection.add(PLATCSzListGet(faults.get(), i),
                       "handlers and their folder must be root's, executable, and writable by "
                       "nobody else");
    }
}

} // namespace sched
