// What the channel library costs per channel, and how that grows with their number.
//
// Every size handles 100,000 channels in all: 100 devices of 1,000 channels, 10 of 10,000, one of
// 100,000, each operation on all devices in turn. So no size has its channels in the cache, and
// what grows is the library's own doing. A column beside shows one device of 1,000 again and again.
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "figures.h"
#include "hwreport/hwreport.h"
#include "hwreport/naive_samples.h"
#include "hwreport/world.h"
#include "platform/platform.h"

namespace {

using namespace tally;

constexpr std::size_t kChannels = 100'000;
constexpr std::size_t kSizes[] = {1'000, 10'000, 100'000};
constexpr int kRuns = 15;
constexpr int kHotRuns = 400;
constexpr std::size_t kNaiveSize = 1'000;

volatile std::int64_t sink = 0;  // so that nothing read is optimised away

// Processor time, so that what else the machine does counts less.
double nowNanoseconds() {
  timespec time{};
  clock_gettime(CLOCK_THREAD_CPUTIME_ID, &time);
  return static_cast<double>(time.tv_sec) * 1e9 + static_cast<double>(time.tv_nsec);
}

double median(std::vector<double> values) {
  const auto middle = values.begin() + static_cast<long>(values.size() / 2);
  std::nth_element(values.begin(), middle, values.end());
  return *middle;
}

double residentBytes() {
  unsigned long total = 0, resident = 0;
  if (std::FILE* file = std::fopen("/proc/self/statm", "r")) {
    if (std::fscanf(file, "%lu %lu", &total, &resident) != 2) resident = 0;
    std::fclose(file);
  }
  return static_cast<double>(resident) * static_cast<double>(::sysconf(_SC_PAGESIZE));
}

struct Device {
  explicit Device(std::size_t channels)
      : world(std::make_shared<bench::ChannelWorld>(channels)), copy(world->region().size()) {}
  std::shared_ptr<bench::ChannelWorld> world;
  KvRef<KvDictionary> all, subscribed, earlier, later;
  KvRef<HwReportSubscription> subscription;
  std::vector<std::byte> copy;
};
using Devices = std::vector<std::unique_ptr<Device>>;

Platform platformOf(const Device& device) {
  Platform services;
  services.deviceRegistry = device.world;
  return services;
}

bool readEach(KvDictionary* samples) {
  std::int64_t sum = 0;
  const int result = HwReportIterate(samples, [&](KvDictionary* channel) {
    switch (HwReportChannelGetFormat(channel)) {
      case kHwReportFormatSimple:
        sum += HwReportSimpleGetIntegerValue(channel);
        break;
      case kHwReportFormatState:
        sum += static_cast<std::int64_t>(HwReportStateGetResidency(channel, 1));
        break;
      case kHwReportFormatHistogram:
        sum += static_cast<std::int64_t>(HwReportHistogramGetBucketHits(channel, 1));
        break;
      default:
        sum += HwReportArrayGetValueAtIndex(channel, 5);
    }
    return HwIterContinue;
  });
  sink = sum;
  return result == 0;
}

KvRef<KvDictionary> subscribe(Device& device) {
  KvRef<KvDictionary> subscribed;
  HwReportCreateSubscription(nullptr, device.all.get(), &subscribed, 0);
  return subscribed;
}

KvRef<KvDictionary> sample(Device& device) {
  return HwReportCreateSamples(device.subscription.get(), device.subscribed.get());
}

// What is measured; the result is freed outside the time, and null is a failure.
struct Operation {
  const char* name;
  KvRef<KvDictionary> (*run)(Device& device);
};
const Operation kOperations[] = {
    {"list from the legends", [](Device&) { return HwReportCopyAllChannels(0); }},
    {"filter by category", [](Device&) { return HwReportCopyChannelsInCategories(0x100, 0); }},
    {"subscribe", subscribe},
    {"sample", sample},
    {"delta",
     [](Device& device) {
       return HwReportCreateSamplesDelta(device.earlier.get(), device.later.get());
     }},
    {"iterate and read",
     [](Device& device) { return readEach(device.later.get()) ? device.later : nullptr; }},
    {"memcpy of the region",
     [](Device& device) {
       std::memcpy(device.copy.data(), device.world->region().data(), device.copy.size());
       sink = std::to_integer<std::int64_t>(device.copy[device.copy.size() / 2]);
       return device.all;
     }},
};

// Nanoseconds for one device.
double timeOf(const Operation& operation, Device& device) {
  const PlatformScope scope(platformOf(device));
  const double start = nowNanoseconds();
  const auto result = operation.run(device);
  const double time = nowNanoseconds() - start;
  if (!result) std::abort();
  return time;
}

double perChannel(const Operation& operation, const Devices& devices) {
  std::vector<double> times;
  for (int i = 0; i < kRuns; ++i) {
    double sum = 0;
    for (const auto& device : devices) sum += timeOf(operation, *device);
    times.push_back(sum / static_cast<double>(kChannels));
  }
  return median(std::move(times));
}

double perChannelHot(const Operation& operation, Device& device, std::size_t channels) {
  std::vector<double> times;
  times.reserve(kHotRuns);
  for (int i = 0; i < kHotRuns; ++i) {
    times.push_back(timeOf(operation, device) / static_cast<double>(channels));
  }
  return median(std::move(times));
}

// Devices whose channels are subscribed to and sampled.
struct Memory {
  double sampled = 0;      // bytes of a channel
  double read = 0;         // after its values were read
  double firstSample = 0;  // nanoseconds of a channel, subscribed and sampled for the first time
};
Devices makeDevices(std::size_t channels, Memory* memory) {
  Devices devices;
  for (std::size_t i = 0; i < kChannels / channels; ++i) {
    devices.push_back(std::make_unique<Device>(channels));
    const PlatformScope scope(platformOf(*devices.back()));
    devices.back()->all = HwReportCopyAllChannels(0);
  }
  const double before = residentBytes(), start = nowNanoseconds();
  for (const auto& device : devices) {
    const PlatformScope scope(platformOf(*device));
    device->subscription =
        HwReportCreateSubscription(nullptr, device->all.get(), &device->subscribed, 0);
    device->later = sample(*device);
  }
  memory->firstSample = (nowNanoseconds() - start) / static_cast<double>(kChannels);
  memory->sampled = (residentBytes() - before) / static_cast<double>(kChannels);
  for (const auto& device : devices) readEach(device->later.get());
  memory->read = (residentBytes() - before) / static_cast<double>(kChannels);
  for (const auto& device : devices) {
    const PlatformScope scope(platformOf(*device));
    device->earlier = sample(*device);
    device->later = sample(*device);
  }
  return devices;
}

// In a process of its own, in which no memory was freed before that could be used again.
Memory memoryOf(std::size_t channels) {
  int ends[2];
  if (::pipe(ends) != 0) std::abort();
  const pid_t child = ::fork();
  if (child == 0) {
    Memory measured;
    makeDevices(channels, &measured);
    ::_exit(::write(ends[1], &measured, sizeof(measured)) == sizeof(measured) ? 0 : 1);
  }
  ::close(ends[1]);
  Memory measured;
  if (::read(ends[0], &measured, sizeof(measured)) != sizeof(measured)) std::abort();
  ::close(ends[0]);
  ::waitpid(child, nullptr, 0);
  return measured;
}

// The scan for every channel from the start, beside the library's; false when they differ.
bool compareWithNaive() {
  Device device(kNaiveSize);
  const PlatformScope scope(platformOf(device));
  device.all = HwReportCopyAllChannels(0);
  static KvRef<KvData> raw;
  raw = KvData::create(device.world->region());
  const Operation fast = {
      "", [](Device& one) { return HwReportCreateSamplesRaw(one.all.get(), raw.get()); }};
  const Operation slow = {"",
                          [](Device& one) { return naive::createSamples(*one.all, raw->bytes()); }};
  const double fastTime = perChannelHot(fast, device, kNaiveSize);
  const double slowTime = perChannelHot(slow, device, kNaiveSize);
  const bool equal = kvEqual(fast.run(device).get(), slow.run(device).get());
  std::printf("a scan for every channel, %zu channels: %.0f ns a channel, %.1f times; answers %s\n",
              kNaiveSize, slowTime, slowTime / fastTime, equal ? "equal" : "DIFFER");
  return equal;
}

}  // namespace

int main() {
  constexpr std::size_t kCount = std::size(kOperations);
  double times[std::size(kSizes)][kCount], hot[kCount];
  Memory memory[std::size(kSizes)];
  for (std::size_t size = 0; size < std::size(kSizes); ++size)
    memory[size] = memoryOf(kSizes[size]);
  for (std::size_t size = 0; size < std::size(kSizes); ++size) {
    Memory unused;
    const Devices devices = makeDevices(kSizes[size], &unused);
    for (std::size_t i = 0; i < kCount; ++i) {
      times[size][i] = perChannel(kOperations[i], devices);
      if (size == 0) hot[i] = perChannelHot(kOperations[i], *devices[0], kSizes[0]);
    }
  }
  std::printf("%-22s %9s %9s %9s %7s %9s %11s\n", "ns a channel", "1,000", "10,000", "100,000",
              "growth", "x memcpy", "1,000 again");
  for (std::size_t i = 0; i < kCount; ++i) {
    std::printf("%-22s %9.1f %9.1f %9.1f %7.2f %9.1f %11.1f\n", kOperations[i].name, times[0][i],
                times[1][i], times[2][i], times[2][i] / times[0][i],
                times[2][i] / times[2][kCount - 1], hot[i]);
  }
  std::printf("subscribed, and sampled for the first time: %.0f %.0f %.0f ns\n",
              memory[0].firstSample, memory[1].firstSample, memory[2].firstSample);
  std::printf("memory of a subscribed and sampled channel: %.0f %.0f %.0f bytes\n",
              memory[0].sampled, memory[1].sampled, memory[2].sampled);
  std::printf("the same, after its values were read: %.0f %.0f %.0f bytes\n", memory[0].read,
              memory[1].read, memory[2].read);
  for (std::size_t i = 0; i + 1 < kCount; ++i) {
    const std::string name = std::string("channels: ") + kOperations[i].name;
    bench::addFigure((name + ", 100,000 channels").c_str(), times[2][i], "ns a channel",
                     "1,000 channels", times[0][i], bench::atMost(1.25));
    if (kOperations[i].name == std::string_view("sample") ||
        kOperations[i].name == std::string_view("delta")) {
      bench::addFigure((name + ", each").c_str(), times[2][i], "ns", bench::atMost(400));
    }
  }
  bench::addFigure("channels: memory of each, subscribed and sampled",
                   std::max({memory[0].sampled, memory[1].sampled, memory[2].sampled}), "bytes",
                   bench::atMost(300));
  return compareWithNaive() ? 0 : 1;
}
