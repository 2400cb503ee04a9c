// tallyctl whitelist absent: the keys of a day that its log does not have, and why.
#pragma once

#include <string>

#include "tools/frame/tool.h"

namespace tally::tools {

struct AbsentArguments {
  std::string day = "yesterday";
  bool wholeStore = false;
};

int listAbsent(const ToolContext& context, const AbsentArguments& arguments);

}  // namespace tally::tools
