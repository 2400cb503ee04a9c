// Reads the type word and other 64-bit numbers of a channel.
#pragma once

#include <cstdint>
#include <optional>

#include "hwreport/channel.h"
#include "hwreport/channels/keys.h"
#include "platform/protocol/hub_protocol.h"

namespace tally {

// A value as 64 bits; the invalid marker when it is absent or not a number.
inline std::uint64_t bitsOf(const KvObject* value) noexcept {
  const auto* number = kvCast<KvNumber>(value);
  return number != nullptr ? static_cast<std::uint64_t>(number->asInt64()) : kHwReportInvalidValue;
}

// Element of a channel's legend array; null when there is none.
inline KvObject* legendElement(const KvDictionary* channel, std::size_t index) noexcept {
  const auto* legend =
      channel != nullptr ? channel->getAs<KvArray>(*keys().legendChannel) : nullptr;
  return legend != nullptr ? legend->get(index) : nullptr;
}

// Empty when it cannot be read.
inline std::optional<TypeWord> typeWordOf(const KvDictionary* channel) noexcept {
  const std::uint64_t bits = bitsOf(legendElement(channel, kLegendTypeWord));
  return bits != kHwReportInvalidValue ? std::optional(TypeWord{bits}) : std::nullopt;
}

// The element count of a channel of this format, else -1.
inline std::int32_t countOfFormat(const KvDictionary* channel, std::uint8_t format) noexcept {
  const auto type = typeWordOf(channel);
  return type && type->format() == format ? type->elementCount() : -1;
}

}  // namespace tally
