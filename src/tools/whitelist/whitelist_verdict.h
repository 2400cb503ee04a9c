// Whether a key would be reported, by which entry, or why not.
#pragma once

#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "config/whitelist.h"
#include "tools/frame/output.h"
#include "tools/whitelist/absence.h"
#include "tools/whitelist/whitelist_index.h"

namespace tally::tools {

enum class KeyKind { Scalar, Distribution };
std::string_view kindName(KeyKind kind);  // "scalar", "distribution"

// "sig_fig 2", "intervals of 5 numbers", "no options".
std::string optionsText(const KvDictionary& options);

struct KeyVerdict {
  KeyKind kind = KeyKind::Scalar;
  WhitelistMatch match;              // the decisive entry; its kind is None when the key is refused
  std::string reason;                // in words, either way
  std::optional<Absence> absence;    // why it is refused
  std::vector<KeyCandidate> others;  // entries of the same kind that do not decide
  bool admitted() const { return match.options != nullptr; }
};

// A whitelist with everything that its verdicts refer to.
class WhitelistJudge {
 public:
  // The platform must outlive the judge.
  WhitelistJudge(Platform& platform, WhitelistFile file);
  const WhitelistFile& file() const { return file_; }
  // Null when the file cannot be used. Valid as long as the judge.
  const WhitelistIndex* index() const { return index_.get(); }
  // Null when the key is refused. Much quicker than a verdict. Valid as long as the judge.
  WhitelistMatch match(std::string_view key, KeyKind kind) const;
  // Why a key that does not match is refused.
  AbsenceReason whyRefused(std::string_view key, KeyKind kind) const;
  // Valid as long as the judge.
  KeyVerdict judge(std::string_view key, KeyKind kind) const;

 private:
  WhitelistFile file_;
  std::unique_ptr<Whitelist> config_;      // null when the file cannot be used
  std::unique_ptr<WhitelistIndex> index_;  // as well
};

Json jsonOf(const KeyVerdict& verdict);

}  // namespace tally::tools
