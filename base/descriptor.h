// A file descriptor that is closed at the end of its scope.
#pragma once

#include <unistd.h>
#include <utility>

namespace base {

class Descriptor {
  public:
    Descriptor() = default;
    explicit Descriptor(int number) : number_(number) {}
    ~Descriptor() { close(); }
    Descriptor(Descriptor &&other) noexcept : number_(std::exchange(other.number_, -1)) {}
    Descriptor &operator=(Descriptor &&other) noexcept {
        if (this != &other) {
            close();
            number_ = std::exchange(other.number_, -1);
        }
        return *this;
    }
    Descriptor(const Descriptor &) = delete;
    Descriptor &operator=(const Descriptor &) = delete;

    explicit operator bool() const { return number_ != -1; }
    int get() const { return number_; }
    int release() { return std::exchange(number_, -1); }
    // Closes it now; false, with errno set, when the close failed.
    bool close() {
        const int number = std::exchange(number_, -1);
        return number == -1 || ::close(number) == 0;
    }

  private:
    int number_ = -1;
};

} // namespace base
