#include "config/whitelist.h"

#include <utility>

#include "config/internal_device.h"

namespace tally {

// Fills the tables from the groups that are in force.
class Whitelist::Loader final : public WhitelistVisitor {
 public:
  Loader(Platform& platform, Whitelist& whitelist)
      : platform_(platform),
        log_(*platform.log),
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
  void entry(WhitelistSection section, WhitelistEntry entry) override {
    tables_[static_cast<std::size_t>(section)]->set(std::move(entry));
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
  Platform& platform_;
  SystemLog& log_;
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
  if (!file.root) {
    log.message(LogLevel::Error, "Couldn't parse the contents of the config file. Error: {}",
                file.fault);
    return nullptr;
  }
  Loader loader(platform, *whitelist);
  visitWhitelist(*file.root, loader);
  whitelist->scalarPrefixes_.buildPrefixIndex();
  whitelist->distributionPrefixes_.buildPrefixIndex();
  return whitelist;
}

WhitelistMatch Whitelist::match(std::string_view key, const Entries& keys,
                                const Entries& prefixes) const {
  if (const WhitelistEntry* entry = keys.exact(key)) {
    return {WhitelistMatchKind::Exact, entry, entry->options.get()};
  }
  if (const WhitelistEntry* entry = prefixes.longestPrefix(key)) {
    return {WhitelistMatchKind::Prefix, entry, entry->options.get()};
  }
  if (isInternalDevice_) return {WhitelistMatchKind::InternalDevice, nullptr, noOptions_.get()};
  return {};
}

const ScalarOptions* Whitelist::logged(const WhitelistMatch& match, std::string_view key) const {
  if (match.kind == WhitelistMatchKind::Prefix) {
    log_.message(LogLevel::Debug, "prefix match {} for {}", match.entry->key->view(), key);
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
