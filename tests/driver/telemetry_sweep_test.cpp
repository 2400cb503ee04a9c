// The daily sweep: what it records, in which order, and what each failure costs.
#include "driver/telemetry_sweep.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "fakes/fake_storage.h"
#include "fakes/kcdata.h"

namespace tally {
namespace {

using fakes::appendValue;
using fakes::Bytes;
using testing::ElementsAre;
using testing::IsEmpty;
using Lines = std::vector<std::string>;

// A storage driver, and beside it one driver whose statistics channels a hub serves.
struct FakeHub final : fakes::FakeStorageRegistry {
  static constexpr RegistryHandle kHub = 30, kIterator = 40, kDriver = 50;
  static constexpr ConnectionHandle kHubConnection = 31;
  struct Channel {
    std::uint64_t id;
    std::uint64_t type;  // format, categories << 16, elements << 32
    const char* name;    // null: the id names it
    std::int64_t value;
  };
  std::vector<Channel> channels;
  RegistryResult subscribeStatus = 0, sampleStatus = 0;
  bool visited = false;
  Bytes elements;
  std::size_t interests = 0;  // that were subscribed

  RegistryHandle RegistryFindService(KvRef<KvDictionary> matching) override {
    if (matching->getString(kMatchClass) == "HwReportHub") return kHub;
    return FakeStorageRegistry::RegistryFindService(std::move(matching));
  }
  RegistryResult RegistryCopyMatchingServices(KvRef<KvDictionary>, RegistryHandle* found) override {
    *found = kIterator;
    visited = channels.empty();
    return 0;
  }
  RegistryHandle RegistryIteratorNext(RegistryHandle) override {
    return std::exchange(visited, true) ? 0 : kDriver;
  }
  bool RegistryIteratorIsValid(RegistryHandle) override { return true; }
  void HandleRelease(RegistryHandle handle) override {
    if (handle < kHub) FakeStorageRegistry::HandleRelease(handle);
  }
  KvRef<KvObject> RegistryCopyProperty(RegistryHandle, std::string_view key) override {
    if (key == "HwReportLegendPublic") return KvBoolean::of(true);
    auto legend = KvArray::create();
    for (const Channel& channel : channels) {
      auto entry = KvArray::create({KvNumber::uint64(channel.id), KvNumber::uint64(channel.type)});
      if (channel.name != nullptr) entry->append(KvString::create(channel.name));
      legend->append(std::move(entry));
    }
    return KvArray::create({KvDictionary::create({{"HwReportChannels", std::move(legend)}})});
  }
  RegistryResult RegistryGetEntryID(RegistryHandle, std::uint64_t* id) override {
    *id = 500;
    return 0;
  }
  RegistryResult RegistryGetName(RegistryHandle, std::string* name) override {
    *name = "driver";
    return 0;
  }
  RegistryResult ServiceOpenConnection(RegistryHandle service, std::uint32_t type,
                                       ConnectionHandle* connection) override {
    if (service != kHub) {
      return FakeStorageRegistry::ServiceOpenConnection(service, type, connection);
    }
    *connection = kHubConnection;
    return 0;
  }
  RegistryResult ServiceCloseConnection(ConnectionHandle connection) override {
    return connection == kHubConnection ? 0
                                        : FakeStorageRegistry::ServiceCloseConnection(connection);
  }
  RegistryResult ConnectionCallMethod(ConnectionHandle connection, std::uint32_t selector,
                                      MethodCall& call) override {
    if (connection != kHubConnection) {
      return FakeStorageRegistry::ConnectionCallMethod(connection, selector, call);
    }
    if (selector == 2) {
      interests = call.structInput.size() / 24;
      call.scalarOutputCount = 1;
      return subscribeStatus;
    }
    return selector == 3 ? sampleStatus : 0;
  }
  RegistryResult ConnectionMapMemory(ConnectionHandle, std::uint32_t, std::uint32_t,
                                     const std::byte** address, std::size_t* length) override {
    elements.clear();
    for (const Channel& channel : channels) {
      for (const std::uint64_t word : {std::uint64_t{500}, channel.id, channel.type,
                                       std::uint64_t{0}, static_cast<std::uint64_t>(channel.value),
                                       std::uint64_t{0}, std::uint64_t{0}, std::uint64_t{0}}) {
        appendValue(elements, word);
      }
    }
    *address = elements.data();
    *length = elements.size();
    return 0;
  }
  RegistryResult ConnectionUnmapMemory(ConnectionHandle, std::uint32_t, const std::byte*) override {
    return 0;
  }
};

constexpr std::uint64_t typeWord(std::uint64_t format, std::uint64_t categories) {
  return format | categories << 16 | 1ull << 32;
}

class TelemetrySweepTest : public testing::Test {
 protected:
  TelemetrySweepTest() {
    storage.platform.kernelValues->fail("kern.bootsessionuuid", 2);
    storage.registry->classes.clear();
  }
  // Everything with an effect, in order.
  const Lines& sweep() {
    storage.platform.calls->clear();
    storage.platform.log->lines.clear();
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

  std::shared_ptr<FakeHub> hub = std::make_shared<FakeHub>();
  fakes::FakeStorage storage{hub};
};

const char* const kTotal = "scalar vellum.dockyard.DiskUsageUserTotalBlocks=";
const char* const kFree = "scalar vellum.dockyard.DiskUsageUserBlocksFree=";

TEST_F(TelemetrySweepTest, DiskUsageInWholeMebibytes) {
  const auto usage = [](std::int64_t total, std::int64_t available) {
    return KvDictionary::create({{"TotalDiskCapacity", KvNumber::int64(total)},
                                 {"TotalDataAvailable", KvNumber::int64(available)}});
  };
  const struct {
    KvRef<KvObject> answer;
    std::string total, free;
  } cases[] = {
      {usage(1'048'575, 1'048'576), "0", "1"},
      {usage(-1, INT64_MAX), "-1", "8796093022207"},
      {nullptr, "-1", "-1"},
      {KvDictionary::create({{"TotalDataAvailable", KvNumber::int64(1 << 22)}}), "-1", "4"},
  };
  for (const auto& c : cases) {
    storage.platform.deviceInformation->answers["DiskUsage"] = c.answer;
    EXPECT_THAT(sweep(), ElementsAre(kTotal + c.total, kFree + c.free));
  }
}

TEST_F(TelemetrySweepTest, TheOrderOfASweep) {
  serve({{53, {1}}, {7, {42}}});
  storage.purgeableSpace->answer =
      KvDictionary::create({{"RECLAIM_TOTAL_AVAILABLE", KvNumber::float64(5.9)},
                            {"RECLAIM_NONPURGEABLE_AMOUNT", KvString::create("6")}});
  storage.platform.kernelValues->answers["kern.next_ecc_event"] = {{eccRecord(1, 0), 0}, {{}, 2}};
  storage.stackshot->buffer = fakes::Kcdata().thread(1, "VM_swapout", 77).bytes;
  hub->channels = {{0x4142, typeWord(1, 0x100), "named", -7},
                   {0x4143, typeWord(1, 0x0FF), "other category", 1},
                   {0x4144, typeWord(2, 0x100), "other format", 1},
                   {0x4145, typeWord(1, 0x300), nullptr, 8},
                   {0x01, typeWord(1, 0x100), nullptr, 9}};
  const Lines calls = sweep();
  ASSERT_GT(calls.size(), 10u);
  EXPECT_THAT(Lines(calls.begin(), calls.begin() + 4),
              ElementsAre(std::string(kTotal) + "-1", std::string(kFree) + "-1",
                          "FDLogStructuredData 176", "scalar vellum.NANDInfo.ExportVersion=1"));
  // The string is passed over, the fraction cut off; a channel that has no name is left out.
  EXPECT_THAT(Lines(calls.end() - 6, calls.end()),
              ElementsAre("scalar vellum.NANDInfo.NodesTotal=0",
                          "scalar vellum.NANDInfo.Reclaim.TotalPurgeableBytes=5",
                          "scalar vellum.NANDInfo.VMFreezer.NumPhysicalWrites=77",
                          "FDLogStructuredData 172", "scalar vellum.hwreport.named=-7",
                          "scalar vellum.hwreport.AE=8"));
  EXPECT_EQ(hub->interests, 3u);
  EXPECT_THAT(messages(), IsEmpty());
}

TEST_F(TelemetrySweepTest, WithoutStorageFigures) {
  const std::string noDriver =
      "error reading nand info, error 1 with message Unable to parse buffer";
  sweep();
  EXPECT_THAT(messages(), ElementsAre(noDriver));
  EXPECT_EQ(storage.platform.calls->size(), 2u);  // nothing of the freezer either

  serve({{53, {0}}});
  sweep();
  EXPECT_THAT(messages(), ElementsAre("error reading nand info, error 1 with message Unsupported "
                                      "export version"));

  storage.platform.kernelValues->answers["kern.bootsessionuuid"] = {{{std::byte{'0'}}, 0}};
  storage.stackshot->buffer = fakes::Kcdata().thread(1, "VM_swapout", 77).bytes;
  // The day is even: the driver's figures go out as events, the freezer's stays a scalar.
  EXPECT_THAT(sweep(), ElementsAre(std::string(kTotal) + "-1", std::string(kFree) + "-1",
                                   "scalar vellum.NANDInfo.VMFreezer.NumPhysicalWrites=77"));
  EXPECT_THAT(messages(), ElementsAre());
}

TEST_F(TelemetrySweepTest, EccEvents) {
  const struct {
    const char* name;
    std::vector<fakes::FakeKernelValues::Answer> answers;
    std::size_t records, reads;
    const char* message;  // null: none
  } cases[] = {
      {"busy", {{eccRecord(1, 1), 0}, {{}, 16}}, 1, 2, nullptr},
      {"another error",
       {{eccRecord(1, 1), 0}, {{}, 5}},
       1,
       2,
       "Unexpected errno (5) reading ECC events from kernel"},
      {"without end", {{eccRecord(1, 1), 0}}, 10, 11, nullptr},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.name);
    auto& kernel = *storage.platform.kernelValues;
    kernel.answers["kern.next_ecc_event"] = c.answers;
    kernel.reads.clear();
    storage.platform.crashReporting->records.clear();
    sweep();
    EXPECT_EQ(storage.platform.crashReporting->records.size(), c.records);
    EXPECT_EQ(std::count(kernel.reads.begin(), kernel.reads.end(), "kern.next_ecc_event"),
              static_cast<std::ptrdiff_t>(c.reads));
    Lines expected{"error reading nand info, error 1 with message Unable to parse buffer"};
    if (c.message != nullptr) expected.push_back(c.message);
    EXPECT_EQ(messages(), expected);
  }
}

TEST_F(TelemetrySweepTest, EccRegistersStayInsideTheirRecord) {
  const struct {
    Bytes record;
    std::string entries;
  } cases[] = {
      {eccRecord(200, 0), "id=200 count=0 "},
      {eccRecord(1, 2), "id=1 count=2 reg0=0 reg1=-1 "},
      {eccRecord(1, 255),
       "id=1 count=255 reg0=0 reg1=-1 reg2=-2 reg3=-3 reg4=-4 reg5=-5 reg6=-6 reg7=-7 "},
      {eccRecord(1, 3, 16), "id=1 count=3 reg0=0 "},
      {{}, "id=0 count=0 "},
  };
  for (const auto& c : cases) {
    storage.platform.kernelValues->answers["kern.next_ecc_event"] = {{c.record, 0}, {{}, 2}};
    storage.platform.crashReporting->records.clear();
    sweep();
    ASSERT_EQ(storage.platform.crashReporting->records.size(), 1u);
    std::string entries;
    for (const auto& [key, value] : *storage.platform.crashReporting->records[0].second) {
      entries.append(key->view()).append("=").append(kvText(value.get())).append(" ");
    }
    EXPECT_EQ(entries, c.entries);
  }
}

TEST_F(TelemetrySweepTest, ChannelsThatCannotBeRead) {
  hub->channels = {{0x4142, typeWord(1, 0x100), "c", 7}};
  for (const auto& [subscribe, sample] : {std::pair{1u, 0u}, std::pair{0u, 1u}}) {
    hub->subscribeStatus = subscribe;
    hub->sampleStatus = sample;
    EXPECT_THAT(sweep(), ElementsAre(std::string(kTotal) + "-1", std::string(kFree) + "-1"));
  }
  hub->subscribeStatus = hub->sampleStatus = 0;
  EXPECT_EQ(sweep().back(), "scalar vellum.hwreport.c=7");
}

}  // namespace
}  // namespace tally
