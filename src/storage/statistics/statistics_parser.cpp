// The statistics buffer: one pass over its records, which become fixed fields and counters.
#include "storage/statistics.h"

#include <algorithm>
#include <array>
#include <span>

#include "base/byte_reader.h"
#include "platform/protocol/storage_protocol.h"
#include "storage/statistics/counter_list.h"
#include "storage/statistics/statistic_keys.h"

namespace tally {
namespace {

constexpr std::size_t kUnit = 8;  // a header, or a value
constexpr std::size_t kValueCountOffset = 4;
constexpr std::uint32_t kHighestWireKey = 0x30000000;
constexpr std::uint32_t kUnset = 0xFFFFFFFF;
constexpr std::uint32_t kReadCountHistoKey = 265;

// The statistics that also have a field of their own, and where it is, by key.
template <class T>
struct FieldOfKey {
  std::uint32_t key;
  T SPXParseContext::*field;
};
constexpr auto kNarrowFields = std::to_array<FieldOfKey<std::uint32_t>>({
    {49, &SPXParseContext::bytesPerPage},
    {50, &SPXParseContext::pagesPerVirtualBlock},
    {51, &SPXParseContext::blocksPerVirtualBlock},
    {52, &SPXParseContext::numVirtualBlocks},
    {53, &SPXParseContext::exportVersion},
});
constexpr auto kWideFields = std::to_array<FieldOfKey<std::uint64_t>>({
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
});
constexpr std::uint32_t kHighestFieldKey = 56;

template <class T, std::size_t N>
constexpr auto fieldsByKey(const std::array<FieldOfKey<T>, N>& rows) {
  std::array<T SPXParseContext::*, kHighestFieldKey + 1> fields{};
  for (const auto& [key, field] : rows) fields[key] = field;
  return fields;
}

void storeField(SPXParseContext& context, std::uint32_t key, std::uint64_t value) {
  static constexpr auto narrow = fieldsByKey(kNarrowFields);
  static constexpr auto wide = fieldsByKey(kWideFields);
  if (key > kHighestFieldKey) return;
  if (narrow[key] != nullptr) context.*narrow[key] = static_cast<std::uint32_t>(value);
  if (wide[key] != nullptr) context.*wide[key] = value;
}

// The values of one record, all of them inside the buffer.
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
  if (key == kKnownAloneStatistic) context.exportsKnownAlone = true;
  const Statistic* const statistic = findStatistic(key);
  if (statistic == nullptr) return true;
  const std::size_t taken = std::min<std::size_t>(values.size(), statistic->elements);
  if (taken == 0) return true;
  storeField(context, key, values.at(0));
  if (key == kReadCountHistoKey) {
    for (std::size_t i = 0; i < taken; ++i) context.readCountHisto[i] = values.at(i);
  }
  // A single value has the plain name, several have those of the elements.
  const std::size_t firstName = statistic->name + (taken == 1 ? 0u : 1u);
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
    const std::uint32_t count = reader.read<std::uint32_t>(at + kValueCountOffset).value_or(0);
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
