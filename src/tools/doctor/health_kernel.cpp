#include "tools/doctor/health_kernel.h"

#include <cerrno>
#include <cstring>

#include "host/kernel/kernel_channels.h"
#include "host/kernel/source_survey.h"
#include "platform/protocol/hub_protocol.h"
#include "tools/frame/output.h"

namespace tally::tools {
namespace {

bool areChannelsDescribed(DeviceRegistry& registry) {
  const RegistryHandle hub =
      registry.RegistryFindService(ServiceMatchingByClass(kStatisticsHubClass));
  if (hub == 0) return false;
  std::uint64_t id = KernelChannels::kHubID;
  registry.RegistryGetEntryID(hub, &id);
  registry.HandleRelease(hub);
  return id != KernelChannels::kHubID;
}

std::string filesThatAre(std::string_view state, const UnreadableFiles& files) {
  return fmt::format("{} {} ({})",
                     files.count == 1 ? "a file is" : counted(files.count, "file") + " are", state,
                     files.example);
}

HealthCheck checkOf(const SourceSurvey& survey) {
  const std::string subject(survey.title);
  const bool isRefused = survey.refused.count > 0, isBroken = survey.broken.count > 0;
  std::string text = survey.channels > 0 ? counted(survey.channels, "channel") : "";
  if (!isRefused && !isBroken) {
    if (text.empty()) return {Health::Missing, subject, "absent on this hardware"};
    return {Health::Ok, subject, text};
  }
  if (isRefused) {
    text += (text.empty() ? "" : ", of which ") + filesThatAre("not permitted", survey.refused) +
            "; the user root or CAP_DAC_READ_SEARCH would permit it";
  }
  if (isBroken) {
    const int error = survey.broken.error;
    const std::string state =
        error == EOPNOTSUPP ? "switched off" : fmt::format("unreadable: {}", std::strerror(error));
    text += (text.empty() ? "" : "; ") + filesThatAre(state, survey.broken);
  }
  return {Health::Missing, subject, text};
}

HealthCheck checkOf(const FlashDisk& disk) {
  const std::string subject = fmt::format("wear of {}", disk.name);
  const std::string_view kind = diskKindName(disk.kind);
  if (disk.wear) return {Health::Ok, subject, fmt::format("{}, available", kind)};
  if (disk.kind != DiskKind::Nvme) return {Health::Missing, subject, "absent on this hardware"};
  return {Health::Missing, subject,
          fmt::format("{}, not permitted; tallyrun-nvme-health.service, which has CAP_SYS_ADMIN, "
                      "would leave the page in /run/tallyd",
                      kind)};
}

}  // namespace

void examineKernelSources(const ToolContext& context, HealthChecks& checks) {
  for (const FlashDisk& disk : context.platform->flashDisks->disks()) {
    checks.push_back(checkOf(disk));
  }
  const SystemTree tree{DeviceRoot(context.root)};
  if (!tree.isThisMachine() && !tree.isRecording()) return;
  if (areChannelsDescribed(*context.platform->deviceRegistry)) return;
  for (const SourceSurvey& survey : surveySources(tree)) checks.push_back(checkOf(survey));
}

}  // namespace tally::tools
