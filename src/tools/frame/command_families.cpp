#include "tools/frame/command_families.h"

#include "tools/channels/channel_commands.h"
#include "tools/device/device_commands.h"
#include "tools/doctor/doctor_command.h"
#include "tools/endpoint/send_commands.h"
#include "tools/frame/complete_command.h"
#include "tools/preferences/prefs_commands.h"
#include "tools/record/record_commands.h"
#include "tools/recorder/recorder_command.h"
#include "tools/report/report_commands.h"
#include "tools/storage/nand_commands.h"
#include "tools/store/forget_command.h"
#include "tools/store/store_commands.h"
#include "tools/tasking/tasking_commands.h"
#include "tools/whitelist/explain_command.h"
#include "tools/whitelist/whitelist_commands.h"

namespace tally::tools {

std::span<const CommandFamily> commandFamilies() {
  static constexpr CommandFamily kFamilies[] = {
      addStoreCommands,   addRecordCommands, addRecorderCommand, addWhitelistCommands,
      addReportCommands,  addExplainCommand, addNandCommands,    addChannelCommands,
      addDeviceCommands,  addPrefsCommands,  addDoctorCommand,   addSendCommands,
      addTaskingCommands, addForgetCommand,  addCompleteCommand,
  };
  return kFamilies;
}

}  // namespace tally::tools
