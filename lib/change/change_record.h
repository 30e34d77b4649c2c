// The durable record of a change: what was there before, flushed to the disk before anything is
// overwritten and removed when everything is known to be good. Whoever finds it when no change is
// going on takes back what was cut off.
//
// It lies beside the persistent file and is a task file itself, the working copy as it was, with
// comment lines behind it that say the rest. So it can be read in the place of a working copy that
// cannot be restored for lack of room, and a rename puts it in the persistent file's place.
#pragma once

#include "tavisdk.h"

#include <array>
#include <optional>
#include <string>
#include <sys/types.h>
#include <vector>

namespace sched {

// By kind; nothing for a kind that does not change.
using PowerEntries = std::array<std::optional<std::vector<TAVIAUTOPOWER>>, 2>;

// What a change is about to overwrite.
struct Before {
    struct Tasks {
        std::optional<std::string> working; // nothing where no file is
        std::optional<std::string> persistent;
    };
    std::optional<Tasks> tasks;
    PowerEntries power;
    bool hasPower() const { return power[0] || power[1]; }
};

enum class RecordState { None, Present, Unreadable };
RecordState recordState();

// Writes the record and flushes it. 0, or -1 with error and log line and no record there.
int writeRecord(const Before &before);

// Removes it and flushes the folder. 0 or -1.
int removeRecord();

struct Record {
    Before before;
    pid_t process = 0;      // whose change it is
    size_t size = 0;        // of the working copy in it
    bool isWhole = true;    // else nothing was overwritten yet
    bool isReadable = true; // else what lies beside it is not
    bool isInPlace = false; // all but the persistent file is restored already
};
// Nothing when it cannot be read, which is logged.
std::optional<Record> readRecord();

// What was recorded is there again in two steps, between which the crontab is the caller's: first
// the working copy and the power schedules, then the persistent file, and with it the record goes.
// Each answers 0, or -1 with the record still there.
int restoreWhatIsRead(const Record &record);
int restorePersistent(const Record &record);

// Puts a new working copy in the place of whatever is there, in one step. False with errno set.
bool replaceWorkingCopy(const std::string &content);

// Whether the record can be read in the place of the working copy.
bool recordHasTasks();

} // namespace sched
