// Reads the raw elements of a channel.
#pragma once

#include <cstdint>
#include <optional>
#include <span>

#include "base/byte_reader.h"
#include "hwreport/channel.h"
#include "hwreport/channels/keys.h"
#include "hwreport/channels/type_word.h"
#include "platform/protocol/hub_protocol.h"

namespace tally {

static_assert(element::kMissingValue == kHwReportInvalidValue);

// The elements of one channel. Borrowed from its data.
class ElementRun {
 public:
  ElementRun() = default;
  explicit ElementRun(std::span<const std::byte> bytes) : bytes_(bytes) {}
  // A run has at most as many elements as its 16-bit count can express.
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
