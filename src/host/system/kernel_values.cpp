#include "host/system/kernel_values.h"

#include <time.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

#include "base/number_text.h"
#include "base/text_lines.h"
#include "platform/tables/measured_metrics.h"

namespace tally {
namespace {

constexpr std::size_t kLargestMeminfo = 64u << 10;

constexpr std::size_t widthOf(std::string_view name) {
  constexpr std::size_t kCounterWidth = 8;
  const auto* const known = std::ranges::find(kMeasuredMetrics, name, &MeasuredMetric::kernelValue);
  return known == std::end(kMeasuredMetrics) ? kCounterWidth : known->width;
}
static_assert(widthOf("vm.swapusage") == sizeof(SwapUsage));

template <class T>
std::vector<std::byte> bytesOf(const T& value) {
  std::vector<std::byte> bytes(sizeof value);
  std::memcpy(bytes.data(), &value, sizeof value);
  return bytes;
}

// The number in the value's width (a record's first field is its number); empty when a 4-byte value
// cannot hold it or it is not a whole number.
std::optional<std::vector<std::byte>> numberBytes(const KvNumber& number, std::size_t width) {
  if (number.isReal()) return std::nullopt;
  auto bytes = bytesOf(number.asUInt64());
  if (width == 4) {
    const std::int64_t value = number.asInt64();
    const bool huge = number.isUnsigned() && value < 0;
    if (huge || value < INT32_MIN || value > std::int64_t{UINT32_MAX}) return std::nullopt;
  }
  bytes.resize(width);
  return bytes;
}

std::optional<std::uint64_t> meminfoBytes(std::string_view meminfo, std::string_view label) {
  constexpr std::string_view kUnit = " kB";
  std::optional<std::uint64_t> bytes;
  eachLine(meminfo, [&](std::string_view line) {
    if (!line.starts_with(label) || !line.ends_with(kUnit)) return;
    line.remove_suffix(kUnit.size());
    const auto kibibytes = parseInt64(trimmed(line.substr(label.size())));
    if (!kibibytes || *kibibytes < 0 || *kibibytes > INT64_MAX / 1024) return;
    bytes = static_cast<std::uint64_t>(*kibibytes) * 1024;
  });
  return bytes;
}

}  // namespace

std::optional<SwapUsage> parseSwapUsage(std::string_view meminfo, std::uint32_t pageSize) {
  const auto total = meminfoBytes(meminfo, "SwapTotal:");
  const auto available = meminfoBytes(meminfo, "SwapFree:");
  if (!total || !available || *available > *total) return std::nullopt;
  return SwapUsage{*total, *available, *total - *available, pageSize, 0};
}

std::optional<std::uint64_t> parseUptime(std::string_view uptime) {
  // "123.45 456.78": seconds, of which the second figure counts the idle ones of all processors.
  constexpr std::uint64_t kHundredth = 10'000'000, kMostHundredths = UINT64_MAX / kHundredth;
  std::uint64_t hundredths = 0;
  int decimals = -1;
  for (const char letter : uptime.substr(0, uptime.find(' '))) {
    if (letter == '.' && decimals < 0) {
      decimals = 0;
      continue;
    }
    if (letter < '0' || letter > '9' || hundredths > kMostHundredths / 10 - 1) return std::nullopt;
    hundredths = hundredths * 10 + static_cast<std::uint64_t>(letter - '0');
    if (decimals >= 0) ++decimals;
  }
  return decimals == 2 ? std::optional(hundredths * kHundredth) : std::nullopt;
}

std::optional<std::string> parseBootSession(std::string_view bootId) {
  std::string session(trimmed(bootId.substr(0, bootId.find('\n'))));
  if (session.empty()) return std::nullopt;
  for (char& letter : session) {
    if (letter >= 'a' && letter <= 'z') letter = static_cast<char>(letter - 'a' + 'A');
  }
  return session;
}

int LinuxKernelValues::readKernelValue(std::string_view name, std::span<std::byte> buffer,
                                       std::size_t* length) {
  const std::size_t room = std::min(buffer.size(), *length);
  auto answer = described(name);
  if (!answer && name == "vm.swapusage") {
    const auto meminfo = tree_->fact("/proc/meminfo", kLargestMeminfo);
    const auto pageSize = static_cast<std::uint32_t>(::sysconf(_SC_PAGESIZE));
    if (const auto usage = meminfo ? parseSwapUsage(*meminfo, pageSize) : std::nullopt) {
      answer = Answer{0, bytesOf(*usage)};
    }
  }
  // A boot session's days are shared out between the analytics service and the daily report. There
  // is such a service only where it is described; otherwise every day is the report's.
  if (!answer && name == "kern.bootsessionuuid" && description_->exists()) {
    const auto text = tree_->fact("/proc/sys/kernel/random/boot_id");
    if (const auto session = text ? parseBootSession(*text) : std::nullopt) {
      const auto bytes = std::as_bytes(std::span(*session));
      answer = Answer{0, {bytes.begin(), bytes.end()}};
    }
  }
  if (!answer) return ENOENT;
  if (answer->error != 0) return answer->error;
  if (answer->bytes.size() > room) return ENOMEM;
  std::copy(answer->bytes.begin(), answer->bytes.end(), buffer.begin());
  *length = answer->bytes.size();
  return 0;
}

// A described device is of a kind that may have any of them.
bool LinuxKernelValues::hasKernelValue(std::string_view name) {
  constexpr std::string_view kOfLinux[] = {"vm.swapusage", "kern.bootsessionuuid"};
  return description_->exists() || std::ranges::find(kOfLinux, name) != std::end(kOfLinux);
}

// The answer that the description gives; empty when it gives none.
std::optional<LinuxKernelValues::Answer> LinuxKernelValues::described(std::string_view name) {
  const auto* values = description_->getAs<KvDictionary>(Described::KernelValues);
  const KvObject* value = values != nullptr ? values->get(name) : nullptr;
  if (value == nullptr) return std::nullopt;
  const auto* successive = kvCast<KvArray>(value);
  if (successive == nullptr) return convert(name, *value);
  const std::lock_guard lock(taking_);
  std::size_t& taken = taken_[std::string(name)];
  if (taken >= successive->size()) return Answer{ENOENT, {}};
  return convert(name, *successive->get(taken++));
}

std::optional<LinuxKernelValues::Answer> LinuxKernelValues::convert(std::string_view name,
                                                                    const KvObject& value) {
  if (const auto* number = kvCast<KvNumber>(&value)) {
    if (auto bytes = numberBytes(*number, widthOf(name))) return Answer{0, *std::move(bytes)};
  } else if (const auto* data = kvCast<KvData>(&value)) {
    return Answer{0, {data->bytes().begin(), data->bytes().end()}};
  } else if (const auto* failure = kvCast<KvDictionary>(&value)) {
    const auto code = failure->getInt64("Error");
    if (code && *code > 0 && *code < INT32_MAX) return Answer{static_cast<int>(*code), {}};
  }
  description_->reportEntry("KernelValues " + std::string(name),
                            "is neither a number of the value's width, nor data, nor an error");
  return std::nullopt;
}

std::uint64_t LinuxKernelValues::MonotonicTicks() {
  if (const auto* ticks = description_->getAs<KvNumber>(Described::MonotonicTicks))
    return ticks->asUInt64();
  if (tree_->isRecording()) {
    return parseUptime(tree_->text("/proc/uptime").value_or("")).value_or(0);
  }
  timespec now{};
  ::clock_gettime(CLOCK_MONOTONIC, &now);
  return static_cast<std::uint64_t>(now.tv_sec) * 1'000'000'000 +
         static_cast<std::uint64_t>(now.tv_nsec);
}

std::optional<Timebase> LinuxKernelValues::TimebaseInfo() {
  const auto* described = description_->getAs<KvDictionary>(Described::Timebase);
  if (described == nullptr) return Timebase{1, 1};  // ticks are nanoseconds
  const auto* numerator = described->getAs<KvNumber>("Numerator");
  const auto* denominator = described->getAs<KvNumber>("Denominator");
  if (numerator == nullptr || denominator == nullptr) return std::nullopt;
  return Timebase{numerator->asUInt32(), denominator->asUInt32()};
}

}  // namespace tally
