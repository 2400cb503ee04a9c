#include "tools/doctor/health_kernel.h"

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

HealthCheck checkOf(const SourceSurvey& survey) {
  const std::string subject(survey.title);
  if (survey.channels == 0) return {Health::Missing, subject, "absent on this hardware"};
  if (survey.refused == 0) return {Health::Ok, subject, counted(survey.channels, "channel")};
  return {Health::Missing, subject,
          fmt::format("{}, of which {} not permitted ({}); the user root or CAP_DAC_READ_SEARCH "
                      "would permit it",
                      counted(survey.channels, "channel"),
                      survey.refused == 1 ? "a file is" : counted(survey.refused, "file") + " are",
                      survey.example)};
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
