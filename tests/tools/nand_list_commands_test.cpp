// tallyctl nand: the driver's lists and the preview of the storage log, which changes nothing.
#include <algorithm>

#include "tools/nand_tool.h"

namespace tally::tools {
namespace {

using fakes::appendValue;
using fakes::Bytes;
using testing::HasSubstr;
using testing::Not;

Bytes listOf(const std::vector<std::uint32_t>& words) {
  Bytes bytes;
  for (const std::uint32_t word : words) appendValue(bytes, word);
  return bytes;
}

class NandListCommandsTest : public NandToolTest {
 protected:
  NandListCommandsTest() {
    storage.registry->properties["Device Characteristics"] =
        KvDictionary::create({{"chip-id", KvString::create("Q7M")},
                              {"manufacturer-id", KvString::create("x")},
                              {"num-bus", KvNumber::int32(2)}});
  }
  void serveTelemetry(std::size_t modes, std::size_t bytes = 2 * 4128) {
    for (std::size_t mode = 0; mode < modes; ++mode) {
      Bytes list(bytes);
      list[4] = std::byte{42};  // the second counter of the first bus
      storage.registry->serveNext(list);
    }
  }
  const Bytes statistics =
      fakes::statisticsBuffer({{53, {1}}, {20, {180}}, {50, {256}}, {49, {16384}}, {4, {102400}}});
  const Bytes validity = listOf({2, 0, 0, 3, 70, 0, 0, 0, 3, 71, 0, 0, 0});
  const Bytes defects = listOf({0, 41, 1, 0x20001, 3, 4, 5, 6, 7, 30, 0});
};

TEST_F(NandListCommandsTest, ListsForPeopleAndForPrograms) {
  serveTelemetry(3);
  const Outcome telemetry = nand({"telemetry"});
  EXPECT_EQ(telemetry.status, kSuccess);
  EXPECT_THAT(telemetry.out, HasSubstr("Mode 2, bus 1"));
  EXPECT_THAT(telemetry.out, HasSubstr("readStage[0-22]"));
  EXPECT_THAT(telemetry.out, HasSubstr("0 42 0"));
  serveTelemetry(1);
  const Outcome one = nand({"telemetry", "--mode", "1", "--json"});
  const nlohmann::json modes = one.json();  // the digit that is none is not named in it
  ASSERT_EQ(modes.size(), 1u);
  EXPECT_EQ(modes[0]["mode"], 1);
  EXPECT_EQ(modes[0]["buses"].size(), 2u);
  EXPECT_EQ(modes[0]["buses"][0]["readStage"][1], 42);
  EXPECT_EQ(nand({"telemetry", "--mode", "3"}).status, kBadUsage);

  storage.registry->serve(validity);
  EXPECT_THAT(nand({"validity"}).out, HasSubstr("70 71"));
  storage.registry->serve(validity);
  EXPECT_EQ(nand({"validity", "--json"}).json(), nlohmann::json({{"ValidityList[3]", {70, 71}}}));

  storage.registry->serve(defects);
  EXPECT_THAT(nand({"defects"}).out, HasSubstr("41 of the factory, 1 found since"));
  storage.registry->serve(defects);
  const nlohmann::json found = nand({"defects", "--json"}).json();
  EXPECT_EQ(found["summary"]["Factory Count"], 41);
  EXPECT_EQ(found["defects"][0]["CE"], 2);
}

TEST_F(NandListCommandsTest, ThePreviewOfTheLogChangesNothing) {
  const struct {
    double sinceLast, threshold;
    bool written;
  } cases[] = {{700000, 1.5, true}, {600000, 1.5, false}, {700000, 5, false}};
  for (const auto& c : cases) {
    const auto serve = [this] {
      storage.registry->replies.clear();
      for (const Bytes& list : {statistics, validity, statistics}) {
        storage.registry->serveNext(list);
      }
      serveTelemetry(3);
      storage.registry->serveNext(defects);
    };
    auto& preferences = *storage.platform.preferences;
    preferences.put("SSLastLoggedAt", KvDate::create(storage.platform.clock->now - c.sinceLast),
                    "vellum.tallyd.tallyrun");
    preferences.put("userWAmp", KvNumber::float64(c.threshold), "vellum.NANDInfo");
    const auto before = preferences.values;
    storage.platform.calls->clear();
    serve();
    const Outcome text = nand({"storage-log", "--preview"});
    EXPECT_EQ(text.status, kSuccess);
    EXPECT_THAT(text.out, HasSubstr("UserWamp:1.80;"));
    EXPECT_THAT(text.out, HasSubstr("FaultDesk Key: error\n"));
    EXPECT_EQ(text.out.find("Next one from") != std::string::npos, c.sinceLast < 604800);
    serve();
    const nlohmann::json preview = nand({"storage-log", "--preview", "--json"}).json();
    EXPECT_EQ(preview["wouldBeWritten"], c.written);
    EXPECT_EQ(preview["structuredRecords"], 3 * 2 + 2);
    EXPECT_THAT(preview["text"].get<std::string>(), HasSubstr("ValidityList[3]:70,71\n"));
    EXPECT_TRUE(storage.platform.calls->empty());
    EXPECT_TRUE(std::equal(preferences.values.begin(), preferences.values.end(), before.begin(),
                           before.end(), [](const auto& now, const auto& then) {
                             return now.first == then.first &&
                                    kvEqual(now.second.get(), then.second.get());
                           }));
    EXPECT_TRUE(storage.platform.logSubmission->logs.empty());
  }
}

}  // namespace
}  // namespace tally::tools
