// What the statistics hub writes into the region that it shares with a client.
#pragma once

#include <memory>
#include <optional>
#include <span>
#include <vector>

#include "host/described/described_files.h"
#include "host/described/registry_source.h"

namespace tally {

// A channel that a client wants to see.
struct Interest {
  std::uint64_t driver = 0, channel = 0, type = 0;
};
// The entries of an interest list; empty unless its count and its length agree.
std::optional<std::vector<Interest>> parseInterestList(std::span<const std::byte> list);

class HubRegion {
 public:
  virtual ~HubRegion() = default;
  // In bytes, never 0; the same for every frame.
  virtual std::size_t size() const = 0;
  // Writes the region as of that refresh; the last frame is repeated.
  virtual void writeFrame(std::size_t refresh, std::span<std::byte> memory) = 0;
};

// The runs of the wanted channels that the drivers describe, in the order of the interests; null
// when they would take more than 256 MiB.
std::unique_ptr<HubRegion> makeChannelRegion(const std::vector<Interest>& interests,
                                             const RegistrySource::Entries& drivers,
                                             DescribedFiles& files);
// Frames that are served unchanged, whatever is wanted; null when there are no bytes.
std::unique_ptr<HubRegion> makeRawRegion(const KvArray& frames, DescribedFiles& files);

}  // namespace tally
