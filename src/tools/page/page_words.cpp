#include "tools/page/page_words.h"

#include <fmt/format.h>

#include <algorithm>

#include "config/internal_device.h"
#include "config/whitelist_file.h"
#include "platform/tables/known_preferences.h"
#include "tools/frame/output.h"

namespace tally::tools {
namespace {

constexpr const KnownPreference& kConsent = knownPreference("DiagnosticSubmissionEnabled");

std::string stepWords(std::string_view option, std::uint32_t setting) {
  if (option == "bucket_interval") return "to the nearest multiple of " + integerText(setting);
  if (option == "sig_fig" && setting == 0) return "to 0, 1 or a power of ten";
  if (option == "sig_fig") return "to " + counted(setting, "significant figure");
  return fmt::format("by {} {}", option, setting);
}

std::string setCommand(std::string_view preference, std::string_view domain) {
  // A name that looks like an option comes after all options.
  const std::string option = fmt::format("--domain {}", shellWord(domain));
  const std::string rest = fmt::format("{} false", shellWord(preference));
  return preference.starts_with('-') ? fmt::format("tallyctl prefs set {} -- {}", option, rest)
                                     : fmt::format("tallyctl prefs set {} {}", rest, option);
}

bool isStorable(std::string_view name) {
  return std::ranges::none_of(name, [](char c) { return static_cast<unsigned char>(c) < ' '; });
}

}  // namespace

std::string roundingWords(const ScalarOptions& options) {
  std::string words;
  for (const WhitelistOption& option : whitelistOptions()) {
    if (!option.effect.isForScalars()) continue;
    const auto setting = unsignedOption(options, option.name);
    if (!setting) continue;
    const auto remark = option.effect.rounding().remark(*setting);
    if (remark && remark->isIdle) continue;
    words += (words.empty() ? "rounded " : ", then ") + stepWords(option.name, *setting);
  }
  return words;
}

std::string shellWord(std::string_view text) {
  const bool isPlain = !text.empty() && std::ranges::all_of(text, [](char c) {
    return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') ||
           std::string_view("._-/:+").find(c) != std::string_view::npos;
  });
  if (isPlain) return std::string(text);
  std::string word = "'";
  for (const char c : text) {
    if (c == '\'') {
      word += "'\\''";
    } else {
      word += c;
    }
  }
  return word + "'";
}

OffSwitch groupSwitch(Platform& platform, std::string_view group) {
  if (isInternalDevice(platform)) {
    return {"", "This is an internal device, where switches of groups have no effect."};
  }
  if (!isStorable(group)) {
    return {"", "The name of the group cannot be stored as a preference, so it has no switch."};
  }
  return {setCommand(group, kGroupSwitchDomain),
          "From then on, nothing leaves because of this group. Keys that another group lists too "
          "still leave. A tasking may set the switch again."};
}

OffSwitch submissionSwitch(Platform& platform) {
  // What a device's description says comes before the user's choice.
  bool exists = false;
  const bool chosen =
      platform.preferences->SMAPreferencesGetBoolValue(kConsent.key, kConsent.domain, &exists);
  const bool allowed = platform.crashReporting->isDiagnosticSubmissionEnabled();
  if (allowed && exists && !chosen) {
    return {"", "The device's description allows submission, whatever the preference says."};
  }
  return {setCommand(kConsent.key, kConsent.domain),
          "Keeps every log on the device, and withdraws those that still wait here."};
}

}  // namespace tally::tools
