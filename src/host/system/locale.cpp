#include "host/system/locale.h"

#include <algorithm>
#include <cctype>

#include "base/files/device_root.h"

namespace tally {
namespace {

// The parts of LANGUAGE[_REGION][.CODESET][@MODIFIER]; all empty unless the name is well formed.
struct LocaleName {
  std::string language, script, region;
};

bool allOf(std::string_view text, int (*test)(int)) {
  return std::all_of(text.begin(), text.end(),
                     [test](char c) { return test(static_cast<unsigned char>(c)) != 0; });
}

std::string mapped(std::string_view text, int (*map)(int)) {
  std::string result(text);
  for (char& c : result) c = static_cast<char>(map(static_cast<unsigned char>(c)));
  return result;
}

LocaleName parseLocaleName(std::string_view name) {
  const std::size_t at = std::min(name.find('@'), name.size());
  const std::string_view modifier = name.substr(std::min(at + 1, name.size()));
  name = name.substr(0, at);
  name = name.substr(0, name.find('.'));
  const std::size_t bar = std::min(name.find_first_of("_-"), name.size());
  const std::string_view language = name.substr(0, bar);
  const std::string_view region = name.substr(std::min(bar + 1, name.size()));
  if (language.size() < 2 || language.size() > 3 || !allOf(language, std::isalpha)) return {};
  LocaleName parsed{mapped(language, std::tolower), "", ""};
  if (modifier == "latin") parsed.script = "Latn";
  if (modifier == "cyrillic") parsed.script = "Cyrl";
  const bool known = (region.size() == 2 && allOf(region, std::isalpha)) ||
                     (region.size() == 3 && allOf(region, std::isdigit));
  if (known) parsed.region = mapped(region, std::toupper);
  return parsed;
}

const std::string& localeName(const LocaleEnvironment& environment) {
  if (!environment.all.empty()) return environment.all;
  return environment.messages.empty() ? environment.lang : environment.messages;
}

bool isPlain(std::string_view name) {
  const std::string_view base = name.substr(0, name.find('.'));
  return base == "C" || base == "POSIX";
}

void addOnce(std::vector<std::string>& tags, std::string tag) {
  if (!tag.empty() && std::find(tags.begin(), tags.end(), tag) == tags.end()) {
    tags.push_back(std::move(tag));
  }
}

}  // namespace

std::string languageTag(std::string_view name) {
  const LocaleName parsed = parseLocaleName(name);
  std::string tag = parsed.language;
  if (!parsed.script.empty()) tag += "-" + parsed.script;
  if (!parsed.region.empty()) tag += "-" + parsed.region;
  return tag;
}

std::vector<std::string> preferredLanguages(const LocaleEnvironment& environment) {
  std::vector<std::string> tags;
  const std::string& name = localeName(environment);
  if (isPlain(name)) return tags;
  const std::string_view list = environment.language;
  for (std::size_t begin = 0; begin < list.size();) {
    const std::size_t end = std::min(list.find(':', begin), list.size());
    addOnce(tags, languageTag(list.substr(begin, end - begin)));
    begin = end + 1;
  }
  addOnce(tags, languageTag(name));
  return tags;
}

std::optional<std::string> regionCode(const LocaleEnvironment& environment) {
  const std::string& name = environment.all.empty() ? environment.lang : environment.all;
  std::string region = parseLocaleName(name).region;
  if (region.empty()) return std::nullopt;
  return region;
}

std::vector<std::string> LinuxLocale::PreferredLanguages() {
  if (auto tags = described(Described::PreferredLanguages)) return *std::move(tags);
  return preferredLanguages(environment_);
}

std::vector<std::string> LinuxLocale::SystemLanguages() {
  if (auto tags = described(Described::SystemLanguages)) return *std::move(tags);
  std::vector<std::string> tags{"en"};
  const DeviceDirectory folder(root_, "/usr/share/locale");
  if (const auto names = folder.list()) {
    for (const std::string& name : *names) {
      if (folder.identity(name + "/LC_MESSAGES")) addOnce(tags, languageTag(name));
    }
  }
  return tags;
}

std::optional<std::string> LinuxLocale::CurrentRegionCode() {
  if (const auto* code = description_->getAs<KvString>(Described::RegionCode)) {
    if (code->view().empty()) return std::nullopt;
    return std::string(code->view());
  }
  return regionCode(environment_);
}

std::optional<std::vector<std::string>> LinuxLocale::described(DescribedAs<KvArray> entry) {
  const auto* array = description_->getAs<KvArray>(entry);
  if (array == nullptr) return std::nullopt;
  std::vector<std::string> tags;
  for (const auto& item : *array) {
    if (const auto* tag = kvCast<KvString>(item.get())) {
      tags.emplace_back(tag->view());
    } else {
      description_->reportEntry(entry.entry, "contains an item that is not a string");
    }
  }
  return tags;
}

}  // namespace tally
