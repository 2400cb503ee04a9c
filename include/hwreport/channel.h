// One statistics channel: what its dictionary says about it.
//
// A channel is a KvDictionary that a builder or a sample made. A null channel is an ordinary
// argument and gives the answer of a missing value. Borrowed results live as long as the channel.
#pragma once

#include <cstdint>

#include "kv/value.h"

namespace tally {

// What every 64-bit getter of the library gives for a value that is missing or not a number.
constexpr std::uint64_t kHwReportInvalidValue = 0x8000000000000000;

constexpr std::uint8_t kHwReportFormatUnknown = 0;  // until the first sample
constexpr std::uint8_t kHwReportFormatSimple = 1;
constexpr std::uint8_t kHwReportFormatState = 2;
constexpr std::uint8_t kHwReportFormatHistogram = 3;
constexpr std::uint8_t kHwReportFormatSimpleArray = 4;

// 0 when the channel's type word cannot be read.
TALLY_API std::uint8_t HwReportChannelGetFormat(const KvDictionary* channel);
// A mask of category bits; 0xFFFF when the channel's type word cannot be read.
TALLY_API std::uint16_t HwReportChannelGetCategories(const KvDictionary* channel);
// Null when the channel has none.
TALLY_API KvString* HwReportChannelGetGroup(const KvDictionary* channel);
TALLY_API KvString* HwReportChannelGetSubGroup(const KvDictionary* channel);
// The unit word: factor, exponents, kind and quantity. HwReportScaleValue computes with it.
TALLY_API std::uint64_t HwReportChannelGetUnit(const KvDictionary* channel);
// The registry entry id of the driver that publishes the channel.
TALLY_API std::uint64_t HwReportChannelGetDriverID(const KvDictionary* channel);
// "NAME <id 0xID>"; null when the channel has none.
TALLY_API KvString* HwReportChannelGetDriverName(const KvDictionary* channel);
TALLY_API std::uint64_t HwReportChannelGetChannelID(const KvDictionary* channel);
// The legend's name, or else the printable bytes of the channel id; null when there is neither.
// What was found is kept in the channel.
TALLY_API KvString* HwReportChannelGetChannelName(KvDictionary* channel);

}  // namespace tally
