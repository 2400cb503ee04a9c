// What the kernel says of this process, and of the machine's clocks.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

namespace tally {

struct ClockReading {
  std::string bootId;                  // different after each boot; empty if it is not known
  std::int64_t bootMilliseconds = 0;   // since boot, suspension included
  std::int64_t awakeMilliseconds = 0;  // without it
  std::int64_t milliseconds = 0;       // since 1970, as the clock has it
  std::optional<bool> isSynchronised;  // whether it follows a reference
};

// Of this process, since its start. Empty: the kernel does not say.
struct RunCost {
  std::optional<std::int64_t> cpuMilliseconds, peakKibibytes, bytesWritten;
};

class Self {
 public:
  virtual ~Self() = default;
  // Empty when the clocks cannot be read.
  virtual std::optional<ClockReading> clocks() { return std::nullopt; }
  virtual RunCost cost() { return {}; }
};

}  // namespace tally
