// Waiting for children.
#include "child.h"

#include <cerrno>
#include <sys/wait.h>

namespace base {

ChildSignals::ChildSignals() {
    struct sigaction standard {};
    standard.sa_handler = SIG_DFL;
    sigset_t child;
    sigemptyset(&child);
    sigaddset(&child, SIGCHLD);
    pthread_sigmask(SIG_BLOCK, &child, &callersMask_);
    sigaction(SIGCHLD, &standard, &callersAction_);
}

ChildSignals::~ChildSignals() {
    const int savedErrno = errno;
    sigaction(SIGCHLD, &callersAction_, nullptr);
    pthread_sigmask(SIG_SETMASK, &callersMask_, nullptr);
    errno = savedErrno;
}

int waitForChild(pid_t pid) {
    int status = 0;
    while (waitpid(pid, &status, 0) == -1) {
        if (errno != EINTR) {
            return -1;
        }
    }
    return status;
}

} // namespace base
