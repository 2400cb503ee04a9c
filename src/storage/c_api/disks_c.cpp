// The disks of a device, and their figures, for C.
#include "storage/storage_c.h"

#include <algorithm>

#include "base/utf8.h"
#include "storage/auxiliary/health.h"
#include "storage/c_api/handles.h"
#include "storage/exporter.h"
#include "storage/nand_info.h"

namespace tally {
namespace {

static_assert(TALLYSTORAGE_BAD_ARGUMENT == kCBadArgument && TALLYSTORAGE_NO_MEMORY == kCNoMemory &&
              TALLYSTORAGE_NOT_FOUND == kCNotFound && TALLYSTORAGE_NO_VALUE == kCNoValue &&
              TALLYSTORAGE_FAILED == kCFailed);

// Numbers and strings stay; a boolean becomes a number, anything else its text.
KvRef<KvObject> plainValue(const KvRef<KvObject>& value) {
  if (const auto* const boolean = kvCast<KvBoolean>(value.get())) {
    return KvNumber::int32(boolean->value() ? 1 : 0);
  }
  const bool isPlain = value->type() == KvType::Number || value->type() == KvType::String;
  return isPlain ? value : KvRef<KvObject>(KvString::create(kvText(value.get())));
}

int storeValues(const KvDictionary& dictionary, tallystorage_values** values) {
  auto made = std::make_unique<tallystorage_values>();
  made->list.reserve(dictionary.size());
  for (const auto& entry : dictionary) made->list.push_back({entry.key, plainValue(entry.value)});
  *values = made.release();
  return kCOk;
}

bool hasExporter() {
  const NandExporter* exporter = nullptr;
  const RegistryHandle service = findNandExporter(&exporter);
  if (service != 0) platform().deviceRegistry->HandleRelease(service);
  return service != 0;
}

// The figures of the disk that the device in force has as its storage.
KvRef<KvDictionary> fetchedInfo(int* code) {
  *code = kCOk;
  if (!hasExporter()) {
    *code = cFailure(kCNotFound, "no driver exports figures of the flash storage");
    return nullptr;
  }
  auto info = CopyNANDInfo();
  if (!info->contains(kNANDInfoErrorKey)) return info;
  *code = cFailure(kCFailed, kvText(info->get(kNANDInfoErrorMessageKey)));
  return nullptr;
}

// The summary without what the driver does not export: a spare of 0 would be alarming.
KvRef<KvDictionary> knownHealth(const KvRef<KvDictionary>& info) {
  auto health = healthOfNandInfo(*info);
  health->removeIf([&](const KvDictionary::Entry& entry) {
    const std::string_view key = entry.key->view();
    if (key == kNANDInfoErrorKey || info->contains(key)) return false;
    return std::ranges::none_of(countersOfHealthFigure(key),
                                [&](std::string_view counter) { return info->contains(counter); });
  });
  return health;
}

// Fetches the figures of a disk, or of the device, and stores what make makes of them.
template <class Make>
int fetchFigures(tallystorage_device* device, const char* disk, tallystorage_values** values,
                 Make make) {
  return cCall([&] {
    if (!cClear(values)) return cBadArgument("the values' output is NULL");
    if (cHandle(device) == nullptr) return cBadArgument("not a device");
    if (disk != nullptr && !isValidUtf8(disk)) return cBadArgument("the disk's name is not UTF-8");
    Platform services = *device->services;
    if (disk != nullptr) services.deviceRegistry = services.flashDisks->registryOf(disk);
    if (!services.deviceRegistry) {
      return cFailure(kCNotFound, "no disk of that name says how worn it is");
    }
    const ThreadPlatformScope scope(services);
    int code = kCOk;
    const auto info = fetchedInfo(&code);
    return info ? storeValues(*make(info), values) : code;
  });
}

const FlashDisk* diskOfList(const tallystorage_disks* disks, std::size_t index) noexcept {
  if (cHandle(disks) == nullptr) {
    cBadArgument("not a list of disks");
    return nullptr;
  }
  if (index < disks->list.size()) return &disks->list[index];
  cBadArgument("there is no disk of that index");
  return nullptr;
}

}  // namespace
}  // namespace tally

using namespace tally;

const char* tallystorage_error_text(void) { return cErrorText.data(); }

void tallystorage_close(tallystorage_device* device) { cRelease(device); }
void tallystorage_free_disks(tallystorage_disks* disks) { cRelease(disks); }
void tallystorage_free_values(tallystorage_values* values) { cRelease(values); }

int tallystorage_list_disks(tallystorage_device* device, tallystorage_disks** disks) {
  return cCall([&] {
    if (!cClear(disks)) return cBadArgument("the disks' output is NULL");
    if (cHandle(device) == nullptr) return cBadArgument("not a device");
    const ThreadPlatformScope scope(*device->services);
    *disks = new tallystorage_disks{{}, device->services->flashDisks->disks()};
    return kCOk;
  });
}

size_t tallystorage_disk_count(const tallystorage_disks* disks) {
  return cHandle(disks) != nullptr ? disks->list.size() : 0;
}

int tallystorage_disk_name(const tallystorage_disks* disks, size_t index, const char** name) {
  if (!cClear(name, "")) return cBadArgument("the name's output is NULL");
  const FlashDisk* const disk = diskOfList(disks, index);
  if (disk == nullptr) return kCBadArgument;
  *name = disk->name.c_str();
  return kCOk;
}

int tallystorage_disk_kind(const tallystorage_disks* disks, size_t index, const char** kind) {
  if (!cClear(kind, "")) return cBadArgument("the kind's output is NULL");
  const FlashDisk* const disk = diskOfList(disks, index);
  if (disk == nullptr) return kCBadArgument;
  *kind = diskKindName(disk->kind).data();  // a literal
  return kCOk;
}

int tallystorage_disk_flags(const tallystorage_disks* disks, size_t index, uint32_t* flags) {
  if (!cClear(flags)) return cBadArgument("the flags' output is NULL");
  const FlashDisk* const disk = diskOfList(disks, index);
  if (disk == nullptr) return kCBadArgument;
  if (disk->isStorage) *flags |= TALLYSTORAGE_DISK_IS_STORAGE;
  if (disk->isRemovable) *flags |= TALLYSTORAGE_DISK_IS_REMOVABLE;
  if (disk->wear && disk->wear->isKnown()) *flags |= TALLYSTORAGE_DISK_HAS_FIGURES;
  return kCOk;
}

int tallystorage_nand_info(tallystorage_device* device, const char* disk,
                           tallystorage_values** values) {
  return fetchFigures(device, disk, values, [](const KvRef<KvDictionary>& info) { return info; });
}

int tallystorage_nand_health(tallystorage_device* device, const char* disk,
                             tallystorage_values** values) {
  return fetchFigures(device, disk, values, knownHealth);
}
