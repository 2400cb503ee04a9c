// Snapshots of all threads, as the kernel takes them.
#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <span>

namespace tally {

constexpr std::uint32_t kStackshotFlagKcdata = 0x10000;  // the buffer is in kcdata format

// One snapshot to take. The buffer goes with it.
class StackshotConfig {
 public:
  virtual ~StackshotConfig() = default;
  // Both return 0 or an errno.
  virtual int stackshotConfigSetFlags(std::uint32_t flags) = 0;
  virtual int stackshotCapture() = 0;
  // What was captured; no data (null) before that and after a failure.
  virtual std::span<const std::byte> stackshotBuffer() = 0;
};

class Stackshot {
 public:
  virtual ~Stackshot() = default;
  // Null when the kernel takes none.
  virtual std::unique_ptr<StackshotConfig> stackshotConfigCreate() = 0;
};

}  // namespace tally
