// The whitelist file: reading it and checking its form.
#pragma once

#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>

#include "config/whitelist_content.h"
#include "config/whitelist_options.h"
#include "platform/platform.h"

namespace tally {

constexpr std::string_view kWhitelistPath =
    "/Library/Application Support/Tallybook/Whitelist_Nimbus.plist";
// The group that exists on internal devices only.
constexpr std::string_view kInternalTestingGroup = "InternalTesting";

// A whitelist file, as far as it could be loaded.
struct WhitelistFile {
  bool read = false;   // its bytes could be read
  std::string digest;  // MD5 of the bytes, 32 lowercase hexadecimal digits
  std::shared_ptr<const WhitelistContent> content;  // null when it could not be read or parsed
  std::string fault;                                // why; empty when content is there
};
WhitelistFile loadWhitelistFile(Platform& platform);
WhitelistFile parseWhitelistFile(std::string_view bytes);

// The texts are borrowed from the content of the file.
struct WhitelistEntry {
  std::string_view key;  // the exact key, or the prefix
  KvRef<KvDictionary> options;
  std::string_view group;  // the group that it was taken from
};

inline std::string_view keyText(const WhitelistEntry& entry) { return entry.key; }

enum class WhitelistSection {
  ScalarKeys,
  DistributionKeys,
  ScalarKeyPrefixes,
  DistributionKeyPrefixes
};
constexpr int kWhitelistSections = 4;
// The sections' names, in the order of WhitelistSection.
std::span<const std::string_view> sectionNames();
std::string_view sectionName(WhitelistSection section);
// Empty if no section has this name.
std::optional<WhitelistSection> sectionOfName(std::string_view name);
constexpr bool isPrefixSection(WhitelistSection section) {
  return section >= WhitelistSection::ScalarKeyPrefixes;
}
constexpr bool isScalarSection(WhitelistSection section) {
  return section == WhitelistSection::ScalarKeys || section == WhitelistSection::ScalarKeyPrefixes;
}

// A place in the file; inner levels that do not apply are absent.
struct WhitelistPlace {
  std::string_view group;
  std::optional<std::string_view> section, key, option;
};

// Receives the parts of a whitelist, in the order of the file.
class WhitelistVisitor {
 public:
  virtual ~WhitelistVisitor() = default;
  // False: the content of the group is skipped, well formed or not.
  virtual bool beginGroup(std::string_view name) = 0;
  // At most this many entries of a section follow.
  virtual void beginSection(WhitelistSection, std::size_t) {}
  // An entry with those of its options that are well formed.
  virtual void entry(WhitelistSection section, const WhitelistEntry& entry) = 0;
  // A part of the wrong type, which is skipped.
  virtual void malformed(const WhitelistPlace& place) = 0;
  // A section of an unknown name.
  virtual void unknownSection(std::string_view, std::string_view) {}
};
void visitWhitelist(const WhitelistContent& content, WhitelistVisitor& visitor);

// Whether a group of the file applies on this device.
enum class GroupState {
  InForce,
  InternalOnly,
  DisabledByTasking,
  SwitchUnreadable,  // it may be off, so nothing of the group leaves the device
};
GroupState groupState(Platform& platform, std::string_view group);
// The state as a predicate: "is for internal devices only", "is disabled by tasking" and so on;
// empty if the group is in force.
std::string_view whyNotInForce(GroupState state);

}  // namespace tally
