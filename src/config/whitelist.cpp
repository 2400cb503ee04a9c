#include "config/whitelist.h"

#include <iterator>
#include <utility>

#include "config/internal_device.h"

namespace tally {

// Fills the tables from the groups that are in force.
class Whitelist::Loader final : public WhitelistVisitor {
 public:
  Loader(Platform& platform, Whitelist& whitelist)
      : platform_(platform),
        log_(*platform.log),
        sources_(whitelist.sources_),
        tables_{&whitelist.scalarKeys_, &whitelist.distributionKeys_, &whitelist.scalarPrefixes_,
                &whitelist.distributionPrefixes_} {}

  bool beginGroup(std::string_view name) override {
    const GroupState state = groupState(platform_, name);
    if (state == GroupState::DisabledByTasking) {
      log_.repeated(LogLevel::Default, "keyGroups disabled by tasking",
                    "keyGroup {} is disabled by tasking", name);
    } else if (state == GroupState::SwitchUnreadable) {
      log_.repeated(LogLevel::Error, "keyGroups whose switch cannot be read",
                    "keyGroup {} is left out: its switch cannot be read", name);
    }
    return state == GroupState::InForce;
  }
  void beginSection(WhitelistSection section, std::size_t entries) override {
    tables_[static_cast<std::size_t>(section)]->reserve(entries);
  }
  void entry(WhitelistSection section, const WhitelistEntry& entry) override {
    Entries& table = *tables_[static_cast<std::size_t>(section)];
    if (waitingFor_ != &table || waiting_ == std::size(waitingEntries_)) flush();
    waitingFor_ = &table;
    waitingEntries_[waiting_++] = {
        {entry.key.data(), static_cast<std::uint32_t>(entry.key.size()), sourceOf(entry)},
        table.prepare(entry.key)};
  }
  // After the last entry.
  void flush() {
    for (std::size_t i = 0; i < waiting_; ++i) {
      waitingFor_->set(waitingEntries_[i].entry, waitingEntries_[i].hash);
    }
    waiting_ = 0;
  }
  void malformed(const WhitelistPlace& place) override {
    if (place.option) {
      log_.fault("whitelist: malformed options",
                 "whitelist: group {}, {}, key {}: malformed option {} skipped", place.group,
                 *place.section, *place.key, *place.option);
    } else if (place.key) {
      log_.fault("whitelist: malformed keys",
                 "whitelist: group {}, {}: malformed options of key {}, skipped", place.group,
                 *place.section, *place.key);
    } else if (place.section) {
      log_.fault("whitelist: malformed sections",
                 "whitelist: group {}: malformed section {} skipped", place.group, *place.section);
    } else {
      log_.fault("whitelist: malformed groups", "whitelist: malformed group {} skipped",
                 place.group);
    }
  }

 private:
  // The entries of a group mostly share a few options, so that a small memory finds nearly all.
  std::uint32_t sourceOf(const WhitelistEntry& entry) {
    const auto address =
        reinterpret_cast<std::uintptr_t>(entry.options.get()) / alignof(ScalarOptions);
    std::uint32_t& recent = recent_[(address ^ address >> 6) % std::size(recent_)];
    if (recent >= sources_.size() || sources_[recent].options != entry.options.get() ||
        sources_[recent].group.data() != entry.group.data()) {
      recent = static_cast<std::uint32_t>(sources_.size());
      sources_.push_back({entry.options.get(), entry.group});
    }
    return recent;
  }

  Platform& platform_;
  SystemLog& log_;
  std::vector<Source>& sources_;
  std::uint32_t recent_[64] = {};  // of sources_
  // Prepared for a table, and not in it yet.
  struct Waiting {
    ListedKey entry;
    std::uint32_t hash;
  };
  Waiting waitingEntries_[32];
  std::size_t waiting_ = 0;
  Entries* waitingFor_ = nullptr;
  Entries* const tables_[kWhitelistSections];  // in the order of WhitelistSection
};

Whitelist::Whitelist(Platform& platform)
    : log_(*platform.log), isInternalDevice_(tally::isInternalDevice(platform)) {}

std::unique_ptr<Whitelist> Whitelist::load(Platform& platform) {
  return fromFile(platform, loadWhitelistFile(platform));
}

std::unique_ptr<Whitelist> Whitelist::fromFile(Platform& platform, const WhitelistFile& file) {
  auto whitelist = std::unique_ptr<Whitelist>(new Whitelist(platform));
  SystemLog& log = *platform.log;
  if (!file.read) {
    log.message(LogLevel::Error, "Couldn't load whitelist");
    // The fixed text does not give the reason.
    log.message(LogLevel::Info, "whitelist: {}", file.fault);
    return nullptr;
  }
  whitelist->fileDigest_ = file.digest;
  if (!file.content) {
    log.message(LogLevel::Error, "Couldn't parse the contents of the config file. Error: {}",
                file.fault);
    return nullptr;
  }
  Loader loader(platform, *whitelist);
  whitelist->texts_ = file.content->texts();
  visitWhitelist(*file.content, loader);
  loader.flush();
  whitelist->scalarPrefixes_.buildPrefixIndex();
  whitelist->distributionPrefixes_.buildPrefixIndex();
  return whitelist;
}

WhitelistMatch Whitelist::matchOf(WhitelistMatchKind kind, const ListedKey& entry) const {
  const Source& source = sources_[entry.source];
  return {kind, &entry, source.options, source.group};
}

WhitelistMatch Whitelist::match(std::string_view key, const Entries& keys,
                                const Entries& prefixes) const {
  if (const ListedKey* entry = keys.exact(key)) {
    return matchOf(WhitelistMatchKind::Exact, *entry);
  }
  if (const ListedKey* entry = prefixes.longestPrefix(key)) {
    return matchOf(WhitelistMatchKind::Prefix, *entry);
  }
  if (isInternalDevice_) return {WhitelistMatchKind::InternalDevice, nullptr, noOptions_.get(), {}};
  return {};
}

const ScalarOptions* Whitelist::logged(const WhitelistMatch& match, std::string_view key) const {
  if (match.kind == WhitelistMatchKind::Prefix) {
    log_.message(LogLevel::Debug, "prefix match {} for {}", match.entry->key(), key);
  } else if (match.kind == WhitelistMatchKind::InternalDevice) {
    log_.message(LogLevel::Debug, "passing @{{}} for {} as device is Orrery Internal", key);
  }
  return match.options;
}

WhitelistMatch Whitelist::matchScalarKey(std::string_view key) const {
  return match(key, scalarKeys_, scalarPrefixes_);
}

WhitelistMatch Whitelist::matchDistributionKey(std::string_view key) const {
  return match(key, distributionKeys_, distributionPrefixes_);
}

const ScalarOptions* Whitelist::scalarOptions(std::string_view key) const {
  return logged(matchScalarKey(key), key);
}

const ScalarOptions* Whitelist::distributionOptions(std::string_view key) const {
  return logged(matchDistributionKey(key), key);
}

}  // namespace tally
