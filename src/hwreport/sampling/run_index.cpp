#include "hwreport/sampling/run_index.h"

#include <algorithm>
#include <utility>

#include "hwreport/channels/raw_element.h"

namespace tally {
namespace {

// How far ahead memory is prefetched; beyond the end of the buffer that is harmless.
constexpr std::size_t kFetchAhead = 2048;

std::uint64_t wordAt(std::span<const std::byte> buffer, std::size_t offset) {
  return ByteReader(buffer).read<std::uint64_t>(offset).value_or(0);
}

std::uint32_t hashOf(std::uint64_t driverID, std::uint64_t channelID) {
  const std::uint64_t words[] = {driverID, channelID};
  return hashWords(words);
}

constexpr std::size_t offsetOf(std::uint32_t number) { return number * element::kSize; }

std::size_t sizeOfRun(std::span<const std::byte> buffer, std::size_t offset) {
  return TypeWord{wordAt(buffer, offset + element::kTypeWord)}.elementCount() * element::kSize;
}

}  // namespace

RunIndex::RunIndex(std::span<const std::byte> buffer) {
  // As many as the index can number, which is 256 GiB of elements.
  constexpr std::size_t kMostElements = HashIndex::kNone;
  const std::size_t elements = std::min(buffer.size() / element::kSize, kMostElements);
  buffer_ = buffer.first(elements * element::kSize);
  // Runs of two elements on average fit without growing.
  constexpr std::size_t kFewestRuns = 64;
  index_.reserve(std::max(kFewestRuns, elements / 2));
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
  index_.prefetch(hash);
  noted_[notedCount_++] = {static_cast<std::uint32_t>(offset / element::kSize), hash};
  if (notedCount_ == noted_.size()) addNoted();
}

void RunIndex::addNoted() {
  for (std::size_t i = 0; i < notedCount_; ++i) {
    const std::size_t offset = offsetOf(noted_[i].element);
    const std::uint64_t driverID = wordAt(buffer_, offset + element::kDriverID);
    const std::uint64_t channelID = wordAt(buffer_, offset + element::kChannelID);
    // The first run is the channel's.
    index_.findOrAdd(noted_[i].hash, noted_[i].element,
                     [&](std::uint32_t run) { return isRunOf(run, driverID, channelID); });
  }
  notedCount_ = 0;
}

bool RunIndex::isRunOf(std::uint32_t run, std::uint64_t driverID, std::uint64_t channelID) const {
  const std::size_t offset = offsetOf(run);
  return wordAt(buffer_, offset + element::kDriverID) == driverID &&
         wordAt(buffer_, offset + element::kChannelID) == channelID;
}

void RunIndex::fetch(std::uint64_t driverID, std::uint64_t channelID) {
  const std::uint32_t coming = hashOf(driverID, channelID);
  index_.prefetch(coming);
  const std::uint32_t hash = std::exchange(fetching_[fetched_++ % kFetching], coming);
  const std::uint32_t found = index_.findHash(hash);
  if (found == HashIndex::kNone) return;
  const std::byte* const run = buffer_.data() + offsetOf(found);
  // After some lines the processor prefetches by itself; beyond the end of the buffer that is
  // harmless.
  constexpr std::size_t kLines = 4;
  for (std::size_t line = 0; line < kLines; ++line) __builtin_prefetch(run + line * element::kSize);
}

std::optional<std::span<const std::byte>> RunIndex::find(std::uint64_t driverID,
                                                         std::uint64_t channelID) const {
  const std::uint32_t found = index_.find(hashOf(driverID, channelID), [&](std::uint32_t run) {
    return isRunOf(run, driverID, channelID);
  });
  if (found == HashIndex::kNone) return std::nullopt;
  const std::size_t offset = offsetOf(found);
  // Read again, so checked again: the hub may be writing.
  const std::size_t size = sizeOfRun(buffer_, offset);
  if (size == 0 || size > buffer_.size() - offset) return std::nullopt;
  return buffer_.subspan(offset, size);
}

}  // namespace tally
