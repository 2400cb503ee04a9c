#include "host/system/machine/linux_self.h"

#include <sys/resource.h>
#include <time.h>

#include <string_view>

#include "base/files/device_root.h"
#include "base/number_text.h"
#include "base/text_lines.h"
#include "host/system/machine/machine.h"

namespace tally {
namespace {

constexpr std::size_t kLargestFile = 64 << 10;
constexpr std::int64_t kMilliseconds = 1000;

std::optional<std::int64_t> millisecondsOf(clockid_t clock) {
  timespec now{};
  if (::clock_gettime(clock, &now) != 0) return std::nullopt;
  constexpr std::int64_t kNanoseconds = 1'000'000;
  return std::int64_t{now.tv_sec} * kMilliseconds + now.tv_nsec / kNanoseconds;
}

// The number after a name in a file of lines such as "VmHWM:	 5120 kB".
std::optional<std::int64_t> numberIn(const char* path, std::string_view name) {
  const auto text = DeviceRoot("").readFile(path, kLargestFile);
  std::optional<std::int64_t> number;
  if (!text) return number;
  eachLine(*text, [&](std::string_view line) {
    if (!line.starts_with(name)) return;
    line.remove_prefix(name.size());
    line.remove_prefix(std::min(line.find_first_not_of(" \t"), line.size()));
    number = parseInt64(line.substr(0, line.find(' ')));
  });
  return number;
}

}  // namespace

std::optional<ClockReading> LinuxSelf::clocks() {
  // Whoever was interrupted between two clocks would see a step: then they are read again.
  constexpr std::int64_t kApart = 10;
  constexpr int kAttempts = 100;
  for (int attempt = 0; attempt < kAttempts; ++attempt) {
    const auto before = millisecondsOf(CLOCK_BOOTTIME), awake = millisecondsOf(CLOCK_MONOTONIC),
               wall = millisecondsOf(CLOCK_REALTIME), after = millisecondsOf(CLOCK_BOOTTIME);
    if (!before || !awake || !wall || !after) break;
    if (*after - *before > kApart) continue;
    return ClockReading{bootId(), *before, *awake, *wall, kernelSynchronisation()};
  }
  return std::nullopt;
}

RunCost LinuxSelf::cost() {
  RunCost cost;
  rusage usage{};
  if (::getrusage(RUSAGE_SELF, &usage) == 0) {
    const auto milliseconds = [](const timeval& time) {
      return std::int64_t{time.tv_sec} * kMilliseconds + time.tv_usec / kMilliseconds;
    };
    cost.cpuMilliseconds = milliseconds(usage.ru_utime) + milliseconds(usage.ru_stime);
  }
  // Not ru_maxrss, which begins with that of the process that started this one.
  cost.peakKibibytes = numberIn("/proc/self/status", "VmHWM:");
  cost.bytesWritten = numberIn("/proc/self/io", "write_bytes:");
  return cost;
}

}  // namespace tally
