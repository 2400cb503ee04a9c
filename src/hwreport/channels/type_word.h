// Reads the type word and other 64-bit numbers of a channel.
#pragma once

#include <cstdint>
#include <optional>

#include "hwreport/channel.h"
#include "platform/protocol/hub_protocol.h"

namespace tally {

// A value as 64 bits; the invalid marker when it is absent or not a number.
inline std::uint64_t bitsOf(const KvObject* value) noexcept {
  const auto* number = kvCast<KvNumber>(value);
  return number != nullptr ? static_cast<std::uint64_t>(number->asInt64()) : kHwReportInvalidValue;
}

// The type word of a channel's legend array; empty when it cannot be read.
inline std::optional<TypeWord> typeWordOfLegend(const KvArray* legend) noexcept {
  const std::uint64_t bits = bitsOf(legend != nullptr ? legend->get(kLegendTypeWord) : nullptr);
  return bits != kHwReportInvalidValue ? std::optional(TypeWord{bits}) : std::nullopt;
}

// The legend array of a channel; null when it has none.
KvArray* legendOf(const KvDictionary* channel);

// Element of it; null when there is none.
inline KvObject* legendElement(const KvDictionary* channel, std::size_t index) {
  const KvArray* const legend = legendOf(channel);
  return legend != nullptr ? legend->get(index) : nullptr;
}

// Empty when it cannot be read.
inline std::optional<TypeWord> typeWordOf(const KvDictionary* channel) {
  return typeWordOfLegend(legendOf(channel));
}

// The element count of a channel of this format, else -1.
inline std::int32_t countOfFormat(const KvDictionary* channel, std::uint8_t format) {
  const auto type = typeWordOf(channel);
  return type && type->format() == format ? type->elementCount() : -1;
}

}  // namespace tally
