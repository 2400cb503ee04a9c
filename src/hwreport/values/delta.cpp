// Subtracts samples.
#include "hwreport/samples.h"

#include <cstring>
#include <vector>

#include "hwreport/channel.h"
#include "hwreport/channels/channel_walk.h"
#include "hwreport/channels/error_maker.h"
#include "hwreport/channels/keys.h"
#include "hwreport/channels/raw_element.h"
#include "hwreport/values.h"

namespace tally {
namespace {

constexpr HwResult kDeltaFailed = 1;

constexpr bool isValid(std::uint64_t value) { return value != kHwReportInvalidValue; }

// The elements of a result channel.
class Elements {
 public:
  explicit Elements(std::span<const std::byte> basis) : bytes_(basis.begin(), basis.end()) {}
  void setSlot(std::size_t index, std::size_t number, std::uint64_t value) {
    std::memcpy(bytes_.data() + index * element::kSize + element::slot(number), &value,
                sizeof(value));
  }
  // All slots of all elements: a run may have more of them than its 16-bit count.
  void invalidate() {
    for (std::size_t index = 0; index < bytes_.size() / element::kSize; ++index) {
      for (std::size_t slot = 0; slot < element::kSlotCount; ++slot) {
        setSlot(index, slot, kHwReportInvalidValue);
      }
    }
  }
  void storeIn(KvDictionary& channel, KvArena* arena) const {
    channel.set(keys().rawElements, KvData::create(bytes_, arena));
  }

 private:
  std::vector<std::byte> bytes_;
};

// The value of the slots that a simple channel's difference does not fill.
enum class OtherSlots { KeepEarlier, Invalidate };

struct Pair {
  const KvDictionary* earlier;
  const KvDictionary* later;
  KvDictionary* result;  // its elements are taken to be the earlier's
  KvArena* arena;        // for the result's; may be null
};

bool subtractSimple(const Pair& pair, OtherSlots others) {
  const auto later = HwReportSimpleGetIntegerValue(pair.later);
  const auto earlier = HwReportSimpleGetIntegerValue(pair.earlier);
  const auto laterBits = static_cast<std::uint64_t>(later);
  const auto earlierBits = static_cast<std::uint64_t>(earlier);
  if (!isValid(laterBits) || !isValid(earlierBits)) return false;
  const auto* const basis = pair.earlier->getAs<KvData>(*keys().rawElements);
  Elements elements(basis->bytes());
  if (others == OtherSlots::Invalidate) elements.invalidate();
  elements.setSlot(0, simple_slot::kValue, laterBits - earlierBits);
  elements.storeIn(*pair.result, pair.arena);
  return true;
}

// The runs of a state or histogram pair whose runs and legends agree on the number of elements.
bool readRuns(const Pair& pair, std::uint8_t format, ElementRun* earlier, ElementRun* later) {
  const auto earlierRun = runOfLegend(pair.earlier, format);
  const auto laterRun = runOfLegend(pair.later, format);
  if (!earlierRun || !laterRun) return false;
  const std::uint16_t count = earlierRun->count();
  if (count != countOfFormat(pair.result, format) || count != laterRun->count()) return false;
  *earlier = *earlierRun;
  *later = *laterRun;
  return true;
}

bool subtractStates(const Pair& pair) {
  ElementRun earlier, later;
  if (!readRuns(pair, kHwReportFormatState, &earlier, &later)) return false;
  Elements elements(later.bytes());
  for (std::size_t i = 0; i < later.count(); ++i) {
    for (const auto slot : {state_slot::kInTransitions, state_slot::kResidency}) {
      const std::uint64_t before = earlier.slot(i, slot), after = later.slot(i, slot);
      if (!isValid(before) || !isValid(after)) return false;
      elements.setSlot(i, slot, after - before);
    }
  }
  elements.storeIn(*pair.result, pair.arena);
  return true;
}

bool subtractBuckets(const Pair& pair) {
  ElementRun earlier, later;
  if (!readRuns(pair, kHwReportFormatHistogram, &earlier, &later)) return false;
  Elements elements(later.bytes());
  for (std::size_t i = 0; i < later.count(); ++i) {
    const std::uint64_t before = earlier.slot(i, bucket_slot::kHits);
    const std::uint64_t after = later.slot(i, bucket_slot::kHits);
    if (!isValid(before) || !isValid(after)) return false;
    elements.setSlot(i, bucket_slot::kHits, after - before);
    const std::uint64_t sum = later.slot(i, bucket_slot::kSum);
    if (after == before) {
      elements.setSlot(i, bucket_slot::kSum, kHwReportInvalidValue);
    } else if (before != 0) {
      elements.setSlot(i, bucket_slot::kSum, sum - earlier.slot(i, bucket_slot::kSum));
    }
  }
  elements.storeIn(*pair.result, pair.arena);
  return true;
}

bool subtractArrays(const Pair& pair) {
  const auto earlier = runOfFormat(pair.earlier, kHwReportFormatSimpleArray);
  const auto later = runOfFormat(pair.later, kHwReportFormatSimpleArray);
  if (!earlier || !later || earlier->count() != later->count()) return false;
  Elements elements(later->bytes());
  for (std::size_t i = 0; i < later->count(); ++i) {
    for (std::size_t slot = 0; slot < element::kSlotCount; ++slot) {
      const std::uint64_t before = earlier->slot(i, slot), after = later->slot(i, slot);
      if (isValid(before)) elements.setSlot(i, slot, isValid(after) ? after - before : before);
    }
  }
  elements.storeIn(*pair.result, pair.arena);
  return true;
}

// Puts later - earlier into the result; 0 or the code of the error that was reported.
HwResult subtract(const Pair& pair, OtherSlots others, KvRef<HwReportError>* error) {
  const std::uint8_t format = HwReportChannelGetFormat(pair.later);
  const std::uint8_t earlierFormat = HwReportChannelGetFormat(pair.earlier);
  if (format == kHwReportFormatUnknown || earlierFormat == kHwReportFormatUnknown) {
    return reportError(error, HwErrBadArgument);
  }
  if (format != earlierFormat) return reportError(error, HwErrBadArgument, "mismatched formats");
  bool done = false;
  switch (format) {
    case kHwReportFormatSimple:
      return subtractSimple(pair, others) ? 0 : reportError(error, HwErrGeneral);
    case kHwReportFormatState:
      done = subtractStates(pair);
      break;
    case kHwReportFormatHistogram:
      done = subtractBuckets(pair);
      break;
    case kHwReportFormatSimpleArray:
      done = subtractArrays(pair);
      break;
    default:
      return reportError(error, HwErrUnsupportedFormat, "unknown report format");
  }
  return done ? 0 : reportError(error, kDeltaFailed);
}

}  // namespace

KvRef<KvDictionary> HwReportCreateSamplesDelta(KvDictionary* earlier, KvDictionary* later,
                                               KvRef<HwReportError>* error) {
  if (earlier == nullptr || later == nullptr) {
    reportError(error, HwErrBadArgument);
    return nullptr;
  }
  bool explained = false;
  KvArena arena;
  KvRef<KvDictionary> delta;
  const int result = deltaChannels(
      later, earlier, arena,
      [&](KvDictionary* before, KvDictionary* after, KvDictionary* made) {
        explained = subtract({before, after, made, &arena}, OtherSlots::Invalidate, error) != 0;
        return explained ? 1 : HwIterContinue;  // a code may be even; any failure ends the walk
      },
      &delta);
  if (!walkFailed(result)) return delta;
  if (!explained) reportError(error, HwErrGeneral);  // the collections differ in their levels
  return nullptr;
}

KvRef<KvDictionary> HwReportSampleCreateDelta(KvDictionary* earlier, KvDictionary* later,
                                              KvRef<HwReportError>* error) {
  auto result = earlier != nullptr ? earlier->copy() : nullptr;
  if (subtract({earlier, later, result.get(), nullptr}, OtherSlots::KeepEarlier, error) != 0)
    return nullptr;
  return result;
}

}  // namespace tally
