// The dump of the driver's lists: what the driver is asked, what becomes of each list, malformed
// lists, the write amplification, and the weekly log.
#include "storage/storage_log.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <limits>

#include "fakes/fake_storage.h"
#include "storage/lists/defects_list.h"
#include "storage/lists/storage_lists.h"
#include "storage/lists/validity_list.h"
#include "storage/lists/write_amplification.h"
#include "storage/texts.h"

namespace tally {
namespace {

using fakes::appendValue;
using fakes::Bytes;
using fakes::statisticsBuffer;
using testing::ElementsAre;
using testing::EndsWith;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::Not;
using tests::errorsOf;
using tests::oneLine;
using Words = std::vector<std::uint32_t>;

constexpr std::string_view kProgramDomain = "vellum.tallyd.tallyrun";
constexpr double kWeek = 604800;

Bytes listOf(const Words& words) {
  Bytes bytes;
  for (const std::uint32_t word : words) appendValue(bytes, word);
  return bytes;
}

// bandErases 180, 256 pages of 16 KiB in a band, hostWrites 102400: a user amplification of 1.8.
Bytes statistics() {
  return statisticsBuffer({{53, {1}}, {20, {180}}, {50, {256}}, {49, {16384}}, {4, {102400}}});
}
const Words kValidity = {3, 1, 0, 9, 9, 2, 70, 0, 0, 0, 0, 5, 0, 0, 0, 2, UINT32_MAX, 0, 0, 0};
const Words kDefects = {9, 41, 1, 0x20001, 3, 4, 5, 6, 7, 0xFB, 1};

class StorageLogTest : public testing::Test {
 protected:
  StorageLogTest() {
    registry.properties["Device Characteristics"] =
        registry.properties["Controller Characteristics"] =
            KvDictionary::create({{"chip-id", KvString::create("Q7M")},
                                  {"manufacturer-id", KvString::create("")},
                                  {"num-bus", KvNumber::int32(1)},
                                  {"nand-device-desc", KvNumber::int64(0x100000007)}});
  }
  ~StorageLogTest() override { gForceCollectionSet = 0; }

  void serveDump() {
    const Bytes figures = statistics();
    registry.calls.clear();
    registry.replies.clear();
    registry.serveNext(figures);
    registry.serveNext(listOf(kValidity));
    if (wantsStatus) registry.serveNext(figures);  // for the log, before the other lists
    for (int mode = 0; mode < 3; ++mode) registry.serveNext(Bytes(4128));
    registry.serveNext(listOf(kDefects));
  }
  // What went to standard error, and "false" for a failure; nothing may stay open.
  std::string dump(bool flag = false) {
    const std::string errors =
        errorsOf([&] { return DumpStorageStructuredLog(*KvBoolean::of(flag))->value(); });
    EXPECT_EQ(registry.services, 0);
    EXPECT_EQ(registry.connections, 0);
    return errors;
  }
  void putThreshold(KvRef<KvObject> value) {
    platform.preferences->put("userWAmp", std::move(value), "vellum.NANDInfo");
  }
  fakes::FakeStorage storage;
  fakes::FakePlatform& platform = storage.platform;
  fakes::FakeStorageRegistry& registry = *storage.registry;
  bool wantsStatus = false;
};

TEST_F(StorageLogTest, AListThatFailsDoesNotStopTheOthers) {
  serveDump();
  registry.replies[7].status = 0xE00002C2;   // the data of the second telemetry list
  registry.replies[10].status = 0xE00002C2;  // the size of the defects list: no data call follows
  registry.replies.pop_back();
  EXPECT_EQ(dump(),
            "Could not retrieve data from driver for selector 17\n"
            "HwConnectCallStructMethod failed with status 0xe00002c2 on selector index 4\n");
  EXPECT_TRUE(registry.replies.empty());

  registry.properties.clear();
  serveDump();
  EXPECT_EQ(dump(), "failed to create dictionaryfalse");
  registry.classes.clear();
  const std::string noService = "Could not get matching HwKit service for exporting classes\n";
  EXPECT_EQ(dump(), noService + noService + "false");
  EXPECT_EQ(gCurrentUserWamp, 0);
}

TEST_F(StorageLogTest, WhatAControllerCannotExport) {
  NandExporter exporter = nand_exporters[0];
  exporter.bandStatsSelectors = nullptr;
  exporter.telemetryListSelectors = nullptr;
  std::string handled;
  const auto handler = [&](const StorageList& list) {
    return !handled.append(list.className).empty();
  };
  const auto fetch = [&](std::vector<ListRequest> requests) {
    handled.clear();
    return errorsOf([&] { return fetchListsFrom(9, exporter, nullptr, requests, false); });
  };
  const std::vector<ListRequest> all = {{kValidityList, handler},
                                        {kTelemetryList, handler, 0},
                                        {kTelemetryList, handler, 1},
                                        {kDefectsList, handler}};
  const std::string unsupported =
      "Validity list retrieval is not supported\nTelemetry list retrieval is not supported\n";
  registry.serve(listOf(kDefects));
  EXPECT_EQ(fetch(all), unsupported);
  EXPECT_EQ(handled, "SPXStorage");

  exporter.defectsListSelectors = nullptr;
  EXPECT_THAT(fetch(all), Not(HasSubstr("false"))) << "nothing to fetch";
  EXPECT_EQ(handled, "");

  // Selectors of data that the driver does not have: no call is made.
  exporter.defectsListSelectors = [] {
    static constexpr std::uint32_t kNone[] = {kSelectorUnavailable, kSelectorUnavailable};
    return static_cast<const std::uint32_t*>(kNone);
  };
  registry.calls.clear();
  EXPECT_THAT(fetch({all.back()}), EndsWith("false"));
  exporter.defectsListSelectors = [] { return static_cast<const std::uint32_t*>(nullptr); };
  EXPECT_THAT(fetch({all.back()}), EndsWith("false"));
  EXPECT_THAT(registry.calls, IsEmpty());

  EXPECT_EQ(fetch(std::vector<ListRequest>(6, all.back())),
            "Increase the size of the selectorFunctions Arrayfalse");
}

TEST_F(StorageLogTest, ValidityLists) {
  const auto lists = [](const Words& words) {
    const Bytes bytes = listOf(words);
    KvRef<KvDictionary> validity;
    const std::string errors = errorsOf([&] { return bool(validity = readValidityList(bytes)); });
    return errors + oneLine(validity.get());
  };
  EXPECT_EQ(lists(kValidity), "{ValidityList[0] = (5);ValidityList[2] = (70,-1);}");
  Words seventeen = {17, 0, 0};
  for (std::uint32_t i = 0; i < 17; ++i) seventeen.insert(seventeen.end(), {i, i * 10, 0, 0, 0});
  EXPECT_THAT(lists(seventeen), EndsWith(";ValidityList[15] = (150);}"));
  for (const Words& words : {Words{1},
                             {0, 0, 0},
                             {1, 1, 0, 1, 1, 0, 0, 0},
                             {858993460, 0, 0, 1, 1, 0, 0, 0},      // * 5 is 4 in 32 bits
                             {1, 0x80000000, 0, 1, 1, 0, 0, 0},     // * 2 is 0 in 32 bits
                             {1, 0x20000000, 0, 1, 1, 0, 0, 0}}) {  // * 8 is 0 in 32 bits
    EXPECT_EQ(lists(words), "data cannot be parsedfalse(null)");
  }
}

TEST_F(StorageLogTest, DefectsLists) {
  const auto records = [](const Words& words, std::string_view className,
                          const KvObject* known = nullptr) {
    const Bytes bytes = listOf(words);
    std::string text;
    const std::string errors = errorsOf([&] {
      return readDefectsList({bytes, known, className},
                             [&text](const KvDictionary& record) { text += oneLine(&record); });
    });
    return text + errors;
  };
  const auto defect = [](std::uint32_t mode) {
    return Words{9, 41, 1, 0xFFFF0001, 3, 4, 0xFFFFFFFF, 6, 7, 0x123FB, mode};
  };
  const std::string count = "{Factory Count = 41;}";
  const auto text = [&](const std::string& reason) {
    return count + "{Bus = 1;CE = 65535;CAU = 3;Block = 4;Cycle = -1;Reason = " + reason +
           ";Page = 7;Temperature = -5;}";
  };
  const char* const nvme = "OrreryEmbeddedNVMeController";
  EXPECT_EQ(records(defect(1), "SPXStorage"), text("6"));
  EXPECT_EQ(records(defect(1), nvme), text("206"));
  EXPECT_EQ(records(defect(2), nvme), text("106"));
  EXPECT_EQ(records(defect(0x1F), nvme), text("6") + "Encountered unexpected defectMode: 0x1f");

  // An incomplete record is left out, the others are kept.
  const auto counted = [&](std::uint32_t defects, std::size_t words) {
    Words list = defect(0);
    list[2] = defects;
    list.resize(words);
    return records(list, "SPXStorage");
  };
  const std::string refused = "data cannot be parsedfalse";
  EXPECT_EQ(counted(1, 2), refused);
  EXPECT_EQ(counted(0, 3), count);
  EXPECT_EQ(counted(1, 10), count + refused);
  EXPECT_EQ(counted(0x08000001, 11), text("6") + refused);  // * 32 is 32 in 32 bits

  const auto summary = [&](KvRef<KvObject> description) {
    const auto known = KvDictionary::create({{"nand-device-desc", std::move(description)}});
    return records({0, UINT32_MAX, 0}, "SPXStorage", known.get());
  };
  EXPECT_EQ(summary(KvNumber::int64(0x100000007)),
            "{Factory Count = -1;vellum.NANDInfo.nandDesc = 7;}");
  EXPECT_EQ(summary(KvString::create("7")), "{Factory Count = -1;}");
}

TEST_F(StorageLogTest, WriteAmplification) {
  const auto measured = [](std::uint64_t erases, std::uint64_t pages, std::uint64_t bytesPerPage,
                           std::uint64_t pagesSlc, std::uint64_t erasesSlc, std::uint64_t host) {
    const Bytes bytes = statisticsBuffer({{20, {erases}},
                                          {50, {pages}},
                                          {49, {bytesPerPage}},
                                          {129, {pagesSlc}},
                                          {84, {erasesSlc}},
                                          {4, {host}}});
    SPXParseContext context;
    SPXParseBufferToCxt(&context, bytes.data(), bytes.size());
    const auto [user, intermediate] = writeAmplificationOf(context);
    SPXReleaseContext(&context);
    return std::pair(user, intermediate);
  };
  EXPECT_EQ(measured(180, 256, 16384, 128, 50, 102400), std::pair(1.8f, 0.25f));
  EXPECT_EQ(measured(180, 256, 16384, 128, 50, 0), std::pair(0.0f, 0.0f));
  EXPECT_EQ(measured(1, 255, 16, 1, 1, 1), std::pair(0.0f, 0.0f)) << "less than a unit";
  EXPECT_EQ(measured(1, 0x10000, 0x10000, 0x10000, 1, 1), std::pair(0.0f, 1048576.0f))
      << "the product of the band's size has 32 bits, the other one 64";
  putThreshold(KvNumber::float64(10));
  EXPECT_EQ(writeAmplificationThreshold(), 2.0) << "of what is too large";
}

TEST_F(StorageLogTest, TheNeedForTheValidityList) {
  const auto number = [](double threshold) { return KvNumber::float64(threshold); };
  // Whether the list is needed, at a user amplification of 1.8.
  const std::pair<KvRef<KvObject>, bool> cases[] = {
      {nullptr, false},
      {number(1.5), true},
      {number(1.9), false},
      {number(-1), false},
      {KvNumber::int32(1), false},  // not a floating-point number
      {number(std::numeric_limits<double>::quiet_NaN()), false},
      {nullptr, true}};  // the last one by force
  for (const auto& [threshold, needed] : cases) {
    gForceCollectionSet = needed && !threshold ? 1 : 0;
    wantsStatus = needed;
    platform.preferences->put("SSLastLoggedAt", nullptr, kProgramDomain);
    platform.logSubmission->logs.clear();
    putThreshold(threshold);
    serveDump();
    EXPECT_EQ(dump(), "");
    EXPECT_EQ(gCurrentUserWamp, double{1.8f});
    EXPECT_EQ(gNeedValidityList != 0, needed) << kvText(threshold.get());
    EXPECT_EQ(platform.logSubmission->logs.size(), needed ? 1u : 0u);
  }
}

TEST_F(StorageLogTest, WhatTheDriverIsAskedAndWhatTheLogSays) {
  wantsStatus = true;
  putThreshold(KvNumber::float64(1.5));
  platform.clock->now = 1709647629.9;
  platform.deviceInformation->answers["InverseDeviceID"] = KvString::create("abcdef");
  serveDump();
  EXPECT_EQ(dump(true), "");
  // Selector, then flags: 1 the size query, 2 the caller's flag, the mode from 4 on.
  EXPECT_THAT(registry.calls,
              ElementsAre("find SPXStorage", "open 7 type 0", "call 8 in 24 13 1 room 4",
                          "call 8 in 24 13 room 80", "close 9",  //
                          "find SPXStorage", "open 7 type 0",    //
                          "call 8 in 24 11 3 room 4", "call 8 in 24 11 2 room 80",
                          "find SPXStorage", "open 7 type 0", "call 8 in 24 13 1 room 4",
                          "call 8 in 24 13 room 80", "close 9",  //
                          "call 8 in 24 17 3 room 4", "call 8 in 24 17 2 room 4128",
                          "call 8 in 24 17 7 room 4", "call 8 in 24 17 6 room 4128",
                          "call 8 in 24 17 11 room 4", "call 8 in 24 17 10 room 4128",
                          "call 8 in 24 15 3 room 4", "call 8 in 24 15 2 room 44", "close 9"));
  EXPECT_EQ(platform.crashReporting->records.size(), 3u + 2u);
  ASSERT_EQ(platform.logSubmission->logs.size(), 1u);
  const auto& log = platform.logSubmission->logs[0];
  EXPECT_EQ(log.typeCode + " " + log.name, "165 StorageStatus");
  EXPECT_FALSE(log.options || log.reservedGiven);
  const std::string p = ";vellum.NANDInfo.";
  EXPECT_EQ(log.body,
            "System ID: test system\nHardware Model: Model,1\nOS Version: Test OS 1.0 (1A1)\n"
            "Date: 2024-03-05 14:07:09 +0000\nIncident ID: INCIDENT-1\nFaultDesk Key: abcdef\n\n"
            "2024-03-05 14:07:09 +0000 tallyrun[321]: IntermediateWamp:0.00;UserWamp:1.80" +
                p + "NumVirtualBlocks:0" + p + "PagesPerVirtualBlock:256" + p +
                "BytesPerPage:16384" + p + "NumLogicalReads:0" + p + "NumLogicalWrites:102400" + p +
                "NumFreeVirtualBlocks:0" + p + "NumWearLevelOps:0" + p + "NumPhysicalReads:0" + p +
                "NumPhysicalWrites:0" + p + "NumPhysicalErases:180" + p + "NodesFree:0" + p +
                "NodesTotal:0;ValidityList[0]:5;ValidityList[2]:70,-1\n");

  platform.deviceInformation->answers["InverseDeviceID"] = KvNumber::int32(1);
  EXPECT_EQ(GetFaultDeskKey(), "error");
}

TEST_F(StorageLogTest, ValuesInTheLog) {
  const auto a = KvString::create("a");
  const std::pair<KvRef<KvObject>, const char*> cases[] = {
      {KvNumber::float32(0.125f), "k:0.12\n"},
      {KvNumber::float64(-std::numeric_limits<double>::quiet_NaN()), "k:nan\n"},
      {KvNumber::uint64(UINT64_MAX), "k:18446744073709551615\n"},
      {KvBoolean::of(true), "k:1\n"},
      {KvArray::create({a, KvNumber::int32(2)}), "k:a,2\n"},
      {KvArray::create({a}), "\n"},
      {KvArray::create(), "\n"},
      {a, "\n"},
      {KvDate::create(0), "\n"},
      {KvData::create({}), "\n"},
      {KvDictionary::create(), "\n"},
  };
  for (const auto& [value, item] : cases) {
    platform.preferences->put("SSLastLoggedAt", nullptr, kProgramDomain);
    NLW_WriteLog("165", KvDictionary::create({{"k", value}}).get());
    EXPECT_THAT(platform.logSubmission->logs.back().body, EndsWith(std::string("[321]: ") + item));
  }
}

TEST_F(StorageLogTest, OnceInSevenDays) {
  const auto values = KvDictionary::create({{"k", KvNumber::int32(1)}});
  const double now = platform.clock->now;
  const std::vector<std::string> none,
      all = {"submit 165 StorageStatus",
             "set vellum.tallyd.tallyrun SSLastLoggedAt=2024-10-04T12:00:00Z",
             "synchronize vellum.tallyd.tallyrun"};
  const std::pair<KvRef<KvObject>, bool> cases[] = {
      {nullptr, true},
      {KvDate::create(now - kWeek), true},
      {KvDate::create(now - kWeek + 1), false},
      {KvDate::create(now + 10 * kWeek), false},  // the clock was set back
  };
  for (const auto& [last, written] : cases) {
    platform.log->lines.clear();
    platform.calls->clear();
    platform.preferences->put("SSLastLoggedAt", last, kProgramDomain);
    NLW_WriteLog("165", values.get());
    EXPECT_EQ(*platform.calls, written ? all : none) << kvText(last.get());
    EXPECT_EQ(platform.log->lines.empty(), written);
    EXPECT_NE(
        platform.log->has(LogLevel::Default, "NANDLogWriter:Last written at " + kvText(last.get()) +
                                                 " current 2024-10-04T12:00:00Z :skipped"),
        written);
  }

  // No values: nothing is written, and the next log is not delayed.
  platform.calls->clear();
  platform.preferences->put("SSLastLoggedAt", nullptr, kProgramDomain);
  NLW_WriteLog("165", nullptr);
  EXPECT_THAT(*platform.calls, IsEmpty());

  // A log that is rejected counts as well.
  platform.logSubmission->failSubmit = true;
  NLW_WriteLog("165", values.get());
  EXPECT_TRUE(platform.preferences->SMAPreferencesGetValue("SSLastLoggedAt", kProgramDomain));
}

}  // namespace
}  // namespace tally
