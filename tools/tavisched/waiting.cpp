// A word to people when the program waits for another one. A timer's signal looks at what goes on,
// so that whatever waits needs not know of it; the handler calls nothing but what signal handlers
// may.
#include "waiting.h"
#include "tavischeduler.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <charconv>
#include <csignal>
#include <cstring>
#include <fcntl.h>
#include <string_view>
#include <sys/time.h>
#include <unistd.h>

namespace tavisched {

namespace {

constexpr suseconds_t kInterval = 250000; // microseconds
constexpr int kPatience = 4;              // intervals

// A text in a place of its own; what does not fit is cut.
class Line {
  public:
    Line &add(std::string_view text) {
        const size_t length = std::min(text.size(), text_.size() - length_);
        std::memcpy(text_.data() + length_, text.data(), length);
        length_ += length;
        return *this;
    }
    Line &add(pid_t number) {
        std::array<char, 16> digits{};
        const auto end = std::to_chars(digits.data(), digits.data() + digits.size(), number).ptr;
        return add({digits.data(), static_cast<size_t>(end - digits.data())});
    }
    // The content of a short file, its last byte left out; what could control a terminal is shown
    // as blanks.
    Line &addFile(const char *path) {
        const int file = open(path, O_RDONLY | O_CLOEXEC);
        std::array<char, 200> content{};
        const ssize_t length = file == -1 ? 0 : read(file, content.data(), content.size());
        if (file != -1) {
            close(file);
        }
        std::replace_if(
            content.begin(), content.end(), [](char byte) { return byte < ' ' || byte > '~'; },
            ' ');
        return add({content.data(), static_cast<size_t>(std::max<ssize_t>(length - 1, 0))});
    }
    const char *c_str() {
        text_[std::min(length_, text_.size() - 1)] = '\0';
        return text_.data();
    }
    std::string_view view() const { return {text_.data(), length_}; }

  private:
    std::array<char, 512> text_{};
    size_t length_ = 0;
};

// The first process that this one has started and that has not ended, or 0.
pid_t child() {
    Line path;
    path.add("/proc/self/task/").add(getpid()).add("/children");
    Line children;
    children.addFile(path.c_str());
    pid_t pid = 0;
    std::from_chars(children.view().data(), children.view().data() + children.view().size(), pid);
    return pid;
}

void tell(pid_t process, bool isChild) {
    Line path;
    path.add("/proc/").add(process).add(isChild ? "/cmdline" : "/comm");
    Line line;
    line.add("tavisched: waiting for process ").add(process).add(" (").addFile(path.c_str());
    line.add(isChild ? ")\n" : "), which changes tasks\n");
    [[maybe_unused]] const ssize_t written =
        write(STDERR_FILENO, line.view().data(), line.view().size());
}

void look(int) {
    static pid_t seen = 0;
    static int times = 0;
    const int savedErrno = errno;
    const pid_t other = TAVISchedWaitedFor();
    const pid_t process = other != 0 ? other : child();
    times = process != 0 && process == seen ? times + 1 : 0;
    seen = process;
    if (times == kPatience) {
        tell(process, other == 0);
    }
    errno = savedErrno;
}

} // namespace

void tellOfWaiting() {
    struct sigaction action {};
    action.sa_handler = look;
    action.sa_flags = SA_RESTART;
    const itimerval timer{.it_interval = {0, kInterval}, .it_value = {0, kInterval}};
    if (sigaction(SIGALRM, &action, nullptr) == 0) {
        setitimer(ITIMER_REAL, &timer, nullptr);
    }
}

void tellNoMoreOfWaiting() {
    const itimerval none{};
    setitimer(ITIMER_REAL, &none, nullptr);
}

} // namespace tavisched
