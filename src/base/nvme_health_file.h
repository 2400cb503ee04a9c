// The files in which the SMART / health pages of NVMe controllers are left: by the one program that
// may ask for them, for all that read them.
#pragma once

#include <algorithm>
#include <cstddef>
#include <string>
#include <string_view>

namespace tally {

constexpr std::size_t kHealthPageSize = 512;
constexpr std::string_view kHealthPageFolder = "run/tallyd";
constexpr std::string_view kHealthPagePrefix = "nvme-health-";

// "nvme0": the name of a controller, not of one of its namespaces.
inline bool isNvmeController(std::string_view name) {
  constexpr std::string_view kPrefix = "nvme";
  if (!name.starts_with(kPrefix) || name.size() == kPrefix.size() || name.size() > 12) return false;
  return std::ranges::all_of(name.substr(kPrefix.size()),
                             [](char letter) { return letter >= '0' && letter <= '9'; });
}

inline std::string healthPageName(std::string_view controller) {
  return std::string(kHealthPagePrefix) + std::string(controller);
}

inline bool isHealthPageName(std::string_view name) {
  return name.starts_with(kHealthPagePrefix) &&
         isNvmeController(name.substr(kHealthPagePrefix.size()));
}

}  // namespace tally
