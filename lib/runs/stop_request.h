// A person's request that a run end. It comes as a signal with a value, which nothing else sends.
#pragma once

#include <csignal>

namespace sched {

class StopRequest {
  public:
    static int signal() { return SIGRTMIN + 1; }
    // The value that carries the seconds between TERM and KILL; others are not obeyed.
    static int valueOf(int graceSeconds) { return kMark + graceSeconds; }
    static constexpr int kLongestGrace = 86400;

    // From here on this process can be asked.
    static void listen();
    static bool isMade();
    static int graceSeconds();
    // Can be read when a request has come that was not taken yet.
    static int file();
    static void take();

  private:
    static constexpr int kMark = 0x5700000;
    static void onSignal(int signal, siginfo_t *info, void *context);
};

} // namespace sched
