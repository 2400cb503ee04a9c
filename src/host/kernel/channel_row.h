// What is known of a statistics channel of the kernel before it is read.
#pragma once

#include <cstdint>
#include <string_view>

namespace tally {

// A kind of file, of which there may be one for each device.
enum class KernelSource : std::uint8_t {
  Disk,
  Pressure,
};

// Of a type word.
enum class ChannelFormat : std::uint8_t { Simple = 1, State = 2, Array = 4 };

enum class Semantics : std::uint8_t {
  Counter,  // only rises, until it starts again
  Gauge,
  State,  // what a device is in, or how long it was in each
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
constexpr std::uint64_t kKilohertz = word(8, 0x82);
constexpr std::uint64_t kBytes = word(9, 0x8200), kKibibytes = word(9, 0x8C00);
constexpr std::uint64_t kMillidegrees = word(10, 0x7C), kDegrees = word(10);
constexpr std::uint64_t kEvents = word(100), kPackets = word(101);
}  // namespace unit

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
  // The channel of the daily sweep: "#" is the device's ordinal by bus path, without it the
  // amounts of all devices are added up. Empty: not swept. A counter's is its rise since the day
  // before.
  std::string_view daily;
  std::string_view description;
};

}  // namespace tally
