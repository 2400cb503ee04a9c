// Subtracts samples.
#include "hwreport/samples.h"

#include <optional>
#include <vector>

#include "hwreport/channels/channel_walk.h"
#include "hwreport/channels/error_maker.h"
#include "hwreport/channels/keys.h"
#include "hwreport/channels/pairing.h"
#include "hwreport/channels/raw_element.h"

namespace tally {
namespace {

constexpr HwResult kDeltaFailed = 1;

constexpr bool isValid(std::uint64_t value) { return value != kHwReportInvalidValue; }

// Where the elements of a result go.
class DeltaOutput {
 public:
  DeltaOutput() = default;
  DeltaOutput(const DeltaOutput&) = delete;
  DeltaOutput& operator=(const DeltaOutput&) = delete;
  virtual ~DeltaOutput() = default;
  // Copies the first elements of a run, and bytes of its tail, to be changed.
  virtual WritableRun copy(const ElementRun& run, std::size_t elements, std::size_t tail = 0) = 0;
};

// Runs of a block have no tails.
class OutputInBlock final : public DeltaOutput {
 public:
  OutputInBlock(RunBlock& block, std::size_t row) : block_(block), row_(row) {}
  WritableRun copy(const ElementRun& run, std::size_t elements, std::size_t) override {
    return block_.addCopy(row_, run, elements);
  }

 private:
  RunBlock& block_;
  const std::size_t row_;
};

class OutputInData final : public DeltaOutput {
 public:
  WritableRun copy(const ElementRun& run, std::size_t elements, std::size_t tail) override {
    bytes_.resize(elements * element::kSize + tail);
    run.copyTo(bytes_);
    return {bytes_.data() + kElementIDs, element::kSize};
  }
  KvRef<KvData> data() const { return KvData::create(bytes_); }

 private:
  std::vector<std::byte> bytes_;
};

// The value of the slots that a simple channel's difference does not fill.
enum class OtherSlots { KeepEarlier, Invalidate };

bool subtractSimple(const ChannelReading& earlier, const ChannelReading& later, OtherSlots others,
                    DeltaOutput& result) {
  const auto before = earlier.runOfFormat(kHwReportFormatSimple);
  const auto after = later.runOfFormat(kHwReportFormatSimple);
  if (!before || !after || before->count() != 1 || after->count() != 1) return false;
  const std::uint64_t earlierValue = before->slot(0, simple_slot::kValue);
  const std::uint64_t laterValue = after->slot(0, simple_slot::kValue);
  if (!isValid(earlierValue) || !isValid(laterValue)) return false;
  // A run may have more elements than its 16-bit count.
  const WritableRun made = result.copy(*before, before->elements(), before->tail());
  for (std::size_t i = 0; others == OtherSlots::Invalidate && i < before->elements(); ++i) {
    for (std::size_t slot = 0; slot < element::kSlotCount; ++slot) {
      made.setSlot(i, slot, kHwReportInvalidValue);
    }
  }
  made.setSlot(0, simple_slot::kValue, laterValue - earlierValue);
  return true;
}

bool subtractStates(const ElementRun& earlier, const ElementRun& later, DeltaOutput& result) {
  const WritableRun made = result.copy(later, later.count());
  for (std::size_t i = 0; i < later.count(); ++i) {
    for (const auto slot : {state_slot::kInTransitions, state_slot::kResidency}) {
      const std::uint64_t before = earlier.slot(i, slot), after = later.slot(i, slot);
      if (!isValid(before) || !isValid(after)) return false;
      made.setSlot(i, slot, after - before);
    }
  }
  return true;
}

bool subtractBuckets(const ElementRun& earlier, const ElementRun& later, DeltaOutput& result) {
  const WritableRun made = result.copy(later, later.count());
  for (std::size_t i = 0; i < later.count(); ++i) {
    const std::uint64_t before = earlier.slot(i, bucket_slot::kHits);
    const std::uint64_t after = later.slot(i, bucket_slot::kHits);
    if (!isValid(before) || !isValid(after)) return false;
    made.setSlot(i, bucket_slot::kHits, after - before);
    const std::uint64_t sum = later.slot(i, bucket_slot::kSum);
    if (after == before) {
      made.setSlot(i, bucket_slot::kSum, kHwReportInvalidValue);
    } else if (before != 0) {
      made.setSlot(i, bucket_slot::kSum, sum - earlier.slot(i, bucket_slot::kSum));
    }
  }
  return true;
}

bool subtractArrays(const ElementRun& earlier, const ElementRun& later, DeltaOutput& result) {
  const WritableRun made = result.copy(later, later.count());
  for (std::size_t i = 0; i < later.count(); ++i) {
    for (std::size_t slot = 0; slot < element::kSlotCount; ++slot) {
      const std::uint64_t before = earlier.slot(i, slot), after = later.slot(i, slot);
      if (isValid(before)) made.setSlot(i, slot, isValid(after) ? after - before : before);
    }
  }
  return true;
}

// The formats whose runs are subtracted element by element.
struct RunFormat {
  std::uint8_t format;
  // The run that can be subtracted; empty when there is none.
  std::optional<ElementRun> (ChannelReading::*run)(std::uint8_t format) const;
  bool (*subtract)(const ElementRun& earlier, const ElementRun& later, DeltaOutput& result);
};
constexpr RunFormat kRunFormats[] = {
    {kHwReportFormatState, &ChannelReading::runOfLegend, subtractStates},
    {kHwReportFormatHistogram, &ChannelReading::runOfLegend, subtractBuckets},
    {kHwReportFormatSimpleArray, &ChannelReading::runOfFormat, subtractArrays},
};

// Puts later - earlier into the result; 0 or the code of the error that was reported.
HwResult subtract(const ChannelReading& earlier, const ChannelReading& later, OtherSlots others,
                  DeltaOutput& result, KvRef<HwReportError>* error) {
  const std::uint8_t format = later.format();
  if (format == kHwReportFormatUnknown || earlier.format() == kHwReportFormatUnknown) {
    return reportError(error, HwErrBadArgument);
  }
  if (format != earlier.format()) return reportError(error, HwErrBadArgument, "mismatched formats");
  if (format == kHwReportFormatSimple) {
    const bool done = subtractSimple(earlier, later, others, result);
    return done ? 0 : reportError(error, HwErrGeneral);
  }
  for (const RunFormat& known : kRunFormats) {
    if (known.format != format) continue;
    const auto before = (earlier.*known.run)(format), after = (later.*known.run)(format);
    const bool done = before && after && before->count() == after->count() &&
                      known.subtract(*before, *after, result);
    return done ? 0 : reportError(error, kDeltaFailed);
  }
  return reportError(error, HwErrUnsupportedFormat, "unknown report format");
}

// The difference of two samples of the same channels, in the order of the later one's runs. False
// when it cannot be made so; then nothing has been reported.
bool subtractRows(const ChannelFrame& earlier, const ChannelFrame& later, ChannelFrame& result) {
  const auto index = later.rows().index();
  if (!index->isComplete() || !later.hasRowsOf(earlier)) return false;
  const RunBlock& before = earlier.block();
  std::size_t done = 0;
  std::size_t position = 0;  // in the index, as long as its order is that of the runs
  const auto ahead = [&](std::size_t row) {
    before.prefetchPlace(row);
    result.block().prefetchPlace(row);
  };
  const bool all = later.block().eachInOrder(ahead, [&](std::size_t row, const ElementRun& after) {
    if (!before.has(row)) return false;
    const bool known = position < index->size() && index->row(position) == row;
    const auto type =
        known ? TypeWord{index->typeBits(position)} : typeWordOfLegend(later.rows().legend(row));
    ++position;
    OutputInBlock made(result.block(), row);
    ++done;
    return subtract({type, before.run(row)}, {type, after}, OtherSlots::Invalidate, made,
                    nullptr) == 0;
  });
  if (!all) return false;
  for (const auto& repeated : index->repeated()) {
    if (!result.block().has(repeated.first)) continue;
    if (!repeated.sameType) return false;
    result.block().share(repeated.row, repeated.first);
    ++done;
  }
  return done == later.size();
}

// The same channel by channel, in their order, with a search for those that have moved.
int subtractChannels(const KvArray& earlier, const KvArray& later, ChannelFrame& result,
                     KvRef<HwReportError>* error, bool* explained) {
  EarlierChannels counterparts(earlier);
  for (std::size_t i = 0; i < later.size(); ++i) {
    const auto* const channel = later.getAs<KvDictionary>(i);
    if (channel == nullptr) return HwIterFailed;
    const auto counterpart = counterparts.counterpartOf(*channel, i);
    if (!counterpart) return HwIterFailed;
    const std::size_t row = result.rowOf(i);
    if (*counterpart == nullptr) {
      result.copyElements(row, *channel);
      continue;
    }
    OutputInData made;
    *explained = subtract(readingOf(*counterpart), readingOf(channel), OtherSlots::Invalidate, made,
                          error) != 0;
    if (*explained) return HwIterFailed;
    result.setElements(row, made.data());
  }
  return HwIterContinue;
}

}  // namespace

KvRef<KvDictionary> HwReportCreateSamplesDelta(KvDictionary* earlier, KvDictionary* later,
                                               KvRef<HwReportError>* error) {
  if (earlier == nullptr || later == nullptr) {
    reportError(error, HwErrBadArgument);
    return nullptr;
  }
  bool explained = false;
  KvRef<KvDictionary> delta;
  const int result = transformLevels(
      later, earlier, true,
      [&](const LevelChannels& after, const LevelChannels* before, KvRef<ChannelFrame>* output) {
        *output = after.copyOfFrame();
        (*output)->makeBlock(after.frame() != nullptr ? after.frame()->block().sizeOfRuns() : 0);
        const bool inFrames = before->frame() != nullptr && after.frame() != nullptr;
        if (inFrames && subtractRows(*before->frame(), *after.frame(), **output)) {
          return HwIterContinue;
        }
        (*output)->makeBlock(0);
        return subtractChannels(before->array(), after.array(), **output, error, &explained);
      },
      &delta);
  if (!walkFailed(result)) return delta;
  if (!explained) reportError(error, HwErrGeneral);  // the collections differ in their levels
  return nullptr;
}

KvRef<KvDictionary> HwReportSampleCreateDelta(KvDictionary* earlier, KvDictionary* later,
                                              KvRef<HwReportError>* error) {
  OutputInData made;
  const HwResult failure =
      subtract(readingOf(earlier), readingOf(later), OtherSlots::KeepEarlier, made, error);
  if (failure != 0) return nullptr;
  auto result = earlier->copy();
  result->set(keys().rawElements, made.data());
  return result;
}

}  // namespace tally
