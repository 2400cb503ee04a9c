// The table of all commands, in the order of the help.
#include "tools/report_commands.h"
#include "tools/store_commands.h"
#include "tools/tool.h"
#include "tools/whitelist_commands.h"

namespace tally::tools {

std::span<const CommandFamily> commandFamilies() {
  static constexpr CommandFamily kFamilies[] = {
      addStoreCommands,
      addWhitelistCommands,
      addReportCommands,
  };
  return kFamilies;
}

}  // namespace tally::tools
