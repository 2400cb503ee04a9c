#include "hwreport/rows/channel_index.h"

#include <bit>

#include "base/hash.h"
#include "hwreport/channels/type_word.h"
#include "hwreport/rows/channel_rows.h"
#include "kv/array_changes.h"

namespace tally {

ChannelIndex::ChannelIndex(const ChannelRows& rows)
    : rows_(rows),
      changes_(kvArrayChanges()),
      slots_(std::bit_ceil(rows.size() * 4 / 3 + 2), kNone) {
  channels_.reserve(rows.size());
  constexpr std::size_t kAhead = 16;
  for (std::size_t row = 0; row < rows.size(); ++row) {
    if (row + kAhead < rows.size()) __builtin_prefetch(rows.legend(row + kAhead));
    if (row + kAhead / 2 < rows.size()) {
      const KvArray* const next = rows.legend(row + kAhead / 2);
      if (next != nullptr) __builtin_prefetch(next->get(kLegendTypeWord));
    }
    addRow(static_cast<std::uint32_t>(row));
  }
}

void ChannelIndex::addRow(std::uint32_t row) {
  if (rows_.shapeNumber(row) >= drivers_.size())
    drivers_.push_back(bitsOf(rows_.shape(row).driverID));
  const KvArray* const legend = rows_.legend(row);
  const Channel channel = {bitsOf(legend != nullptr ? legend->get(kLegendChannelID) : nullptr),
                           bitsOf(legend != nullptr ? legend->get(kLegendTypeWord) : nullptr)};
  channels_.push_back(channel);
  const TypeWord type{channel.typeBits};
  if (type.format() == kHwReportFormatUnknown) formless_.push_back(row);
  sizeOfRuns_ += RunBlock::sizeOf(type.elementCount());
  complete_ = complete_ && channel.id != kHwReportInvalidValue &&
              channel.typeBits != kHwReportInvalidValue && driverID(row) != kHwReportInvalidValue;
  std::size_t slot = slotOf(driverID(row), channel.id);
  for (; slots_[slot] != kNone; slot = (slot + 1) & (slots_.size() - 1)) {
    const std::uint32_t other = slots_[slot];
    if (channels_[other].id != channel.id || driverID(other) != driverID(row)) continue;
    repeated_.push_back({row, other});
    return;
  }
  slots_[slot] = row;
}

bool ChannelIndex::isCurrent() const noexcept { return complete_ && changes_ == kvArrayChanges(); }

std::uint32_t ChannelIndex::shapeOf(std::size_t row) const noexcept {
  return rows_.shapeNumber(row);
}

std::size_t ChannelIndex::slotOf(std::uint64_t driverID, std::uint64_t channelID) const noexcept {
  const std::uint64_t words[] = {driverID, channelID};
  return hashWords(words) & (slots_.size() - 1);
}

void ChannelIndex::prefetchRow(std::size_t slot, const RunBlock& block) const noexcept {
  const std::uint32_t row = slots_[slot];
  if (row == kNone) return;
  __builtin_prefetch(&channels_[row]);
  rows_.prefetchShape(row);
  block.prefetchPlace(row);
}

std::uint32_t ChannelIndex::find(std::size_t slot, std::uint64_t wantedDriver,
                                 std::uint64_t wantedChannel) const noexcept {
  for (;; slot = (slot + 1) & (slots_.size() - 1)) {
    const std::uint32_t row = slots_[slot];
    if (row == kNone) return kNone;
    if (channels_[row].id == wantedChannel && driverID(row) == wantedDriver) return row;
  }
}

}  // namespace tally
