// Names of drivers, of this process, and those that are packed into ids.
#include "hwreport/channels/naming.h"

#include <string>

#include <fmt/core.h>

#include "base/process.h"
#include "hwreport/channels.h"
#include "hwreport/channels/keys.h"
#include "hwreport/channels/printf_hex.h"
#include "hwreport/channels/type_word.h"
#include "platform/platform.h"

namespace tally {

KvRef<KvString> nameOfID(std::uint64_t id) {
  char name[8];
  std::size_t length = 0;
  for (int shift = 56; shift >= 0; shift -= 8) {
    const auto byte = static_cast<std::uint8_t>(id >> shift);
    if (byte == 0) continue;
    if (byte < 0x20 || byte > 0x7E) return nullptr;
    name[length++] = static_cast<char>(byte);
  }
  return length != 0 ? KvString::create({name, length}) : nullptr;
}

KvRef<KvString> nameOfLegend(const KvArray* legend) {
  if (legend == nullptr) return nullptr;
  if (auto* const name = legend->getAs<KvString>(kLegendChannelName)) {
    return KvRef<KvString>::share(name);
  }
  const std::uint64_t id = bitsOf(legend->get(kLegendChannelID));
  return id != kHwReportInvalidValue ? nameOfID(id) : nullptr;
}

KvRef<KvString> HwReportCopyDriverName(HwRegistryEntry driver) {
  DeviceRegistry& registry = *platform().deviceRegistry;
  std::string name;
  std::uint64_t id = 0;
  if (registry.RegistryGetName(driver, &name) != 0) return nullptr;
  if (registry.RegistryGetEntryID(driver, &id) != 0) return nullptr;
  // The registry's name is a C string.
  return KvString::create(fmt::format("{} <id {}>", name.c_str(), printfHex(id)));
}

KvRef<KvString> HwReportCopyCurrentProcessName() {
  return KvString::create(fmt::format("{} <pid {}>", programName(), processID()));
}

KvRef<KvDictionary> HwReportCreateUnitInfo(std::uint64_t unit) {
  auto information = KvDictionary::create(1);
  information->set(keys().channelUnit, KvNumber::uint64(unit));
  return information;
}

}  // namespace tally
