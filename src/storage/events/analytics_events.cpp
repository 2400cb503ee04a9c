// Sends the storage figures as analytics events.
#include "storage/analytics_events.h"

#include "platform/platform.h"
#include "storage/events/event_payload.h"
#include "storage/freezer.h"
#include "storage/nand_info.h"
#include "storage/nand_info/nand_info_failure.h"

namespace tally {
namespace {

constexpr int kMebibyteShift = 20;

void takeMebibytes(const KvDictionary& usage, std::string_view key, std::int64_t& figure) {
  if (const auto bytes = usage.getInt64(key)) figure = *bytes >> kMebibyteShift;
}

EventFigures gatherFigures() {
  EventFigures figures;
  figures.info = CopyNANDInfo();
  const auto answer = platform().deviceInformation->DeviceQuery("DiskUsage");
  if (const auto* usage = kvCast<KvDictionary>(answer.get())) {
    takeMebibytes(*usage, kDOQDiskUsageTotalDiskCapacity, figures.capacityMiB);
    takeMebibytes(*usage, kDOQDiskUsageTotalDataAvailable, figures.availableMiB);
  }
  measureFreezerWrites(&figures.freezerWrites);
  return figures;
}

}  // namespace

KvRef<KvDictionary> LogtoEPNANDInfoWithOptions(std::uint32_t options) {
  AnalyticsEvents& service = *platform().analyticsEvents;
  if (!service.isAvailable()) return nandInfoFailure("Unable call EP API PulseSendEventLazy");
  const EventFigures figures = gatherFigures();
  const auto reference = parseEventReference(kEventPulseRefJson);
  auto result = KvDictionary::create();
  if (!reference || !figures.info) return result;
  for (const std::string_view event : kEventPulseEvents) {
    const auto mapping = reference->find(event);
    if (mapping == reference->end()) continue;
    service.PulseSendEventLazy(event, [&] {
      auto payload = buildEventPayload(event, mapping->second, figures);
      if ((options & kNANDInfoLogPayloadsOption) != 0) {
        logMessage(LogLevel::Default, "{} :\n{}\n", event, kvText(payload.get()));
      }
      return payload;
    });
  }
  return result;
}

}  // namespace tally
