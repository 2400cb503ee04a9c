// An owned file descriptor.
#pragma once

#include <utility>

namespace tally {

class Descriptor {
 public:
  Descriptor() = default;
  explicit Descriptor(int value) : value_(value) {}
  Descriptor(Descriptor&& other) noexcept : value_(std::exchange(other.value_, -1)) {}
  Descriptor& operator=(Descriptor&& other) noexcept {
    std::swap(value_, other.value_);
    return *this;
  }
  ~Descriptor() { (void)close(); }
  int get() const { return value_; }
  explicit operator bool() const { return value_ >= 0; }
  // Leaves the descriptor to the caller.
  int release() { return std::exchange(value_, -1); }
  // What close(2) returned; 0 when nothing was open.
  int close();

 private:
  int value_ = -1;
};

}  // namespace tally
