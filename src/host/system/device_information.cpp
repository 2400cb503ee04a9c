#include "host/system/device_information.h"

#include <sha2.h>
#include <sys/statvfs.h>

#include <algorithm>
#include <cctype>
#include <iterator>

#include "host/system/os_release.h"

namespace tally {
namespace {

constexpr std::size_t kLargestTextFile = 1u << 20;
constexpr std::size_t kMachineIdDigits = 32;
// Keeps the identifier apart from those that other programs derive from the same machine id.
constexpr std::string_view kIdentifierPurpose = "vellum.tallyd.tallyrun InverseDeviceID ";

}  // namespace

std::string inverseDeviceID(std::string_view machineId) {
  if (machineId.ends_with('\n')) machineId.remove_suffix(1);
  if (machineId.size() != kMachineIdDigits ||
      !std::all_of(machineId.begin(), machineId.end(),
                   [](char c) { return std::isxdigit(static_cast<unsigned char>(c)) != 0; })) {
    return {};
  }
  const std::string text = std::string(kIdentifierPurpose) + std::string(machineId);
  char digits[SHA256_DIGEST_STRING_LENGTH];
  ::SHA256Data(reinterpret_cast<const std::uint8_t*>(text.data()), text.size(), digits);
  return std::string(digits, kMachineIdDigits);
}

Result<Directory> openDataVolume(const DeviceRoot& root) {
  for (const char* const path : {"/var/mobile", "/var"}) {
    auto directory = root.open(path);
    if (directory) return directory;
  }
  return root.open("/");
}

KvRef<KvObject> LinuxDeviceInformation::DeviceQuery(std::string_view question) {
  if (const auto* answers = description_->getAs<KvDictionary>(Described::DeviceAnswers)) {
    if (auto* answer = answers->get(question)) return KvRef<KvObject>::share(answer);
  }
  if (question == "DiskUsage") return diskUsage();
  if (question == "InternalBuild") return KvBoolean::of(false);
  if (question == "InverseDeviceID") return inverseDeviceID();
  return nullptr;
}

KvRef<KvObject> LinuxDeviceInformation::diskUsage() const {
  struct statvfs volume {};
  const auto directory = openDataVolume(root_);
  if (!directory || ::fstatvfs(directory->descriptor(), &volume) != 0) return nullptr;
  const auto bytes = [&volume](fsblkcnt_t blocks) {
    return KvNumber::int64(static_cast<std::int64_t>(blocks * volume.f_frsize));
  };
  return KvDictionary::create({{kDOQDiskUsageTotalDiskCapacity, bytes(volume.f_blocks)},
                               {kDOQDiskUsageTotalDataAvailable, bytes(volume.f_bavail)}});
}

KvRef<KvObject> LinuxDeviceInformation::inverseDeviceID() const {
  for (const DeviceRoot& root : {root_, DeviceRoot("/")}) {
    const auto text = root.readFile("/etc/machine-id", kLargestTextFile);
    const std::string identifier = text ? tally::inverseDeviceID(*text) : "";
    if (!identifier.empty()) return KvString::create(identifier);
  }
  return nullptr;
}

bool LinuxDeviceInformation::HasInternalDiagnostics(std::string_view) {
  const auto* described = description_->getAs<KvBoolean>(Described::HasInternalDiagnostics);
  return described != nullptr && described->value();
}

std::string LinuxDeviceInformation::SMAOSVersion() {
  if (const auto* described = description_->getAs<KvString>(Described::OSVersion)) {
    if (!described->view().empty()) return std::string(described->view());
    description_->reportEntry(Described::OSVersion, "is empty");
  }
  return osVersionText(*copySystemVersionDictionary());
}

KvRef<KvDictionary> LinuxDeviceInformation::copySystemVersionDictionary() {
  if (const auto* described = description_->getAs<KvDictionary>(Described::SystemVersion)) {
    return described->copy();
  }
  // A device root need not be a whole system: what it lacks is the host's.
  for (const DeviceRoot& root : {root_, DeviceRoot("/")}) {
    for (const char* const name : {"/etc/os-release", "/usr/lib/os-release"}) {
      const auto text = root.readFile(name, kLargestTextFile);
      if (text) return systemVersionFromOsRelease(*text);
    }
  }
  return KvDictionary::create();
}

}  // namespace tally
