#include "storage/lists/defects_list.h"

#include <cstdio>

#include "base/byte_reader.h"

namespace tally {
namespace {

// 32-bit words, little endian: an unused one, the factory's count, the number of records; then
// the records.
constexpr std::size_t kFactoryCountOffset = 4, kRecordCountOffset = 8, kDefectsHeaderBytes = 12;
constexpr std::size_t kDefectBytes = 32;
constexpr std::size_t kBusOffset = 0, kChipEnableOffset = 2;  // 16 bits each
constexpr std::size_t kReasonOffset = 16, kTemperatureOffset = 24, kDefectModeOffset = 28;

// The 32-bit fields of a record, in the order in which they are reported.
struct DefectField {
  std::string_view name;
  std::size_t offset;
};
constexpr DefectField kDefectFields[] = {
    {"CAU", 4}, {"Block", 8}, {"Cycle", 12}, {"Reason", kReasonOffset}, {"Page", 20}};

// On one controller, the hundreds of a reason give the mode.
constexpr std::string_view kPlainReasonsClass = "SPXStorage";
constexpr std::uint32_t kReasonOfMode[] = {0, 200, 100};

std::uint32_t adjusted(std::uint32_t reason, std::uint32_t mode) {
  if (mode < std::size(kReasonOfMode)) return reason + kReasonOfMode[mode];
  std::fprintf(stderr, "Encountered unexpected defectMode: 0x%x", mode);
  return reason;
}

KvRef<KvDictionary> summaryOf(std::uint32_t factoryCount, const KvObject* characteristics) {
  auto summary = KvDictionary::create();
  summary->set("Factory Count", KvNumber::int32(static_cast<std::int32_t>(factoryCount)));
  if (const auto* known = kvCast<KvDictionary>(characteristics)) {
    if (const auto* description = known->getAs<KvNumber>("nand-device-desc")) {
      summary->set("vellum.NANDInfo.nandDesc", KvNumber::int32(description->asInt32()));
    }
  }
  return summary;
}

KvRef<KvDictionary> defectOf(const ByteReader& record, bool plainReasons) {
  auto defect = KvDictionary::create(8);
  defect->set("Bus", KvNumber::int32(record.read<std::uint16_t>(kBusOffset).value_or(0)));
  defect->set("CE", KvNumber::int32(record.read<std::uint16_t>(kChipEnableOffset).value_or(0)));
  for (const DefectField& field : kDefectFields) {
    auto value = record.read<std::uint32_t>(field.offset).value_or(0);
    if (field.offset == kReasonOffset && !plainReasons) {
      value = adjusted(value, record.read<std::uint32_t>(kDefectModeOffset).value_or(0));
    }
    defect->set(field.name, KvNumber::int32(static_cast<std::int32_t>(value)));
  }
  defect->set("Temperature",
              KvNumber::int8(record.read<std::int8_t>(kTemperatureOffset).value_or(0)));
  return defect;
}

}  // namespace

bool readDefectsList(const StorageList& list, const RecordSink& sink) {
  const ByteReader words(list.bytes);
  const auto factoryCount = words.read<std::uint32_t>(kFactoryCountOffset);
  const auto announced = words.read<std::uint32_t>(kRecordCountOffset);
  if (!factoryCount || !announced) {
    std::fputs("data cannot be parsed", stderr);
    return false;
  }
  sink(*summaryOf(*factoryCount, list.characteristics));
  const std::size_t present = (list.bytes.size() - kDefectsHeaderBytes) / kDefectBytes;
  const bool plainReasons = list.className == kPlainReasonsClass;
  for (std::size_t i = 0; i < *announced && i < present; ++i) {
    const ByteReader record(
        list.bytes.subspan(kDefectsHeaderBytes + i * kDefectBytes, kDefectBytes));
    sink(*defectOf(record, plainReasons));
  }
  if (*announced <= present) return true;
  std::fputs("data cannot be parsed", stderr);
  return false;
}

}  // namespace tally
