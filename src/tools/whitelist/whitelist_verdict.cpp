#include "tools/whitelist/whitelist_verdict.h"

#include <algorithm>
#include <nlohmann/json.hpp>

namespace tally::tools {
namespace {

class CandidateFinder final : public WhitelistVisitor {
 public:
  CandidateFinder(Platform& platform, std::string_view key) : platform_(platform), key_(key) {}
  std::vector<KeyCandidate> found;

  bool beginGroup(std::string_view name) override {
    state_ = groupState(platform_, name);
    return true;
  }
  void entry(WhitelistSection section, WhitelistEntry entry) override {
    const std::string_view text = entry.key->view();
    if (isPrefixSection(section) ? key_.starts_with(text) : key_ == text) {
      found.push_back({section, std::move(entry), state_});
    }
  }
  void malformed(const WhitelistPlace&) override {}

 private:
  Platform& platform_;
  std::string_view key_;
  GroupState state_ = GroupState::InForce;
};

std::string entryText(WhitelistSection section, const WhitelistEntry& entry) {
  if (!isPrefixSection(section)) return fmt::format("the group {}", entry.group->view());
  return fmt::format("the prefix {} of the group {}", entry.key->view(), entry.group->view());
}

std::string whyRefused(const std::vector<KeyCandidate>& candidates, KeyKind kind) {
  for (const KeyCandidate& candidate : candidates) {
    if (isScalarSection(candidate.section) != (kind == KeyKind::Scalar)) continue;
    return fmt::format("named only by {}, which {}", entryText(candidate.section, candidate.entry),
                       whyNotInForce(candidate.state));
  }
  return "it is not listed";
}

bool isDecisive(const KeyCandidate& candidate, const WhitelistMatch& match) {
  return match.entry != nullptr && candidate.state == GroupState::InForce &&
         isPrefixSection(candidate.section) == (match.kind == WhitelistMatchKind::Prefix) &&
         candidate.entry.key->view() == match.entry->key->view() &&
         candidate.entry.group->view() == match.entry->group->view();
}

}  // namespace

std::string_view kindName(KeyKind kind) {
  return kind == KeyKind::Scalar ? "scalar" : "distribution";
}

std::string optionsText(const KvDictionary& options) {
  if (options.empty()) return "no options";
  std::string text;
  for (const auto& option : options) {
    if (!text.empty()) text += ", ";
    const auto* array = kvCast<KvArray>(option.value.get());
    text += fmt::format("{} {}", option.key->view(),
                        array != nullptr ? fmt::format("of {}", counted(array->size(), "number"))
                                         : kvText(option.value.get()));
  }
  return text;
}

WhitelistJudge::WhitelistJudge(Platform& platform, WhitelistFile file)
    : platform_(platform), file_(std::move(file)), config_(Whitelist::fromFile(platform, file_)) {}

KeyVerdict WhitelistJudge::judge(std::string_view key, KeyKind kind) const {
  KeyVerdict verdict;
  verdict.kind = kind;
  if (!config_) {
    verdict.reason = "the whitelist cannot be loaded: " + file_.fault;
    return verdict;
  }
  verdict.match =
      kind == KeyKind::Scalar ? config_->matchScalarKey(key) : config_->matchDistributionKey(key);
  CandidateFinder finder(platform_, key);
  visitWhitelist(*file_.root, finder);
  switch (verdict.match.kind) {
    case WhitelistMatchKind::Exact:
      verdict.reason = fmt::format("the group {} lists it", verdict.match.entry->group->view());
      break;
    case WhitelistMatchKind::Prefix:
      verdict.reason =
          fmt::format("the group {} lists the prefix {}", verdict.match.entry->group->view(),
                      verdict.match.entry->key->view());
      break;
    case WhitelistMatchKind::InternalDevice:
      verdict.reason = "it is not listed, but this is an internal device";
      break;
    case WhitelistMatchKind::None:
      verdict.reason = whyRefused(finder.found, kind);
      break;
  }
  for (KeyCandidate& candidate : finder.found) {
    const bool sameKind = isScalarSection(candidate.section) == (kind == KeyKind::Scalar);
    if (sameKind && !isDecisive(candidate, verdict.match)) {
      verdict.others.push_back(std::move(candidate));
    }
  }
  return verdict;
}

Json jsonOf(const KeyVerdict& verdict) {
  Json json = {{"reported", verdict.admitted()}, {"reason", verdict.reason}};
  if (const WhitelistEntry* entry = verdict.match.entry) {
    json["group"] = entry->group->view();
    json["match"] = verdict.match.kind == WhitelistMatchKind::Exact ? "exact" : "prefix";
    json["entry"] = entry->key->view();
  }
  if (verdict.admitted()) json["options"] = jsonOf(verdict.match.options);
  Json others = Json::array();
  for (const KeyCandidate& other : verdict.others) {
    others.push_back({{"group", other.entry.group->view()},
                      {"section", sectionName(other.section)},
                      {"entry", other.entry.key->view()},
                      {"options", jsonOf(other.entry.options.get())},
                      {"inForce", other.state == GroupState::InForce}});
  }
  json["otherEntries"] = std::move(others);
  return json;
}

}  // namespace tally::tools
