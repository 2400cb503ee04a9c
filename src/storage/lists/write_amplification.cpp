#include "storage/lists/write_amplification.h"

#include <cstdint>

#include "platform/platform.h"
#include "platform/protocol/storage_protocol.h"
#include "platform/tables/known_preferences.h"
#include "storage/controller/statistics_fetch.h"

namespace tally {
namespace {

constexpr unsigned kHostUnitShift = 12;
static_assert(1u << kHostUnitShift == kHostUnitBytes);

float ratio(std::uint64_t written, std::uint64_t hostWrites) {
  if (hostWrites == 0) return 0;
  return static_cast<float>(static_cast<double>(written) / static_cast<double>(hostWrites));
}

// If a name occurs twice, the last value applies.
struct IntermediateBand {
  std::uint64_t pagesPerVirtualBlock = 0, erases = 0;
};
IntermediateBand intermediateBandOf(const SPXParseContext& context) {
  IntermediateBand band;
  SPXForEachCounter(context, [&band](std::string_view name, std::uint64_t value) {
    if (name == "pagesPerVirtualBlockSlc") band.pagesPerVirtualBlock = value;
    if (name == "intermediateBandErases") band.erases = value;
  });
  return band;
}

}  // namespace

WriteAmplification writeAmplificationOf(const SPXParseContext& context) {
  const std::uint32_t bandBytes = context.pagesPerVirtualBlock * context.bytesPerPage;
  const IntermediateBand band = intermediateBandOf(context);
  const std::uint64_t intermediateBytes = band.pagesPerVirtualBlock * context.bytesPerPage;
  return {ratio(context.bandErases * (bandBytes >> kHostUnitShift), context.hostWrites),
          ratio(band.erases * (intermediateBytes >> kHostUnitShift), context.hostWrites)};
}

WriteAmplification measureWriteAmplification() {
  const LoadedStatistics statistics;
  return statistics ? writeAmplificationOf(statistics.context()) : WriteAmplification();
}

double writeAmplificationThreshold() {
  return platform().preferences->getReal(knownPreference("userWAmp"));
}

}  // namespace tally
