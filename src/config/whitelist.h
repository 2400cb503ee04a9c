// The whitelist: which keys may be reported, and with which options.
#pragma once

#include <memory>
#include <string>
#include <string_view>

#include "config/key_table.h"
#include "config/whitelist_file.h"
#include "config/whitelist_options.h"
#include "kv/value.h"

namespace tally {

// Why a key is admitted.
enum class WhitelistMatchKind { None, Exact, Prefix, InternalDevice };
struct WhitelistMatch {
  WhitelistMatchKind kind = WhitelistMatchKind::None;
  const WhitelistEntry* entry = nullptr;   // for Exact and Prefix
  const ScalarOptions* options = nullptr;  // null for None; borrowed from the whitelist
};

class Whitelist {
 public:
  // Reads the whitelist file. Null when it cannot be read or parsed; the reason is logged. A group,
  // section or option that is malformed is skipped with one error line that names it. The platform
  // must outlive the whitelist.
  static std::unique_ptr<Whitelist> load(Platform& platform);
  // The same from a file that was loaded already.
  static std::unique_ptr<Whitelist> fromFile(Platform& platform, const WhitelistFile& file);

  // Null: the key must not be reported. Any dictionary, empty or not: report it with these options.
  // The dictionary lives as long as the whitelist and must not be changed. A match that is not
  // exact is logged at debug level.
  const ScalarOptions* scalarOptions(std::string_view key) const;
  const ScalarOptions* distributionOptions(std::string_view key) const;
  // MD5 of the file's bytes as read, 32 lowercase hexadecimal digits.
  const std::string& fileDigest() const { return fileDigest_; }

  // The same answers with their reasons; nothing is logged.
  WhitelistMatch matchScalarKey(std::string_view key) const;
  WhitelistMatch matchDistributionKey(std::string_view key) const;

 private:
  explicit Whitelist(Platform& platform);
  class Loader;
  using Entries = KeyTable<WhitelistEntry>;
  WhitelistMatch match(std::string_view key, const Entries& keys, const Entries& prefixes) const;
  const ScalarOptions* logged(const WhitelistMatch& match, std::string_view key) const;

  SystemLog& log_;
  const bool isInternalDevice_;
  std::string fileDigest_;
  Entries scalarKeys_, scalarPrefixes_, distributionKeys_, distributionPrefixes_;
  KvRef<KvDictionary> noOptions_ = KvDictionary::create();
};

}  // namespace tally
