#include "config/config.h"

#include <utility>

#include "config/internal_device.h"
#include "platform/platform.h"

namespace tally {
namespace {

const ScalarOptions* logged(const WhitelistMatch& match, std::string_view key) {
  if (match.kind == WhitelistMatchKind::Prefix) {
    logMessage(LogLevel::Debug, "prefix match {} for {}", match.entry->key->view(), key);
  } else if (match.kind == WhitelistMatchKind::InternalDevice) {
    logMessage(LogLevel::Debug, "passing @{{}} for {} as device is Orrery Internal", key);
  }
  return match.options;
}

}  // namespace

// Fills the tables from the groups that are in force.
class TBConfig::Loader final : public WhitelistVisitor {
 public:
  explicit Loader(TBConfig& config)
      : tables_{&config._scalarKeys, &config._distributionKeys, &config._scalarPrefixes,
                &config._distributionPrefixes} {}

  bool beginGroup(std::string_view name) override {
    const GroupState state = groupState(name);
    if (state == GroupState::DisabledByTasking) {
      logBounded(LogLevel::Default, "keyGroups disabled by tasking",
                 "keyGroup {} is disabled by tasking", name);
    } else if (state == GroupState::SwitchUnreadable) {
      logBounded(LogLevel::Error, "keyGroups whose switch cannot be read",
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
      logFault("whitelist: malformed options",
               "whitelist: group {}, {}, key {}: malformed option {} skipped", place.group,
               *place.section, *place.key, *place.option);
    } else if (place.key) {
      logFault("whitelist: malformed keys",
               "whitelist: group {}, {}: malformed options of key {}, skipped", place.group,
               *place.section, *place.key);
    } else if (place.section) {
      logFault("whitelist: malformed sections", "whitelist: group {}: malformed section {} skipped",
               place.group, *place.section);
    } else {
      logFault("whitelist: malformed groups", "whitelist: malformed group {} skipped", place.group);
    }
  }

 private:
  KeyTable* const tables_[kWhitelistSections];  // in the order of WhitelistSection
};

std::unique_ptr<TBConfig> TBConfig::init() { return initWithFile(loadWhitelistFile()); }

std::unique_ptr<TBConfig> TBConfig::initWithFile(const WhitelistFile& file) {
  auto config = std::unique_ptr<TBConfig>(new TBConfig());
  config->_isInternalDevice = TBIsInternalDevice();
  if (!file.read) {
    logMessage(LogLevel::Error, "Couldn't load whitelist");
    // The fixed text does not say why, and an operator needs to know.
    logMessage(LogLevel::Info, "whitelist: {}", file.fault);
    return nullptr;
  }
  config->_configFileDigest = file.digest;
  if (!file.root) {
    logMessage(LogLevel::Error, "Couldn't parse the contents of the config file. Error: {}",
               file.fault);
    return nullptr;
  }
  Loader loader(*config);
  visitWhitelist(*file.root, loader);
  config->_scalarPrefixes.buildPrefixIndex();
  config->_distributionPrefixes.buildPrefixIndex();
  return config;
}

WhitelistMatch TBConfig::match(std::string_view key, const KeyTable& keys,
                               const KeyTable& prefixes) const {
  if (const WhitelistEntry* entry = keys.exact(key)) {
    return {WhitelistMatchKind::Exact, entry, entry->options.get()};
  }
  if (const WhitelistEntry* entry = prefixes.longestPrefix(key)) {
    return {WhitelistMatchKind::Prefix, entry, entry->options.get()};
  }
  if (_isInternalDevice) return {WhitelistMatchKind::InternalDevice, nullptr, _noOptions.get()};
  return {};
}

WhitelistMatch TBConfig::matchScalarKey(std::string_view key) const {
  return match(key, _scalarKeys, _scalarPrefixes);
}

WhitelistMatch TBConfig::matchDistributionKey(std::string_view key) const {
  return match(key, _distributionKeys, _distributionPrefixes);
}

const ScalarOptions* TBConfig::configOptionsForScalarKey(std::string_view key) const {
  return logged(matchScalarKey(key), key);
}

const ScalarOptions* TBConfig::configOptionsForDistributionKey(std::string_view key) const {
  return logged(matchDistributionKey(key), key);
}

}  // namespace tally
