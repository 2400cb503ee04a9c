// What a whitelist's options and switches mean, in words for the device's owner.
#pragma once

#include <string>
#include <string_view>

#include "config/whitelist_options.h"
#include "platform/platform.h"

namespace tally::tools {

// "rounded to the nearest multiple of 100, then to 2 significant figures"; empty when the options
// round no scalar.
std::string roundingWords(const ScalarOptions& options);

// One word of a shell's command line that stands for the text, whatever is in it.
std::string shellWord(std::string_view text);

// A command that keeps something from leaving, or why there is none.
struct OffSwitch {
  std::string command;  // empty: there is none
  std::string note;     // what it does, or why there is none
};
OffSwitch groupSwitch(Platform& platform, std::string_view group);
// The user's choice about all logs.
OffSwitch submissionSwitch(Platform& platform);

}  // namespace tally::tools
