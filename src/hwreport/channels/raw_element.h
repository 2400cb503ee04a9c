// Raw elements: 64 bytes each, a run of them for each channel. The one place that knows the layout.
#pragma once

#include <cstdint>
#include <optional>
#include <span>

#include "base/byte_reader.h"
#include "hwreport/channel.h"
#include "hwreport/channels/keys.h"
#include "hwreport/channels/type_word.h"

namespace tally {

// Offsets in an element. The first three are read from a run's first element.
namespace element {
constexpr std::size_t kSize = 64;
constexpr std::size_t kDriverID = 0;
constexpr std::size_t kChannelID = 8;
constexpr std::size_t kTypeWord = 16;  // its element count is the run's
constexpr std::size_t kUpdateTime = 24;
constexpr std::size_t kSlots = 32;
constexpr std::size_t kSlotCount = 4;
constexpr std::size_t slot(std::size_t number) { return kSlots + number * 8; }
}  // namespace element

// What the value slots hold, by format.
namespace simple_slot {
constexpr std::size_t kValue = 0;
}
namespace state_slot {
constexpr std::size_t kID = 0, kInTransitions = 1, kResidency = 2;
}
namespace bucket_slot {
constexpr std::size_t kHits = 0, kMinimum = 1, kMaximum = 2, kSum = 3;
}

// The elements of one channel. Borrowed from its data.
class ElementRun {
 public:
  ElementRun() = default;
  explicit ElementRun(std::span<const std::byte> bytes) : bytes_(bytes) {}
  // A run has no more elements than its 16-bit count can say.
  std::uint16_t count() const noexcept {
    return static_cast<std::uint16_t>(bytes_.size() / element::kSize);
  }
  // The bytes of exactly count() elements.
  std::span<const std::byte> bytes() const noexcept {
    return bytes_.first(count() * element::kSize);
  }
  // The invalid marker when there is no such element.
  std::uint64_t slot(std::size_t index, std::size_t number) const noexcept {
    return read(index, element::slot(number));
  }
  std::uint64_t updateTime(std::size_t index) const noexcept {
    return read(index, element::kUpdateTime);
  }
  std::uint64_t channelID() const noexcept { return read(0, element::kChannelID); }
  TypeWord typeWord() const noexcept { return {read(0, element::kTypeWord)}; }

 private:
  std::uint64_t read(std::size_t index, std::size_t offset) const noexcept {
    return ByteReader(bytes_)
        .read<std::uint64_t>(index * element::kSize + offset)
        .value_or(kHwReportInvalidValue);
  }
  std::span<const std::byte> bytes_;
};

// The run of a sampled channel, if its elements are of this format.
inline std::optional<ElementRun> runOfFormat(const KvDictionary* channel, std::uint8_t format) {
  const auto* data = channel != nullptr ? channel->getAs<KvData>(*keys().rawElements) : nullptr;
  if (data == nullptr || data->bytes().size() < element::kSize) return std::nullopt;
  const ElementRun run(data->bytes());
  return run.typeWord().format() == format ? std::optional(run) : std::nullopt;
}

// The same for formats whose legend says how many elements there are: it must agree.
inline std::optional<ElementRun> runOfLegend(const KvDictionary* channel, std::uint8_t format) {
  const auto run = runOfFormat(channel, format);
  return run && countOfFormat(channel, format) == run->count() ? run : std::nullopt;
}

// Element slot of a run that the legend agrees with; the invalid marker when it cannot be read.
inline std::uint64_t slotOfLegendRun(const KvDictionary* channel, std::uint8_t format,
                                     std::int32_t index, std::size_t number) {
  const auto run = runOfLegend(channel, format);
  if (!run || index < 0 || index >= run->count()) return kHwReportInvalidValue;
  return run->slot(static_cast<std::size_t>(index), number);
}

}  // namespace tally
