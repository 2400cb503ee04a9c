// The health summary of the NAND info dictionary, and the extract for each audience.
#include "storage/auxiliary/health.h"

#include <algorithm>
#include <span>

#include "storage/health.h"
#include "storage/nand_info.h"

namespace tally {
namespace {

constexpr std::string_view kWearKeys[] = {
    "vellum.NANDInfo.fwUpdatesPercentUsed",
    "vellum.NANDInfo.IntermediatePartitionPEPercentUsed",
    "vellum.NANDInfo.UserPartitionPEPercentUsed",
};
constexpr std::string_view kEndToEndKeys[] = {
    "vellum.NANDInfo.E2E_H2F_VL_LBA",  "vellum.NANDInfo.E2E_H2F_VL_Corr",
    "vellum.NANDInfo.E2E_H2F_VL_UECC", "vellum.NANDInfo.E2E_H2F_SL_LBA",
    "vellum.NANDInfo.E2E_H2F_SL_Corr", "vellum.NANDInfo.E2E_H2F_SL_UECC",
    "vellum.NANDInfo.E2E_F2H_VL_LBA",  "vellum.NANDInfo.E2E_F2H_VL_Corr",
    "vellum.NANDInfo.E2E_F2H_VL_UECC", "vellum.NANDInfo.E2E_F2H_SL_LBA",
    "vellum.NANDInfo.E2E_F2H_SL_Corr", "vellum.NANDInfo.E2E_F2H_SL_UECC",
};
constexpr std::string_view kHostReadKeys[] = {
    "vellum.NANDInfo.ueccReads",
    "vellum.NANDInfo.raidSmartErrors",
};
constexpr std::string_view kGrownBadKey = "vellum.NANDInfo.numGrownBad";
constexpr std::string_view kSpareKey = "vellum.NANDInfo.spareAvailablePercent";
constexpr std::string_view kPlainKeys[] = {kGrownBadKey, kSpareKey};

// Below this a drive is taken out of service.
constexpr std::uint32_t kLeastSparePercent = 3;

struct HealthGroup {
  std::span<const std::string_view> keys;
  std::string_view largestKey;
  bool isWide;
};
constexpr HealthGroup kGroups[] = {
    {kWearKeys, kNANDInfoHealthMaxPercentageNANDUsedKey, false},
    {kEndToEndKeys, kNANDInfoHealthMaxE2EErrorsKey, true},
    {kHostReadKeys, kNANDInfoHealthHostReadErrorsKey, true},
};

// Reads and copies values, and remembers whether one of them was not a number.
class HealthCopier {
 public:
  // A source with a failure of its own gives a copy with one.
  explicit HealthCopier(const KvDictionary& from)
      : from_(from), failed_(kvCast<KvNumber>(from.get(kNANDInfoErrorKey)) != nullptr) {}
  std::int32_t read(std::string_view key) {
    const auto value = GetNumberFromDictionarySafe(from_, key);
    const auto* number = kvCast<KvNumber>(value.get());
    if (number == nullptr) failed_ = true;
    return number == nullptr ? 0 : number->asInt32();
  }
  std::int32_t copy(KvDictionary& to, std::string_view key) {
    const std::int32_t value = read(key);
    to.set(key, KvNumber::int32(value));
    return value;
  }
  void copyAll(KvDictionary& to, std::span<const std::string_view> keys) {
    for (const std::string_view key : keys) copy(to, key);
  }
  void markFailure(KvDictionary& to) const {
    if (failed_) to.set(kNANDInfoErrorKey, KvNumber::int32(kOne));
  }

 private:
  const KvDictionary& from_;
  bool failed_;
};

void copyGroup(HealthCopier& copier, KvDictionary& health, const HealthGroup& group) {
  std::uint32_t largest = 0;
  for (const std::string_view key : group.keys) {
    const std::int32_t value = copier.read(key);
    if (group.isWide) {
      health.set(key, KvNumber::int64(value));
    } else {
      health.set(key, KvNumber::int32(value));
    }
    largest = std::max(largest, static_cast<std::uint32_t>(value));
  }
  health.set(group.largestKey, KvNumber::int32(static_cast<std::int32_t>(largest)));
}

constexpr std::string_view kServiceKeys[] = {kNANDInfoHealthMaxPercentageNANDUsedKey,
                                             kNANDInfoHealthHostReadErrorsKey, kGrownBadKey,
                                             kNANDInfoHealthMaxE2EErrorsKey};
constexpr std::string_view kUpdateKeys[] = {kNANDInfoHealthMaxPercentageNANDUsedKey,
                                            kNANDInfoHealthHostReadErrorsKey, kGrownBadKey};

}  // namespace

KvRef<KvDictionary> healthOfNandInfo(const KvDictionary& info) {
  auto health = KvDictionary::create();
  HealthCopier copier(info);
  for (const HealthGroup& group : kGroups) copyGroup(copier, *health, group);
  copier.copyAll(*health, kPlainKeys);
  copier.markFailure(*health);
  return health;
}

KvRef<KvDictionary> fixlineExtract(const KvDictionary& health) {
  auto extract = KvDictionary::create();
  HealthCopier copier(health);
  copier.copyAll(*extract, kServiceKeys);
  extract->set(kNANDInfoHealthIsNANDRefurbishableKey, KvNumber::int32(kOne));
  copier.markFailure(*extract);
  return extract;
}

KvRef<KvDictionary> internalLabExtract(const KvDictionary& health) {
  auto extract = KvDictionary::create();
  HealthCopier copier(health);
  copier.copyAll(*extract, kServiceKeys);
  const auto spare = static_cast<std::uint32_t>(copier.copy(*extract, kSpareKey));
  extract->set(kNANDInfoHealthIsNANDRetirableKey,
               KvNumber::int32(spare < kLeastSparePercent ? kOne : kZero));
  copier.markFailure(*extract);
  return extract;
}

KvRef<KvDictionary> otaExtract(const KvDictionary& health) {
  auto extract = KvDictionary::create();
  HealthCopier copier(health);
  copier.copyAll(*extract, kUpdateKeys);
  copier.copyAll(*extract, kEndToEndKeys);
  copier.markFailure(*extract);
  return extract;
}

std::span<const std::string_view> countersOfHealthFigure(std::string_view key) {
  for (const HealthGroup& group : kGroups) {
    if (group.largestKey == key) return group.keys;
  }
  return {};
}

KvRef<KvDictionary> CopyNANDHealthInfo() { return healthOfNandInfo(*CopyNANDInfo()); }
KvRef<KvDictionary> CopyFixlineNANDInfo() { return fixlineExtract(*CopyNANDHealthInfo()); }
KvRef<KvDictionary> CopyInternalLabNANDInfo() { return internalLabExtract(*CopyNANDHealthInfo()); }
KvRef<KvDictionary> CopyOTANANDInfo() { return otaExtract(*CopyNANDHealthInfo()); }

}  // namespace tally
