// What is known of a statistics channel of the kernel before it is read.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string_view>

namespace tally {

// A kind of file, of which there may be one for each device.
enum class KernelSource : std::uint8_t {
  Disk,
  Zram,
  Network,
  Pressure,
  Memory,
  Paging,
  ProcessorTime,
  ProcessorTimes,
  ProcessorIdle,
  ProcessorFrequency,
  ProcessorThrottling,
  Interrupts,
  SoftInterrupts,
  ThermalZone,
  Cooling,
  Sensor,
  PowerSupply,
  WakeupSource,
  Suspend,
  MemoryErrors,
  Time,
};

// Of a type word.
enum class ChannelFormat : std::uint8_t { Simple = 1, State = 2, Array = 4 };

enum class Semantics : std::uint8_t {
  Counter,  // only rises, until it starts again
  Gauge,
  State,            // what a device is in, or how long it was in each
  UnsteadyCounter,  // may fall back, which does not mean that it started again
};

// How long a counter keeps its value.
enum class CounterScope : std::uint8_t {
  Boot,      // it starts again with the kernel
  Creation,  // and also when its device is made again
  Lifetime,  // it belongs to the device, on whatever machine
};

// Unit words, by the label that they are shown with.
namespace unit {
constexpr std::uint64_t word(unsigned quantity, unsigned scale = 0, unsigned factor = 0) {
  return std::uint64_t{quantity} << 56 | std::uint64_t{scale} << 32 | factor;
}
constexpr std::uint64_t kNone = 0;
constexpr std::uint64_t kSeconds = word(1), kMilliseconds = word(1, 0x7C),
                        kMicroseconds = word(1, 0x79);
constexpr std::uint64_t kMicrowatts = word(2, 0x79), kMicrojoules = word(3, 0x79);
constexpr std::uint64_t kMilliamperes = word(4, 0x7C), kMicroamperes = word(4, 0x79);
constexpr std::uint64_t kMillivolts = word(5, 0x7C), kMicrovolts = word(5, 0x79);
constexpr std::uint64_t kHertz = word(8), kKilohertz = word(8, 0x82);
constexpr std::uint64_t kBytes = word(9, 0x8200), kKibibytes = word(9, 0x8C00),
                        kFourKibibytes = word(9, 0x8C00, 4);
constexpr std::uint64_t kMillidegrees = word(10, 0x7C), kDegrees = word(10);
constexpr std::uint64_t kEvents = word(100), kPackets = word(101);
}  // namespace unit

// As legends have them.
constexpr std::string_view textOf(Semantics semantics) {
  constexpr std::string_view kTexts[] = {"counter", "gauge", "state", "counter"};
  return kTexts[static_cast<std::size_t>(semantics)];
}
constexpr std::string_view textOf(CounterScope scope) {
  constexpr std::string_view kTexts[] = {"boot", "creation", "lifetime"};
  return kTexts[static_cast<std::size_t>(scope)];
}

constexpr bool isCounter(Semantics semantics) {
  return semantics == Semantics::Counter || semantics == Semantics::UnsteadyCounter;
}

struct ChannelRow {
  KernelSource source;
  // After the source's name and the device's: "disk.sda.reads". Empty where the device's is enough.
  std::string_view name;
  std::uint64_t unit;
  ChannelFormat format;
  Semantics semantics;
  CounterScope scope;
  std::uint8_t width;     // bits of the counter; 0: not a counter, or not known
  std::string_view file;  // "*" for the device
  // The channel of the daily sweep. In it "#" is the device's ordinal by bus path and "%" its
  // kind; the amounts of all channels that come to the same name are added up. Empty: not swept. A
  // counter's is its rise since the day before.
  std::string_view daily;
  std::string_view description;
};

}  // namespace tally
