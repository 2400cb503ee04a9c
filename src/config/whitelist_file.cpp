#include "config/whitelist_file.h"

#include <md5.h>

#include <algorithm>

#include "base/hex.h"
#include "config/internal_device.h"
#include "platform/tables/known_preferences.h"

namespace tally {
namespace {

constexpr std::string_view kSectionNames[kWhitelistSections] = {
    "ScalarKeys", "DistributionKeys", "ScalarKeyPrefixes", "DistributionKeyPrefixes"};

class Md5 {
 public:
  Md5() { MD5Init(&context_); }
  void add(std::string_view bytes) {
    MD5Update(&context_, reinterpret_cast<const std::uint8_t*>(bytes.data()), bytes.size());
  }
  std::string finish() {
    std::uint8_t digest[MD5_DIGEST_LENGTH];
    MD5Final(digest, &context_);
    std::string text;
    for (const std::uint8_t byte : digest) appendHex(text, byte, 2);
    return text;
  }

 private:
  MD5_CTX context_;
};

void readContent(DocumentWindow& window, WhitelistFile& file) {
  if (auto content = WhitelistContent::read(window)) {
    file.content = *std::move(content);
  } else {
    file.fault = content.error().message;
  }
}

void visitSection(const WhitelistContent& content, std::string_view group, WhitelistSection section,
                  std::span<const WhitelistContent::Item> entries, WhitelistVisitor& visitor) {
  WhitelistPlace place{group, sectionName(section), {}, {}};
  visitor.beginSection(section, entries.size());
  for (const auto& entry : entries) {
    const std::string_view key = content.nameOf(entry);
    place.key = key;
    if (entry.value == WhitelistContent::kNotDictionary) {
      visitor.malformed(place);
      continue;
    }
    const PooledOptions& options = content.optionsOf(entry);
    if (options.wellFormed.get() != options.read.get()) {
      for (const auto& option : *options.read) {
        if (isWellFormedOption(option.key->view(), *option.value)) continue;
        place.option = option.key->view();
        visitor.malformed(place);
      }
      place.option.reset();
    }
    visitor.entry(section, {key, options.wellFormed, group});
  }
}

}  // namespace

WhitelistFile loadWhitelistFile(Platform& platform) {
  WhitelistFile file;
  const auto opened = platform.files->openFile(kWhitelistPath, kPlistMaximumBytes);
  if (!opened) {
    file.fault = opened.error().message;
    return file;
  }
  Md5 digest;
  std::optional<Error> failure;
  DocumentWindow window([&](std::span<char> buffer) -> std::size_t {
    const auto count = (*opened)(buffer);
    if (!count) failure = count.error();
    if (!count) return 0;
    digest.add({buffer.data(), *count});
    return *count;
  });
  readContent(window, file);
  // The digest is of the whole file, even if it is not a property list.
  while (!window.endsDocument()) window.more(window.text().size());
  if (failure) return {.read = false, .digest = {}, .content = nullptr, .fault = failure->message};
  file.read = true;
  file.digest = digest.finish();
  return file;
}

WhitelistFile parseWhitelistFile(std::string_view bytes) {
  WhitelistFile file;
  file.read = true;
  Md5 digest;
  digest.add(bytes);
  file.digest = digest.finish();
  DocumentWindow window(bytes);
  readContent(window, file);
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

void visitWhitelist(const WhitelistContent& content, WhitelistVisitor& visitor) {
  for (const auto& group : content.groups()) {
    const std::string_view name = content.nameOf(group);
    if (!visitor.beginGroup(name)) continue;
    if (group.value == WhitelistContent::kNotDictionary) {
      visitor.malformed({name, {}, {}, {}});
      continue;
    }
    for (const auto& item : content.sectionsOf(group)) {
      const std::string_view title = content.nameOf(item);
      const auto section = sectionOfName(title);
      if (!section) {
        visitor.unknownSection(name, title);
      } else if (item.value == WhitelistContent::kNotDictionary) {
        visitor.malformed({name, title, {}, {}});
      } else {
        visitSection(content, name, *section, content.entriesOf(item), visitor);
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
