// What runs need besides their tasks, what is kept of them, and the plug-in handlers.
#include "base/trust.h"
#include "finding.h"
#include "platplugin.h"
#include "runs/limits.h"
#include "runs/run_records.h"
#include "sched_handle.h"
#include "sched_paths.h"
#include "tavischeduler.h"

#include <array>
#include <sys/stat.h>
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

// ---- Records ----

struct RecordFile {
    const char *path;
    base::TrustRule rule;
};
constexpr std::array<RecordFile, 4> kRecordFiles = {{{kRecordFolder, base::kRootsFolder},
                                                     {kOutputFolder, base::kRootsFolder},
                                                     {kRunDatabase, base::kRootsFile},
                                                     {kRunNumber, base::kRootsFile}}};

// The folder comes before what is in it: nobody else can put a link there then.
bool makeRootsAlone(const RecordFile &file) {
    return lchown(file.path, 0, 0) == 0 &&
           chmod(file.path, file.rule.kind == S_IFDIR ? 0700 : 0600) == 0;
}

void inspectRecordFile(const RecordFile &file, Inspection &inspection) {
    struct stat status {};
    if (lstat(file.path, &status) != 0) {
        return; // the next run makes it
    }
    const std::string path = file.path;
    const bool isFolder = file.rule.kind == S_IFDIR;
    const bool isPrivate = !isFolder || (status.st_mode & 077) == 0;
    if ((status.st_mode & S_IFMT) != file.rule.kind) {
        inspection.add(path + " is no " + (isFolder ? "folder" : "file") +
                           ", so that runs are not recorded as they should be",
                       "look what it is, then remove it; the next run makes it");
    } else if (!isPrivate || !base::isTrusted(status, file.rule)) {
        inspection.add({path + ", where runs are recorded, must be root's alone",
                        "chown root:root " + path + " and chmod go= " + path,
                        [file] { return makeRootsAlone(file); }, "it is root's alone again"});
    }
}

void inspectLimits(Inspection &inspection) {
    for (const std::string &fault : faultsOfRunLimits()) {
        inspection.add(std::string(kRunLimits) + ": " + fault,
                       "mend it by hand; accepted are, in the section [limits], runs_per_task and "
                       "runs, each a number above 0, and skipped, 0 or 1");
    }
}

bool replaceRecords() {
    RunRecords records(RunRecords::Mode::Write); // may have done it by itself
    return records && (records.health() == RunRecords::Health::Whole || records.replace());
}

} // namespace

void inspectRecordFiles(Inspection &inspection) {
    for (const RecordFile &file : kRecordFiles) {
        inspectRecordFile(file, inspection);
    }
    inspectLimits(inspection);
}

void inspectRecords(Inspection &inspection) {
    const std::string damaged = kDamagedRuns;
    if (access(kDamagedRuns, F_OK) == 0) {
        inspection.add({.what = "records of runs were put aside in " + damaged +
                                " when they were found damaged",
                        .advice = "remove it when nothing of it is needed",
                        .isNote = true});
    }
    RunRecords records(RunRecords::Mode::Read);
    const RunRecords::Health health =
        records.isMissing() ? RunRecords::Health::Whole : records.health();
    if (health == RunRecords::Health::Damaged) {
        inspection.add({std::string("the records of runs in ") + kRunDatabase + " are damaged",
                        "put them aside as " + damaged + "; the next run begins new ones",
                        replaceRecords, "they were put aside as " + damaged});
    } else if (health == RunRecords::Health::Unknown) {
        inspection.add(std::string("the records of runs in ") + kRunDatabase +
                           " cannot be read, and runs are not recorded",
                       "the system log tells why; another program may have them locked, or a later "
                       "version has made them");
    }
}

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
    for (const char *const plugin : {"task_scheduler", "task_scheduler_run"}) {
        const int count = PLATPluginCheck && faults ? PLATPluginCheck(plugin, faults.address()) : 0;
        for (int i = 0; i < count; ++i) {
            inspection.add(PLATCSzListGet(faults.get(), i),
                           "handlers and their folder must be root's, executable, and writable by "
                           "nobody else");
        }
    }
}

} // namespace sched
