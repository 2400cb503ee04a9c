// Faults and surprises of a whitelist.
#pragma once

#include <string>
#include <vector>

#include "config/whitelist_file.h"
#include "platform/platform.h"

namespace tally::tools {

// A fault makes the file do something other than it says. A surprise is allowed, but probably not
// intended, or worth knowing.
enum class Severity { Fault, Surprise };

struct Finding {
  Severity severity;
  std::string group, section, key, option;  // where; empty levels do not apply
  std::string message;
};

// In the file's order; faults and surprises mixed.
std::vector<Finding> checkWhitelist(Platform& platform, const WhitelistContent& whitelist);

// "Radio, ScalarKeys, vellum.radio.calls, sig_fig".
std::string placeText(const Finding& finding);

}  // namespace tally::tools
