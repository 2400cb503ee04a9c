#include "host/flash/flash_source.h"

#include <algorithm>
#include <cstring>
#include <optional>

#include "host/flash/wear_statistics.h"
#include "platform/protocol/fetch_request.h"

namespace tally {
namespace {

struct FlashEntry final : RegistryEntry {
  Disk disk;
};

RegistryResult copyOut(std::span<const std::byte> bytes, MethodCall& call) {
  call.structOutputSize = std::min(bytes.size(), call.structOutput.size());
  if (call.structOutputSize > 0) {
    std::memcpy(call.structOutput.data(), bytes.data(), call.structOutputSize);
  }
  return kRegistrySuccess;
}

class FlashDriver final : public UserClient {
 public:
  FlashDriver(const DiskReader& reader, Disk disk) : reader_(reader), disk_(std::move(disk)) {}

  RegistryResult call(std::uint32_t method, MethodCall& call) override {
    if (method != kStorageFetchMethod) return kRegistryUnsupported;
    const auto request = decodeFetchRequest(call.structInput);
    if (!request) return kRegistryBadArgument;
    switch (request->selector) {
      case kSelectStatistics:
        break;
      case kSelectValidityList:
      case kSelectDefectsList:
      case kSelectTelemetryList:
        return answer({}, *request, call);  // Linux keeps no such lists
      default:
        return kRegistryUnsupported;
    }
    // The size and the data are those of one reading.
    if (!statistics_ || (request->flags & FetchRequest::kSizeQueryFlag) != 0) {
      const auto wear = reader_.wear(disk_);
      const bool isFresh = wear && wear->ageSeconds.value_or(0) <= maximumAge();
      statistics_ = isFresh ? statisticsBuffer(disk_.kind, *wear) : std::vector<std::byte>();
    }
    return statistics_->empty() ? kRegistryNotFound : answer(*statistics_, *request, call);
  }

 private:
  // The registers of an eMMC are as old as the boot, and still the latest there are.
  std::int64_t maximumAge() const {
    return disk_.kind == DiskKind::Emmc ? INT64_MAX : kFreshSeconds;
  }
  static RegistryResult answer(std::span<const std::byte> bytes, const FetchRequest& request,
                               MethodCall& call) {
    if ((request.flags & FetchRequest::kSizeQueryFlag) == 0) return copyOut(bytes, call);
    const auto size = static_cast<std::uint32_t>(bytes.size());
    return copyOut(std::as_bytes(std::span(&size, 1)), call);
  }

  DiskReader reader_;
  Disk disk_;
  std::optional<std::vector<std::byte>> statistics_;
};

}  // namespace

std::shared_ptr<const RegistrySource::Entries> FlashSource::entries() {
  // Every search of any class asks. The disk of a device stays; that there is none may change.
  constexpr std::chrono::seconds kPause{10};
  const auto now = std::chrono::steady_clock::now();
  if (!found_ && now >= lookAgain_) {
    found_ = find();
    lookAgain_ = now + kPause;
  }
  return found_ ? found_ : none_;
}

std::shared_ptr<const RegistrySource::Entries> FlashSource::find() const {
  const auto disks = reader_.disks();
  const std::string name = name_.empty() ? reader_.deviceDisk(disks) : name_;
  const auto disk = std::ranges::find(disks, name, &Disk::name);
  if (disk == disks.end() || !reader_.mayTellWear(*disk)) return nullptr;
  auto entry = std::make_shared<FlashEntry>();
  entry->className = kStorageDriverClass;
  entry->name = disk->name;
  entry->id = kFlashEntryID;
  entry->properties = KvDictionary::create();
  // What decodes a driver's lists looks for it.
  entry->properties->set(kStorageCharacteristicsProperty, KvDictionary::create());
  entry->disk = *disk;
  return std::make_shared<Entries>(Entries{std::move(entry)});
}

std::unique_ptr<UserClient> FlashSource::open(const RegistryEntry& entry, std::uint32_t type,
                                              RegistryResult* result) {
  *result = type == 0 ? kRegistrySuccess : kRegistryUnsupported;
  if (type != 0) return nullptr;
  return std::make_unique<FlashDriver>(reader_, static_cast<const FlashEntry&>(entry).disk);
}

}  // namespace tally
