#include "host/described/described_hub.h"

#include <algorithm>
#include <cstring>
#include <unordered_map>

#include "host/described/described_frames.h"
#include "host/registry/statistics_hub.h"

namespace tally {
namespace {

// A client that asks for the same large channel again and again gets no more memory than this.
constexpr std::size_t kMostRegionElements = (256u << 20) / element::kSize;

constexpr ElementValues kMissingElement;

template <class T>
void put(std::span<std::byte> memory, std::size_t offset, T value) {
  std::memcpy(memory.data() + offset, &value, sizeof value);
}

struct Channel {
  Interest interest;
  std::shared_ptr<const ChannelFrames> described;
};

class ChannelRegion final : public HubRegion {
 public:
  explicit ChannelRegion(std::vector<Channel> channels) : channels_(std::move(channels)) {
    for (const Channel& channel : channels_) elements_ += channel.described->elementCount;
  }
  std::size_t size() const override { return elements_ * element::kSize; }

  void writeFrame(std::size_t refresh, std::span<std::byte> memory) override {
    for (const Channel& channel : channels_) {
      const auto& frames = channel.described->frames;
      const auto& frame = frames[std::min(refresh, frames.size() - 1)];
      for (std::size_t i = 0; i < channel.described->elementCount; ++i) {
        const ElementValues& values = i < frame.size() ? frame[i] : kMissingElement;
        writeElement(channel, values, memory.first(element::kSize));
        memory = memory.subspan(element::kSize);
      }
    }
  }

 private:
  static void writeElement(const Channel& channel, const ElementValues& values,
                           std::span<std::byte> memory) {
    const TypeWord type{channel.interest.type != 0 ? channel.interest.type
                                                   : channel.described->type};
    const auto count = static_cast<std::uint16_t>(channel.described->elementCount);
    put(memory, element::kDriverID, channel.interest.driver);
    put(memory, element::kChannelID, channel.interest.channel);
    put(memory, element::kTypeWord, type.withElementCount(count).bits);
    put(memory, element::kUpdateTime, values.time);
    std::memcpy(memory.data() + element::kSlots, values.slots, sizeof values.slots);
  }

  std::vector<Channel> channels_;
  std::size_t elements_ = 0;
};

class RawRegion final : public HubRegion {
 public:
  explicit RawRegion(std::vector<std::vector<std::byte>> frames) : frames_(std::move(frames)) {
    for (const auto& frame : frames_) size_ = std::max(size_, frame.size());
  }
  std::size_t size() const override { return size_; }
  void writeFrame(std::size_t refresh, std::span<std::byte> memory) override {
    const auto& frame = frames_[std::min(refresh, frames_.size() - 1)];
    std::fill(std::copy(frame.begin(), frame.end(), memory.begin()), memory.end(), std::byte{0});
  }

 private:
  std::vector<std::vector<std::byte>> frames_;
  std::size_t size_ = 0;
};

using ChannelsByID = std::unordered_map<std::uint64_t, std::shared_ptr<const ChannelFrames>>;

// The type word that a driver's legend gives a channel, by channel id.
std::unordered_map<std::uint64_t, std::uint64_t> legendTypes(const RegistryEntry& driver) {
  std::unordered_map<std::uint64_t, std::uint64_t> types;
  const auto* groups = driver.properties->getAs<KvArray>(kLegendProperty);
  if (groups == nullptr) return types;
  for (const auto& group : *groups) {
    const auto* dictionary = kvCast<KvDictionary>(group.get());
    const auto* channels =
        dictionary != nullptr ? dictionary->getAs<KvArray>(kLegendChannelsKey) : nullptr;
    if (channels == nullptr) continue;
    for (const auto& item : *channels) {
      const auto* line = kvCast<KvArray>(item.get());
      const auto* id = line != nullptr ? line->getAs<KvNumber>(kLegendChannelID) : nullptr;
      const auto* type = line != nullptr ? line->getAs<KvNumber>(kLegendTypeWord) : nullptr;
      if (id != nullptr && type != nullptr) types.try_emplace(id->asUInt64(), type->asUInt64());
    }
  }
  return types;
}

// A channel that no client has. A region cannot be empty, and with a run of no elements in it, the
// samples of clients that only want a channel that is not served would fail.
Channel placeholderChannel() {
  ChannelFrames frames{0, {{kMissingElement}}, 1};
  return {{element::kMissingValue, element::kMissingValue, 0},
          std::make_shared<ChannelFrames>(std::move(frames))};
}

ChannelsByID describedChannels(const RegistryEntry& driver, DescribedFiles& files) {
  ChannelsByID channels;
  const auto* values = driver.properties->getAs<KvArray>("HwReportValues");
  if (values == nullptr) return channels;
  const auto types = legendTypes(driver);
  for (const auto& item : *values) {
    const auto* description = kvCast<KvDictionary>(item.get());
    const auto id = description != nullptr ? description->getInt64("Channel") : std::nullopt;
    auto frames = id ? parseChannelFrames(*description) : std::nullopt;
    if (!frames) {
      files.report("values of channels skipped",
                   "driver " + driver.name + ": malformed values of a channel, skipped: " +
                       (id ? std::to_string(*id) : std::string("no channel")));
      continue;
    }
    const auto key = static_cast<std::uint64_t>(*id);
    const auto type = types.find(key);
    if (frames->type == 0 && type != types.end()) frames->type = type->second;
    channels.try_emplace(key, std::make_shared<const ChannelFrames>(std::move(*frames)));
  }
  return channels;
}

// The runs of the channels that the drivers describe, in the order of the interests; null when they
// would take more than 256 MiB.
std::unique_ptr<HubRegion> makeChannelRegion(const std::vector<Interest>& interests,
                                             const RegistrySource::Entries& drivers,
                                             DescribedFiles& files) {
  std::unordered_map<std::uint64_t, const RegistryEntry*> entries;
  for (const auto& driver : drivers) entries.try_emplace(driver->id, driver.get());
  std::unordered_map<std::uint64_t, ChannelsByID> described;
  std::vector<Channel> channels;
  std::size_t elements = 0;
  for (const Interest& interest : interests) {
    const auto entry = entries.find(interest.driver);
    if (entry == entries.end()) continue;
    const auto [known, isNew] = described.try_emplace(interest.driver);
    if (isNew) known->second = describedChannels(*entry->second, files);
    const auto frames = known->second.find(interest.channel);
    if (frames == known->second.end()) continue;
    elements += frames->second->elementCount;
    if (elements > kMostRegionElements) return nullptr;
    channels.push_back({interest, frames->second});
  }
  if (channels.empty()) channels.push_back(placeholderChannel());
  return std::make_unique<ChannelRegion>(std::move(channels));
}

// Frames that are served unchanged, whatever is wanted; null when there are no bytes.
std::unique_ptr<HubRegion> makeRawRegion(const KvArray& frames, DescribedFiles& files) {
  std::vector<std::vector<std::byte>> regions;
  for (const auto& frame : frames) {
    auto bytes = files.bytes(*frame);
    if (bytes) regions.push_back(std::move(*bytes));
  }
  if (std::all_of(regions.begin(), regions.end(), [](const auto& r) { return r.empty(); })) {
    return nullptr;
  }
  return std::make_unique<RawRegion>(std::move(regions));
}

}  // namespace

std::unique_ptr<UserClient> openDescribedHub(KvRef<KvDictionary> description,
                                             std::shared_ptr<const RegistrySource::Entries> drivers,
                                             std::shared_ptr<DescribedFiles> files,
                                             RegistryResult* result) {
  const auto makeRegion = [description, drivers = std::move(drivers),
                           files = std::move(files)](const std::vector<Interest>& interests) {
    const auto* raw = description ? description->getAs<KvArray>("RawFrames") : nullptr;
    return raw != nullptr ? makeRawRegion(*raw, *files)
                          : makeChannelRegion(interests, *drivers, *files);
  };
  return openStatisticsHub(makeRegion, description, result);
}

}  // namespace tally
