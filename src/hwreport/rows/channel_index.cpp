#include "hwreport/rows/channel_index.h"

#include <algorithm>
#include <bit>
#include <utility>

#include "base/hash.h"
#include "hwreport/channels/type_word.h"
#include "hwreport/rows/channel_rows.h"
#include "kv/array_changes.h"

namespace tally {
namespace {

// How many channels ahead slots are fetched.
constexpr std::uint32_t kSlotAhead = 8;

std::size_t slotsFor(std::size_t channels) { return std::bit_ceil(channels * 4 / 3 + 2); }

}  // namespace

ChannelIndex::ChannelIndex(const ChannelRows& rows)
    : changes_(kvArrayChanges()), slots_(slotsFor(rows.size()), kNone) {
  const auto count = static_cast<std::uint32_t>(rows.size());
  channels_.reserve(count);
  for (std::uint32_t i = 0; i < count + kSlotAhead; ++i) {
    if (i < count) rows.prefetchLegends(i);
    if (i < count) read(rows, i);
    if (i >= kSlotAhead) place(i - kSlotAhead);
  }
}

void ChannelIndex::reorder(std::vector<std::uint32_t> order) {
  std::vector<bool> placed(size());
  for (const std::uint32_t row : order) placed[row] = true;
  for (std::uint32_t row = 0; row < size(); ++row) {
    if (!placed[row]) order.push_back(row);
  }
  // In place, cycle by cycle: a second copy of all would be the largest memory of a subscription.
  for (std::uint32_t start = 0; start < size(); ++start) {
    const Channel first = channels_[start];
    std::uint32_t position = start;
    while (order[position] != start && order[position] != position) {
      const std::uint32_t from = std::exchange(order[position], position);
      channels_[position] = channels_[from];
      position = from;
    }
    if (position != start) channels_[position] = first;
    order[position] = position;
  }
  std::ranges::fill(slots_, kNone);
  for (std::uint32_t position = 0; position < size(); ++position) place(position);
  inOrderOfRows_ = false;
}

void ChannelIndex::read(const ChannelRows& rows, std::uint32_t row) {
  const std::uint32_t shape = rows.shapeNumber(row);
  if (shape >= drivers_.size()) drivers_.push_back(bitsOf(rows.shape(row).driverID));
  const KvArray* const legend = rows.legend(row);
  const Channel channel = {bitsOf(legend != nullptr ? legend->get(kLegendChannelID) : nullptr),
                           bitsOf(legend != nullptr ? legend->get(kLegendTypeWord) : nullptr), row,
                           shape & INT32_MAX, 0};
  channels_.push_back(channel);
  const TypeWord type{channel.typeBits};
  if (type.format() == kHwReportFormatUnknown) formless_.push_back(row);
  sizeOfRuns_ += RunBlock::sizeOf(type.elementCount());
  const std::uint64_t words[] = {channel.id, channel.typeBits, drivers_[shape]};
  complete_ = complete_ && std::ranges::find(words, kHwReportInvalidValue) == std::end(words);
  prefetchSlot(slotOf(drivers_[shape], channel.id));
}

void ChannelIndex::place(std::uint32_t position) {
  Channel& channel = channels_[position];
  if (channel.repeated != 0) return;
  std::size_t slot = slotOf(drivers_[channel.shape], channel.id);
  for (; slots_[slot] != kNone; slot = (slot + 1) & (slots_.size() - 1)) {
    const Channel& other = channels_[slots_[slot]];
    if (!isAt(slots_[slot], drivers_[channel.shape], channel.id)) continue;
    channel.repeated = 1;
    repeated_.push_back({channel.row, other.row, channel.typeBits == other.typeBits});
    return;
  }
  slots_[slot] = position;
}

bool ChannelIndex::isCurrent() const noexcept { return complete_ && changes_ == kvArrayChanges(); }

std::size_t ChannelIndex::slotOf(std::uint64_t driverID, std::uint64_t channelID) const noexcept {
  const std::uint64_t words[] = {driverID, channelID};
  return hashWords(words) & (slots_.size() - 1);
}

void ChannelIndex::prefetchChannel(std::size_t slot) const noexcept {
  if (slots_[slot] != kNone) __builtin_prefetch(&channels_[slots_[slot]]);
}

std::uint32_t ChannelIndex::find(std::size_t slot, std::uint64_t driverID,
                                 std::uint64_t channelID) const noexcept {
  while (slots_[slot] != kNone && !isAt(slots_[slot], driverID, channelID)) {
    slot = (slot + 1) & (slots_.size() - 1);
  }
  return slots_[slot];
}

}  // namespace tally
