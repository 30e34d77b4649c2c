// The receiving side of a request to end.
#include "stop_request.h"

#include <cerrno>
#include <cstdint>
#include <sys/eventfd.h>
#include <unistd.h>

namespace {

volatile std::sig_atomic_t grace = -1;
int event = -1;

} // namespace

void sched::StopRequest::onSignal(int, siginfo_t *info, void *) {
    const int seconds = info->si_value.sival_int - kMark;
    if (info->si_code != SI_QUEUE || seconds < 0 || seconds > kLongestGrace) {
        return;
    }
    const int savedErrno = errno;
    const uint64_t one = 1;
    grace = seconds;
    (void)!write(event, &one, sizeof one);
    errno = savedErrno;
}

// A lock that is waited for is waited for on; a pause ends.
void sched::StopRequest::listen() {
    event = eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK);
    struct sigaction action {};
    action.sa_sigaction = onSignal;
    action.sa_flags = SA_SIGINFO | SA_RESTART;
    sigaction(signal(), &action, nullptr);
    sigset_t own;
    sigemptyset(&own);
    sigaddset(&own, signal());
    pthread_sigmask(SIG_UNBLOCK, &own, nullptr);
}

bool sched::StopRequest::isMade() {
    return grace >= 0;
}

int sched::StopRequest::graceSeconds() {
    return grace;
}

int sched::StopRequest::file() {
    return event;
}

void sched::StopRequest::take() {
    uint64_t count = 0;
    (void)!read(event, &count, sizeof count);
}
