// The command line of tavisched: reads what was typed, and does it.
#pragma once

#include <memory>
#include <string>

namespace tavisched {

class CommandLine {
  public:
    CommandLine();
    ~CommandLine();
    CommandLine(const CommandLine &) = delete;
    CommandLine &operator=(const CommandLine &) = delete;

    // Executes what the arguments of main() ask for: the exit status. Failures are told on standard
    // error; only std::bad_alloc is thrown. May be called again and again.
    int run(int argc, char **argv);

  private:
    struct Parts;
    std::unique_ptr<Parts> parts_;
};

// The command's own name, as people know some by another one.
std::string commandFor(const std::string &typed);

} // namespace tavisched
