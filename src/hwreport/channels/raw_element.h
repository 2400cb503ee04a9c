// Reads the raw elements of a channel.
#pragma once

#include <cstdint>
#include <cstring>
#include <optional>
#include <span>

#include "hwreport/channel.h"
#include "hwreport/channels/type_word.h"
#include "platform/protocol/hub_protocol.h"

namespace tally {

static_assert(element::kMissingValue == kHwReportInvalidValue);

// What identifies an element, and what follows it: the update time and the slots.
constexpr std::size_t kElementIDs = element::kUpdateTime;
constexpr std::size_t kElementRest = element::kSize - kElementIDs;

// The elements of one channel, borrowed. They lie side by side, or packed: the ids of the first,
// which are those of all, and then the rest of each.
class ElementRun {
 public:
  ElementRun() = default;
  // Whole elements; bytes after the last one are not read.
  explicit ElementRun(std::span<const std::byte> bytes)
      : ids_(bytes.data()),
        rest_(bytes.data() + kElementIDs),
        stride_(element::kSize),
        elements_(bytes.size() / element::kSize),
        tail_(bytes.size() % element::kSize) {}
  static ElementRun packed(const std::byte* start, std::size_t elements) {
    ElementRun run;
    run.ids_ = start;
    run.rest_ = start + kElementIDs;
    run.stride_ = kElementRest;
    run.elements_ = elements;
    return run;
  }
  // A run has at most as many elements as its 16-bit count can express.
  std::uint16_t count() const noexcept { return static_cast<std::uint16_t>(elements_); }
  // All of them.
  std::size_t elements() const noexcept { return elements_; }
  // Bytes after the last whole one; they follow it.
  std::size_t tail() const noexcept { return tail_; }
  bool isPacked() const noexcept { return stride_ == kElementRest; }
  // The invalid marker when there is no such element.
  std::uint64_t slot(std::size_t index, std::size_t number) const noexcept {
    return index < elements_ ? word(rest(index) + number * 8 + element::kSlots - kElementIDs)
                             : kHwReportInvalidValue;
  }
  std::uint64_t updateTime(std::size_t index) const noexcept {
    return index < elements_ ? word(rest(index)) : kHwReportInvalidValue;
  }
  std::uint64_t channelID() const noexcept { return idWord(element::kChannelID); }
  TypeWord typeWord() const noexcept { return {idWord(element::kTypeWord)}; }

  // Of one element.
  const std::byte* ids(std::size_t index) const noexcept {
    return isPacked() ? ids_ : ids_ + index * element::kSize;
  }
  const std::byte* rest(std::size_t index) const noexcept { return rest_ + index * stride_; }
  // The first elements, side by side, as many as there is space for, and the tail if it is asked
  // for. REQUIRES: there are so many.
  void copyTo(std::span<std::byte> bytes) const {
    if (!isPacked()) {
      std::memcpy(bytes.data(), ids_, bytes.size());
      return;
    }
    for (std::size_t i = 0; i < bytes.size() / element::kSize; ++i) {
      std::byte* const to = bytes.data() + i * element::kSize;
      std::memcpy(to, ids_, kElementIDs);
      std::memcpy(to + kElementIDs, rest(i), kElementRest);
    }
  }

 private:
  static std::uint64_t word(const std::byte* at) noexcept {
    std::uint64_t value;
    std::memcpy(&value, at, sizeof(value));
    return value;
  }
  std::uint64_t idWord(std::size_t offset) const noexcept {
    return elements_ != 0 ? word(ids_ + offset) : kHwReportInvalidValue;
  }
  const std::byte* ids_ = nullptr;
  const std::byte* rest_ = nullptr;
  std::size_t stride_ = element::kSize;
  std::size_t elements_ = 0;
  std::size_t tail_ = 0;
};

// What can be read of a sampled channel: its legend's type word and its elements.
struct ChannelReading {
  std::optional<TypeWord> type;
  std::optional<ElementRun> elements;

  std::uint8_t format() const noexcept { return type ? type->format() : kHwReportFormatUnknown; }
  // The run, if its elements are of this format.
  std::optional<ElementRun> runOfFormat(std::uint8_t format) const {
    return elements && elements->typeWord().format() == format ? elements : std::nullopt;
  }
  // The same for formats whose legend says how many elements there are: it must agree.
  std::optional<ElementRun> runOfLegend(std::uint8_t format) const {
    auto run = runOfFormat(format);
    const bool agreed = run && type && type->format() == format;
    return agreed && type->elementCount() == run->count() ? run : std::nullopt;
  }
};
ChannelReading readingOf(const KvDictionary* channel);

// The elements that a value contains; empty when it is not data of at least one.
inline std::optional<ElementRun> runOfValue(const KvObject* value) {
  const auto* const data = kvCast<KvData>(value);
  if (data == nullptr || data->bytes().size() < element::kSize) return std::nullopt;
  return ElementRun(data->bytes());
}

inline std::optional<ElementRun> runOfFormat(const KvDictionary* channel, std::uint8_t format) {
  return readingOf(channel).runOfFormat(format);
}

inline std::optional<ElementRun> runOfLegend(const KvDictionary* channel, std::uint8_t format) {
  return readingOf(channel).runOfLegend(format);
}

// Element slot of a run that the legend agrees with; the invalid marker when it cannot be read.
inline std::uint64_t slotOfLegendRun(const KvDictionary* channel, std::uint8_t format,
                                     std::int32_t index, std::size_t number) {
  const auto run = runOfLegend(channel, format);
  if (!run || index < 0 || index >= run->count()) return kHwReportInvalidValue;
  return run->slot(static_cast<std::size_t>(index), number);
}

}  // namespace tally
