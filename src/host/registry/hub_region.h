// What a statistics hub writes into the region that it shares with a client.
#pragma once

#include <cstddef>
#include <cstdint>
#include <span>

namespace tally {

// A channel that a client subscribes to.
struct Interest {
  std::uint64_t driver = 0, channel = 0, type = 0;
};

class HubRegion {
 public:
  virtual ~HubRegion() = default;
  // In bytes, never 0; the same for every frame.
  virtual std::size_t size() const = 0;
  // Whether the region has a frame before the first refresh, the same as that of the refresh. Not
  // so where a frame is what is read at that moment.
  virtual bool hasFirstFrame() const { return true; }
  // Writes the region as of that refresh, counted from 0.
  virtual void writeFrame(std::size_t refresh, std::span<std::byte> memory) = 0;
};

}  // namespace tally
