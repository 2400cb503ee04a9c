// The user's locale, from the environment.
#pragma once

#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "host/described/device_description.h"
#include "platform/locale.h"

namespace tally {

// The values of the variables that name a locale; empty when unset.
struct LocaleEnvironment {
  std::string language, all, messages, lang;  // LANGUAGE, LC_ALL, LC_MESSAGES, LANG
};

// "de_CH.UTF-8@euro" as "de-CH", "sr_RS@latin" as "sr-Latn-RS"; empty for "C", "POSIX" and text
// that is not a locale's name.
std::string languageTag(std::string_view localeName);
// In order of preference; LANGUAGE is ignored in the locales C and POSIX.
std::vector<std::string> preferredLanguages(const LocaleEnvironment& environment);
std::optional<std::string> regionCode(const LocaleEnvironment& environment);

// The description's "PreferredLanguages", "SystemLanguages" and "RegionCode" come first. The
// system's languages are those that it has translations for, and English, which needs none.
class LinuxLocale final : public Locale {
 public:
  LinuxLocale(DeviceRoot root, LocaleEnvironment environment,
              std::shared_ptr<DeviceDescription> description)
      : root_(std::move(root)),
        environment_(std::move(environment)),
        description_(std::move(description)) {}
  std::vector<std::string> PreferredLanguages() override;
  std::vector<std::string> SystemLanguages() override;
  std::optional<std::string> CurrentRegionCode() override;

 private:
  std::optional<std::vector<std::string>> described(DescribedAs<KvArray> entry);

  DeviceRoot root_;
  LocaleEnvironment environment_;
  std::shared_ptr<DeviceDescription> description_;
};

}  // namespace tally
