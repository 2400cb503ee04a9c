// The user's languages and region.
#pragma once

#include <optional>
#include <string>
#include <vector>

namespace tally {

class Locale {
 public:
  virtual ~Locale() = default;
  // The user's languages, in order of preference, as tags ("de-DE").
  virtual std::vector<std::string> PreferredLanguages() = 0;
  // The languages that the system can show.
  virtual std::vector<std::string> SystemLanguages() = 0;
  // "CH"; empty when there is no current locale or it names no region.
  virtual std::optional<std::string> CurrentRegionCode() = 0;
};

// Those of available that serve the preferences, best first: for each preference the exact tag,
// then the tag without its region, then any tag of the same language. If none does, the first of
// available.
std::vector<std::string> BestLocalizations(const std::vector<std::string>& available,
                                           const std::vector<std::string>& preferred);

}  // namespace tally
