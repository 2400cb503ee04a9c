#include "tools/channels/keep_command.h"

#include <nlohmann/json.hpp>

#include "driver/own_figures.h"
#include "hwreport/hwreport.h"
#include "tools/frame/output.h"

namespace tally::tools {
namespace {

constexpr std::uint16_t kSweptCategories = 0x100;

// Reads the sweep's channels, whose counters are kept with their readings.
bool readCounters() {
  const auto channels = HwReportCopyChannelsInCategories(kSweptCategories, kHwReportByDriver);
  KvRef<KvDictionary> subscribed;
  const auto subscription =
      channels ? HwReportCreateSubscription(nullptr, channels.get(), &subscribed, 0) : nullptr;
  return subscription && HwReportCreateSamples(subscription.get(), subscribed.get());
}

int keep(const ToolContext& context) {
  Platform& platform = *context.platform;
  // A sweep that is under way would undo it, or be undone.
  const RunTurn turn(*platform.runLock);
  if (!turn) return kWrong;  // the lock has said why
  platform.metricsStore->beginBatch();
  const std::size_t kept = readCounters() ? platform.dailyCounters->accumulate() : 0;
  keepOwnFigures(platform);
  platform.metricsStore->endBatch();
  if (context.json) {
    printJson(context, {{"kept", kept}});
  } else {
    printLine(context, counted(kept, "counter") + " kept");
  }
  return kSuccess;
}

}  // namespace

void addKeepCommand(CLI::App& channels, ToolContext& context) {
  addCommand(channels, context, "keep",
             "Keep what the kernel's counters count until now, before they restart",
             [&context] { return keep(context); });
}

}  // namespace tally::tools
