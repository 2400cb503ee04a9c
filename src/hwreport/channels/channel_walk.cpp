// One engine for the four modes, so that they agree about order and failures.
#include "hwreport/channels/channel_walk.h"

#include <vector>

#include "hwreport/channels/keys.h"
#include "hwreport/channels/pairing.h"
#include "hwreport/channels/type_word.h"

namespace tally {
namespace {

// Collections have at most four levels; a deeper one contains itself.
constexpr int kMaximumDepth = 16;

// What a mode does with the channels of one array. The output is null unless the mode makes one.
class Mode {
 public:
  struct Traits {
    bool makesOutput = false, needsOther = false, prunes = false;
  };
  explicit Mode(const Traits& given) : traits(given) {}
  virtual ~Mode() = default;
  virtual int visit(KvArray& channels, const KvArray* others, KvArray* output) = 0;
  const Traits traits;
};

int walkLevel(Mode& mode, KvDictionary* collection, const KvDictionary* other, int depth,
              KvRef<KvDictionary>* output);

int walkArray(Mode& mode, KvDictionary& collection, const KvDictionary* other,
              KvDictionary* output) {
  const auto& key = keys().channels;
  KvObject* const held = collection.get(*key);
  if (held == nullptr) return HwIterContinue;
  const auto channels = KvRef<KvArray>::share(kvCast<KvArray>(held));
  const KvArray* const others = other != nullptr ? other->getAs<KvArray>(*key) : nullptr;
  if (!channels || (other != nullptr && others == nullptr)) return HwIterFailed;
  const auto kept = mode.traits.makesOutput ? KvArray::create(channels->size()) : nullptr;
  const int result = mode.visit(*channels, others, kept.get());
  if (walkFailed(result)) return result;
  if (output != nullptr) output->set(key, kept);
  if (mode.traits.prunes && channels->empty()) collection.remove(key->view());
  return result;
}

int walkNamed(Mode& mode, KvDictionary& collection, const KvDictionary* other, int depth,
              const KvRef<KvString>& key, KvDictionary* output) {
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
  if (output != nullptr) output->set(key, kept);
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
  KvRef<KvDictionary> made;
  if (mode.traits.makesOutput) made = KvDictionary::create();
  int result = walkArray(mode, *collection, other, made.get());
  for (const auto* key : {&keys().drivers, &keys().channelGroups}) {
    if (walkFailed(result)) return result;
    const int levelResult = walkNamed(mode, *collection, other, depth, *key, made.get());
    result = walkFailed(levelResult) ? levelResult : result | levelResult;
  }
  if (walkFailed(result)) return result;
  if (output != nullptr) *output = std::move(made);
  return result;
}

// The channels of a large collection are scattered over memory, and a walk would mostly wait for
// them. So it prefetches: first the dictionaries, then their values, then the type word, which is
// next to the id.
constexpr std::size_t kDictionariesAhead = 32;
constexpr std::size_t kValuesAhead = 24;
constexpr std::size_t kLegendAhead = 20;
constexpr std::size_t kCallbackAhead = 16;
constexpr std::size_t kCacheLine = 64;

void fetchAhead(const KvArray& channels, std::size_t i) {
  if (const KvObject* const later = channels.get(i + kDictionariesAhead)) {
    const auto* const start = reinterpret_cast<const char*>(later);
    for (std::size_t line = 0; line < 3; ++line) __builtin_prefetch(start + line * kCacheLine);
  }
  if (const auto* const next = channels.getAs<KvDictionary>(i + kValuesAhead)) {
    for (const auto& entry : *next) __builtin_prefetch(entry.value.get());
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

class Iterate final : public Mode {
 public:
  explicit Iterate(const HwReportCallback& callback) : Mode({}), callback_(callback) {}
  int visit(KvArray& channels, const KvArray*, KvArray*) override {
    return eachChannel(channels,
                       [&](KvDictionary* channel, std::size_t) { return callback_(channel); });
  }

 private:
  const HwReportCallback& callback_;
};

class Prune final : public Mode {
 public:
  explicit Prune(const HwReportCallback& callback) : Mode({.prunes = true}), callback_(callback) {}
  int visit(KvArray& channels, const KvArray*, KvArray*) override {
    // Dropped channels are removed in one pass: closing the gap after each would take quadratic
    // time.
    std::vector<std::size_t> dropped;
    const int result = eachChannel(channels, [&](KvDictionary* channel, std::size_t i) {
      const int one = callback_(channel);
      if (one == HwIterDrop) dropped.push_back(i);
      return one;
    });
    channels.removeAt(dropped);
    return result;
  }

 private:
  const HwReportCallback& callback_;
};

class Transform final : public Mode {
 public:
  Transform(KvArena& arena, const TransformCallback& callback,
            const std::function<void(const KvDictionary&)>& ahead)
      : Mode({.makesOutput = true}), arena_(arena), callback_(callback), ahead_(ahead) {}
  int visit(KvArray& channels, const KvArray*, KvArray* output) override {
    return eachChannel(channels, [&](KvDictionary* channel, std::size_t i) {
      if (ahead_) {
        const auto* const next = channels.getAs<KvDictionary>(i + kCallbackAhead);
        if (next != nullptr) ahead_(*next);
      }
      auto copy = channel->copy(1, &arena_);  // space for the elements
      const int one = callback_(channel, copy.get());
      if (one == HwIterContinue) output->append(std::move(copy));
      return one;
    });
  }

 private:
  KvArena& arena_;
  const TransformCallback& callback_;
  const std::function<void(const KvDictionary&)>& ahead_;
};

class Delta final : public Mode {
 public:
  Delta(KvArena& arena, const DeltaCallback& callback)
      : Mode({.makesOutput = true, .needsOther = true}), arena_(arena), callback_(callback) {}
  int visit(KvArray& channels, const KvArray* others, KvArray* output) override {
    EarlierChannels earlier(*others);
    return eachChannel(channels, [&](KvDictionary* channel, std::size_t i) -> int {
      const auto counterpart = earlier.counterpartOf(*channel, i);
      if (!counterpart) return HwIterFailed;
      auto copy = channel->copy(0, &arena_);
      const int one =
          *counterpart != nullptr ? callback_(*counterpart, channel, copy.get()) : HwIterContinue;
      if (one == HwIterContinue) output->append(std::move(copy));
      return one;
    });
  }

 private:
  KvArena& arena_;
  const DeltaCallback& callback_;
};

}  // namespace

int iterateChannels(KvDictionary* collection, const HwReportCallback& callback) {
  Iterate mode(callback);
  return walkLevel(mode, collection, nullptr, 0, nullptr);
}

int pruneChannels(KvDictionary* collection, const HwReportCallback& callback) {
  Prune mode(callback);
  return walkLevel(mode, collection, nullptr, 0, nullptr);
}

int transformChannels(KvDictionary* collection, KvArena& arena, const TransformCallback& callback,
                      KvRef<KvDictionary>* output,
                      const std::function<void(const KvDictionary&)>& ahead) {
  Transform mode(arena, callback, ahead);
  return walkLevel(mode, collection, nullptr, 0, output);
}

int deltaChannels(KvDictionary* later, KvDictionary* earlier, KvArena& arena,
                  const DeltaCallback& callback, KvRef<KvDictionary>* output) {
  Delta mode(arena, callback);
  return walkLevel(mode, later, earlier, 0, output);
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
