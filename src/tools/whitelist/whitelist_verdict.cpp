#include "tools/whitelist/whitelist_verdict.h"

#include <algorithm>
#include <nlohmann/json.hpp>

namespace tally::tools {
namespace {

std::string entryText(WhitelistSection section, const WhitelistEntry& entry) {
  if (!isPrefixSection(section)) return fmt::format("the group {}", entry.group);
  return fmt::format("the prefix {} of the group {}", entry.key, entry.group);
}

// The entry of the kind that comes nearest to admitting the key: one whose switch cannot be read
// may be in force. Null when there is none.
const KeyCandidate* nearestOf(const std::vector<const KeyCandidate*>& candidates, bool scalar) {
  const KeyCandidate* nearest = nullptr;
  for (const KeyCandidate* candidate : candidates) {
    if (isScalarSection(candidate->section) != scalar) continue;
    if (candidate->state == GroupState::SwitchUnreadable) return candidate;
    if (nearest == nullptr) nearest = candidate;
  }
  return nearest;
}

bool isDecisive(const KeyCandidate& candidate, const WhitelistMatch& match) {
  return match.entry != nullptr && candidate.state == GroupState::InForce &&
         isPrefixSection(candidate.section) == (match.kind == WhitelistMatchKind::Prefix) &&
         candidate.entry.key == match.entry->key() && candidate.entry.group == match.group;
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
    : file_(std::move(file)), config_(Whitelist::fromFile(platform, file_)) {
  if (config_) index_ = std::make_unique<WhitelistIndex>(platform, *file_.content);
}

WhitelistMatch WhitelistJudge::match(std::string_view key, KeyKind kind) const {
  if (!config_) return {};
  return kind == KeyKind::Scalar ? config_->matchScalarKey(key)
                                 : config_->matchDistributionKey(key);
}

AbsenceReason WhitelistJudge::whyRefused(std::string_view key, KeyKind kind) const {
  if (!index_) return {Absence::Unreadable, "the whitelist cannot be loaded: " + file_.fault};
  const bool scalar = kind == KeyKind::Scalar;
  const auto candidates = index_->find(key);
  if (const KeyCandidate* const same = nearestOf(candidates, scalar)) {
    return {same->state == GroupState::SwitchUnreadable ? Absence::Unreadable : Absence::GroupOff,
            fmt::format("named only by {}, which {}", entryText(same->section, same->entry),
                        whyNotInForce(same->state))};
  }
  if (const KeyCandidate* const other = nearestOf(candidates, !scalar)) {
    return {Absence::OtherSection,
            fmt::format("listed only as a {}, by {}",
                        kindName(scalar ? KeyKind::Distribution : KeyKind::Scalar),
                        entryText(other->section, other->entry))};
  }
  return {Absence::NotListed, "it is not listed"};
}

KeyVerdict WhitelistJudge::judge(std::string_view key, KeyKind kind) const {
  KeyVerdict verdict;
  verdict.kind = kind;
  verdict.match = match(key, kind);
  switch (verdict.match.kind) {
    case WhitelistMatchKind::Exact:
      verdict.reason = fmt::format("the group {} lists it", verdict.match.group);
      break;
    case WhitelistMatchKind::Prefix:
      verdict.reason = fmt::format("the group {} lists the prefix {}", verdict.match.group,
                                   verdict.match.entry->key());
      break;
    case WhitelistMatchKind::InternalDevice:
      verdict.reason = "it is not listed, but this is an internal device";
      break;
    case WhitelistMatchKind::None: {
      AbsenceReason why = whyRefused(key, kind);
      verdict.reason = std::move(why.detail);
      verdict.absence = why.absence;
      break;
    }
  }
  if (!index_) return verdict;
  for (const KeyCandidate* candidate : index_->find(key)) {
    const bool sameKind = isScalarSection(candidate->section) == (kind == KeyKind::Scalar);
    if (sameKind && !isDecisive(*candidate, verdict.match)) verdict.others.push_back(*candidate);
  }
  return verdict;
}

Json jsonOf(const KeyVerdict& verdict) {
  Json json = {{"reported", verdict.admitted()}, {"reason", verdict.reason}};
  if (const ListedKey* entry = verdict.match.entry) {
    json["group"] = verdict.match.group;
    json["match"] = verdict.match.kind == WhitelistMatchKind::Exact ? "exact" : "prefix";
    json["entry"] = entry->key();
  }
  if (verdict.absence) json["absence"] = rowOf(*verdict.absence).name;
  if (verdict.admitted()) json["options"] = jsonOf(verdict.match.options);
  Json others = Json::array();
  for (const KeyCandidate& other : verdict.others) {
    others.push_back({{"group", other.entry.group},
                      {"section", sectionName(other.section)},
                      {"entry", other.entry.key},
                      {"options", jsonOf(other.entry.options.get())},
                      {"inForce", other.state == GroupState::InForce}});
  }
  json["otherEntries"] = std::move(others);
  return json;
}

}  // namespace tally::tools
