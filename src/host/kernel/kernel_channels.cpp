#include "host/kernel/kernel_channels.h"

#include <algorithm>
#include <map>
#include <tuple>

#include "host/kernel/source_table.h"
#include "platform/protocol/hub_protocol.h"

namespace tally {
namespace {

// A machine with more devices of a kind reports the first of them.
constexpr unsigned kMostSweptDevices = 4;

constexpr std::string_view kDriverClass = "KernelStatistics";
constexpr std::string_view kDailyName = "day", kDailyTitle = "Since the day before";

std::string nameOf(const FoundChannel& channel, std::string_view device) {
  std::string name(sourceRow(channel.row->source).name);
  for (const std::string_view part : {device, std::string_view(channel.item), channel.row->name}) {
    if (!part.empty()) name.append(".").append(part);
  }
  return name;
}

std::string dailyName(const ChannelRow& row, const FoundDevice& device) {
  std::string name;
  for (const char letter : row.daily) {
    if (letter == '#') {
      name += std::to_string(*device.ordinal);
    } else if (letter == '%') {
      name += device.kind;
    } else {
      name += letter;
    }
  }
  return name;
}

// Groups of channels that share what a legend says once for a group.
class Legend {
 public:
  void add(std::string_view group, const std::string& subgroup, const ChannelRow& row,
           const std::string& name, TypeWord type) {
    auto line = KvArray::create();
    line->append(KvNumber::uint64(KernelChannels::idOf(name)));
    line->append(KvNumber::uint64(type.bits));
    line->append(KvString::create(name));
    line->append(details(row));
    channelsOf(group, subgroup, row.unit).append(std::move(line));
  }
  bool empty() const { return groups_.empty(); }
  KvRef<KvArray> take() { return std::move(legend_); }

 private:
  KvRef<KvDictionary> details(const ChannelRow& row) {
    KvRef<KvDictionary>& known = details_[&row];
    if (!known) {
      known = KvDictionary::create({
          {kDetailSemantics, KvString::create(textOf(row.semantics))},
          {kDetailScope, KvString::create(textOf(row.scope))},
          {kDetailWidth, KvNumber::int32(row.width)},
          {kDetailFile, KvString::create(row.file)},
          {kDetailDescription, KvString::create(row.description)},
      });
    }
    return known;
  }

  KvArray& channelsOf(std::string_view group, const std::string& subgroup, std::uint64_t unit) {
    KvArray*& channels = groups_[{std::string(group), subgroup, unit}];
    if (channels == nullptr) {
      auto lines = KvArray::create();
      channels = lines.get();
      auto entry = KvDictionary::create({{kLegendGroupName, KvString::create(group)}});
      if (!subgroup.empty()) entry->set(kLegendSubGroupName, KvString::create(subgroup));
      entry->set(kLegendChannelInfo,
                 KvDictionary::create({{kLegendChannelUnit, KvNumber::uint64(unit)}}));
      entry->set(kLegendChannelsKey, std::move(lines));
      legend_->append(std::move(entry));
    }
    return *channels;
  }

  KvRef<KvArray> legend_ = KvArray::create();
  std::map<std::tuple<std::string, std::string, std::uint64_t>, KvArray*> groups_;
  std::map<const ChannelRow*, KvRef<KvDictionary>> details_;
};

std::shared_ptr<const RegistryEntry> driverEntry(std::string_view name, std::uint64_t id,
                                                 KvRef<KvArray> legend) {
  auto entry = std::make_shared<RegistryEntry>();
  entry->className = kDriverClass;
  entry->name = name;
  entry->id = id;
  entry->parents = {KernelChannels::kHubID};
  entry->properties = KvDictionary::create(
      {{kLegendPublicProperty, KvBoolean::of(true)}, {kLegendProperty, std::move(legend)}});
  return entry;
}

}  // namespace

TypeWord typeOf(const ChannelRow& row, std::uint16_t category, std::uint16_t elements) {
  return {std::uint64_t{static_cast<std::uint8_t>(row.format)} | std::uint64_t{category} << 16 |
          std::uint64_t{elements} << 32};
}

KernelChannels::KernelChannels(const SystemTree& tree) {
  Findings found;
  for (const SourceRow& source : sourceTable()) {
    if (source.find != nullptr) source.find(tree, found);
  }
  findings_ = std::move(found);
  const auto& channels = findings_.channels();
  names_.resize(channels.size());
  for (std::uint32_t i = 0; i < channels.size(); ++i) {
    names_[i] = nameOf(channels[i], channels[i].device.name);
    // Two of one name could not be told apart: the first stays.
    if (byID_.try_emplace(idOf(names_[i]), i).second) addDaily(i);
  }
}

bool KernelChannels::isSame(const KernelChannels& other) const {
  const auto isSameFile = [](const FoundFile& a, const FoundFile& b) {
    return a.path == b.path && a.layout == b.layout;
  };
  const auto isSameDevice = [](const FoundChannel& a, const FoundChannel& b) {
    return a.device.identity == b.device.identity && a.device.ordinal == b.device.ordinal;
  };
  return names_ == other.names_ &&
         std::ranges::equal(findings_.files(), other.findings_.files(), isSameFile) &&
         std::ranges::equal(findings_.channels(), other.findings_.channels(), isSameDevice);
}

void KernelChannels::addDaily(std::uint32_t channel) {
  const FoundChannel& found = findings_.channels()[channel];
  const ChannelRow& row = *found.row;
  if (row.daily.empty() || !found.device.ordinal) return;
  const bool ofDevice = row.daily.find('#') != std::string_view::npos;
  if (ofDevice && *found.device.ordinal >= kMostSweptDevices) return;
  std::string name = dailyName(row, found.device);
  const auto [place, isNew] = dailyByName_.try_emplace(name, daily_.size());
  if (isNew) {
    dailyByID_.emplace(idOf(name), static_cast<std::uint32_t>(daily_.size()));
    daily_.push_back({std::move(name), &row, {}});
  }
  daily_[place->second].channels.push_back(channel);
}

std::uint64_t KernelChannels::idOf(std::string_view name) {
  std::uint64_t hash = 0xCBF29CE484222325;  // FNV-1a
  for (const char letter : name) {
    hash = (hash ^ static_cast<unsigned char>(letter)) * 0x100000001B3;
  }
  // The library's mark of a missing number is not an id.
  return hash != element::kMissingValue ? hash : hash + 1;
}

std::string KernelChannels::lastingName(std::size_t channel) const {
  const FoundChannel& found = findings_.channels()[channel];
  const FoundDevice& device = found.device;
  return nameOf(found, device.lasting.empty() ? device.name : device.lasting);
}

const FoundChannel* KernelChannels::channel(std::uint64_t id) const {
  const auto found = byID_.find(id);
  return found != byID_.end() ? &findings_.channels()[found->second] : nullptr;
}

const DailyChannel* KernelChannels::dailyChannel(std::uint64_t id) const {
  const auto found = dailyByID_.find(id);
  return found != dailyByID_.end() ? &daily_[found->second] : nullptr;
}

RegistrySource::Entries KernelChannels::entries() const {
  RegistrySource::Entries entries;
  if (findings_.channels().empty()) return entries;
  auto hub = std::make_shared<RegistryEntry>();
  hub->className = hub->name = kStatisticsHubClass;
  hub->id = kHubID;
  hub->properties = KvDictionary::create();
  entries.push_back(std::move(hub));

  std::map<std::string_view, Legend> legends;
  for (std::size_t i = 0; i < names_.size(); ++i) {
    const FoundChannel& channel = findings_.channels()[i];
    if (&channel != this->channel(idOf(names_[i]))) continue;
    const SourceRow& source = sourceRow(channel.row->source);
    legends[source.name].add(source.title, channel.device.name, *channel.row, names_[i],
                             typeOf(*channel.row, kRawCategory, channel.elements));
  }
  std::uint64_t id = kFirstDriverID;
  std::string_view last;
  for (const SourceRow& source : sourceTable()) {
    if (source.name == last) continue;
    last = source.name;
    const std::uint64_t driver = id++;  // counted in the order of the table, found or not
    const auto legend = legends.find(source.name);
    if (legend != legends.end()) {
      entries.push_back(driverEntry(source.name, driver, legend->second.take()));
    }
  }
  Legend legend;
  for (const DailyChannel& daily : daily_) {
    legend.add(kDailyTitle, "", *daily.row, daily.name, typeOf(*daily.row, kSweptCategory, 1));
  }
  if (!legend.empty()) entries.push_back(driverEntry(kDailyName, kDailyID, legend.take()));
  return entries;
}

}  // namespace tally
