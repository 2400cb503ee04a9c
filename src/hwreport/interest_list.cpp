#include "hwreport/interest_list.h"

#include <cstring>
#include <new>

#include "hwreport/channel.h"
#include "hwreport/channel_walk.h"
#include "hwreport/type_word.h"

namespace tally {
namespace {

constexpr std::size_t kCountOffset = 0;  // 32 bits; 32 reserved ones follow
constexpr std::size_t kHeaderSize = 8;
constexpr std::size_t kEntrySize = 24;  // driver id, channel id, type word

template <class T>
void write(std::vector<std::byte>& list, std::size_t offset, T value) {
  std::memcpy(list.data() + offset, &value, sizeof(value));
}

}  // namespace

std::optional<std::vector<std::byte>> createInterestList(KvDictionary* desired, std::size_t count) {
  if (count > kMaximumInterests) return std::nullopt;
  std::vector<std::byte> list;
  try {
    list.resize(kHeaderSize + kEntrySize * count);
  } catch (const std::bad_alloc&) {
    return std::nullopt;
  }
  write(list, kCountOffset, static_cast<std::uint32_t>(count));
  std::size_t offset = kHeaderSize;
  const int result = iterateChannels(desired, [&](KvDictionary* channel) {
    const std::uint64_t driverID = HwReportChannelGetDriverID(channel);
    const std::uint64_t channelID = HwReportChannelGetChannelID(channel);
    const auto type = typeWordOf(channel);
    if (driverID == kHwReportInvalidValue || channelID == kHwReportInvalidValue || !type ||
        offset == list.size()) {
      return 1;
    }
    write(list, offset, driverID);
    write(list, offset + 8, channelID);
    write(list, offset + 16, type->bits);
    offset += kEntrySize;
    return HwIterContinue;
  });
  if (walkFailed(result) || offset != list.size()) return std::nullopt;
  return list;
}

}  // namespace tally
