#include "host/flash/nvme.h"

#include <algorithm>
#include <limits>

#include "base/byte_reader.h"
#include "base/nvme_health_file.h"

namespace tally {
namespace {

// Where the fields lie.
constexpr std::size_t kWarnings = 0, kKelvin = 1, kSpare = 3, kSpareThreshold = 4, kPercentUsed = 5;
constexpr std::size_t kUnitsRead = 32, kUnitsWritten = 48, kPowerOnHours = 128,
                      kUnsafeShutdowns = 144, kMediaErrors = 160;
constexpr std::uint64_t kUnitBytes = std::uint64_t{1000} * 512;
constexpr unsigned kAbove254 = 255;
constexpr std::uint64_t kLargest = std::numeric_limits<std::uint64_t>::max();

// Of 128 bits.
std::uint64_t counter(const ByteReader& page, std::size_t at) {
  const bool fits = page.read<std::uint64_t>(at + 8).value_or(0) == 0;
  return fits ? page.read<std::uint64_t>(at).value_or(0) : kLargest;
}

Figure<std::uint64_t> bytesOf(std::uint64_t units, std::string_view origin) {
  if (units == 0) return std::nullopt;  // not reported
  return {{units > kLargest / kUnitBytes ? kLargest : units * kUnitBytes, origin}};
}

bool isBlank(std::span<const std::byte> page) {
  return std::ranges::all_of(page, [&](std::byte byte) { return byte == page.front(); });
}

DeviceDirectory pages(const DeviceRoot& root) {
  return {root, "/" + std::string(kHealthPageFolder)};
}

}  // namespace

std::optional<Wear> parseHealthPage(std::span<const std::byte> bytes) {
  if (bytes.size() != kHealthPageSize || isBlank(bytes)) return std::nullopt;
  const ByteReader page(bytes);
  Wear wear;
  const unsigned used = page.read<std::uint8_t>(kPercentUsed).value_or(0);
  wear.used = {{{used, used == kAbove254 ? std::nullopt : std::optional(used)}, "percentage used"}};
  const unsigned spare = page.read<std::uint8_t>(kSpare).value_or(0);
  const unsigned warnings = page.read<std::uint8_t>(kWarnings).value_or(0);
  // Emulated disks leave out the spare and its threshold. A disk whose spare is used up warns of
  // it.
  constexpr unsigned kSpareWarning = 1;
  const bool hasSpare =
      spare > 0 || page.read<std::uint8_t>(kSpareThreshold) != 0 || (warnings & kSpareWarning) != 0;
  if (hasSpare && spare <= 100) wear.spare = {{{spare, spare}, "available spare"}};
  wear.warnings = {{warnings, "critical warning"}};
  constexpr int kFreezing = 273, kHottest = 1000;
  const int kelvin = page.read<std::uint16_t>(kKelvin).value_or(0);
  if (kelvin > 0 && kelvin < kHottest) {
    wear.temperature = {{kelvin - kFreezing, "composite temperature"}};
  }
  wear.hostBytesRead = bytesOf(counter(page, kUnitsRead), "data units read");
  wear.hostBytesWritten = bytesOf(counter(page, kUnitsWritten), "data units written");
  wear.powerOnHours = {{counter(page, kPowerOnHours), "power-on hours"}};
  wear.unsafeShutdowns = {{counter(page, kUnsafeShutdowns), "unsafe shutdowns"}};
  wear.mediaErrors = {{counter(page, kMediaErrors), "media errors"}};
  return wear;
}

std::string nvmeController(const SystemTree& tree, const std::string& name) {
  const std::string device = "/sys/block/" + name + "/device";
  // With several paths to a disk the namespace belongs to a subsystem, which lists its controllers.
  for (const std::string& entry : tree.list(device)) {
    if (isNvmeController(entry)) return entry;
  }
  const std::string controller = name.substr(0, name.find('n', 4));
  return isNvmeController(controller) ? controller : "";
}

bool hasHealthPage(const DeviceRoot& root, const std::string& controller) {
  return pages(root).identity(healthPageName(controller)).has_value();
}

HealthPage readHealthPage(const DeviceRoot& root, const std::string& controller) {
  const DeviceDirectory folder = pages(root);
  const auto identity = folder.identity(healthPageName(controller));
  const auto content = folder.readFile(healthPageName(controller), kHealthPageSize);
  if (!identity || !content) return {};
  return {parseHealthPage(std::as_bytes(std::span(*content))),
          identity->modifiedNanoseconds / 1'000'000'000};
}

std::string nvmeIdentity(const SystemTree& tree, const std::string& name) {
  return tree.text("/sys/block/" + name + "/device/serial").value_or("");
}

}  // namespace tally
