// Which statistics channels a command is about.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "hwreport/channel.h"
#include "tools/tool.h"

namespace tally::tools {

// "simple", "state", "histogram", "array", or "unknown" before the first sample.
std::string_view formatName(std::uint8_t format);

// All that are given must hold.
struct ChannelFilter {
  std::string driver, group, subgroup, unit;
  std::optional<std::string> format;
  std::optional<std::uint16_t> categories;

  void addOptions(CLI::App& command);
  bool admits(KvDictionary* channel) const;
};

}  // namespace tally::tools
