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

namespace tally {
namespace {

using fakes::appendValue;
using fakes::Bytes;
using fakes::statisticsBuffer;
using testing::ElementsAre;
using testing::IsEmpty;
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
  StorageLogTest() { putCharacteristics(); }
  ~StorageLogTest() override { gForceCollectionSet = 0; }

  void putCharacteristics() {
    auto known = KvDictionary::create({{"chip-id", KvString::create("Q7M")},
                                       {"manufacturer-id", KvString::create("")},
                                       {"num-bus", KvNumber::int32(1)},
                                       {"nand-device-desc", KvNumber::int64(0x100000007)}});
    registry.properties["Device Characteristics"] = known;
    registry.properties["Controller Characteristics"] = known;
  }
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
  // The result, and what went to standard error; nothing may stay open.
  std::pair<bool, std::string> dump(bool flag = false) {
    testing::internal::CaptureStderr();
    const bool result = DumpStorageStructuredLog(*KvBoolean::of(flag))->value();
    EXPECT_EQ(registry.services, 0);
    EXPECT_EQ(registry.connections, 0);
    return {result, testing::internal::GetCapturedStderr()};
  }
  void putThreshold(KvRef<KvObject> value) {
    platform.preferences->put("userWAmp", std::move(value), "vellum.NANDInfo");
  }
  // The line of the log without its date, the key and the value of each item.
  std::string itemsOf(const KvDictionary& values) {
    platform.preferences->put("SSLastLoggedAt", nullptr, kProgramDomain);
    platform.logSubmission->logs.clear();
    NLW_WriteLog("165", &values);
    if (platform.logSubmission->logs.size() != 1) return "no log";
    const std::string& body = platform.logSubmission->logs[0].body;
    return body.substr(body.find("[321]: ") + 7);
  }
  fakes::FakeStorage storage;
  fakes::FakePlatform& platform = storage.platform;
  fakes::FakeStorageRegistry& registry = *storage.registry;
  bool wantsStatus = false;
};

TEST_F(StorageLogTest, WhatTheDriverIsAsked) {
  wantsStatus = true;
  putThreshold(KvNumber::float64(1.5));
  serveDump();
  EXPECT_EQ(dump(true), std::pair(true, std::string()));
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
}

TEST_F(StorageLogTest, EveryCallFailsOnce) {
  const std::string fetchFailed = "HwConnectCallStructMethod failed with status 0xe00002c2 on ";
  const struct {
    std::size_t reply;  // of the dump's twelve; 2 is the first of a list
    bool result;
    std::string line;
  } cases[] = {
      {7, true, "Could not retrieve data from driver for selector 17\n"},
      {10, true, fetchFailed + "selector index 4\n"},
  };
  for (const auto& c : cases) {
    serveDump();
    registry.replies[c.reply].status = 0xE00002C2;
    const bool isSizeQuery = c.reply % 2 == 0;  // the data call does not follow
    if (isSizeQuery) {
      registry.replies.erase(registry.replies.begin() + static_cast<std::ptrdiff_t>(c.reply) + 1);
    }
    EXPECT_EQ(dump(), std::pair(c.result, c.line)) << c.reply;
    EXPECT_TRUE(registry.replies.empty()) << "the other lists are fetched all the same";
  }

  registry.properties.clear();
  serveDump();
  EXPECT_EQ(dump(), std::pair(false, std::string("failed to create dictionary")));
  putCharacteristics();
  registry.classes.clear();
  const std::string noService = "Could not get matching HwKit service for exporting classes\n";
  EXPECT_EQ(dump(), std::pair(false, noService + noService));
  EXPECT_EQ(gCurrentUserWamp, 0);
}

TEST_F(StorageLogTest, WhatAControllerCannotExport) {
  NandExporter exporter = nand_exporters[0];
  exporter.bandStatsSelectors = nullptr;
  exporter.telemetryListSelectors = nullptr;
  std::vector<std::string> handled;
  const auto handler = [&handled](const StorageList& list) {
    handled.emplace_back(list.className);
    return true;
  };
  const auto fetch = [&](std::vector<ListRequest> requests) {
    handled.clear();
    testing::internal::CaptureStderr();
    const bool result = fetchListsFrom(9, exporter, nullptr, requests, false);
    return std::pair(result, testing::internal::GetCapturedStderr());
  };
  const std::vector<ListRequest> all = {{kValidityList, handler},
                                        {kTelemetryList, handler, 0},
                                        {kTelemetryList, handler, 1},
                                        {kDefectsList, handler}};
  registry.serve(listOf(kDefects));
  EXPECT_EQ(fetch(all),
            std::pair(true, std::string("Validity list retrieval is not supported\n"
                                        "Telemetry list retrieval is not supported\n")));
  EXPECT_THAT(handled, ElementsAre("SPXStorage"));

  exporter.defectsListSelectors = nullptr;
  EXPECT_TRUE(fetch(all).first) << "nothing to fetch";
  EXPECT_THAT(handled, IsEmpty());

  // Selectors of data that the driver does not have: no call is made.
  exporter.defectsListSelectors = [] {
    static constexpr std::uint32_t kNone[] = {kSelectorUnavailable, kSelectorUnavailable};
    return static_cast<const std::uint32_t*>(kNone);
  };
  registry.calls.clear();
  EXPECT_FALSE(fetch({all.back()}).first);
  exporter.defectsListSelectors = [] { return static_cast<const std::uint32_t*>(nullptr); };
  EXPECT_FALSE(fetch({all.back()}).first);
  EXPECT_THAT(registry.calls, IsEmpty());

  EXPECT_EQ(fetch(std::vector<ListRequest>(6, all.back())),
            std::pair(false, std::string("Increase the size of the selectorFunctions Array")));
}

TEST_F(StorageLogTest, ValidityLists) {
  const std::string refused = "data cannot be parsed";
  Words sixteen = {17, 0, 0};
  for (std::uint32_t i = 0; i < 17; ++i) sixteen.insert(sixteen.end(), {i, i * 10, 0, 0, 0});
  const struct {
    Words words;
    std::string lists;  // "" is a refusal
  } cases[] = {
      {kValidity, "[0]=(5) [2]=(70,-1) "},
      {sixteen,
       "[0]=(0) [1]=(10) [2]=(20) [3]=(30) [4]=(40) [5]=(50) [6]=(60) [7]=(70) [8]=(80) "
       "[9]=(90) [10]=(100) [11]=(110) [12]=(120) [13]=(130) [14]=(140) [15]=(150) "},
      {{1}, ""},
      {{1, 1, 0, 1, 1, 0, 0, 0}, ""},
      {{858993460, 0, 0, 1, 1, 0, 0, 0}, ""},   // * 5 is 4 in 32 bits
      {{1, 0x80000000, 0, 1, 1, 0, 0, 0}, ""},  // * 2 is 0 in 32 bits
      {{1, 0x20000000, 0, 1, 1, 0, 0, 0}, ""},  // * 8 is 0 in 32 bits
  };
  for (const auto& c : cases) {
    testing::internal::CaptureStderr();
    const Bytes bytes = listOf(c.words);
    const auto validity = readValidityList(bytes);
    EXPECT_EQ(testing::internal::GetCapturedStderr(), c.lists.empty() ? refused : "");
    std::string lists;
    if (validity) {
      for (const auto& [key, value] : *validity) {
        lists.append(key->view().substr(std::strlen("ValidityList"))).append("=(");
        for (const auto& number : *kvCast<KvArray>(value.get())) {
          lists.append(lists.back() == '(' ? "" : ",").append(kvText(number.get()));
        }
        lists += ") ";
      }
    }
    EXPECT_EQ(lists, c.lists);
  }
}

TEST_F(StorageLogTest, DefectsLists) {
  const auto records = [this](const Words& words, std::string_view className,
                              const KvObject* known) {
    const Bytes bytes = listOf(words);
    std::string text;
    testing::internal::CaptureStderr();
    const bool result =
        readDefectsList({bytes, known, className}, [&text](const KvDictionary& record) {
          for (const auto& [key, value] : record) {
            text.append(key->view()).append("=").append(kvText(value.get())).append(" ");
          }
        });
    return text + (result ? "" : "false ") + testing::internal::GetCapturedStderr();
  };
  const auto defect = [](std::uint32_t mode) {
    return Words{9, 41, 1, 0xFFFF0001, 3, 4, 0xFFFFFFFF, 6, 7, 0x123FB, mode};
  };
  const auto text = [](const char* reason) {
    return std::string("Factory Count=41 Bus=1 CE=65535 CAU=3 Block=4 Cycle=-1 Reason=") + reason +
           " Page=7 Temperature=-5 ";
  };
  const struct {
    std::uint32_t mode;
    const char* className;
    std::string text;
  } modes[] = {
      {1, "SPXStorage", text("6")},
      {1, "OrreryEmbeddedNVMeController", text("206")},
      {2, "OrreryEmbeddedNVMeController", text("106")},
      {0x1F, "OrreryEmbeddedNVMeController", text("6") + "Encountered unexpected defectMode: 0x1f"},
  };
  for (const auto& c : modes) EXPECT_EQ(records(defect(c.mode), c.className, nullptr), c.text);

  // An incomplete record is left out, the others are kept.
  const auto counted = [&](std::uint32_t count, std::size_t words) {
    Words list = defect(0);
    list[2] = count;
    list.resize(words);
    return records(list, "SPXStorage", nullptr);
  };
  const std::string refused = "false data cannot be parsed";
  EXPECT_EQ(counted(1, 2), refused);
  EXPECT_EQ(counted(0, 3), "Factory Count=41 ");
  EXPECT_EQ(counted(1, 10), "Factory Count=41 " + refused);
  EXPECT_EQ(counted(0x08000001, 11), text("6") + refused);  // * 32 is 32 in 32 bits

  const auto summary = [&](KvRef<KvObject> description) {
    const auto known = KvDictionary::create({{"nand-device-desc", std::move(description)}});
    return records({0, UINT32_MAX, 0}, "SPXStorage", known.get());
  };
  EXPECT_EQ(summary(KvNumber::int64(0x100000007)), "Factory Count=-1 vellum.NANDInfo.nandDesc=7 ");
  EXPECT_EQ(summary(KvString::create("7")), "Factory Count=-1 ");
}

TEST_F(StorageLogTest, WriteAmplification) {
  const auto measured = [](std::vector<fakes::Record> records) {
    const Bytes bytes = statisticsBuffer(records);
    SPXParseContext context;
    SPXParseBufferToCxt(&context, bytes.data(), bytes.size());
    const WriteAmplification figures = writeAmplificationOf(context);
    SPXReleaseContext(&context);
    return std::pair(figures.user, figures.intermediate);
  };
  const auto case_ = [&](std::uint64_t erases, std::uint64_t pages, std::uint64_t bytesPerPage,
                         std::uint64_t pagesSlc, std::uint64_t erasesSlc, std::uint64_t host) {
    const std::vector<fakes::Record> records = {{20, {erases}},       {50, {pages}},
                                                {49, {bytesPerPage}}, {129, {pagesSlc}},
                                                {84, {erasesSlc}},    {4, {host}}};
    return measured(records);
  };
  EXPECT_EQ(case_(180, 256, 16384, 128, 50, 102400), std::pair(1.8f, 0.25f));
  EXPECT_EQ(case_(180, 256, 16384, 128, 50, 0), std::pair(0.0f, 0.0f));
  EXPECT_EQ(case_(1, 255, 16, 1, 1, 1), std::pair(0.0f, 0.0f)) << "less than a unit";
  EXPECT_EQ(case_(1, 0x10000, 0x10000, 0x10000, 1, 1), std::pair(0.0f, 1048576.0f))
      << "the product of the band's size has 32 bits, the other one 64";
  putThreshold(KvNumber::float64(10));
  EXPECT_EQ(writeAmplificationThreshold(), 2.0) << "of what is too large";
}

TEST_F(StorageLogTest, TheNeedForTheValidityList) {
  const struct {
    KvRef<KvObject> threshold;
    bool force;
    bool needed;  // at a user amplification of 1.8
  } cases[] = {
      {nullptr, false, false},
      {KvNumber::float64(1.5), false, true},
      {KvNumber::float64(1.9), false, false},
      {KvNumber::int32(1), false, false},  // not a floating-point number
      {KvNumber::float64(-1), false, false},
      {KvNumber::float64(10), false, false},
      {KvNumber::float64(std::numeric_limits<double>::quiet_NaN()), false, false},
      {nullptr, true, true},
  };
  for (const auto& c : cases) {
    gForceCollectionSet = c.force ? 1 : 0;
    wantsStatus = c.needed;
    platform.preferences->put("SSLastLoggedAt", nullptr, kProgramDomain);
    platform.logSubmission->logs.clear();
    putThreshold(c.threshold);
    serveDump();
    EXPECT_EQ(dump(), std::pair(true, std::string()));
    EXPECT_EQ(gCurrentUserWamp, double{1.8f});
    EXPECT_EQ(gNeedValidityList != 0, c.needed) << kvText(c.threshold.get());
    EXPECT_EQ(platform.logSubmission->logs.size(), c.needed ? 1u : 0u);
  }
}

TEST_F(StorageLogTest, TheLogAsItIsWritten) {
  wantsStatus = true;
  gForceCollectionSet = 1;
  platform.clock->now = 1709647629.9;
  platform.deviceInformation->answers["InverseDeviceID"] = KvString::create("abcdef");
  serveDump();
  ASSERT_EQ(dump(), std::pair(true, std::string()));
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
  const auto item = [this](KvRef<KvObject> value) {
    return itemsOf(*KvDictionary::create({{"k", std::move(value)}}));
  };
  const auto array = [](std::initializer_list<KvRef<KvObject>> items) {
    return KvArray::create(items);
  };
  const auto text = [](const char* value) { return KvString::create(value); };
  EXPECT_EQ(item(KvNumber::float32(0.125f)), "k:0.12\n");
  EXPECT_EQ(item(KvNumber::float64(-std::numeric_limits<double>::quiet_NaN())), "k:nan\n");
  EXPECT_EQ(item(KvNumber::uint64(UINT64_MAX)), "k:18446744073709551615\n");
  EXPECT_EQ(item(KvBoolean::of(true)), "k:1\n");
  EXPECT_EQ(item(array({text("a"), KvNumber::int32(2)})), "k:a,2\n");
  for (const KvRef<KvObject>& skipped : std::initializer_list<KvRef<KvObject>>{
           array({text("a")}), array({}), text("a"), KvDate::create(0), KvData::create({}),
           KvDictionary::create()}) {
    EXPECT_EQ(item(skipped), "\n");
  }
}

TEST_F(StorageLogTest, OnceInSevenDays) {
  const auto values = KvDictionary::create({{"k", KvNumber::int32(1)}});
  const double now = platform.clock->now;
  const struct {
    KvRef<KvObject> last;
    bool written;
  } cases[] = {
      {nullptr, true},
      {KvDate::create(now - kWeek), true},
      {KvDate::create(now - kWeek + 1), false},
      {KvDate::create(now + 10 * kWeek), false},  // the clock was set back
  };
  for (const auto& c : cases) {
    platform.log->lines.clear();
    platform.logSubmission->logs.clear();
    platform.calls->clear();
    platform.preferences->put("SSLastLoggedAt", c.last, kProgramDomain);
    NLW_WriteLog("165", values.get());
    EXPECT_EQ(platform.logSubmission->logs.size(), c.written ? 1u : 0u) << kvText(c.last.get());
    if (c.written) {
      EXPECT_THAT(*platform.calls,
                  ElementsAre("submit 165 StorageStatus",
                              "set vellum.tallyd.tallyrun SSLastLoggedAt=2024-10-04T12:00:00Z",
                              "synchronize vellum.tallyd.tallyrun"));
      EXPECT_TRUE(platform.log->lines.empty());
    } else {
      EXPECT_THAT(*platform.calls, IsEmpty());
      EXPECT_TRUE(platform.log->has(LogLevel::Default,
                                    "NANDLogWriter:Last written at " + kvText(c.last.get()) +
                                        " current 2024-10-04T12:00:00Z :skipped"));
    }
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
