// The table of all commands, in the order of the help.
#include "tools/nand_commands.h"
#include "tools/store_commands.h"
#include "tools/tool.h"

namespace tally::tools {

std::span<const CommandFamily> commandFamilies() {
  static constexpr CommandFamily kFamilies[] = {
      addStoreCommands,
      addNandCommands,
  };
  return kFamilies;
}

}  // namespace tally::tools
