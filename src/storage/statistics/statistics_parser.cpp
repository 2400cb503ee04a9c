// The statistics buffer: one pass over its records, which become fixed fields and counters.
#include <algorithm>
#include <span>

#include "base/byte_reader.h"
#include "storage/statistics.h"
#include "storage/statistics/counter_list.h"
#include "storage/statistics/statistic_keys.h"

namespace tally {
namespace {

constexpr std::size_t kUnit = 8;  // a header, or a value
constexpr std::size_t kCountOffset = 4;
constexpr std::uint32_t kHighestWireKey = 0x30000000;
constexpr std::uint32_t kUnset = 0xFFFFFFFF;
constexpr std::uint32_t kReadCountHistoKey = 265;

// The statistics that also have a field of their own.
struct NarrowField {
  std::uint32_t key;
  std::uint32_t SPXParseContext::*field;
};
struct WideField {
  std::uint32_t key;
  std::uint64_t SPXParseContext::*field;
};
constexpr NarrowField kNarrowFields[] = {
    {49, &SPXParseContext::bytesPerPage},          {50, &SPXParseContext::pagesPerVirtualBlock},
    {51, &SPXParseContext::blocksPerVirtualBlock}, {52, &SPXParseContext::numVirtualBlocks},
    {53, &SPXParseContext::exportVersion},
};
constexpr WideField kWideFields[] = {
    {4, &SPXParseContext::hostWrites},
    {7, &SPXParseContext::hostReads},
    {12, &SPXParseContext::indPoolFree},
    {13, &SPXParseContext::indPoolCount},
    {17, &SPXParseContext::wearLevMoves},
    {18, &SPXParseContext::nandWrites},
    {19, &SPXParseContext::nandReads},
    {20, &SPXParseContext::bandErases},
    {28, &SPXParseContext::numSleepOps},
    {45, &SPXParseContext::maxHighEnduranceBlockErases},
    {48, &SPXParseContext::numFreeVirtualBlocks},
    {56, &SPXParseContext::utilFormatTime},
};
constexpr std::uint32_t kHighestFieldKey = 56;

void storeField(SPXParseContext& context, std::uint32_t key, std::uint64_t value) {
  if (key > kHighestFieldKey) return;
  for (const NarrowField& narrow : kNarrowFields) {
    if (narrow.key == key) context.*narrow.field = static_cast<std::uint32_t>(value);
  }
  for (const WideField& wide : kWideFields) {
    if (wide.key == key) context.*wide.field = value;
  }
}

// The values of one record, all of which lie in the buffer.
class Values {
 public:
  explicit Values(std::span<const std::byte> bytes) : reader_(bytes) {}
  std::size_t size() const { return reader_.size() / kUnit; }
  std::uint64_t at(std::size_t index) const {
    return reader_.read<std::uint64_t>(index * kUnit).value_or(0);
  }

 private:
  ByteReader reader_;
};

bool appendRecord(SPXParseContext& context, std::uint32_t key, const Values& values) {
  Statistic statistic;
  if (!findStatistic(key, &statistic)) return true;
  const std::size_t taken = std::min<std::size_t>(values.size(), statistic.maximum);
  if (taken == 0) return true;
  if (!statistic.isArray) storeField(context, key, values.at(0));
  if (key == kReadCountHistoKey) {
    for (std::size_t i = 0; i < taken; ++i) context.readCountHisto[i] = values.at(i);
  }
  // A single value goes by the plain name, several by those of the elements.
  const std::size_t firstName = statistic.name + (taken == 1 ? 0u : 1u);
  for (std::size_t i = 0; i < taken; ++i) {
    const auto name = static_cast<std::uint16_t>(firstName + i);
    if (!appendCounter(context, name, values.at(i))) return false;
  }
  return true;
}

int fail(SPXParseContext& context) {
  context.exportVersion = 0;
  return 0;
}

}  // namespace

int SPXParseBufferToCxt(SPXParseContext* context, const void* buffer, std::size_t length) {
  context->driverVersion = kUnset;
  context->reserved.fill(kUnset);
  if (length < kUnit) return 0;
  const ByteReader reader({static_cast<const std::byte*>(buffer), length / kUnit * kUnit});
  for (std::size_t at = 0; at < reader.size();) {
    const std::uint32_t key = reader.read<std::uint32_t>(at).value_or(0);
    const std::uint32_t count = reader.read<std::uint32_t>(at + kCountOffset).value_or(0);
    // Compared in units: in bytes the product would wrap where sizes have 32 bits.
    const std::size_t unitsLeft = (reader.size() - at) / kUnit - 1;
    const auto values = count <= unitsLeft ? reader.slice(at + kUnit, count * kUnit) : std::nullopt;
    if (key > kHighestWireKey || !values) return fail(*context);
    if (!appendRecord(*context, key, Values(*values))) return fail(*context);
    at += kUnit + values->size();
  }
  return 1;
}

void SPXReleaseContext(SPXParseContext* context) {
  freeCounters(*context);
  *context = {};
}

}  // namespace tally
