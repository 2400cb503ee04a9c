// Kernel values: those of the device description, else those that Linux has.
#pragma once

#include <array>
#include <cstdint>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "host/described/device_description.h"
#include "host/tree/system_tree.h"
#include "platform/kernel_values.h"

namespace tally {

// The record of "vm.swapusage".
struct SwapUsage {
  std::uint64_t totalBytes = 0, availableBytes = 0, usedBytes = 0;
  std::uint32_t pageSize = 0, encrypted = 0;
};
static_assert(sizeof(SwapUsage) == 32);

// From the text of /proc/meminfo; empty unless it tells both the total and the free space.
std::optional<SwapUsage> parseSwapUsage(std::string_view meminfo, std::uint32_t pageSize);

// From the text of /proc/uptime: in nanoseconds.
std::optional<std::uint64_t> parseUptime(std::string_view uptime);

// From the text of the kernel's boot id: the same in upper case; empty when there is none.
std::optional<std::string> parseBootSession(std::string_view bootId);

class LinuxKernelValues final : public KernelValues {
 public:
  LinuxKernelValues(std::shared_ptr<DeviceDescription> description,
                    std::shared_ptr<const SystemTree> tree)
      : description_(std::move(description)), tree_(std::move(tree)) {}
  int readKernelValue(std::string_view name, std::span<std::byte> buffer,
                      std::size_t* length) override;
  bool hasKernelValue(std::string_view name) override;
  std::uint64_t MonotonicTicks() override;
  std::optional<Timebase> TimebaseInfo() override;

 private:
  struct Answer {
    int error = 0;
    std::vector<std::byte> bytes;
  };
  std::optional<Answer> described(std::string_view name);
  std::optional<Answer> convert(std::string_view name, const KvObject& value);

  std::shared_ptr<DeviceDescription> description_;
  std::shared_ptr<const SystemTree> tree_;
  std::mutex taking_;
  std::map<std::string, std::size_t, std::less<>> taken_;  // items of described arrays
};

}  // namespace tally
