// The protocol of drivers, the statistics hub and its clients: how a driver publishes its channels,
// the hub's calls, and the memory that it shares.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string_view>

namespace tally {

constexpr std::string_view kStatisticsHubClass = "HwReportHub";

// A driver's properties. A legend is an array of groups; each group has an array of channels, and
// each channel is an array.
constexpr std::string_view kLegendPublicProperty = "HwReportLegendPublic";
constexpr std::string_view kLegendProperty = "HwReportLegend";
constexpr std::string_view kLegendGroupName = "HwReportGroupName";
constexpr std::string_view kLegendSubGroupName = "HwReportSubGroupName";
constexpr std::string_view kLegendChannelInfo = "HwReportChannelInfo";
constexpr std::string_view kLegendChannelUnit = "HwReportChannelUnit";
constexpr std::string_view kLegendChannelsKey = "HwReportChannels";
constexpr std::size_t kLegendChannelID = 0, kLegendTypeWord = 1, kLegendChannelName = 2;
// Our own: what a source knows of a channel beyond what the library reads, a dictionary.
constexpr std::size_t kLegendDetails = 3;
constexpr std::string_view kDetailSemantics = "Semantics";      // "counter", "gauge", "state"
constexpr std::string_view kDetailScope = "Scope";              // "boot", "creation", "lifetime"
constexpr std::string_view kDetailWidth = "Width";              // bits of a counter; 0: not known
constexpr std::string_view kDetailFile = "File";                // where it is read, "*" the device
constexpr std::string_view kDetailDescription = "Description";  // one line

// Methods of a connection to the hub.
enum HubMethod : std::uint32_t { kHubOpen = 0, kHubConfigureInterests = 2, kHubUpdate = 3 };

// The input of kHubConfigureInterests: a 32-bit count, a reserved word of zeros, then the driver
// id, channel id and type word of each channel, 64 bits each.
constexpr std::size_t kInterestHeaderSize = 8;
constexpr std::size_t kInterestSize = 24;
constexpr std::size_t kMostInterests = 0x555554D;  // the list's size stays within 32 bits

struct TypeWord {
  std::uint64_t bits = 0;
  constexpr std::uint8_t format() const noexcept { return static_cast<std::uint8_t>(bits); }
  constexpr std::uint16_t categories() const noexcept {
    return static_cast<std::uint16_t>(bits >> 16);
  }
  constexpr std::uint16_t elementCount() const noexcept {
    return static_cast<std::uint16_t>(bits >> 32);
  }
  constexpr TypeWord withElementCount(std::uint16_t count) const noexcept {
    return {(bits & ~(std::uint64_t{UINT16_MAX} << 32)) | std::uint64_t{count} << 32};
  }
};

// The shared memory is an array of raw elements, a run of them for each channel. A channel is
// identified, and its run measured, by the first element.
namespace element {
constexpr std::size_t kSize = 64;
constexpr std::size_t kDriverID = 0;
constexpr std::size_t kChannelID = 8;
constexpr std::size_t kTypeWord = 16;  // its element count is that of the run
constexpr std::size_t kUpdateTime = 24;
constexpr std::size_t kSlots = 32;
constexpr std::size_t kSlotCount = 4;
constexpr std::size_t slot(std::size_t number) { return kSlots + number * 8; }
constexpr std::uint64_t kMissingValue = std::uint64_t{1} << 63;
}  // namespace element

// What the value slots contain, by format.
namespace simple_slot {
constexpr std::size_t kValue = 0;
}
namespace state_slot {
constexpr std::size_t kID = 0, kInTransitions = 1, kResidency = 2;
}
namespace bucket_slot {
constexpr std::size_t kHits = 0, kMinimum = 1, kMaximum = 2, kSum = 3;
}

}  // namespace tally
