#include "driver/telemetry_sweep.h"

#include <algorithm>
#include <array>
#include <cstdint>
#include <optional>
#include <string>

#include "base/byte_reader.h"
#include "hwreport/hwreport.h"
#include "platform/tables/swept_metrics.h"
#include "storage/auxiliary_metrics.h"
#include "storage/nand_info.h"
#include "storage/storage_log.h"

namespace tally {
namespace {

constexpr std::uint16_t kSweptCategories = 0x100;

constexpr std::size_t kEccRecordSize = 72;
constexpr std::size_t kEccCountOffset = 1, kEccRegistersOffset = 8;
constexpr std::size_t kEccRegisterSlots = (kEccRecordSize - kEccRegistersOffset) / 8;
constexpr std::uint32_t kEccRecordType = 172;
constexpr int kEccRecordsPerSweep = 10;
constexpr int kNoSuchValue = 2, kBusy = 16;  // nothing is pending

// The scalars that are set through it are one transaction of the store, which its end commits.
class StoreBatch {
 public:
  explicit StoreBatch(MetricsStore& store) : store_(store) { store_.beginBatch(); }
  ~StoreBatch() { store_.endBatch(); }
  StoreBatch(const StoreBatch&) = delete;
  StoreBatch& operator=(const StoreBatch&) = delete;

  void setScalar(std::string_view key, std::int64_t value) {
    store_.TBClientSetValueForScalarKey(key, value);
  }

 private:
  MetricsStore& store_;
};

// Bytes as whole MiB; -1 if the answer lacks the entry.
std::int64_t mebibytes(const KvDictionary* usage, std::string_view entry) {
  const auto bytes = usage != nullptr ? usage->getInt64(entry) : std::nullopt;
  return bytes ? *bytes >> 20 : -1;
}

void sweepDiskUsage(DeviceInformation& device, StoreBatch& batch) {
  const auto answer = device.DeviceQuery("DiskUsage");
  const auto* usage = kvCast<KvDictionary>(answer.get());
  batch.setScalar(kDiskCapacity.key, mebibytes(usage, kDOQDiskUsageTotalDiskCapacity));
  batch.setScalar(kDiskFree.key, mebibytes(usage, kDOQDiskUsageTotalDataAvailable));
}

void sweepStorage(SystemLog& log, StoreBatch& batch) {
  const auto info = CopyNANDInfoWithOptions(kNANDInfoAnalyticsOption);
  if (!info) {
    log.message(LogLevel::Default, "failed to get NAND info dict");
    return;
  }
  if (const auto freezer = CopyVMFreezerNANDInfo()) info->merge(*freezer);
  if (const KvObject* error = info->get(kNANDInfoErrorKey)) {
    log.message(LogLevel::Default, "error reading nand info, error {} with message {}",
                kvText(error), kvText(info->get(kNANDInfoErrorMessageKey)));
    return;
  }
  for (const auto& [key, value] : *info) {
    if (const auto* number = kvCast<KvNumber>(value.get())) {
      batch.setScalar(key->view(), number->asInt64());
    }
  }
}

void logEccRecord(CrashReporting& crashReporting, const ByteReader& record) {
  const std::uint8_t count = record.read<std::uint8_t>(kEccCountOffset).value_or(0);
  auto entry = KvDictionary::create(2 + kEccRegisterSlots);
  entry->set("id", KvNumber::int32(record.read<std::uint8_t>(0).value_or(0)));
  entry->set("count", KvNumber::int32(count));
  // The count may exceed the registers of the record.
  for (std::size_t i = 0; i < count; ++i) {
    const auto value = record.read<std::int64_t>(kEccRegistersOffset + 8 * i);
    if (!value) break;
    entry->set("reg" + std::to_string(i), KvNumber::int64(*value));
  }
  crashReporting.FDLogStructuredData(kEccRecordType, *entry);
}

void forwardEccEvents(Platform& platform) {
  std::array<std::byte, kEccRecordSize> buffer;
  // Not reset between reads: each passes the length of the last record to the kernel.
  std::size_t length = buffer.size();
  const auto readNext = [&] {
    const int error =
        platform.kernelValues->readKernelValue("kern.next_ecc_event", buffer, &length);
    length = std::min(length, buffer.size());
    return error;
  };
  int error = readNext();
  for (int logged = 0; error == 0 && logged < kEccRecordsPerSweep; ++logged) {
    logEccRecord(*platform.crashReporting, ByteReader({buffer.data(), length}));
    error = readNext();
  }
  if (error != 0 && error != kNoSuchValue && error != kBusy) {
    platform.log->message(LogLevel::Default, "Unexpected errno ({}) reading ECC events from kernel",
                          error);
  }
}

bool isSimple(const KvDictionary* channel) {
  return HwReportChannelGetFormat(channel) == kHwReportFormatSimple;
}

int recordChannel(StoreBatch& batch, KvDictionary* channel) {
  if (!isSimple(channel)) return HwIterContinue;
  const KvString* name = HwReportChannelGetChannelName(channel);
  if (name != nullptr) {
    batch.setScalar(std::string("vellum.hwreport.").append(name->view()),
                    HwReportSimpleGetIntegerValue(channel));
  }
  return HwIterContinue;
}

void sweepChannels(DailyCounters& counters, StoreBatch& batch) {
  const auto channels = HwReportCopyChannelsInCategories(kSweptCategories, kHwReportByDriver);
  if (!channels) return;
  HwReportPrune(channels.get(), [](KvDictionary* channel) {
    return isSimple(channel) ? HwIterContinue : HwIterDrop;
  });
  KvRef<KvDictionary> subscribed;
  const auto subscription = HwReportCreateSubscription(nullptr, channels.get(), &subscribed, 0);
  if (!subscription) return;
  const auto samples = HwReportCreateSamples(subscription.get(), subscribed.get());
  if (samples) {
    HwReportIterate(samples.get(),
                    [&batch](KvDictionary* channel) { return recordChannel(batch, channel); });
    counters.commitSweep();
  }
}

void recordWear(Platform& platform) {
  MetricsStore& store = *platform.metricsStore;
  for (const FlashDisk& disk : platform.flashDisks->disks()) {
    if (disk.isRemovable || disk.identity.empty() || !disk.wear) continue;
    const auto row = wearRowOf(*disk.wear, store.TBDaysSince1970());
    if (row && addsToHistory(store.wearHistory(disk.identity), *row)) {
      store.addWear(disk.identity, *row);
    }
  }
}

}  // namespace

void runTelemetrySweep(Platform& platform) {
  StoreBatch batch(*platform.metricsStore);
  sweepDiskUsage(*platform.deviceInformation, batch);
  DumpStorageStructuredLog(*KvBoolean::of(false));
  sweepStorage(*platform.log, batch);
  forwardEccEvents(platform);
  sweepChannels(*platform.dailyCounters, batch);
  recordWear(platform);
}

}  // namespace tally
