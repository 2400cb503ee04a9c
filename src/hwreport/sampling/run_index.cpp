#include "hwreport/sampling/run_index.h"

#include <algorithm>
#include <bit>
#include <utility>

#include "base/hash.h"
#include "hwreport/channels/raw_element.h"

namespace tally {
namespace {

// How far before its turn memory is asked for; past the end of the buffer that does no harm.
constexpr std::size_t kFetchAhead = 2048;

// Runs of four elements on average fill half of the slots that there are at first.
constexpr std::size_t kFewestSlots = 256;

std::uint64_t wordAt(std::span<const std::byte> buffer, std::size_t offset) {
  return ByteReader(buffer).read<std::uint64_t>(offset).value_or(0);
}

std::uint32_t hashOf(std::uint64_t driverID, std::uint64_t channelID) {
  const std::uint64_t words[] = {driverID, channelID};
  return hashWords(words);
}

constexpr std::size_t offsetOf(std::uint32_t element) {
  return (element - std::size_t{1}) * element::kSize;
}

std::size_t sizeOfRun(std::span<const std::byte> buffer, std::size_t offset) {
  return TypeWord{wordAt(buffer, offset + element::kTypeWord)}.elementCount() * element::kSize;
}

}  // namespace

RunIndex::RunIndex(std::span<const std::byte> buffer) {
  // As far as slots can count, which is 256 GiB of elements.
  constexpr std::size_t kMostElements = UINT32_MAX - 1;
  const std::size_t elements = std::min(buffer.size() / element::kSize, kMostElements);
  buffer_ = buffer.first(elements * element::kSize);
  slots_.resize(std::bit_ceil(std::max(kFewestSlots, elements / 2)));
  for (std::size_t offset = 0; offset < buffer_.size();) {
    const std::size_t size = sizeOfRun(buffer_, offset);
    stopped_ = size == 0;
    if (stopped_ || size > buffer_.size() - offset) break;
    for (std::size_t line = 0; line < size; line += element::kSize) {
      __builtin_prefetch(buffer_.data() + offset + kFetchAhead + line);
    }
    note(offset);
    offset += size;
  }
  addNoted();
}

void RunIndex::note(std::size_t offset) {
  const std::uint32_t hash = hashOf(wordAt(buffer_, offset + element::kDriverID),
                                    wordAt(buffer_, offset + element::kChannelID));
  __builtin_prefetch(&slots_[hash & (slots_.size() - 1)]);
  noted_[notedCount_++] = {static_cast<std::uint32_t>(offset / element::kSize + 1), hash};
  if (notedCount_ == noted_.size()) addNoted();
}

void RunIndex::addNoted() {
  for (std::size_t i = 0; i < notedCount_; ++i) {
    if (runs_ * 2 >= slots_.size()) grow();
    const std::size_t offset = offsetOf(noted_[i].element);
    Slot& slot = slots_[slotOf(wordAt(buffer_, offset + element::kDriverID),
                               wordAt(buffer_, offset + element::kChannelID), noted_[i].hash)];
    if (slot.element != 0) continue;  // the first run is the channel's
    slot = noted_[i];
    ++runs_;
  }
  notedCount_ = 0;
}

void RunIndex::grow() {
  Slots larger(slots_.size() * 4);
  const std::size_t mask = larger.size() - 1;
  for (const Slot& slot : slots_) {
    if (slot.element == 0) continue;
    std::size_t place = slot.hash & mask;
    while (larger[place].element != 0) place = (place + 1) & mask;
    larger[place] = slot;
  }
  slots_ = std::move(larger);
}

std::size_t RunIndex::slotOf(std::uint64_t driverID, std::uint64_t channelID,
                             std::uint32_t hash) const {
  const std::size_t mask = slots_.size() - 1;
  std::size_t slot = hash & mask;
  for (; slots_[slot].element != 0; slot = (slot + 1) & mask) {
    if (slots_[slot].hash != hash) continue;
    const std::size_t offset = offsetOf(slots_[slot].element);
    if (wordAt(buffer_, offset + element::kDriverID) == driverID &&
        wordAt(buffer_, offset + element::kChannelID) == channelID) {
      break;
    }
  }
  return slot;
}

void RunIndex::fetch(std::uint64_t driverID, std::uint64_t channelID) {
  const std::size_t mask = slots_.size() - 1;
  const std::uint32_t coming = hashOf(driverID, channelID);
  __builtin_prefetch(&slots_[coming & mask]);
  const std::uint32_t hash = std::exchange(fetching_[fetched_++ % kFetching], coming);
  std::size_t slot = hash & mask;
  while (slots_[slot].element != 0 && slots_[slot].hash != hash) slot = (slot + 1) & mask;
  if (slots_[slot].element == 0) return;
  const std::byte* const run = buffer_.data() + offsetOf(slots_[slot].element);
  // After some lines the processor has noticed by itself; past the end of the buffer that does no
  // harm.
  constexpr std::size_t kLines = 4;
  for (std::size_t line = 0; line < kLines; ++line) __builtin_prefetch(run + line * element::kSize);
}

std::optional<std::span<const std::byte>> RunIndex::find(std::uint64_t driverID,
                                                         std::uint64_t channelID) const {
  const Slot& slot = slots_[slotOf(driverID, channelID, hashOf(driverID, channelID))];
  if (slot.element == 0) return std::nullopt;
  const std::size_t offset = offsetOf(slot.element);
  // Read again, so checked again: the hub may be writing.
  const std::size_t size = sizeOfRun(buffer_, offset);
  if (size == 0 || size > buffer_.size() - offset) return std::nullopt;
  return buffer_.subspan(offset, size);
}

}  // namespace tally
