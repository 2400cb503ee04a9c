// The table of all commands, in the order of the help.
#include "tools/channel_commands.h"
#include "tools/complete_command.h"
#include "tools/doctor_command.h"
#include "tools/explain_command.h"
#include "tools/forget_command.h"
#include "tools/nand_commands.h"
#include "tools/prefs_commands.h"
#include "tools/report_commands.h"
#include "tools/send_commands.h"
#include "tools/store_commands.h"
#include "tools/tasking_commands.h"
#include "tools/tool.h"
#include "tools/whitelist_commands.h"

namespace tally::tools {

std::span<const CommandFamily> commandFamilies() {
  static constexpr CommandFamily kFamilies[] = {
      addStoreCommands, addWhitelistCommands, addReportCommands, addExplainCommand,
      addNandCommands,  addChannelCommands,   addPrefsCommands,  addDoctorCommand,
      addSendCommands,  addTaskingCommands,   addForgetCommand,  addCompleteCommand,
  };
  return kFamilies;
}

}  // namespace tally::tools
