// One engine for all walks, so that they agree about order and failures.
#include "hwreport/channels/channel_walk.h"

#include <vector>

#include "hwreport/channels/keys.h"
#include "hwreport/channels/type_word.h"

namespace tally {

LevelChannels::LevelChannels(const KvDictionary& level)
    : level_(&level), frame_(KvRef<const ChannelFrame>::share(ChannelFrame::behind(level))) {
  if (frame_) return;
  const KvObject* const held = level.get(*keys().channels);
  array_ = kvCast<KvArray>(held);
  malformed_ = held != nullptr && array_ == nullptr;
  if (array_ != nullptr) {
    frame_ = KvRef<const ChannelFrame>::share(ChannelFrame::behind(*array_));
  }
}

KvRef<ChannelFrame> LevelChannels::copy() const {
  return frame_ && frame_->hasAllRows() && !frame_->isSampled()
             ? frame_->copyWithoutElements()
             : ChannelFrame::of(array(), ChannelFrame::Elements::Copied);
}

KvRef<ChannelFrame> LevelChannels::copyWithoutElements() const {
  return frame_ && frame_->hasAllRows() ? frame_->copyWithoutElements()
                                        : ChannelFrame::of(array(), ChannelFrame::Elements::Left);
}

KvRef<ChannelFrame> LevelChannels::copyOfFrame() const {
  return frame_ ? frame_->copyWithoutElements() : copyWithoutElements();
}

const KvArray& LevelChannels::array() const {
  return array_ != nullptr ? *array_ : *level_->getAs<KvArray>(*keys().channels);
}

bool LevelChannels::isWhole(const ChannelFrame& frame) const {
  return array_ == nullptr || array_->size() == frame.size();
}

namespace {

// Collections have at most four levels; a deeper one contains itself.
constexpr int kMaximumDepth = 16;

// What a walk does with the channels of one level.
class Mode {
 public:
  struct Traits {
    bool makesOutput = false, needsOther = false, prunes = false;
  };
  explicit Mode(const Traits& given) : traits(given) {}
  virtual ~Mode() = default;
  // Of a level that has some.
  virtual int visit(KvDictionary& level, const KvDictionary* other,
                    KvRef<ChannelFrame>* output) = 0;
  const Traits traits;
};

// The output of one level. A level of channels alone stays a frame.
class LevelOutput {
 public:
  KvRef<ChannelFrame> channels;
  void set(const KvRef<KvString>& key, KvRef<KvDictionary> level) {
    named().set(key, std::move(level));
  }
  KvRef<KvDictionary> take() {
    if (!made_ && channels) return channels->makeLevel();
    named();
    return std::move(made_);
  }

 private:
  KvDictionary& named() {
    if (!made_) {
      made_ = KvDictionary::create();
      if (channels) made_->set(keys().channels, channels->makeArray());
    }
    return *made_;
  }
  KvRef<KvDictionary> made_;
};

int walkLevel(Mode& mode, KvDictionary* collection, const KvDictionary* other, int depth,
              KvRef<KvDictionary>* output);

int walkNamed(Mode& mode, KvDictionary& collection, const KvDictionary* other, int depth,
              const KvRef<KvString>& key, LevelOutput& output) {
  KvObject* const held = collection.get(*key);
  if (held == nullptr) return HwIterContinue;
  const auto level = KvRef<KvDictionary>::share(kvCast<KvDictionary>(held));
  if (!level || (other != nullptr && !other->get(*key))) return HwIterFailed;
  const KvDictionary* const others = other != nullptr ? other->getAs<KvDictionary>(*key) : nullptr;
  const auto kept = mode.traits.makesOutput ? KvDictionary::create(level->size()) : nullptr;
  int result = HwIterContinue;
  bool walked = false;
  for (std::size_t i = 0; i < level->size(); ++i) {
    const KvDictionary::Entry entry = level->begin()[static_cast<std::ptrdiff_t>(i)];
    auto* const sub = kvCast<KvDictionary>(entry.value.get());
    if (sub == nullptr) continue;
    const KvDictionary* const subOther =
        others != nullptr ? others->getAs<KvDictionary>(*entry.key) : nullptr;
    KvRef<KvDictionary> subOutput;
    const int subResult = walkLevel(mode, sub, subOther, depth + 1, &subOutput);
    if (walkFailed(subResult)) return subResult;
    if (mode.traits.makesOutput) {
      if (!subOutput) return HwIterFailed;
      kept->set(entry.key, subOutput);
    }
    result |= subResult;
    walked = true;
  }
  if (!walked) return HwIterFailed;
  if (kept) output.set(key, kept);
  if (mode.traits.prunes) {
    level->removeIf([](const KvDictionary::Entry& entry) {
      const auto* sub = kvCast<KvDictionary>(entry.value.get());
      return sub != nullptr && sub->empty();
    });
    if (level->empty()) collection.remove(key->view());
  }
  return result;
}

int walkLevel(Mode& mode, KvDictionary* collection, const KvDictionary* other, int depth,
              KvRef<KvDictionary>* output) {
  if (collection == nullptr || depth > kMaximumDepth) return HwIterFailed;
  if (mode.traits.needsOther && other == nullptr) return HwIterFailed;
  LevelOutput made;
  int result = mode.visit(*collection, other, &made.channels);
  // A level of which there is a frame has no others below it.
  if (!walkFailed(result) && ChannelFrame::behind(*collection) == nullptr) {
    for (const auto* key : {&keys().drivers, &keys().channelGroups}) {
      const int levelResult = walkNamed(mode, *collection, other, depth, *key, made);
      result = walkFailed(levelResult) ? levelResult : result | levelResult;
      if (walkFailed(result)) break;
    }
  }
  if (walkFailed(result)) return result;
  if (output != nullptr && mode.traits.makesOutput) *output = made.take();
  return result;
}

// The channels of a large collection are scattered over memory, and a walk would mostly wait for
// them. So it prefetches: first the dictionaries, then their values or those of their rows, then
// the type word, which is next to the id.
constexpr std::size_t kDictionariesAhead = 32;
constexpr std::size_t kValuesAhead = 24;
constexpr std::size_t kLegendAhead = 20;
constexpr std::size_t kCacheLine = 64;

void fetchAhead(const KvArray& channels, std::size_t i) {
  if (const KvObject* const later = channels.get(i + kDictionariesAhead)) {
    const auto* const start = reinterpret_cast<const char*>(later);
    for (std::size_t line = 0; line < 3; ++line) __builtin_prefetch(start + line * kCacheLine);
  }
  if (const auto* const next = channels.getAs<KvDictionary>(i + kValuesAhead)) {
    if (const auto row = FrameChannel::of(next); row.frame != nullptr) {
      __builtin_prefetch(row.legend());
      row.frame->block().prefetch(row.row());
    } else {
      for (const auto& entry : *next) __builtin_prefetch(entry.value.get());
    }
  }
  __builtin_prefetch(
      legendElement(channels.getAs<KvDictionary>(i + kLegendAhead), kLegendTypeWord));
}

// The items of an array one after the other, up to its current length. step(channel, index) gives a
// result.
template <class Step>
int eachChannel(const KvArray& channels, Step step) {
  int result = HwIterContinue;
  for (std::size_t i = 0; i < channels.size(); ++i) {
    fetchAhead(channels, i);
    auto* const channel = channels.getAs<KvDictionary>(i);
    const int one = channel != nullptr ? step(channel, i) : HwIterFailed;
    if (walkFailed(one)) return one;
    result |= one;
  }
  return result;
}

// A mode that shows each channel to a callback.
class Visit final : public Mode {
 public:
  Visit(const HwReportCallback& callback, bool prunes)
      : Mode({.prunes = prunes}), callback_(callback) {}
  int visit(KvDictionary& level, const KvDictionary*, KvRef<ChannelFrame>*) override {
    KvObject* const held = level.get(*keys().channels);
    if (held == nullptr) return HwIterContinue;
    const auto channels = KvRef<KvArray>::share(kvCast<KvArray>(held));
    if (!channels) return HwIterFailed;
    // Dropped channels are removed in one pass: closing the gap after each would take quadratic
    // time.
    std::vector<std::size_t> dropped;
    const int result = eachChannel(*channels, [&](KvDictionary* channel, std::size_t i) {
      const int one = callback_(channel);
      if (traits.prunes && one == HwIterDrop) dropped.push_back(i);
      return one;
    });
    if (!dropped.empty()) channels->removeAt(dropped);
    if (traits.prunes && !walkFailed(result) && channels->empty()) {
      level.remove(keys().channels->view());
    }
    return result;
  }

 private:
  const HwReportCallback& callback_;
};

class Transform final : public Mode {
 public:
  Transform(const LevelStep& step, bool needsOther)
      : Mode({.makesOutput = true, .needsOther = needsOther}), step_(step) {}
  int visit(KvDictionary& level, const KvDictionary* other, KvRef<ChannelFrame>* output) override {
    const LevelChannels channels(level);
    if (channels.malformed()) return HwIterFailed;
    if (!channels) return HwIterContinue;
    if (other == nullptr) return step_(channels, nullptr, output);
    const LevelChannels others(*other);
    return others ? step_(channels, &others, output) : HwIterFailed;
  }

 private:
  const LevelStep& step_;
};

}  // namespace

int iterateChannels(KvDictionary* collection, const HwReportCallback& callback) {
  Visit mode(callback, false);
  return walkLevel(mode, collection, nullptr, 0, nullptr);
}

int pruneChannels(KvDictionary* collection, const HwReportCallback& callback) {
  Visit mode(callback, true);
  return walkLevel(mode, collection, nullptr, 0, nullptr);
}

int transformLevels(KvDictionary* collection, const KvDictionary* other, bool needsOther,
                    const LevelStep& step, KvRef<KvDictionary>* output) {
  Transform mode(step, needsOther);
  return walkLevel(mode, collection, other, 0, output);
}

int HwReportPrune(KvDictionary* collection, const HwReportCallback& callback) {
  return callback ? pruneChannels(collection, callback) : HwIterFailed;
}

int HwReportIterate(KvDictionary* collection, const HwReportCallback& callback) {
  return callback ? iterateChannels(collection, callback) : HwIterFailed;
}

std::int32_t HwReportGetChannelCount(KvDictionary* collection) {
  std::int32_t count = 0;
  const int result = iterateChannels(collection, [&](KvDictionary*) {
    ++count;
    return HwIterContinue;
  });
  return walkFailed(result) ? -1 : count;
}

}  // namespace tally
