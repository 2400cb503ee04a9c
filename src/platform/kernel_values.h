// Kernel values by name, ticks and their timebase.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string_view>

namespace tally {

struct Timebase {
  std::uint32_t numerator = 0;  // nanoseconds = ticks * numerator / denominator
  std::uint32_t denominator = 0;
};

class KernelValues {
 public:
  virtual ~KernelValues() = default;
  // Reads the named value into buffer. *length is the buffer's length at the call and the bytes
  // written afterwards. Returns 0 or an errno: ENOENT when there is no such value, ENOMEM when it
  // does not fit.
  virtual int readKernelValue(std::string_view name, std::span<std::byte> buffer,
                              std::size_t* length) = 0;
  // Whether this kind of device has the value, though a read of it may fail.
  virtual bool hasKernelValue(std::string_view) { return true; }
  // Ticks since boot; they stop while the device sleeps.
  virtual std::uint64_t MonotonicTicks() = 0;
  // Empty when it cannot be read.
  virtual std::optional<Timebase> TimebaseInfo() = 0;
};

}  // namespace tally
