// What a daily log holds, in the order and with the bytes of dictionaries that are written whole.
#include "kv/plist_xml_writer.h"
#include "report/logged_distributions.h"
#include "report/logged_scalars.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <limits>
#include <random>
#include <string>
#include <vector>

#include "kv/plist_codec.h"

namespace tally {
namespace {

std::size_t below(std::mt19937_64& random, std::size_t bound) {
  return static_cast<std::size_t>(random()) % bound;
}

// Few letters and lengths, so that keys begin alike and come again.
std::string anyKey(std::mt19937_64& random) {
  std::string key(below(random, 5), 'a');
  for (char& letter : key) letter = "ab\x7f&<"[below(random, 5)];
  if (random() % 8 == 0) key += "\u00e9\u20ac";
  return key + std::string(random() % 50 == 0 ? 300 : 0, 'z');
}

std::int64_t anyValue(std::mt19937_64& random) {
  constexpr std::int64_t kEnds[] = {0,
                                    -1,
                                    63,
                                    64,
                                    -64,
                                    -65,
                                    std::numeric_limits<std::int64_t>::max(),
                                    std::numeric_limits<std::int64_t>::min()};
  return random() % 2 == 0 ? kEnds[below(random, std::size(kEnds))]
                           : static_cast<std::int64_t>(random()) >> (random() % 64);
}

TEST(LoggedScalars, AreInTheOrderOfADictionary) {
  for (unsigned seed = 0; seed < 300; ++seed) {
    std::mt19937_64 random(seed);
    LoggedScalars scalars;
    const auto expected = KvDictionary::create();
    std::vector<std::string> keys(below(random, 40));
    for (std::string& key : keys) key = anyKey(random);
    // As the store gives them, then what is measured; or in any order.
    if (seed % 3 != 0) std::ranges::sort(keys);
    const std::size_t later = seed % 2 == 0 ? 6 : 0;
    for (std::size_t i = 0; i < later; ++i) keys.push_back(anyKey(random));
    for (const std::string& key : keys) {
      const std::int64_t value = anyValue(random);
      scalars.set(key, value);
      expected->set(key, KvNumber::int64(value));
    }
    EXPECT_EQ(scalars.empty(), keys.empty());
    XmlPlistWriter writer(kPlistMaximumBytes);
    std::size_t around = writer.size();
    if (keys.empty()) {
      writer.emptyDictionary();
    } else {
      writer.beginDictionary();
      scalars.each([&](std::string_view key, std::int64_t value) {
        writer.key(key);
        writer.integer(value);
        return true;
      });
      writer.endDictionary();
      around += std::string_view("<dict>\n</dict>\n").size();
      EXPECT_LE(writer.size(), around + scalars.mostBytes());
    }
    EXPECT_EQ(*writer.finish(), *encodeXmlPlist(*expected)) << seed;
  }
}

TEST(LoggedDistributions, TheLastOfAKeyStays) {
  for (unsigned seed = 0; seed < 100; ++seed) {
    std::mt19937_64 random(seed);
    LoggedDistributions distributions;
    const auto statistics = KvDictionary::create();
    std::vector<std::string> keys(below(random, 20));
    for (std::string& key : keys) key = anyKey(random);
    if (seed % 2 != 0) std::ranges::sort(keys);
    for (const std::string& key : keys) {
      DistributionResult result;
      result.summary.count = static_cast<std::int64_t>(random() % 100);
      statistics->set(key, result.summary.toArray());
      distributions.set(key, result);
    }
    const auto found = KvDictionary::create();
    for (const auto& [key, result] : distributions) found->set(key, result.summary.toArray());
    EXPECT_EQ(*encodeXmlPlist(*found), *encodeXmlPlist(*statistics)) << seed;
    EXPECT_FALSE(distributions.hasHistograms());
  }
}

TEST(XmlPlistWriter, PiecesAreTheDocument) {
  const auto inner = KvDictionary::create(), root = KvDictionary::create();
  for (int i = 0; i < 5000; ++i) inner->set("key " + std::to_string(i), KvNumber::float64(i / 7.0));
  for (int i = 0; i < 3; ++i) root->set(std::to_string(i), inner);
  const std::string whole = *encodeXmlPlist(*root);
  std::string together;
  std::size_t pieces = 0, largest = 0;
  XmlPlistWriter writer(kPlistMaximumBytes, [&](std::string_view piece) {
    together += piece;
    ++pieces;
    largest = std::max(largest, piece.size());
    return true;
  });
  ASSERT_TRUE(writer.value(*root));
  ASSERT_TRUE(writer.finish());
  EXPECT_EQ(together, whole);
  EXPECT_GT(pieces, 5u);
  EXPECT_LT(largest, whole.size() / 5);

  // A piece that is not taken, or the bound, ends it.
  pieces = 0;
  XmlPlistWriter refused(kPlistMaximumBytes, [&](std::string_view) { return ++pieces < 2; });
  EXPECT_FALSE(refused.value(*root));
  EXPECT_EQ(pieces, 2u);
  for (const auto& [bound, fits] : {std::pair(whole.size(), true), {whole.size() - 1, false}}) {
    XmlPlistWriter bounded(bound, [](std::string_view) { return true; });
    EXPECT_EQ(bounded.value(*root) && bounded.finish(), fits);
  }
}

}  // namespace
}  // namespace tally
