// The channels that the kernel's sources have on a device at one time.
#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <unordered_map>
#include <vector>

#include "host/kernel/findings.h"
#include "host/registry/registry_source.h"
#include "host/tree/system_tree.h"

namespace tally {

// Categories of type words.
constexpr std::uint16_t kRawCategory = 0x1;
constexpr std::uint16_t kSweptCategory = 0x100;

TypeWord typeOf(const ChannelRow& row, std::uint16_t category, std::uint16_t elements);

// A channel of the daily sweep: the sum over channels of one row.
struct DailyChannel {
  std::string name;
  const ChannelRow* row;
  std::vector<std::uint32_t> channels;
};

class KernelChannels {
 public:
  // Finds everything there is.
  explicit KernelChannels(const SystemTree& tree);

  const Findings& findings() const { return findings_; }
  const std::string& name(std::size_t channel) const { return names_[channel]; }
  const std::vector<std::string>& names() const { return names_; }
  // The channel's name in the store.
  std::string lastingName(std::size_t channel) const;
  const std::vector<DailyChannel>& daily() const { return daily_; }
  // Whether nothing came, went or was made again since the other was found.
  bool isSame(const KernelChannels& other) const;
  // By channel id; null if there is none.
  const FoundChannel* channel(std::uint64_t id) const;
  const DailyChannel* dailyChannel(std::uint64_t id) const;
  // One driver for each source that has channels, one for the sweep's, and the hub.
  RegistrySource::Entries entries() const;

  // The id of a channel: the same for the same name, on every machine.
  static std::uint64_t idOf(std::string_view name);
  // Entries' ids.
  static constexpr std::uint64_t kHubID = 0x4B00000000, kDailyID = kHubID + 1,
                                 kFirstDriverID = kHubID + 0x100;

 private:
  void addDaily(std::uint32_t channel);

  Findings findings_;
  std::vector<std::string> names_;  // of the channels
  std::vector<DailyChannel> daily_;
  std::unordered_map<std::string, std::size_t> dailyByName_;
  std::unordered_map<std::uint64_t, std::uint32_t> byID_, dailyByID_;
};

}  // namespace tally
