// The statistics hub: what it refuses, what it shares, how frames follow one another.
#include <gtest/gtest.h>

#include <cstring>

#include "host/described/described_frames.h"
#include "host/described_device.h"

namespace tally {
namespace {

using tests::DescribedDevice;

constexpr std::uint32_t kStart = 0, kConfigure = 2, kUpdate = 3;
constexpr std::uint64_t kState = 2;  // the format of a state channel

// A driver with three channels: 1 counts over four frames, 2 has two states, 3 is malformed.
std::string described(const std::string& hub) {
  return "<dict><key>Entries</key><array><dict><key>Class</key><string>HwReportHub</string>"
         "<key>Hub</key><dict>" +
         hub + R"(</dict></dict>
    <dict><key>Class</key><string>Driver</string><key>ID</key><integer>5</integer>
      <key>Properties</key><dict>
      <key>HwReportLegend</key><array><dict><key>HwReportChannels</key><array>
        <array><integer>1</integer><integer>1</integer></array></array></dict></array>
      <key>HwReportValues</key><array>
      <dict><key>Channel</key><integer>1</integer><key>Frames</key><array>
        <integer>10</integer><integer>17</integer><integer>-1</integer><real>-2.5</real></array></dict>
      <dict><key>Channel</key><integer>2</integer><key>Value</key><array>
        <dict><key>ID</key><string>IDLE</string><key>InTransitions</key><integer>3</integer>
          <key>Residency</key><integer>99</integer><key>Time</key><integer>8</integer></dict>
        <dict><key>ID</key><string>BUSY</string></dict></array></dict>
      <dict><key>Channel</key><integer>3</integer><key>Value</key><string>x</string></dict>
      </array></dict></dict></array></dict>)";
}

std::vector<std::byte> interestList(std::uint32_t count,
                                    const std::vector<std::array<std::uint64_t, 3>>& entries) {
  std::vector<std::byte> list(8 + 24 * entries.size());
  std::memcpy(list.data(), &count, sizeof count);
  if (!entries.empty()) std::memcpy(list.data() + 8, entries.data(), 24 * entries.size());
  return list;
}

struct Hub {
  explicit Hub(const std::string& description) : device(described(description)) {
    connection = device.connect("HwReportHub");
  }
  RegistryResult start() {
    MethodCall call;
    return device.registry().ConnectionCallMethod(connection, kStart, call);
  }
  RegistryResult configure(const std::vector<std::byte>& list) {
    MethodCall call{.structInput = list, .scalarOutput = {&token, 1}};
    return device.registry().ConnectionCallMethod(connection, kConfigure, call);
  }
  RegistryResult map() {
    return device.registry().ConnectionMapMemory(connection, static_cast<std::uint32_t>(token),
                                                 kMapAnywhere, &memory, &length);
  }
  // Whether all steps up to a region that both share succeed.
  bool share(const std::vector<std::byte>& list) {
    return start() == 0 && configure(list) == 0 && map() == 0;
  }
  RegistryResult unmap() {
    return device.registry().ConnectionUnmapMemory(connection, static_cast<std::uint32_t>(token),
                                                   memory);
  }
  RegistryResult update() {
    MethodCall call{.scalarInput = {&token, 1}};
    return device.registry().ConnectionCallMethod(connection, kUpdate, call);
  }
  std::uint64_t word(std::size_t offset) const {
    std::uint64_t value = 0;
    std::memcpy(&value, memory + offset, sizeof value);
    return value;
  }
  DescribedDevice device;
  ConnectionHandle connection = 0;
  std::uint64_t token = 0;
  const std::byte* memory = nullptr;
  std::size_t length = 0;
};

const auto kOneInterest = interestList(1, {{5, 1, 1}});

TEST(StatisticsHub, RefusesMalformedInterestLists) {
  const std::vector<std::byte> cut(kOneInterest.begin(), kOneInterest.begin() + 31);
  auto reserved = kOneInterest;
  reserved[4] = std::byte{1};
  for (const auto& list : {std::vector<std::byte>(7), cut, reserved, interestList(2, {{5, 1, 1}}),
                           interestList(1, {{5, 1, 1}, {5, 2, 2}}), interestList(UINT32_MAX, {})}) {
    Hub hub("");
    ASSERT_EQ(hub.start(), 0u);
    EXPECT_EQ(hub.configure(list), kRegistryBadArgument) << list.size();
    EXPECT_NE(hub.map(), 0u);
    EXPECT_NE(hub.update(), 0u);
  }
}

TEST(StatisticsHub, KeepsTheOrderOfCalls) {
  Hub hub("");
  EXPECT_EQ(hub.configure(kOneInterest), kRegistryNotOpen);
  EXPECT_EQ(hub.update(), kRegistryNotOpen);
  ASSERT_EQ(hub.start(), 0u);
  ASSERT_EQ(hub.configure(kOneInterest), 0u);
  EXPECT_EQ(hub.configure(kOneInterest), kRegistryBadArgument);
  ++hub.token;
  EXPECT_NE(hub.map(), 0u);
  EXPECT_NE(hub.update(), 0u);
}

TEST(StatisticsHub, FailsWhereTheDescriptionSaysSo) {
  const char* const steps[] = {"Open", "Start", "Configure", "Map", "Update"};
  for (std::size_t failing = 0; failing < std::size(steps); ++failing) {
    SCOPED_TRACE(steps[failing]);
    Hub hub("<key>" + std::string(steps[failing]) + "Status</key><integer>3758097084</integer>");
    EXPECT_EQ(hub.connection == 0, failing == 0);
    const RegistryResult results[] = {hub.start(), hub.configure(kOneInterest), hub.map(),
                                      hub.update()};
    for (std::size_t i = 0; failing > 0 && i < failing; ++i) {
      EXPECT_EQ(results[i], i + 1 == failing ? 0xE00002BCu : 0u);
    }
    if (hub.connection != 0) hub.device.registry().ServiceCloseConnection(hub.connection);
    EXPECT_EQ(hub.device.openHandles(), 0u);
  }
}

TEST(StatisticsHub, RefreshesTheRegionThatItShares) {
  Hub hub("");
  // The second channel and the counter; malformed and unknown channels and other drivers are not
  // served.
  ASSERT_TRUE(
      hub.share(interestList(5, {{5, 2, kState}, {5, 3, 1}, {5, 1, 0}, {5, 9, 1}, {6, 1, 1}})));
  ASSERT_EQ(hub.length, 3 * element::kSize);
  constexpr std::uint64_t kMinusTwo = ~std::uint64_t{1};  // of a real, and after the last frame
  for (const std::uint64_t counter :
       {std::uint64_t{10}, std::uint64_t{17}, ~std::uint64_t{0}, kMinusTwo, kMinusTwo}) {
    ASSERT_EQ(hub.update(), 0u);
    EXPECT_EQ(hub.word(2 * element::kSize + element::kSlots), counter);
  }
  EXPECT_EQ(hub.word(element::kDriverID), 5u);
  EXPECT_EQ(hub.word(element::kChannelID), 2u);
  EXPECT_EQ(hub.word(element::kTypeWord), kState | std::uint64_t{2} << 32);
  EXPECT_EQ(hub.word(element::kUpdateTime), 8u);
  EXPECT_EQ(hub.word(element::kSlots), 0x49444C45u);
  EXPECT_EQ(hub.word(element::kSlots + 16), 99u);
  EXPECT_EQ(hub.word(element::kSize + element::kSlots + 16), element::kMissingValue);
  // The type that is not given is the legend's.
  EXPECT_EQ(hub.word(2 * element::kSize + element::kTypeWord), 1 | std::uint64_t{1} << 32);
  EXPECT_EQ(hub.unmap(), 0u);
  EXPECT_NE(hub.unmap(), 0u);
}

TEST(StatisticsHub, HasARunOfNobodysWhenNothingIsServed) {
  Hub hub("");
  ASSERT_TRUE(hub.share(interestList(2, {{5, 9, 1}, {6, 1, 1}})));
  ASSERT_EQ(hub.update(), 0u);
  EXPECT_EQ(hub.length, element::kSize);
  EXPECT_EQ(hub.word(element::kDriverID), element::kMissingValue);
  EXPECT_EQ(hub.word(element::kChannelID), element::kMissingValue);
  EXPECT_EQ(hub.word(element::kTypeWord), std::uint64_t{1} << 32) << "not a run of no elements";
}

TEST(StatisticsHub, ServesRawRegionsVerbatim) {
  Hub hub("<key>RawFrames</key><array><data>AQID</data><data>/w==</data></array>");
  ASSERT_TRUE(hub.share(kOneInterest));
  ASSERT_EQ(hub.length, 3u);
  for (const char* frame : {"\1\2\3", "\xff\0\0"}) {
    hub.update();
    EXPECT_EQ(std::memcmp(hub.memory, frame, 3), 0);
  }
}

}  // namespace
}  // namespace tally
