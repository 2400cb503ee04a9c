// Whether a key would be reported, by which entry, or why not.
#pragma once

#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "config/whitelist.h"
#include "tools/frame/output.h"

namespace tally::tools {

enum class KeyKind { Scalar, Distribution };
std::string_view kindName(KeyKind kind);  // "scalar", "distribution"

// "sig_fig 2", "intervals of 5 numbers", "no options".
std::string optionsText(const KvDictionary& options);

// An entry of the file that names a key, in force or not, decisive or not.
struct KeyCandidate {
  WhitelistSection section;
  WhitelistEntry entry;
  GroupState state;
};

struct KeyVerdict {
  KeyKind kind = KeyKind::Scalar;
  WhitelistMatch match;              // the decisive entry; its kind is None when the key is refused
  std::string reason;                // in words, either way
  std::vector<KeyCandidate> others;  // entries of the same kind that do not decide
  bool admitted() const { return match.options != nullptr; }
};

// A whitelist with everything that its verdicts refer to.
class WhitelistJudge {
 public:
  // The platform must outlive the judge.
  WhitelistJudge(Platform& platform, WhitelistFile file);
  const WhitelistFile& file() const { return file_; }
  // Valid as long as the judge.
  KeyVerdict judge(std::string_view key, KeyKind kind) const;

 private:
  Platform& platform_;
  WhitelistFile file_;
  std::unique_ptr<Whitelist> config_;  // null when the file cannot be used
};

Json jsonOf(const KeyVerdict& verdict);

}  // namespace tally::tools
