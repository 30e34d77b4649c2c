// What there is between a detached run and the process that asked for it: a connection that carries
// the run's process id and ends with the run, and nothing else.
#pragma once

#include "base/descriptor.h"

#include <cstdint>

namespace sched {

class RunConnection {
  public:
    // False with errno set.
    bool make();
    // In the run's process: what ends when it is closed, at the latest with the process, as nobody
    // else has this side of it. A caller that is gone by now is no reason to end.
    base::Descriptor tellPid();
    // In the caller's process: what is at its end when the run has ended. A run that was killed at
    // once has told no process id, which is -1 then.
    base::Descriptor takePid(int32_t &pid);

  private:
    base::Descriptor callers_;
    base::Descriptor runs_;
};

// In the run's process, which lives as long as the command does: what its caller has open, such as
// a web server's connections, is closed, but for the system log's and the one that is kept. Nor are
// signals the caller's functions' any more, which may know those descriptors.
void leaveCaller(const base::Descriptor &kept);

} // namespace sched
