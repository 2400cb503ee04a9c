// The plain scan that sampling must agree with: for each channel from the buffer's start.
#pragma once

#include <cstring>
#include <optional>
#include <span>

#include "hwreport/hwreport.h"

namespace tally::naive {

enum class ScanEnd { Found, NotFound, Stopped };

struct Scan {
  ScanEnd end = ScanEnd::NotFound;
  std::span<const std::byte> run = {};
};

template <class T>
T readAt(std::span<const std::byte> buffer, std::size_t offset) {
  T value;
  std::memcpy(&value, buffer.data() + offset, sizeof(value));
  return value;
}

inline Scan scan(std::span<const std::byte> buffer, std::uint64_t driver, std::uint64_t channel) {
  const std::size_t end = buffer.size() / 64 * 64;
  for (std::size_t at = 0; at < end;) {
    const std::size_t size = readAt<std::uint16_t>(buffer, at + 20) * std::size_t{64};
    if (size == 0) return {ScanEnd::Stopped};
    if (size > end - at) return {ScanEnd::NotFound};
    if (readAt<std::uint64_t>(buffer, at) == driver &&
        readAt<std::uint64_t>(buffer, at + 8) == channel) {
      return {ScanEnd::Found, buffer.subspan(at, size)};
    }
    at += size;
  }
  return {ScanEnd::NotFound};
}

// The sample of a flat collection; null when the scan of a channel was stopped.
inline KvRef<KvDictionary> createSamples(const KvDictionary& subscribed,
                                         std::span<const std::byte> buffer) {
  auto channels = KvArray::create();
  for (const auto& item : *subscribed.getAs<KvArray>("HwReportChannels")) {
    const auto& channel = static_cast<const KvDictionary&>(*item);
    const Scan found =
        scan(buffer, HwReportChannelGetDriverID(&channel), HwReportChannelGetChannelID(&channel));
    if (found.end == ScanEnd::Stopped) return nullptr;
    if (found.end == ScanEnd::NotFound) continue;
    auto copy = channel.copy();
    copy->set("RawElements", KvData::create(found.run));
    channels->append(std::move(copy));
  }
  return KvDictionary::create({{"HwReportChannels", channels}});
}

}  // namespace tally::naive
