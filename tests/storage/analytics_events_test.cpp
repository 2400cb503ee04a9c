// The storage figures as analytics events: what is mapped, in which order, and what is filled in.
#include "storage/analytics_events.h"

#include <gtest/gtest.h>

#include <cstring>

#include "fakes/fake_storage.h"
#include "storage/auxiliary_metrics.h"
#include "storage/events/event_payload.h"
#include "storage/nand_info.h"

namespace tally {
namespace {

using fakes::statisticsBuffer;

constexpr std::string_view kFirst = kEventPulseEvents[0], kSecond = kEventPulseEvents[1],
                           kLast = kEventPulseEvents[34];

class AnalyticsEventsTest : public testing::Test {
 protected:
  const KvDictionary& send(std::uint32_t options = 1) {
    result = LogtoEPNANDInfoWithOptions(options);
    return *result;
  }
  const KvDictionary& payload(std::string_view event) { return *events.sent.find(event)->second; }

  fakes::FakeStorage storage;
  fakes::FakeAnalyticsEvents& events = *storage.analyticsEvents;
  KvRef<KvDictionary> result;
};

TEST(EventReferenceText, MapsEveryCounterAndOnlyKnownKeys) {
  fakes::FakeStorage storage;
  const auto reference = parseEventReference(kEventPulseRefJson);
  ASSERT_TRUE(reference);
  std::set<std::string, std::less<>> known{std::string(kNANDInfoTlydPlaceholder),
                                           std::string(kNANDInfoErrorMessageKey),
                                           std::string(kNANDInfoReclaimTotalPurgeableKey),
                                           std::string(kNANDInfoReclaimTotalNonPurgeableKey)};
  for (const auto& row : keyMap) known.emplace(row.key);
  SPXParseContext context;
  context.exportVersion = 0x20002;
  const auto info = buildNandInfo(context, false);
  for (const auto& [key, value] : *info) known.emplace(key->view());
  known.emplace(kNANDInfoIntermediatePartitionSizeKey);
  std::set<std::string, std::less<>> mapped;
  for (const auto& [event, mapping] : *reference) {
    EXPECT_TRUE(std::ranges::count(kEventPulseEvents, event) == 1) << event << " is never sent";
    for (const EventField& field : mapping) {
      EXPECT_TRUE(known.contains(field.key->view())) << event << " " << field.key->view();
      mapped.emplace(field.key->view());
    }
  }
  EXPECT_EQ(reference->size(), kEventPulseEvents.size());
  for (const SPXKeyMapRow& row : keyMap) {
    EXPECT_TRUE(mapped.contains(row.key))
        << row.key << " is in no event of src/storage/events/analytics_events.json";
  }
}

TEST_F(AnalyticsEventsTest, SendsEveryEventInOrderFromOneFetch) {
  storage.registry->serve(
      statisticsBuffer({{53, {0x20002}}, {4, {77}}, {460, std::vector<std::uint64_t>(256, 5)}}));
  storage.platform.deviceInformation->answers["DiskUsage"] = KvDictionary::create(
      {{kDOQDiskUsageTotalDiskCapacity, KvNumber::int64((64LL << 30) + 1048575)},
       {kDOQDiskUsageTotalDataAvailable, KvNumber::int64(1048575)}});
  EXPECT_TRUE(send().empty());
  EXPECT_TRUE(std::equal(events.offered.begin(), events.offered.end(), kEventPulseEvents.begin(),
                         kEventPulseEvents.end()));
  EXPECT_EQ(std::count_if(storage.registry->calls.begin(), storage.registry->calls.end(),
                          [](const std::string& call) { return call.starts_with("open"); }),
            1);
  EXPECT_EQ(payload(kFirst).getString("Error"), "empty");
  EXPECT_EQ(payload(kFirst).getInt64("ExportVersion"), 0x20002);
  EXPECT_EQ(payload(kFirst).getInt64("ColdestCycle"), 0);
  EXPECT_EQ(payload(kSecond).getString("ErrorMessage"), "empty");
  EXPECT_EQ(payload(kSecond).getInt64("NumLogicalWrites"), 77);
  EXPECT_EQ(payload(kSecond).getInt64("DiskUsageUserBlocksFree"), 65536);
  EXPECT_EQ(payload(kSecond).getInt64("DiskUsageUserTotalBlocks"), 0);
  EXPECT_EQ(payload("vellum.massstorage.NANDInfo.CacheDepthVsThroughput3").getInt64("field255"), 5);
  const auto* freezer = payload(kLast).getAs<KvNumber>("VMFreezer_NumPhysicalWrites");
  EXPECT_EQ(freezer->kind(), KvNumberKind::UInt64);
  EXPECT_EQ(freezer->asUInt64(), ~std::uint64_t{0}) << "not measured";
  EXPECT_EQ((*payload(kFirst).begin()).key->view(), "2E_H2F_VL_Corr") << "the mapping's order";
}

TEST_F(AnalyticsEventsTest, AFailedFetchIsSentWithItsError) {
  EXPECT_TRUE(send().empty());
  EXPECT_EQ(payload(kFirst).getString("Error"), "1");
  EXPECT_EQ(payload(kSecond).getString("ErrorMessage"), "Unable to parse buffer");
  EXPECT_EQ(payload(kSecond).getInt64("DiskUsageUserTotalBlocks"), -1);
  EXPECT_EQ(payload(kSecond).getInt64("NumLogicalWrites"), 0);
}

TEST_F(AnalyticsEventsTest, WithoutTheServiceNothingIsAsked) {
  events.available = false;
  EXPECT_EQ(send().getString(kNANDInfoErrorKey), "1");
  EXPECT_EQ(result->getString(kNANDInfoErrorMessageKey), "Unable call EP API PulseSendEventLazy");
  EXPECT_TRUE(events.offered.empty());
  EXPECT_TRUE(storage.registry->calls.empty());
}

TEST_F(AnalyticsEventsTest, PayloadsAreBuiltAndLoggedOnlyWhenWanted) {
  for (const std::string_view event : kEventPulseEvents) events.unwanted.emplace(event);
  events.unwanted.erase(std::string(kLast));
  send(3);
  EXPECT_EQ(events.offered.size(), 35u);
  EXPECT_EQ(events.sent.size(), 1u);
  const auto texts = storage.platform.log->texts(LogLevel::Default);
  ASSERT_EQ(texts.size(), 1u);
  EXPECT_EQ(texts[0], "vellum.massstorage.NANDInfo_6 :\n" + kvText(&payload(kLast)) + "\n");
  send(1);
  EXPECT_EQ(storage.platform.log->texts(LogLevel::Default).size(), 1u);
}

}  // namespace
}  // namespace tally
