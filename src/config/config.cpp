#include "config/config.h"

#include <md5.h>

#include <algorithm>
#include <utility>

#include "config/internal_device.h"
#include "kv/plist_codec.h"
#include "platform/platform.h"

namespace tally {
namespace {

std::string md5Text(std::string_view bytes) {
  MD5_CTX context;
  MD5Init(&context);
  MD5Update(&context, reinterpret_cast<const std::uint8_t*>(bytes.data()), bytes.size());
  std::uint8_t digest[MD5_DIGEST_LENGTH];
  MD5Final(digest, &context);
  std::string text;
  for (const std::uint8_t byte : digest) fmt::format_to(std::back_inserter(text), "{:02x}", byte);
  return text;
}

// The options that can be used; the others are named in one error line each.
KvRef<KvDictionary> wellFormedOptions(KvDictionary& options, std::string_view group,
                                      std::string_view section, std::string_view key) {
  const auto wellFormed = [](const KvDictionary::Entry& option) {
    return isWellFormedOption(option.key->view(), *option.value);
  };
  if (std::all_of(options.begin(), options.end(), wellFormed)) {
    return KvRef<KvDictionary>::share(&options);
  }
  auto kept = KvDictionary::create();
  for (const auto& option : options) {
    if (wellFormed(option)) {
      kept->set(option.key, option.value);
    } else {
      logMessage(LogLevel::Error, "whitelist: group {}, {}, key {}: malformed option {} skipped",
                 group, section, key, option.key->view());
    }
  }
  return kept;
}

const ScalarOptions* logged(const WhitelistMatch& match, std::string_view key) {
  if (match.kind == WhitelistMatchKind::Prefix) {
    logMessage(LogLevel::Debug, "prefix match {} for {}", match.entry->key->view(), key);
  } else if (match.kind == WhitelistMatchKind::InternalDevice) {
    logMessage(LogLevel::Debug, "passing @{{}} for {} as device is Orrery Internal", key);
  }
  return match.options;
}

}  // namespace

std::unique_ptr<TBConfig> TBConfig::init() {
  auto config = std::unique_ptr<TBConfig>(new TBConfig());
  config->_isInternalDevice = TBIsInternalDevice();
  auto file = platform().files->readFile(kWhitelistPath, kPlistMaximumBytes);
  if (!file) {
    logMessage(LogLevel::Error, "Couldn't load whitelist");
    // The fixed text does not say why, and an operator needs to know.
    logMessage(LogLevel::Info, "whitelist: {}", file.error().message);
    return nullptr;
  }
  config->_configFileDigest = md5Text(*file);
  const auto parsed = decodePlist(*file);
  const auto* root = parsed ? kvCast<KvDictionary>(parsed->get()) : nullptr;
  if (root == nullptr) {
    logMessage(LogLevel::Error, "Couldn't parse the contents of the config file. Error: {}",
               parsed ? "the root is not a dictionary" : parsed.error().message);
    return nullptr;
  }
  config->addGroups(*root);
  config->_scalarPrefixes.buildPrefixIndex();
  config->_distributionPrefixes.buildPrefixIndex();
  return config;
}

void TBConfig::addGroups(const KvDictionary& root) {
  for (const auto& group : root) {
    const std::string_view name = group.key->view();
    if (!groupIsInForce(name)) continue;
    if (const auto* sections = kvCast<KvDictionary>(group.value.get())) {
      addGroup(group.key, *sections);
    } else {
      logMessage(LogLevel::Error, "whitelist: malformed group {} skipped", name);
      _skippedGroups.push_back({std::string(name), "it is not a dictionary"});
    }
  }
}

bool TBConfig::groupIsInForce(std::string_view group) {
  if (_isInternalDevice) return true;
  if (group == kInternalTestingGroup) {
    _skippedGroups.push_back({std::string(group), "it is for internal devices only"});
    return false;
  }
  bool exists = false;
  const bool enabled =
      platform().preferences->SMAPreferencesGetBoolValue(group, kGroupSwitchDomain, &exists);
  if (enabled || !exists) return true;
  logMessage(LogLevel::Default, "keyGroup {} is disabled by tasking", group);
  _skippedGroups.push_back({std::string(group), "it is disabled by tasking"});
  return false;
}

void TBConfig::addGroup(const KvRef<KvString>& group, const KvDictionary& sections) {
  const std::pair<std::string_view, KeyTable*> tables[] = {
      {"ScalarKeys", &_scalarKeys},
      {"DistributionKeys", &_distributionKeys},
      {"ScalarKeyPrefixes", &_scalarPrefixes},
      {"DistributionKeyPrefixes", &_distributionPrefixes},
  };
  for (const auto& section : sections) {
    const std::string_view name = section.key->view();
    const auto table = std::find_if(std::begin(tables), std::end(tables),
                                    [name](const auto& row) { return row.first == name; });
    if (table == std::end(tables)) continue;
    if (const auto* keys = kvCast<KvDictionary>(section.value.get())) {
      addSection(group, name, *keys, *table->second);
    } else {
      logMessage(LogLevel::Error, "whitelist: group {}: malformed section {} skipped",
                 group->view(), name);
    }
  }
}

void TBConfig::addSection(const KvRef<KvString>& group, std::string_view section,
                          const KvDictionary& keys, KeyTable& table) {
  table.reserve(keys.size());
  for (const auto& item : keys) {
    if (auto* options = kvCast<KvDictionary>(item.value.get())) {
      table.set(
          {item.key, wellFormedOptions(*options, group->view(), section, item.key->view()), group});
    } else {
      logMessage(LogLevel::Error, "whitelist: group {}, {}: malformed options of key {}, skipped",
                 group->view(), section, item.key->view());
    }
  }
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
