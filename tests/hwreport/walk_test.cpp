// The walk over collections: order, results, what malformed ones come to.
#include <gmock/gmock.h>

#include "hwreport/channel_world.h"
#include "hwreport/channels/channel_walk.h"

namespace tally {
namespace {

using namespace tests;

// Every level holds channels: a b at the top, c d below a driver, e below its group G, f below S.
KvRef<KvDictionary> nested() {
  const auto named = [](const char* name) { return channel(1, 1, name); };
  const auto group = flat({named("e")});
  group->set("HwReportChannelGroups", KvDictionary::create({{"S", flat({named("f")})}}));
  const auto driver = flat({named("c"), named("d")});
  driver->set("HwReportChannelGroups", KvDictionary::create({{"G", group}}));
  auto collection = flat({named("a"), named("b")});
  // The groups come after the drivers, wherever they are.
  collection->set("HwReportChannelGroups", KvDictionary::create({{"T", flat({named("g")})}}));
  collection->set("HwReportDrivers", KvDictionary::create({{"D", driver}}));
  return collection;
}

enum class Mode { Iterate, Prune, Transform, Delta };
constexpr Mode kModes[] = {Mode::Iterate, Mode::Prune, Mode::Transform, Mode::Delta};

// Walks in a mode with the result that each name asks for; the names visited, in order.
int walk(Mode mode, KvDictionary* collection, const std::map<std::string, int>& results,
         std::string* visited, KvRef<KvDictionary>* output) {
  const auto answer = [&](KvDictionary* one) {
    const std::string name(HwReportChannelGetChannelName(one)->view());
    *visited += name;
    const auto found = results.find(name);
    return found != results.end() ? found->second : 0;
  };
  if (mode == Mode::Iterate) return iterateChannels(collection, answer);
  if (mode == Mode::Prune) return pruneChannels(collection, answer);
  const auto step = [&](const LevelChannels& channels, const LevelChannels*,
                        KvRef<ChannelFrame>* made) {
    int result = 0;
    std::vector<std::uint32_t> kept;
    *made = channels.copy();
    for (std::uint32_t i = 0; i < channels.array().size() && !walkFailed(result); ++i) {
      auto* const one = channels.array().getAs<KvDictionary>(i);
      const int answered = one != nullptr ? answer(one) : HwIterFailed;
      result = walkFailed(answered) ? answered : result | answered;
      if (answered == 0) kept.push_back(i);
    }
    (*made)->keepRows(std::move(kept));
    return result;
  };
  const bool delta = mode == Mode::Delta;
  return transformLevels(collection, delta ? nested().get() : nullptr, delta, step, output);
}

TEST(Walk, ResultsInEveryMode) {
  constexpr int kDrop = HwIterDrop;
  const struct {
    std::map<std::string, int> results;
    int result;
    const char* visited;
    const char* kept;    // in the output of a transform or delta
    const char* pruned;  // what a prune leaves
  } cases[] = {
      {{}, 0, "abcdefg", "a b c d e f g", "a b c d e f g"},
      {{{"a", kDrop}, {"b", kDrop}}, kDrop, "abcdefg", "c d e f g", "c d e f g"},
      {{{"c", kDrop}, {"e", 2}, {"f", kDrop}}, kDrop | 2, "abcdefg", "a b d g", "a b d e g"},
      {{{"a", kDrop}, {"c", kDrop}, {"d", 1}}, 1, "abcd", nullptr, "b d e f g"},
      {{{"b", kDrop | 1}}, kDrop | 1, "ab", nullptr, "a b c d e f g"},
      {{{"a", 4}, {"f", HwIterFailed}}, HwIterFailed, "abcdef", nullptr, "a b c d e f g"},
  };
  for (const auto& c : cases) {
    for (const Mode mode : kModes) {
      const auto collection = nested();
      std::string visited;
      KvRef<KvDictionary> output;
      EXPECT_EQ(walk(mode, collection.get(), c.results, &visited, &output), c.result);
      EXPECT_EQ(visited, c.visited);
      EXPECT_EQ(namesOf(collection.get()), mode == Mode::Prune ? c.pruned : "a b c d e f g");
      const bool makes = mode == Mode::Transform || mode == Mode::Delta;
      ASSERT_EQ(!!output, makes && c.kept != nullptr);
      EXPECT_EQ(namesOf(output.get()), output ? c.kept : "");
    }
  }
}

TEST(Walk, MalformedCollectionsFailInEveryMode) {
  const auto with = [](const char* key, KvRef<KvObject> value) {
    auto collection = nested();
    collection->set(key, value);
    return collection;
  };
  const auto drivers = [&](KvRef<KvObject> driver, KvRef<KvObject> other = nullptr) {
    return with("HwReportDrivers", KvDictionary::create({{"x", other}, {"D", driver}}));
  };
  const auto cyclic = nested();
  cyclic->set("HwReportDrivers", KvDictionary::create({{"D", cyclic}}));
  const KvRef<KvDictionary> malformed[] = {
      nullptr,
      with("HwReportChannels", text("x")),
      with("HwReportChannels", KvArray::create({text("x")})),
      with("HwReportDrivers", KvArray::create()),
      drivers(flat({text("x")})),
      cyclic,
  };
  std::string visited;
  KvRef<KvDictionary> output;
  for (const auto& collection : malformed) {
    SCOPED_TRACE(&collection - malformed);
    EXPECT_EQ(HwReportGetChannelCount(collection.get()), -1);
    for (const Mode mode : kModes) {
      const auto copy = collection ? collection->copy() : nullptr;
      EXPECT_EQ(walk(mode, copy.get(), {}, &visited, &output), HwIterFailed);
      EXPECT_FALSE(output);
    }
  }
  cyclic->set("HwReportDrivers", nullptr);  // so that it is freed
  for (const Mode mode : kModes) {
    const auto stranger = drivers(flat({channel(1, 1, "n")}), text("not a driver"));
    EXPECT_EQ(walk(mode, stranger.get(), {}, &visited, &output), 0);
  }
  EXPECT_EQ(HwReportIterate(nested().get(), nullptr), HwIterFailed);
  EXPECT_EQ(HwReportPrune(nested().get(), nullptr), HwIterFailed);
}

}  // namespace
}  // namespace tally
