#include "tools/whitelist/whitelist_check.h"

#include <fmt/format.h>
#include <algorithm>
#include <cmath>
#include <map>

#include "config/internal_device.h"
#include "config/whitelist_options.h"
#include "host/store/store_schema.h"
#include "platform/platform.h"
#include "platform/tables/known_preferences.h"
#include "tools/frame/spelling.h"
#include "tools/whitelist/whitelist_verdict.h"

namespace tally::tools {
namespace {

std::vector<std::string_view> optionNames() {
  std::vector<std::string_view> names;
  for (const WhitelistOption& option : whitelistOptions()) names.push_back(option.name);
  return names;
}

class Checker final : public WhitelistVisitor {
 public:
  explicit Checker(Platform& platform) : platform_(platform) {}
  std::vector<Finding> findings;

  bool beginGroup(std::string_view name) override {
    endGroup();
    group_ = name;
    entriesOfGroup_ = 0;
    malformedOfGroup_ = false;
    const GroupState state = groupState(platform_, name);
    inForce_ = state == GroupState::InForce;
    if (state != GroupState::InForce) {
      add(Severity::Surprise, {name, {}, {}, {}},
          fmt::format("not in force here: it {}", whyNotInForce(state)));
    }
    const auto value = platform_.preferences->SMAPreferencesGetValue(name, kGroupSwitchDomain);
    if (value && value->type() != KvType::Boolean && value->type() != KvType::Number) {
      add(Severity::Surprise, {name, {}, {}, {}},
          fmt::format("its switch in the preferences {} is not a boolean and is ignored",
                      kGroupSwitchDomain));
    }
    return true;
  }

  void malformed(const WhitelistPlace& place) override {
    malformedOfGroup_ = true;
    if (place.option) {
      add(Severity::Fault, place,
          whitelistOption(*place.option)->value == OptionValue::Numbers
              ? "not an array of numbers; the option is left out"
              : "not a whole number from 0 to 4294967295; the option is left out");
    } else if (place.key) {
      add(Severity::Fault, place, "its options are not a dictionary; the key is left out");
    } else if (place.section) {
      add(Severity::Fault, place, "not a dictionary; the section is left out");
    } else {
      add(Severity::Fault, place, "not a dictionary; the group is left out");
    }
  }

  void unknownSection(std::string_view group, std::string_view section) override {
    const WhitelistPlace place{group, section, {}, {}};
    if (const auto meant = nearestWord(section, sectionNames())) {
      add(Severity::Fault, place,
          fmt::format("no section has this name and its keys are not reported; {} may be meant",
                      *meant));
    } else {
      add(Severity::Surprise, place, "no section has this name; it is ignored");
    }
  }

  void entry(WhitelistSection section, const WhitelistEntry& entry) override {
    ++entriesOfGroup_;
    const WhitelistPlace place{*group_, sectionName(section), entry.key, {}};
    checkKey(section, place);
    checkOptions(section, place, *entry.options);
    checkRepetition(section, place, entry);
    if (inForce_) inForceTable(section).insert_or_assign(std::string(entry.key), entry);
  }

  void finish() {
    endGroup();
    for (const bool scalar : {true, false}) {
      const auto exact = scalar ? WhitelistSection::ScalarKeys : WhitelistSection::DistributionKeys;
      const auto prefix =
          scalar ? WhitelistSection::ScalarKeyPrefixes : WhitelistSection::DistributionKeyPrefixes;
      checkNesting(exact, inForceTable(exact), inForceTable(prefix));
      checkNesting(prefix, inForceTable(prefix), inForceTable(prefix));
    }
    if (isInternalDevice(platform_)) {
      findings.push_back({Severity::Surprise, "", "", "", "",
                          "this is an internal device: every group is in force, and keys that are "
                          "not listed are reported unchanged"});
    }
  }

 private:
  using Table = std::map<std::string, WhitelistEntry, std::less<>>;
  Table& table(WhitelistSection section) { return tables_[static_cast<std::size_t>(section)]; }

  Table& inForceTable(WhitelistSection section) {
    return inForceTables_[static_cast<std::size_t>(section)];
  }

  void add(Severity severity, const WhitelistPlace& place, std::string message) {
    const auto text = [](const std::optional<std::string_view>& level) {
      return std::string(level.value_or(""));
    };
    findings.push_back({severity, std::string(place.group), text(place.section), text(place.key),
                        text(place.option), std::move(message)});
  }

  void endGroup() {
    if (group_ && entriesOfGroup_ == 0 && !malformedOfGroup_) {
      add(Severity::Surprise, {*group_, {}, {}, {}}, "the group admits no key");
    }
  }

  void checkKey(WhitelistSection section, const WhitelistPlace& place) {
    if (isPrefixSection(section) && place.key->empty()) {
      add(Severity::Surprise, place,
          fmt::format("the empty prefix admits every {} of the store",
                      isScalarSection(section) ? "scalar" : "distribution"));
    } else if (!isStoreKey(*place.key)) {
      add(Severity::Fault, place,
          fmt::format("no key of the store can match it: {}", kStoreKeyRule));
    }
  }

  void checkOptions(WhitelistSection section, WhitelistPlace place, const KvDictionary& options) {
    const bool scalar = isScalarSection(section);
    for (const auto& option : options) {
      place.option = option.key->view();
      const WhitelistOption* const known = whitelistOption(*place.option);
      if (known == nullptr) {
        const auto names = optionNames();
        const auto meant = nearestWord(*place.option, names);
        add(meant ? Severity::Fault : Severity::Surprise, place,
            meant ? fmt::format("no option has this name and it does nothing; {} may be meant",
                                *meant)
                  : "no option has this name; it does nothing");
      } else if (scalar != known->effect.isForScalars()) {
        add(Severity::Surprise, place,
            scalar ? "scalars have no histogram; the option does nothing"
                   : "distributions are not rounded; the option does nothing");
      } else if (*place.option == kOptionIntervals) {
        checkIntervals(place, static_cast<const KvArray&>(*option.value));
      }
    }
    if (scalar) checkRounding(place, options);
  }

  void checkRounding(WhitelistPlace place, const KvDictionary& options) {
    std::vector<std::string_view> steps;
    for (const WhitelistOption& option : whitelistOptions()) {
      if (!option.effect.isForScalars()) continue;
      const auto setting = unsignedOption(options, option.name);
      if (!setting) continue;
      steps.push_back(option.name);
      place.option = option.name;
      if (const auto remark = option.effect.rounding().remark(*setting)) {
        add(remark->isFault ? Severity::Fault : Severity::Surprise, place,
            std::string(remark->text));
      }
    }
    if (steps.size() > 1) {
      place.option.reset();
      add(Severity::Surprise, place,
          fmt::format("has both {}: it is rounded twice, to the interval first",
                      fmt::join(steps, " and ")));
    }
  }

  void checkIntervals(const WhitelistPlace& place, const KvArray& boundaries) {
    if (boundaries.empty()) {
      add(Severity::Surprise, place, "no boundary: the histogram has one bucket for everything");
    }
    std::optional<double> former;
    for (std::size_t i = 0; i < boundaries.size(); ++i) {
      const KvNumber& number = *boundaries.getAs<KvNumber>(i);
      const double boundary = number.asDouble();
      const auto name = [&] { return fmt::format("boundary {}, {},", i + 1, kvText(&number)); };
      if (std::isnan(boundary)) {
        add(Severity::Fault, place,
            fmt::format("boundary {} is not a number; its bucket stays empty", i + 1));
        continue;
      }
      if (former && boundary == *former) {
        add(Severity::Fault, place, name() + " is there twice; its bucket stays empty");
      } else if (former && boundary < *former) {
        add(Severity::Fault, place, name() + " is below one before it; its bucket stays empty");
      } else if (std::isinf(boundary)) {
        add(Severity::Surprise, place, name() + " is infinite");
      }
      former = std::max(former.value_or(boundary), boundary);
    }
  }

  void checkRepetition(WhitelistSection section, const WhitelistPlace& place,
                       const WhitelistEntry& entry) {
    const auto [former, added] = table(section).try_emplace(std::string(*place.key), entry);
    if (added) return;
    WhitelistEntry& present = former->second;
    if (!kvEqual(present.options.get(), entry.options.get())) {
      add(Severity::Surprise, place,
          fmt::format("the group {} lists it too, with {}; the later group wins, with {}",
                      present.group, optionsText(*present.options), optionsText(*entry.options)));
    }
    present = entry;
  }

  // What the longest prefix above an entry makes of it.
  void checkNesting(WhitelistSection section, const Table& entries, const Table& prefixes) {
    for (const auto& [key, entry] : entries) {
      if (!isStoreKey(key)) continue;  // a fault already; and one of megabytes has as many prefixes
      const WhitelistPlace place{entry.group, sectionName(section), key, {}};
      const bool exact = !isPrefixSection(section);
      if (const auto same = prefixes.find(key); exact && same != prefixes.end()) {
        add(Severity::Surprise, place,
            fmt::format("the group {} has a prefix of the same text, which this exact key shadows",
                        same->second.group));
      }
      const WhitelistEntry* around = outerPrefix(prefixes, key);
      if (around == nullptr) continue;
      if (!exact && kvEqual(around->options.get(), entry.options.get())) {
        add(Severity::Surprise, place,
            fmt::format("says the same as the prefix {} of the group {}", around->key,
                        around->group));
      } else if (entry.options->empty() && haveEffect(*around->options)) {
        add(Severity::Surprise, place,
            fmt::format("reported without options, though the prefix {} around it has {}",
                        around->key, optionsText(*around->options)));
      }
    }
  }

  // The longest prefix that is shorter than the key.
  static const WhitelistEntry* outerPrefix(const Table& prefixes, std::string_view key) {
    for (std::size_t length = key.size(); length-- > 0;) {
      const auto found = prefixes.find(key.substr(0, length));
      if (found != prefixes.end()) return &found->second;
    }
    return nullptr;
  }

  Platform& platform_;
  std::optional<std::string> group_;
  std::size_t entriesOfGroup_ = 0;
  bool malformedOfGroup_ = false;
  bool inForce_ = false;
  Table tables_[kWhitelistSections];         // of the whole file
  Table inForceTables_[kWhitelistSections];  // of the groups in force on this device
};

}  // namespace

std::vector<Finding> checkWhitelist(Platform& platform, const WhitelistContent& whitelist) {
  Checker checker(platform);
  visitWhitelist(whitelist, checker);
  checker.finish();
  return std::move(checker.findings);
}

std::string placeText(const Finding& finding) {
  std::string text;
  for (const std::string* level :
       {&finding.group, &finding.section, &finding.key, &finding.option}) {
    if (level->empty()) continue;
    if (!text.empty()) text += ", ";
    text += *level;
  }
  return text;
}

}  // namespace tally::tools
