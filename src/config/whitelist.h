// The whitelist: which keys may be reported, and with which options.
#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "config/key_table.h"
#include "config/whitelist_file.h"
#include "config/whitelist_options.h"
#include "kv/value.h"

namespace tally {

// Why a key is admitted.
enum class WhitelistMatchKind { None, Exact, Prefix, InternalDevice };
// A key or prefix that is in force. One for each entry of a large file, so it holds little.
struct ListedKey {
  const char* text;
  std::uint32_t length;
  std::uint32_t source;  // its options and group, in the whitelist

  std::string_view key() const { return {text, length}; }
};
inline std::string_view keyText(const ListedKey& listed) { return listed.key(); }

// Borrowed from the whitelist.
struct WhitelistMatch {
  WhitelistMatchKind kind = WhitelistMatchKind::None;
  const ListedKey* entry = nullptr;        // for Exact and Prefix
  const ScalarOptions* options = nullptr;  // null for None
  std::string_view group = {};             // of the entry
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
  using Entries = KeyTable<ListedKey>;
  struct Source {
    const ScalarOptions* options;
    std::string_view group;
  };
  WhitelistMatch matchOf(WhitelistMatchKind kind, const ListedKey& entry) const;
  WhitelistMatch match(std::string_view key, const Entries& keys, const Entries& prefixes) const;
  const ScalarOptions* logged(const WhitelistMatch& match, std::string_view key) const;

  SystemLog& log_;
  const bool isInternalDevice_;
  std::string fileDigest_;
  std::shared_ptr<const WhitelistTexts> texts_;  // what the entries point into
  std::vector<Source> sources_;
  Entries scalarKeys_, scalarPrefixes_, distributionKeys_, distributionPrefixes_;
  KvRef<KvDictionary> noOptions_ = KvDictionary::create();
};

}  // namespace tally
