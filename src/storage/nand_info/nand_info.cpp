// CopyNANDInfo, and small helpers for its dictionary.
#include "storage/nand_info.h"

#include <cstdio>

#include "storage/analytics_events.h"
#include "storage/controller/statistics_fetch.h"
#include "storage/nand_info/analytics_day.h"
#include "storage/nand_info/nand_info_failure.h"
#include "storage/reclaim.h"

namespace tally {
namespace {

constexpr std::string_view kUnparsable = "Unable to parse buffer";

KvRef<KvDictionary> fetchNandInfo() {
  const LoadedStatistics statistics;
  if (!statistics) return nandInfoFailure(kUnparsable);
  return buildNandInfo(statistics.context(), false);
}

}  // namespace

KvRef<KvDictionary> CopyNANDInfo() {
  auto info = fetchNandInfo();
  if (!addReclaimFigures(*info)) {
    setFailure(*info, kNANDInfoReclaimErrorKey, kNANDInfoReclaimErrorMessageKey,
               "Unable to parse reclaim counters");
  }
  return info;
}

KvRef<KvDictionary> CopyNANDInfoWithOptions(std::uint32_t options) {
  if (isAnalyticsDay()) {
    const bool wanted = (options & kNANDInfoAnalyticsOption) != 0;
    return wanted ? LogtoEPNANDInfoWithOptions(options) : nullptr;
  }
  auto info = CopyNANDInfo();
  return info ? info : nandInfoFailure(kUnparsable);
}

KvRef<KvObject> GetNumberFromDictionarySafe(const KvDictionary& dictionary, std::string_view key) {
  KvObject* const value = dictionary.get(key);
  if (value == nullptr) return KvNumber::int32(kZero);
  return KvRef<KvObject>::share(value);
}

KvRef<KvObject> GetStringFromDictionarySafe(const KvDictionary& dictionary, std::string_view key) {
  KvObject* const value = dictionary.get(key);
  if (value == nullptr) return KvString::create("empty");
  return KvRef<KvObject>::share(value);
}

void setNumberInDictionary(KvDictionary& dictionary, std::string_view key, const void* valuePointer,
                           NumberType numberType) {
  KvRef<KvNumber> number;
  if (valuePointer != nullptr && numberType == NumberType::SInt32) {
    number = KvNumber::int32(*static_cast<const std::int32_t*>(valuePointer));
  } else if (valuePointer != nullptr && numberType == NumberType::SInt64) {
    number = KvNumber::int64(*static_cast<const std::int64_t*>(valuePointer));
  }
  if (!number) {
    std::fprintf(stderr, "Failed to create KvNumber from value: %p", valuePointer);
    return;
  }
  dictionary.set(key, std::move(number));
}

}  // namespace tally
