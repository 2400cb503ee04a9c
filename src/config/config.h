// TBConfig: the key whitelist, read once for each report.
#pragma once

#include <memory>
#include <string>
#include <string_view>

#include "config/key_table.h"
#include "config/scalar_options.h"
#include "config/whitelist_file.h"
#include "kv/value.h"

namespace tally {

// How a key came to be admitted.
enum class WhitelistMatchKind { None, Exact, Prefix, InternalDevice };
struct WhitelistMatch {
  WhitelistMatchKind kind = WhitelistMatchKind::None;
  const WhitelistEntry* entry = nullptr;   // for Exact and Prefix
  const ScalarOptions* options = nullptr;  // null for None; borrowed from the TBConfig
};

class TBConfig {
 public:
  // Reads the whitelist file. Null when it cannot be read or parsed; the reason is logged. A group,
  // section or option that is malformed is left out with one error line that names it.
  static std::unique_ptr<TBConfig> init();
  // The same with a file that was loaded already.
  static std::unique_ptr<TBConfig> initWithFile(const WhitelistFile& file);

  // Null: the key must not be reported. Any dictionary, empty or not: report it with these options.
  // The dictionary lives as long as the TBConfig and must not be changed.
  const ScalarOptions* configOptionsForScalarKey(std::string_view key) const;
  const ScalarOptions* configOptionsForDistributionKey(std::string_view key) const;
  // MD5 of the file's bytes as read, 32 lowercase hexadecimal digits.
  const std::string& configFileDigest() const { return _configFileDigest; }

  // The same answers with their reasons, for tools; nothing is logged.
  WhitelistMatch matchScalarKey(std::string_view key) const;
  WhitelistMatch matchDistributionKey(std::string_view key) const;
  bool isInternalDevice() const { return _isInternalDevice; }

 private:
  TBConfig() = default;
  class Loader;
  WhitelistMatch match(std::string_view key, const KeyTable& keys, const KeyTable& prefixes) const;

  KeyTable _scalarKeys;
  KeyTable _scalarPrefixes;
  KeyTable _distributionKeys;
  KeyTable _distributionPrefixes;
  bool _isInternalDevice = false;
  std::string _configFileDigest;
  KvRef<KvDictionary> _noOptions = KvDictionary::create();
};

}  // namespace tally
