#include "config/whitelist_file.h"

#include <md5.h>

#include <algorithm>

#include "base/hex.h"
#include "config/internal_device.h"
#include "config/whitelist_options.h"
#include "kv/plist_codec.h"
#include "platform/tables/known_preferences.h"

namespace tally {
namespace {

constexpr std::string_view kSectionNames[kWhitelistSections] = {
    "ScalarKeys", "DistributionKeys", "ScalarKeyPrefixes", "DistributionKeyPrefixes"};

std::string md5Text(std::string_view bytes) {
  MD5_CTX context;
  MD5Init(&context);
  MD5Update(&context, reinterpret_cast<const std::uint8_t*>(bytes.data()), bytes.size());
  std::uint8_t digest[MD5_DIGEST_LENGTH];
  MD5Final(digest, &context);
  std::string text;
  for (const std::uint8_t byte : digest) appendHex(text, byte, 2);
  return text;
}

// The well-formed options; the others are passed to the visitor.
KvRef<KvDictionary> wellFormedOptions(KvDictionary& options, WhitelistPlace place,
                                      WhitelistVisitor& visitor) {
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
      place.option = option.key->view();
      visitor.malformed(place);
    }
  }
  return kept;
}

void visitSection(const KvRef<KvString>& group, WhitelistSection section, const KvDictionary& keys,
                  WhitelistVisitor& visitor) {
  WhitelistPlace place{group->view(), sectionName(section), {}, {}};
  visitor.beginSection(section, keys.size());
  for (const auto& item : keys) {
    place.key = item.key->view();
    if (auto* options = kvCast<KvDictionary>(item.value.get())) {
      visitor.entry(section, {item.key, wellFormedOptions(*options, place, visitor), group});
    } else {
      visitor.malformed(place);
    }
  }
}

}  // namespace

WhitelistFile loadWhitelistFile(Platform& platform) {
  const auto bytes = platform.files->readFile(kWhitelistPath, kPlistMaximumBytes);
  if (bytes) return parseWhitelistFile(*bytes);
  WhitelistFile file;
  file.fault = bytes.error().message;
  return file;
}

WhitelistFile parseWhitelistFile(std::string_view bytes) {
  WhitelistFile file;
  file.read = true;
  file.digest = md5Text(bytes);
  const auto parsed = decodePlist(bytes);
  file.root = KvRef<KvDictionary>::share(parsed ? kvCast<KvDictionary>(parsed->get()) : nullptr);
  if (!file.root) {
    file.fault = parsed ? "the root is not a dictionary" : parsed.error().message;
  }
  return file;
}

std::span<const std::string_view> sectionNames() { return kSectionNames; }

std::string_view sectionName(WhitelistSection section) {
  return kSectionNames[static_cast<std::size_t>(section)];
}

std::optional<WhitelistSection> sectionOfName(std::string_view name) {
  const auto found = std::find(std::begin(kSectionNames), std::end(kSectionNames), name);
  if (found == std::end(kSectionNames)) return std::nullopt;
  return static_cast<WhitelistSection>(found - std::begin(kSectionNames));
}

void visitWhitelist(const KvDictionary& root, WhitelistVisitor& visitor) {
  for (const auto& group : root) {
    const std::string_view name = group.key->view();
    if (!visitor.beginGroup(name)) continue;
    const auto* sections = kvCast<KvDictionary>(group.value.get());
    if (sections == nullptr) {
      visitor.malformed({name, {}, {}, {}});
      continue;
    }
    for (const auto& item : *sections) {
      const std::string_view title = item.key->view();
      const auto section = sectionOfName(title);
      if (!section) {
        visitor.unknownSection(name, title);
      } else if (const auto* keys = kvCast<KvDictionary>(item.value.get())) {
        visitSection(group.key, *section, *keys, visitor);
      } else {
        visitor.malformed({name, title, {}, {}});
      }
    }
  }
}

GroupState groupState(Platform& platform, std::string_view group) {
  if (isInternalDevice(platform)) return GroupState::InForce;
  if (group == kInternalTestingGroup) return GroupState::InternalOnly;
  bool exists = false;
  Preferences& preferences = *platform.preferences;
  const bool enabled = preferences.SMAPreferencesGetBoolValue(group, kGroupSwitchDomain, &exists);
  if (exists) return enabled ? GroupState::InForce : GroupState::DisabledByTasking;
  return preferences.isReadable(kGroupSwitchDomain) ? GroupState::InForce
                                                    : GroupState::SwitchUnreadable;
}

std::string_view whyNotInForce(GroupState state) {
  switch (state) {
    case GroupState::InternalOnly:
      return "is for internal devices only";
    case GroupState::DisabledByTasking:
      return "is disabled by tasking";
    case GroupState::SwitchUnreadable:
      return "has a switch that cannot be read";
    default:
      return "";
  }
}

}  // namespace tally
