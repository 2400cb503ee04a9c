// The daily sweep: what it records, in which order, and that a failure stops nothing after it.
#include "driver/telemetry_sweep.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "fakes/fake_registry.h"
#include "fakes/fake_storage.h"
#include "fakes/kcdata.h"

namespace tally {
namespace {

using fakes::appendValue;
using fakes::Bytes;
using testing::ElementsAre;
using testing::IsEmpty;
using Lines = std::vector<std::string>;

const std::string kTotal = "scalar vellum.dockyard.DiskUsageUserTotalBlocks=";
const std::string kFree = "scalar vellum.dockyard.DiskUsageUserBlocksFree=";
const char* const kNoDriver =
    "error reading nand info, error 1 with message Unable to parse buffer";

class TelemetrySweepTest : public testing::Test {
 protected:
  TelemetrySweepTest() {
    kernel.fail("kern.bootsessionuuid", 2);
    storage.registry->classes.clear();
  }
  // Everything with an effect, in order. The registry is that of the storage driver unless given.
  const Lines& sweep(std::shared_ptr<DeviceRegistry> registry = nullptr) {
    storage.platform.calls->clear();
    storage.platform.log->lines.clear();
    Platform services = storage.services();
    if (registry) services.deviceRegistry = std::move(registry);
    const PlatformScope scope(std::move(services));  // for the libraries
    testing::internal::CaptureStderr();
    runTelemetrySweep(platform());
    testing::internal::GetCapturedStderr();
    EXPECT_EQ(storage.platform.metricsStore->batchDepth, 0);
    return *storage.platform.calls;
  }
  Lines messages() { return storage.platform.log->texts(LogLevel::Default); }
  // Figures for both of their readers: the structured log, whose lists end with the defects, and
  // then the sweep.
  void serve(std::vector<fakes::Record> records) {
    const Bytes figures = fakes::statisticsBuffer(std::move(records));
    storage.registry->classes = {"SPXStorage"};
    storage.registry->properties["Device Characteristics"] = KvDictionary::create();
    storage.registry->serve(figures);
    for (int call = 0; call < 4; ++call) storage.registry->replies.push_back({{}, 1});
    storage.registry->serveNext(Bytes(12));  // no defects
    storage.registry->serveNext(figures);
  }
  Bytes eccRecord(std::uint8_t id, std::uint8_t count, std::size_t length = 72) {
    Bytes record;
    for (const std::uint8_t byte : {id, count}) appendValue(record, byte);
    record.resize(8);
    for (std::int64_t i = 0; i < 8; ++i) appendValue(record, -i);
    record.resize(length);
    return record;
  }

  fakes::FakeStorage storage;
  fakes::FakeKernelValues& kernel = *storage.platform.kernelValues;
};

TEST_F(TelemetrySweepTest, DiskUsageInWholeMebibytes) {
  const auto usage = [](std::int64_t total, std::int64_t available) {
    return KvDictionary::create({{"TotalDiskCapacity", KvNumber::int64(total)},
                                 {"TotalDataAvailable", KvNumber::int64(available)}});
  };
  const std::tuple<KvRef<KvObject>, std::string, std::string> cases[] = {
      {usage(1'048'575, 1'048'576), "0", "1"},
      {usage(-1, INT64_MAX), "-1", "8796093022207"},
      {nullptr, "-1", "-1"},
      {KvDictionary::create({{"TotalDataAvailable", KvNumber::int64(1 << 22)}}), "-1", "4"},
  };
  for (const auto& [answer, total, available] : cases) {
    storage.platform.deviceInformation->answers["DiskUsage"] = answer;
    EXPECT_THAT(sweep(), ElementsAre(kTotal + total, kFree + available));
  }
}

TEST_F(TelemetrySweepTest, TheOrderOfASweep) {
  serve({{53, {1}}, {7, {42}}});
  storage.purgeableSpace->answer =
      KvDictionary::create({{"RECLAIM_TOTAL_AVAILABLE", KvNumber::float64(5.9)},
                            {"RECLAIM_NONPURGEABLE_AMOUNT", KvString::create("6")}});
  kernel.answers["kern.next_ecc_event"] = {{eccRecord(1, 0), 0}, {{}, 2}};
  storage.stackshot->buffer = fakes::Kcdata().thread(1, "VM_swapout", 77).bytes;
  const Lines calls = sweep();
  ASSERT_GT(calls.size(), 10u);
  // The structured log comes before the figures. A text is skipped, and a fraction truncated.
  EXPECT_THAT(Lines(calls.begin(), calls.begin() + 4),
              ElementsAre(kTotal + "-1", kFree + "-1", "FDLogStructuredData 176",
                          "scalar vellum.NANDInfo.ExportVersion=1"));
  EXPECT_THAT(Lines(calls.end() - 4, calls.end()),
              ElementsAre("scalar vellum.NANDInfo.NodesTotal=0",
                          "scalar vellum.NANDInfo.Reclaim.TotalPurgeableBytes=5",
                          "scalar vellum.NANDInfo.VMFreezer.NumPhysicalWrites=77",
                          "FDLogStructuredData 172"));
  EXPECT_THAT(messages(), IsEmpty());
}

TEST_F(TelemetrySweepTest, WithoutStorageFigures) {
  sweep();
  EXPECT_THAT(messages(), ElementsAre(kNoDriver));
  EXPECT_EQ(storage.platform.calls->size(), 2u);  // nothing of the freezer either

  serve({{53, {0}}});
  sweep();
  EXPECT_THAT(messages(), ElementsAre("error reading nand info, error 1 with message Unsupported "
                                      "export version"));

  kernel.answers["kern.bootsessionuuid"] = {{{std::byte{'0'}}, 0}};
  storage.stackshot->buffer = fakes::Kcdata().thread(1, "VM_swapout", 77).bytes;
  // The day is even: the driver's figures are sent as events, that of the freezer stays a scalar.
  EXPECT_THAT(sweep(), ElementsAre(kTotal + "-1", kFree + "-1",
                                   "scalar vellum.NANDInfo.VMFreezer.NumPhysicalWrites=77"));
  EXPECT_THAT(messages(), IsEmpty());
}

TEST_F(TelemetrySweepTest, EccEventsUntilAnError) {
  const std::string unexpected = "Unexpected errno (5) reading ECC events from kernel";
  const struct {
    const char* name;
    std::vector<fakes::FakeKernelValues::Answer> answers;
    std::size_t records;
    std::ptrdiff_t reads;
    Lines messages;
  } cases[] = {
      {"busy", {{eccRecord(1, 1), 0}, {{}, 16}}, 1, 2, {kNoDriver}},
      {"another error", {{eccRecord(1, 1), 0}, {{}, 5}}, 1, 2, {kNoDriver, unexpected}},
      {"without end", {{eccRecord(1, 1), 0}}, 10, 11, {kNoDriver}},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.name);
    kernel.answers["kern.next_ecc_event"] = c.answers;
    kernel.reads.clear();
    storage.platform.crashReporting->records.clear();
    sweep();
    EXPECT_EQ(storage.platform.crashReporting->records.size(), c.records);
    EXPECT_EQ(std::ranges::count(kernel.reads, "kern.next_ecc_event"), c.reads);
    EXPECT_EQ(messages(), c.messages);
  }
}

TEST_F(TelemetrySweepTest, EccRegistersStayInsideTheirRecord) {
  const std::pair<Bytes, std::string> cases[] = {
      {eccRecord(200, 0), "id=200 count=0 "},
      {eccRecord(1, 2), "id=1 count=2 reg0=0 reg1=-1 "},
      {eccRecord(1, 255),
       "id=1 count=255 reg0=0 reg1=-1 reg2=-2 reg3=-3 reg4=-4 reg5=-5 reg6=-6 reg7=-7 "},
      {eccRecord(1, 3, 16), "id=1 count=3 reg0=0 "},
      {{}, "id=0 count=0 "},
  };
  for (const auto& [record, expected] : cases) {
    kernel.answers["kern.next_ecc_event"] = {{record, 0}, {{}, 2}};
    storage.platform.crashReporting->records.clear();
    sweep();
    ASSERT_EQ(storage.platform.crashReporting->records.size(), 1u);
    std::string entries;
    for (const auto& [key, value] : *storage.platform.crashReporting->records[0].second) {
      entries.append(key->view()).append("=").append(kvText(value.get())).append(" ");
    }
    EXPECT_EQ(entries, expected);
  }
}

TEST_F(TelemetrySweepTest, ChannelsOfTheHub) {
  const auto hub = std::make_shared<fakes::FakeRegistry>();
  auto channels = KvArray::create();
  const auto serveChannel = [&](std::uint64_t id, std::uint64_t format, std::uint64_t categories,
                                const char* name, std::int64_t value) {
    const std::uint64_t type = format | categories << 16 | 1ull << 32;
    auto entry = KvArray::create({KvNumber::uint64(id), KvNumber::uint64(type)});
    if (name != nullptr) entry->append(KvString::create(name));
    channels->append(std::move(entry));
    const auto word = static_cast<std::uint64_t>(value);
    for (const std::uint64_t field : {std::uint64_t{500}, id, type, std::uint64_t{0}, word,
                                      std::uint64_t{0}, std::uint64_t{0}, std::uint64_t{0}}) {
      appendValue(hub->region, field);
    }
  };
  serveChannel(0x4142, 1, 0x100, "named", -7);
  serveChannel(0x4143, 1, 0x0FF, "other category", 1);
  serveChannel(0x4144, 2, 0x100, "other format", 1);
  serveChannel(0x4145, 1, 0x300, nullptr, 8);  // named by its id
  serveChannel(0x01, 1, 0x100, nullptr, 9);    // which is not a name
  hub->entries.push_back({.className = "HwReportHub", .name = "hub"});
  hub->entries.push_back({.className = "Driver", .name = "driver", .id = 500});
  hub->entries.back().properties = KvDictionary::create(
      {{"HwReportLegendPublic", KvBoolean::of(true)},
       {"HwReportLegend",
        KvArray::create({KvDictionary::create({{"HwReportChannels", std::move(channels)}})})}});
  EXPECT_THAT(sweep(hub),
              ElementsAre(kTotal + "-1", kFree + "-1", "scalar vellum.hwreport.named=-7",
                          "scalar vellum.hwreport.AE=8"));
  for (const std::uint32_t selector : {2u, 3u}) {  // to subscribe, to sample
    hub->callResults = {{selector, 1}};
    EXPECT_THAT(sweep(hub), ElementsAre(kTotal + "-1", kFree + "-1"));
  }
}

TEST_F(TelemetrySweepTest, EachChangeOfADisksWearIsRecordedAndElseAWeek) {
  auto& disks = storage.platform.flashDisks->list;
  const auto& rows = storage.platform.metricsStore->wears;
  Wear wear;
  wear.used = {{{10, 20}, ""}};
  disks = {{"sda", DiskKind::Ufs, "UFS 1", false, false, wear},
           {"mmcblk1", DiskKind::Other, "other 2", true, false, wear},
           {"sdb", DiskKind::Ufs, "", false, false, wear},
           {"sdc", DiskKind::Other, "other 3", false, true, std::nullopt}};
  std::vector<std::int32_t> days;
  const auto sweepOn = [&](std::int32_t day, unsigned used, std::int64_t age = 0) {
    storage.platform.clock->setDay(day, 3600);
    disks[0].wear->used->value = {used, used + 10};
    disks[0].wear->ageSeconds = age;
    sweep();
    days.clear();
    for (const WearRow& row : rows.at("UFS 1")) days.push_back(row.day);
    return days;
  };
  EXPECT_THAT(sweepOn(20000, 10), ElementsAre(20000));
  EXPECT_THAT(sweepOn(20006, 10), ElementsAre(20000));
  EXPECT_THAT(sweepOn(20007, 10), ElementsAre(20000, 20007));
  EXPECT_THAT(sweepOn(20008, 20), ElementsAre(20000, 20007, 20008));
  EXPECT_THAT(sweepOn(20100, 20, 92 * 86400), ElementsAre(20000, 20007, 20008))
      << "figures that are as old as the last row";
  EXPECT_EQ(rows.size(), 1u) << "neither cards nor disks without identity or wear";
}

}  // namespace
}  // namespace tally
