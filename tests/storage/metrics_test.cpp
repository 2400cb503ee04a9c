// The NAND info dictionary from driver to caller, and the figures that are added to it.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <string>

#include "fakes/fake_storage.h"
#include "fakes/kcdata.h"
#include "platform/protocol/storage_protocol.h"
#include "storage/auxiliary/health.h"
#include "storage/auxiliary_metrics.h"
#include "storage/nand_info.h"
#include "storage/nand_info/figure_groups.h"

namespace tally {
namespace {

using fakes::Bytes;
using fakes::Kcdata;
using fakes::kIo;
using fakes::Record;
using fakes::statisticsBuffer;

constexpr std::string_view kPrefix = "vellum.NANDInfo.";
constexpr std::uint64_t kFull = 0x20002;

// "name=value"; a wide number carries an L, a string quotes.
std::string text(const KvDictionary& dictionary) {
  std::string all;
  for (const auto& [key, value] : dictionary) {
    EXPECT_TRUE(key->view().starts_with(kPrefix)) << key->view();
    const auto* number = kvCast<KvNumber>(value.get());
    const std::string quote = kvCast<KvString>(value.get()) != nullptr ? "'" : "";
    all.append(all.empty() ? "" : " ").append(key->view().substr(kPrefix.size())).append("=");
    all.append(quote).append(kvText(value.get())).append(quote);
    if (number != nullptr && number->kind() == KvNumberKind::Int64) all.append("L");
  }
  return all;
}

class NandInfoTest : public testing::Test {
 protected:
  NandInfoTest() {
    storage.purgeableSpace->answer =
        KvDictionary::create({{"RECLAIM_TOTAL_AVAILABLE", KvNumber::int64(5)},
                              {"RECLAIM_NONPURGEABLE_AMOUNT", KvNumber::int64(6)}});
  }
  KvRef<KvDictionary> infoOf(std::uint64_t exportVersion, std::vector<Record> records) {
    records.insert(records.begin(), {53, {exportVersion}});
    storage.registry->serve(statisticsBuffer(records));
    return CopyNANDInfo();
  }
  // One figure of a full export, as text; "(null)" when it is not there.
  std::string figure(std::string_view name, std::vector<Record> records) {
    return kvText(infoOf(kFull, std::move(records))->get(std::string(kPrefix).append(name)));
  }
  fakes::FakeStorage storage;
};

const std::string kReclaim = " Reclaim.TotalPurgeableBytes=5L Reclaim.TotalNonPurgeableBytes=6L";

TEST_F(NandInfoTest, AnOldExportHasTheFirstFiguresOnly) {
  const std::vector<Record> records = {
      {49, {4096}}, {50, {128}},   {52, {0x1FFFFFFFF}}, {7, {1}},  {4, {2}},
      {48, {3}},    {17, {4}},     {19, {5}},           {18, {6}}, {20, {7}},
      {12, {8}},    {13, {~0ull}}, {56, {1u << 30}},    {37, {9}}};
  EXPECT_EQ(text(*infoOf(0x20001, records)),
            "ExportVersion=131073 DriverVersion=-1 DemoMode=0L NumVirtualBlocks=-1 "
            "PagesPerVirtualBlock=128 BytesPerPage=4096 NumLogicalReads=1L NumLogicalWrites=2L "
            "NumFreeVirtualBlocks=3L NumWearLevelOps=4L NumPhysicalReads=5L NumPhysicalWrites=6L "
            "NumPhysicalErases=7L NodesFree=8L NodesTotal=-1L" +
                kReclaim);
}

TEST_F(NandInfoTest, AFullExportGoesOn) {
  const std::vector<Record> records = {{37, {9}},   {28, {1}},  {45, {2}}, {51, {3}}, {265, {4, 5}},
                                       {86, {100}}, {85, {40}}, {2, {1}},  {42, {1}}};
  EXPECT_THAT(text(*infoOf(kFull, records)),
              testing::EndsWith(
                  "NodesFree=0L NodesTotal=0L formatDaysSince2000=0L NumSleepOps=1L "
                  "HighEnduranceBlockEraseCount=2L BlocksPerVirtualBlock=3 ReadsBeforeErasure0=4L "
                  "ReadsBeforeErasure50000=5L ReadsBeforeErasure100000=0L "
                  "ReadsBeforeErasure150000=0L ReadsBeforeErasure200000=0L NumFlushes=9L "
                  "IntermediatePartitionSize=60L NumMaintenanceRequests=0L "
                  "MaintenanceRequestsFailedRead=0L MaintenanceRequestsFailedProg=0L "
                  "MaintenanceRequestsFailedErase=0L" +
                  kReclaim));
}

TEST_F(NandInfoTest, EveryFigureIsShownInItsGroup) {
  auto info = infoOf(kFull, {{86, {100}}, {85, {40}}});
  storage.stackshot->buffer = fakes::Kcdata().thread(1, "VM_swapout", 1).bytes;
  const auto freezer = CopyVMFreezerNANDInfo();
  for (const auto& [key, value] : *freezer) info->set(key, value);
  for (const auto& [key, value] : *info) {
    EXPECT_NE(figureGroup(key->view()), FigureGroup::Other)
        << key->view() << " has no row in kKeyGroups of figure_groups.cpp";
  }
  EXPECT_EQ(figureGroup("vellum.NANDInfo.PadSectorsPerHostFlow3"), FigureGroup::Traffic);
  EXPECT_EQ(figureGroup("vellum.NANDInfo.padSectorsPerFlow4"), FigureGroup::Other);
}

TEST_F(NandInfoTest, DerivedFigures) {
  constexpr std::uint64_t k2000 = 946'684'800, kWeek = 604'800;
  const struct {
    const char* figure;
    std::vector<Record> records;
    const char* value;
  } cases[] = {
      {"formatDaysSince2000", {{56, {k2000 + kWeek - 1}}}, "0"},
      {"formatDaysSince2000", {{56, {k2000 + kWeek}}}, "1"},
      {"maxMemChokeDuration", {{142, {999}}}, "999"},
      {"maxMemChokeDuration", {{142, {1235}}}, "1240"},
      {"maxMemChokeDuration", {{142, {0x500000001}}}, "1"},
      {"maxMemChokeDuration", {{142, {0xFFFFFFFF}}}, "4290000000"},
      {"maxMemExtremeDuration", {{188, {123'500}}}, "124000"},
      {"memExtremeDuration", {{189, {123'456}}}, "123456"},
      {"IntermediatePartitionSize", {{86, {100}}}, "(null)"},
      {"IntermediatePartitionSize", {{86, {1}}, {85, {3}}}, "-2"},
      {"NumMaintenanceRequests", {{269, {3, 100}}, {270, {4, 100}}}, "7"},
      {"MaintenanceRequestsFailedRead", {{289, {0, 5, 0, 9}}}, "1"},
      {"MaintenanceRequestsFailedProg", {{290, {2, 5, 1, 9}}}, "3"},
      {"BandsPerInternalFlow3", {{114, {1, 2, 3, 4, 5}}}, "5"},
      {"ColdestCycle", {{124, {7}}}, "(null)"},
      {"IntermediateColdestCycle", {{124, {7, 8}}}, "8"},
      {"raidReconstructFailPartition", {{470, {3, 4}}}, "3"},
      {"raidReconstructFailPartition1", {{470, {3, 4}}}, "4"},
      {"padSectorsPerFlow4", {{120, {1, 2, 3, 4, 5, 6}}}, "5"},
      {"clogProgram", {{41, {1}}, {41, {~0ull}}}, "-1"},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.figure);
    EXPECT_EQ(figure(c.figure, c.records), c.value);
  }
}

TEST_F(NandInfoTest, DemoModeIsAPreferenceThatIsTrue) {
  const std::pair<KvRef<KvObject>, const char*> cases[] = {{KvBoolean::of(true), "1"},
                                                           {KvBoolean::of(false), "0"},
                                                           {KvNumber::int32(1), "1"},
                                                           {KvString::create("1"), "0"}};
  for (const auto& [preference, mode] : cases) {
    storage.platform.preferences->put("StoreDemoMode", preference, "vellum.demo-settings");
    EXPECT_EQ(figure("DemoMode", {}), mode);
  }
}

TEST_F(NandInfoTest, ADriverOfWhatIsKnownAloneHasNoOtherFigures) {
  EXPECT_EQ(text(*infoOf(kFull, {{kKnownAloneStatistic, {1}}, {4, {9}}, {431, {7}}})),
            "ExportVersion=131074 DemoMode=0L NumLogicalWrites=9L UserPartitionPEPercentUsed=7L" +
                kReclaim);
}

TEST_F(NandInfoTest, Failures) {
  const std::string unparsable = "Error='1' ErrorMessage='Unable to parse buffer'";
  storage.registry->serve(statisticsBuffer({{53, {kFull}}, {7, {1}, 2}}));
  EXPECT_EQ(text(*CopyNANDInfo()), unparsable + kReclaim);
  EXPECT_EQ(text(*infoOf(0, {})), "Error='1' ErrorMessage='Unsupported export version'" + kReclaim);

  SPXParseContext context;
  EXPECT_FALSE(buildNandInfo(context, true));
  context.exportVersion = 1;
  EXPECT_TRUE(text(*buildNandInfo(context, true)).starts_with("NumVirtualBlocks=0 "));

  storage.purgeableSpace->available = false;
  storage.registry->serve({});
  EXPECT_EQ(text(*CopyNANDInfo()), unparsable +
                                       " Reclaim.Error='1' Reclaim.ErrorMessage='Unable to parse "
                                       "reclaim counters'");
}

TEST_F(NandInfoTest, PurgeableSpace) {
  const std::string failed =
      "Reclaim.Error='1' Reclaim.ErrorMessage='Unable to parse reclaim counters.'";
  const auto five = KvNumber::int64(5), seven = KvNumber::int64(7);
  const std::pair<KvRef<KvDictionary>, std::string> cases[] = {
      {nullptr, failed},
      {KvDictionary::create({{"RECLAIM_TOTAL_AVAILABLE", five}}),
       "Reclaim.TotalPurgeableBytes=5L " + failed},
      {KvDictionary::create({{"RECLAIM_ERROR", seven}, {"RECLAIM_TOTAL_AVAILABLE", five}}), failed},
  };
  for (const auto& [answer, figures] : cases) {
    storage.purgeableSpace->answer = answer;
    EXPECT_EQ(text(*CopyReclaimNANDInfo()), figures);
    EXPECT_EQ(storage.purgeableSpace->asked, "/private/var");
  }
  auto figures = KvDictionary::create();
  EXPECT_FALSE(addReclaimFigures(*figures));
  EXPECT_EQ(text(*figures), "Reclaim.Error=7L");
}

TEST_F(NandInfoTest, Freezer) {
  using Change = void (*)(fakes::FakeStackshot&);
  const std::string failed =
      "VMFreezer.Error='1' VMFreezer.ErrorMessage='Unable parse snapshot for VMFreezer NAND "
      "writes.'";
  const std::pair<Change, std::string> cases[] = {
      {[](auto&) {}, "VMFreezer.NumPhysicalWrites=-1L"},
      {[](auto& s) { s.exists = false; }, failed},
      {[](auto& s) { s.flagsStatus = 22; }, failed},
      {[](auto& s) { s.captureStatus = 1; }, failed},
      {[](auto& s) {
         s.buffer = Kcdata().begin(1).name("VM_swapout").item(kIo, 0, Bytes(31)).bytes;
       },
       failed},
  };
  for (const auto& [change, figures] : cases) {
    auto& stackshot = *storage.stackshot = fakes::FakeStackshot();
    stackshot.buffer = Kcdata().thread(1, "VM_swapout", ~0ull).bytes;
    change(stackshot);
    EXPECT_EQ(text(*CopyVMFreezerNANDInfo()), figures);
    EXPECT_EQ(stackshot.configs, 0);
  }
}

TEST_F(NandInfoTest, EveryOtherDayOfABootSessionBelongsToAnalytics) {
  // Whether the analytics day, of an even and an odd one, is the odd one.
  const std::pair<std::string, bool> cases[] = {{"0", false},  {"1", true},  {"9F", true},
                                                {"8F", false}, {"A", false}, {"F", true},
                                                {"b", false},  {"", false},  {"G", false}};
  const auto copyInfo = [this](std::uint32_t options) {
    storage.registry->serve(statisticsBuffer({{53, {1}}}));
    return CopyNANDInfoWithOptions(options);
  };
  for (const auto& [session, oddDay] : cases) {
    Bytes uuid;
    for (const char letter : session) fakes::appendValue(uuid, letter);
    storage.platform.kernelValues->answers["kern.bootsessionuuid"] = {{uuid, 0}};
    for (const int day : {20000, 20001, 20002, 20003}) {
      SCOPED_TRACE(session + " " + std::to_string(day));
      storage.platform.clock->setDay(day, 86399);
      const bool analytics = (day % 2 != 0) == oddDay;
      storage.analyticsEvents->offered.clear();
      EXPECT_EQ(copyInfo(1)->empty(), analytics);
      EXPECT_EQ(storage.analyticsEvents->offered.size(), analytics ? 35u : 0u);
      // Without the option the day's figures go nowhere.
      EXPECT_NE(bool(copyInfo(2)), analytics);
    }
  }
  storage.platform.kernelValues->answers.clear();
  for (const int day : {20000, 20001}) {
    storage.platform.clock->setDay(day);
    EXPECT_TRUE(copyInfo(1)) << day;
  }
}

// The disk-writes-size figure as text; "none" without statistics, "-" without a match.
std::string search(const Bytes& bytes, const char* wanted = "VM_swapout") {
  const Bytes exact = bytes;  // so that a sanitizer sees a read beyond it
  const auto* const end = exact.data() + exact.size();
  std::span<const std::byte> stats;
  if (getIOStatsWithThreadnameFromKCData(exact.data(), end, wanted, &stats) == 0) return "-";
  if (stats.data() == nullptr) return "none";
  if (stats.size() < 32) return "short";
  std::uint64_t figure;
  std::memcpy(&figure, stats.data() + 24, sizeof figure);
  return std::to_string(figure);
}

TEST(Kcdata, FindsTheThread) {
  const std::string longName(70, 'x');
  const struct {
    const char* name;
    Kcdata data;
    const char* found;
    std::string wanted = "VM_swapout";
  } cases[] = {
      {"zero-terminated name", Kcdata().thread(1, std::string("VM_swapout\0\0", 12), 7), "7"},
      {"name goes on", Kcdata().thread(1, "VM_swapout2", 7).stop(), "-"},
      {"name is a prefix", Kcdata().thread(1, "VM_", 7).stop(), "7"},
      {"name ends early", Kcdata().thread(1, std::string("VM_\0swapout", 11), 7).stop(), "-"},
      {"64 bytes of a name count", Kcdata().thread(1, longName, 7), "7", std::string(64, 'x')},
      {"no statistics", Kcdata().begin(1).name("VM_swapout").end(1).stop(), "none"},
      {"short statistics", Kcdata().begin(1).name("VM_swapout").item(kIo, 0, Bytes(24)).end(1),
       "short"},
      {"statistics outside", Kcdata().io(5).begin(1).name("VM_swapout").end(1).io(6).stop(),
       "none"},
      {"a later sibling", Kcdata().thread(1, "a", 5).thread(2, "VM_swapout", 7).stop(), "7"},
      {"the outer, its figures after the inner",
       Kcdata().begin(9).thread(1, "a", 5).name("VM_swapout").io(8).end(9), "8"},
      {"an inner container of the same number",
       Kcdata().begin(1).name("VM_swapout").io(8).begin(1).name("a").end(1).end(1), "8"},
      {"begin without a payload opens none",
       Kcdata().begin(1, 3).name("VM_swapout").io(7).end(1).stop(), "-"},
      {"nothing counts beyond the end", Kcdata().stop().thread(1, "VM_swapout", 7), "-"},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.name);
    EXPECT_EQ(search(c.data.bytes, c.wanted.c_str()), c.found);
  }
  EXPECT_EQ(search(cases[0].data.bytes, nullptr), "-");
}

KvRef<KvDictionary> nandInfo(
    std::initializer_list<std::pair<std::string_view, KvRef<KvObject>>> entries) {
  auto info = KvDictionary::create();
  for (const auto& [name, value] : entries) info->set(std::string(kPrefix).append(name), value);
  return info;
}

TEST(Health, SummaryAndExtracts) {
  const auto number = [](std::int64_t value) { return KvNumber::int64(value); };
  const auto health = healthOfNandInfo(*nandInfo({{"fwUpdatesPercentUsed", number(3)},
                                                  {"UserPartitionPEPercentUsed", number(41)},
                                                  {"E2E_H2F_VL_UECC", number(12)},
                                                  {"E2E_F2H_SL_UECC", number(0x100000002)},
                                                  {"ueccReads", number(5)},
                                                  {"raidSmartErrors", number(-1)},
                                                  {"numGrownBad", number(9)},
                                                  {"spareAvailablePercent", number(2)},
                                                  {"other", number(1)}}));
  EXPECT_EQ(text(*health),
            "fwUpdatesPercentUsed=3 IntermediatePartitionPEPercentUsed=0 "
            "UserPartitionPEPercentUsed=41 Health.MaxPercentageNANDUsed=41 "
            "E2E_H2F_VL_LBA=0L E2E_H2F_VL_Corr=0L E2E_H2F_VL_UECC=12L E2E_H2F_SL_LBA=0L "
            "E2E_H2F_SL_Corr=0L E2E_H2F_SL_UECC=0L E2E_F2H_VL_LBA=0L E2E_F2H_VL_Corr=0L "
            "E2E_F2H_VL_UECC=0L E2E_F2H_SL_LBA=0L E2E_F2H_SL_Corr=0L E2E_F2H_SL_UECC=2L "
            "Health.MaxE2EErrors=12 ueccReads=5L raidSmartErrors=-1L Health.HostReadErrors=-1 "
            "numGrownBad=9 spareAvailablePercent=2");
  EXPECT_EQ(text(*fixlineExtract(*health)),
            "Health.MaxPercentageNANDUsed=41 Health.HostReadErrors=-1 numGrownBad=9 "
            "Health.MaxE2EErrors=12 Health.IsNANDRefurbishable=1");
  EXPECT_EQ(text(*internalLabExtract(*health)),
            "Health.MaxPercentageNANDUsed=41 Health.HostReadErrors=-1 numGrownBad=9 "
            "Health.MaxE2EErrors=12 spareAvailablePercent=2 Health.IsNANDRetirable=1");
  EXPECT_EQ(text(*otaExtract(*health)),
            "Health.MaxPercentageNANDUsed=41 Health.HostReadErrors=-1 numGrownBad=9 "
            "E2E_H2F_VL_LBA=0 E2E_H2F_VL_Corr=0 E2E_H2F_VL_UECC=12 E2E_H2F_SL_LBA=0 "
            "E2E_H2F_SL_Corr=0 E2E_H2F_SL_UECC=0 E2E_F2H_VL_LBA=0 E2E_F2H_VL_Corr=0 "
            "E2E_F2H_VL_UECC=0 E2E_F2H_SL_LBA=0 E2E_F2H_SL_Corr=0 E2E_F2H_SL_UECC=2");
}

TEST(Health, SparePercentageDecidesRetirement) {
  const std::pair<KvRef<KvObject>, int> cases[] = {
      {nullptr, 1}, {KvNumber::int64(2), 1}, {KvNumber::int64(3), 0}, {KvNumber::int64(-1), 0}};
  for (const auto& [spare, retirable] : cases) {
    const auto health = healthOfNandInfo(*nandInfo({{"spareAvailablePercent", spare}}));
    EXPECT_EQ(internalLabExtract(*health)->getInt64("vellum.NANDInfo.Health.IsNANDRetirable"),
              retirable);
  }
}

// A value that is not a number counts as 0 and is reported, in the summary and its extracts.
TEST(Health, ValuesThatAreNotNumbers) {
  for (const char* key : {"UserPartitionPEPercentUsed", "E2E_H2F_VL_LBA", "numGrownBad"}) {
    SCOPED_TRACE(key);
    const auto health = healthOfNandInfo(*nandInfo({{key, KvString::create("7")}}));
    EXPECT_EQ(health->getInt64(std::string(kPrefix) + key), 0);
    EXPECT_EQ(health->getInt64("vellum.NANDInfo.Error"), 1);
    for (const auto& extract :
         {fixlineExtract(*health), internalLabExtract(*health), otaExtract(*health)}) {
      EXPECT_EQ(extract->getInt64("vellum.NANDInfo.Error"), 1);
    }
  }
  EXPECT_FALSE(healthOfNandInfo(*nandInfo({{"Error", KvString::create("1")}}))
                   ->contains("vellum.NANDInfo.Error"));
}

}  // namespace
}  // namespace tally
