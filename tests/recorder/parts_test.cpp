#include <gtest/gtest.h>

#include <bit>
#include <cmath>
#include <random>

#include "fakes/fake_platform.h"
#include "fakes/temporary_folder.h"
#include "recorder/recorder_settings.h"
#include "recorder/sample_stream.h"

namespace tally {
namespace {

TEST(SampleStream, GivesBackEveryBit) {
  std::mt19937_64 random(7);
  const double kSpecial[] = {0.0,
                             -0.0,
                             1.0,
                             -1.0,
                             0.5,
                             9007199254740991.0,
                             1e300,
                             -1e300,
                             5e-324,
                             123456.0,
                             9007199254740992.0,
                             INFINITY,
                             -INFINITY};
  SampleStream stream;
  StreamSamples expected;
  for (int i = 0; i < 20000; ++i) {
    double value = kSpecial[random() % std::size(kSpecial)];
    if (i % 3 == 0) value = static_cast<double>(random() % 5000) - 100;
    if (i % 7 == 0) value = std::bit_cast<double>(random());
    if (std::isnan(value)) value = 1;
    const auto offset = static_cast<std::uint32_t>(random() % (i % 5 == 0 ? 0x100000000 : 3));
    const auto weight = static_cast<std::uint32_t>(i % 11 == 0 ? random() % 0xffffffff + 1 : 1);
    stream.add(value, offset, weight);
    expected.values.push_back(value);
    expected.offsets.push_back(offset);
    expected.weights.push_back(weight);
  }
  SampleStream::Reader reader(stream);
  StreamSamples part;
  std::size_t at = 0;
  while (reader.next(part, 777)) {
    for (std::size_t i = 0; i < part.values.size(); ++i, ++at) {
      ASSERT_EQ(std::bit_cast<std::uint64_t>(part.values[i]),
                std::bit_cast<std::uint64_t>(expected.values[at]));
      ASSERT_EQ(part.offsets[i], expected.offsets[at]);
      ASSERT_EQ(part.weights.empty() ? 1 : part.weights[i], expected.weights[at]);
    }
  }
  EXPECT_EQ(at, expected.values.size());
}

TEST(SampleStream, ThinnedItStandsForAsMany) {
  SampleStream stream;
  for (int i = 0; i < 10001; ++i) stream.add(i, 5, 3);
  const std::size_t before = stream.bytes();
  EXPECT_EQ(stream.thin(), 5000u);
  EXPECT_LT(stream.bytes(), before);
  std::uint64_t weights = 0;
  StreamSamples part;
  for (SampleStream::Reader reader(stream); reader.next(part, 100);) {
    for (const std::uint32_t weight : part.weights) weights += weight;
  }
  EXPECT_EQ(weights, 30003u);
}

TEST(RecorderSettings, ComeFromTheSystemThenFromTheStoresOwner) {
  const TemporaryFolder folder;
  const auto put = [&](std::string_view path, std::string_view body) {
    folder.putPlist(path, "<dict>" + std::string(body) + "</dict>");
  };
  put("Library/Preferences/tallyd.plist",
      "<key>Prefix</key><string>a.</string><key>CommitInterval</key><integer>60</integer>"
      "<key>Tags</key><array><string>x</string></array><key>Wrong</key><true/>");
  put("Library/Preferences/tallyd.d/20.plist",
      "<key>Prefix</key><string>b.</string><key>MemoryLimit</key><integer>5</integer>");
  put("Library/Preferences/tallyd.d/10.plist", "<key>Prefix</key><string>c.</string>");
  folder.put("Library/Preferences/tallyd.d/30.plist", "rubbish");
  put("var/mobile/Library/Preferences/tallyd.plist",
      "<key>Tags</key><array><string>x</string><string>y</string><integer>1</integer></array>"
      "<key>Allow</key><dict><key>net.</key><array><string>ada</string><string>nobody-here</string>"
      "<integer>7</integer></array><key>shut.</key><string>?</string></dict>");
  fakes::FakeSystemLog log;
  const auto settings = readRecorderSettings(
      DeviceRoot(folder.root),
      [](std::string_view name) {
        return name == "ada" ? std::optional<std::int64_t>(1001) : std::nullopt;
      },
      log);
  EXPECT_EQ(settings.prefix, "b.");
  EXPECT_EQ(settings.number(RecorderNumber::CommitInterval), 60);
  EXPECT_EQ(settings.number(RecorderNumber::MemoryLimit), 32 << 20);
  EXPECT_EQ(settings.tags, (std::vector<std::string>{"x", "y"}));
  EXPECT_EQ(settings.allow.at("net.").numbers, (std::set<std::int64_t>{7, 1001}));
  EXPECT_TRUE(settings.allow.at("shut.").numbers.empty());
  EXPECT_EQ(settings.allow.at("vellum.").numbers, (std::set<std::int64_t>{0}));
  // Wrong, MemoryLimit, rubbish, the tag 1, nobody-here, shut.
  EXPECT_EQ(log.texts(LogLevel::Error).size(), 6u);
}

}  // namespace
}  // namespace tally
