#include "hwreport/run_index.h"

#include <bit>

#include "base/hash.h"
#include "hwreport/raw_element.h"

namespace tally {

RunIndex::RunIndex(std::span<const std::byte> buffer)
    : buffer_(buffer.first(buffer.size() / element::kSize * element::kSize)) {
  const ByteReader reader(buffer_);
  for (std::size_t offset = 0; offset < buffer_.size();) {
    const auto count = TypeWord{reader.read<std::uint64_t>(offset + element::kTypeWord).value_or(0)}
                           .elementCount();
    stopped_ = count == 0;
    const std::size_t size = count * element::kSize;
    if (stopped_ || !reader.has(offset, size)) break;
    runs_.push_back({reader.read<std::uint64_t>(offset + element::kDriverID).value_or(0),
                     reader.read<std::uint64_t>(offset + element::kChannelID).value_or(0), offset,
                     size});
    offset += size;
  }
  slots_.resize(std::bit_ceil(runs_.size() * 2 + 1));
  for (std::size_t i = 0; i < runs_.size(); ++i) {
    std::uint32_t& slot = slots_[slotOf(runs_[i].driverID, runs_[i].channelID)];
    if (slot == 0) slot = static_cast<std::uint32_t>(i + 1);
  }
}

std::size_t RunIndex::slotOf(std::uint64_t driverID, std::uint64_t channelID) const {
  const std::uint64_t words[] = {driverID, channelID};
  const std::size_t mask = slots_.size() - 1;
  std::size_t slot = hashWords(words) & mask;
  for (; slots_[slot] != 0; slot = (slot + 1) & mask) {
    const Run& run = runs_[slots_[slot] - 1];
    if (run.driverID == driverID && run.channelID == channelID) break;
  }
  return slot;
}

std::optional<std::span<const std::byte>> RunIndex::find(std::uint64_t driverID,
                                                         std::uint64_t channelID) const {
  const std::uint32_t number = slots_[slotOf(driverID, channelID)];
  if (number == 0) return std::nullopt;
  return buffer_.subspan(runs_[number - 1].offset, runs_[number - 1].size);
}

}  // namespace tally
