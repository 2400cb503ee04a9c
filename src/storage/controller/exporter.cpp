// The table of exporters and the search through it.
#include "storage/exporter.h"

#include "platform/platform.h"
#include "platform/protocol/storage_protocol.h"

namespace tally {
namespace {

using Selectors = std::array<std::uint32_t, 2>;
constexpr Selectors kStatsSelector{kSelectStatistics, kSelectStatistics};
constexpr Selectors kBandStatsSelector{kSelectValidityList, kSelectValidityList};
constexpr Selectors kDefectsListSelector{kSelectDefectsList, kSelectDefectsList};
constexpr Selectors kTelemetryListSelectors{kSelectTelemetryList, kSelectTelemetryList};
constexpr Selectors kTaskSchedulerSelectors{39, 39};
constexpr Selectors kSnapshotSelectors{22, 22};
constexpr Selectors kSnapshotHeaderSelectors{145, 145};

constexpr NandExporter exporter(const char* className, const char* characteristicsKey,
                                std::int32_t contentDeletionMethod, std::uint32_t fetchMethod) {
  return {className,
          characteristicsKey,
          contentDeletionMethod,
          fetchMethod,
          fetchMethod,
          SPXGetStatsSelectors,
          SPXGetDefectsListSelectors,
          SPXGetTelemetryListSelectors,
          SPXGetTaskSchedulerSelectors,
          SPXGetSnapshotSelectors,
          SPXGetSnapshotHeaderSelectors,
          SPXGetBandStatsSelectors,
          {nullptr, nullptr},
          SPXParseBufferToCxt,
          SPXReleaseContext};
}

}  // namespace

const std::uint32_t* SPXGetStatsSelectors() { return kStatsSelector.data(); }
const std::uint32_t* SPXGetDefectsListSelectors() { return kDefectsListSelector.data(); }
const std::uint32_t* SPXGetTelemetryListSelectors() { return kTelemetryListSelectors.data(); }
const std::uint32_t* SPXGetTaskSchedulerSelectors() { return kTaskSchedulerSelectors.data(); }
const std::uint32_t* SPXGetSnapshotSelectors() { return kSnapshotSelectors.data(); }
const std::uint32_t* SPXGetSnapshotHeaderSelectors() { return kSnapshotHeaderSelectors.data(); }
const std::uint32_t* SPXGetBandStatsSelectors() { return kBandStatsSelector.data(); }

constinit const std::array<NandExporter, 3> nand_exporters{{
    exporter(kStorageDriverClass.data(), kStorageCharacteristicsProperty.data(), 5,
             kStorageFetchMethod),
    exporter(kStorageDriverClasses[1].data(), "Controller Characteristics", -1, 9),
    {},
}};

std::uint32_t findNandExporter(const NandExporter** exporterOut) {
  const NandExporter* exporter = nand_exporters.data();
  for (; exporter->className != nullptr; ++exporter) {
    const RegistryHandle service =
        platform().deviceRegistry->RegistryFindService(ServiceMatchingByClass(exporter->className));
    if (service != 0) {
      *exporterOut = exporter;
      return service;
    }
  }
  *exporterOut = exporter;
  return 0;
}

}  // namespace tally
