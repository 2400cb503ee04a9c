// CopyNANDInfo and the day rule; small dictionary helpers.
#include "storage/nand_info.h"

#include <array>
#include <cmath>
#include <cstdio>
#include <optional>
#include <span>

#include "base/time_text.h"
#include "platform/platform.h"
#include "storage/analytics_events.h"
#include "storage/auxiliary_metrics.h"
#include "storage/exporter.h"
#include "storage/nand_info/analytics_day.h"
#include "storage/nand_info/nand_info_failure.h"

namespace tally {
namespace {

constexpr std::string_view kUnparsable = "Unable to parse buffer";
constexpr std::size_t kBootSessionRoom = 100;

// The first character of the boot session identifier; a zero byte of an empty one. Empty when
// there is no identifier.
std::optional<char> bootSessionInitial() {
  std::array<std::byte, kBootSessionRoom> text{};
  std::size_t length = text.size();
  if (platform().kernelValues->readKernelValue("kern.bootsessionuuid", text, &length) != 0) {
    return std::nullopt;
  }
  return length == 0 ? '\0' : static_cast<char>(text[0]);
}

// That of the hexadecimal digit; anything else counts as even.
bool isOddDigit(char digit) {
  if (digit >= '0' && digit <= '9') return (digit & 1) != 0;
  if (digit >= 'A' && digit <= 'F') return ((digit + 1) & 1) != 0;
  return false;
}

KvRef<KvDictionary> fetchNandInfo() {
  SPXParseContext context;
  const NandExporter* exporter = nullptr;
  if (!loadNandStatistics(&exporter, &context)->value()) return nandInfoFailure(kUnparsable);
  auto info = buildNandInfo(context, false);
  if (exporter->releaseContext != nullptr) exporter->releaseContext(&context);
  return info;
}

}  // namespace

bool isAnalyticsDay() {
  const std::optional<char> initial = bootSessionInitial();
  if (!initial) return false;
  const double day = std::floor(platform().clock->secondsSince1970() / kSecondsPerDay);
  const bool isOddDay = std::fmod(day, 2.0) != 0.0;
  return isOddDay == isOddDigit(*initial);
}

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
