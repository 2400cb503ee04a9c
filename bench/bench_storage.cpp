// From the driver's buffer to the NAND info dictionary, beside (a) a walk over the same records
// that only sums their values, and (b) the same work with linear searches of the two tables. Then a
// buffer of a million records.
#include <malloc.h>

#include <algorithm>
#include <chrono>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <string>
#include <vector>

#include "base/byte_reader.h"
#include "figures.h"
#include "platform/platform.h"
#include "storage/exporter.h"
#include "storage/nand_info.h"
#include "storage/statistics/counter_names.h"

namespace {

using namespace tally;
using Clocked = std::chrono::steady_clock;
using Bytes = std::vector<std::byte>;

constexpr std::uint32_t kUnknownKey = 0x1000;

// A driver in memory: one service, one connection, one buffer.
class MemoryDriver final : public DeviceRegistry {
 public:
  explicit MemoryDriver(Bytes buffer) : buffer_(std::move(buffer)) {}
  RegistryHandle RegistryFindService(KvRef<KvDictionary> matching) override {
    return matching->getString(kMatchClass) == "SPXStorage" ? 1 : 0;
  }
  RegistryResult ServiceOpenConnection(RegistryHandle, std::uint32_t,
                                       ConnectionHandle* connection) override {
    *connection = 1;
    return 0;
  }
  RegistryResult ConnectionCallMethod(ConnectionHandle, std::uint32_t, MethodCall& call) override {
    const auto size = static_cast<std::uint32_t>(buffer_.size());
    const bool isSizeQuery = call.structInput[4] != std::byte{0};
    const void* from = isSizeQuery ? static_cast<const void*>(&size) : buffer_.data();
    call.structOutputSize = isSizeQuery ? sizeof size : buffer_.size();
    std::memcpy(call.structOutput.data(), from, call.structOutputSize);
    return 0;
  }
  RegistryResult ServiceCloseConnection(ConnectionHandle) override { return 0; }
  void HandleRelease(RegistryHandle) override {}

  // What the fetch does not ask for.
  RegistryResult RegistryCopyMatchingServices(KvRef<KvDictionary>, RegistryHandle*) override {
    return 1;
  }
  RegistryHandle RegistryIteratorNext(RegistryHandle) override { return 0; }
  bool RegistryIteratorIsValid(RegistryHandle) override { return false; }
  KvRef<KvObject> RegistryCopyProperty(RegistryHandle, std::string_view) override { return {}; }
  KvRef<KvObject> RegistrySearchProperty(RegistryHandle, std::string_view) override { return {}; }
  RegistryResult RegistryGetEntryID(RegistryHandle, std::uint64_t*) override { return 1; }
  RegistryResult RegistryGetName(RegistryHandle, std::string*) override { return 1; }
  std::uint32_t RegistryHandleIsValid(RegistryHandle) override { return 1; }
  void HandleRetain(RegistryHandle) override {}
  RegistryResult ConnectionMapMemory(ConnectionHandle, std::uint32_t, std::uint32_t,
                                     const std::byte**, std::size_t*) override {
    return 1;
  }
  RegistryResult ConnectionUnmapMemory(ConnectionHandle, std::uint32_t, const std::byte*) override {
    return 1;
  }

 private:
  Bytes buffer_;
};

class NoPreferences final : public Preferences {
 public:
  KvRef<KvObject> SMAPreferencesGetValue(std::string_view, std::string_view) override { return {}; }
  void SMAPreferencesSetValue(std::string_view, KvRef<KvObject>, std::string_view) override {}
  WriteResult SMAPreferencesSynchronize(std::string_view) override { return WriteResult::Written; }
};

class NoPurgeableSpace final : public PurgeableSpace {
 public:
  bool isAvailable() override { return false; }
  KvRef<KvDictionary> copyItemizedPurgeableSpace(const KvDictionary&) override { return {}; }
};

template <class T>
void append(Bytes& bytes, T value) {
  const auto* from = reinterpret_cast<const std::byte*>(&value);
  bytes.insert(bytes.end(), from, from + sizeof value);
}

void appendRecord(Bytes& bytes, std::uint32_t key, std::uint32_t count, std::uint64_t value) {
  append(bytes, key);
  append(bytes, count);
  for (std::uint32_t i = 0; i < count; ++i) append(bytes, value + i);
}

// All keys, all elements.
Bytes fullBuffer() {
  Bytes bytes;
  for (const std::size_t first : kFirstRows) {
    if (first == kNoStorageCounter) continue;
    const StorageCounter& row = kStorageCounters[first];
    const std::uint64_t value = row.statistic == 53 ? 0x20002 : row.statistic * 1'000'003ull;
    appendRecord(bytes, row.statistic, row.elements, value);
  }
  return bytes;
}

// A million records, of which every n-th is known.
Bytes millionRecords(std::uint32_t everyKnown) {
  Bytes bytes;
  bytes.reserve(16'000'000);
  for (std::uint32_t i = 0; i < 1'000'000; ++i) {
    appendRecord(bytes, i % everyKnown == 0 ? 2 : kUnknownKey, 1, std::uint64_t{i} << 20);
  }
  return bytes;
}

template <class Visit>
void walk(const Bytes& bytes, const Visit& visit) {
  const ByteReader reader(bytes);
  for (std::size_t at = 0; at + 8 <= bytes.size();) {
    const std::uint32_t key = *reader.read<std::uint32_t>(at);
    const std::uint32_t count = *reader.read<std::uint32_t>(at + 4);
    visit(key, ByteReader(*reader.slice(at + 8, count * std::size_t{8})), count);
    at += 8 + count * std::size_t{8};
  }
}

std::uint64_t sumOfValues(const Bytes& bytes) {
  std::uint64_t sum = 0;
  walk(bytes, [&](std::uint32_t, const ByteReader& values, std::uint32_t count) {
    for (std::size_t i = 0; i < count; ++i) sum += *values.read<std::uint64_t>(i * 8);
  });
  return sum;
}

KvRef<KvDictionary> linearNandInfo(const Bytes& bytes) {
  auto info = KvDictionary::create();
  walk(bytes, [&](std::uint32_t key, const ByteReader& values, std::uint32_t count) {
    const auto* row = std::ranges::find(kStorageCounters, key, &StorageCounter::statistic);
    if (row == kStorageCounters.end()) return;
    const std::uint32_t taken = std::min<std::uint32_t>(count, row->elements);
    for (std::size_t i = 0; i < taken; ++i) {
      const std::string name = taken == 1 ? row->name : row->name + std::to_string(i);
      const auto found = std::ranges::find(keyMap, name, &SPXKeyMapRow::name);
      if (found == keyMap.end()) continue;
      const auto value = static_cast<std::int64_t>(*values.read<std::uint64_t>(i * 8));
      info->set(found->key, KvNumber::int64(value));
    }
  });
  return info;
}

// The median of many runs, in microseconds.
template <class Run>
double microseconds(int runs, const Run& run) {
  std::vector<double> times;
  for (int i = 0; i < runs; ++i) {
    const auto start = Clocked::now();
    run();
    times.push_back(std::chrono::duration<double, std::micro>(Clocked::now() - start).count());
  }
  std::nth_element(times.begin(), times.begin() + runs / 2, times.end());
  return times[static_cast<std::size_t>(runs / 2)];
}

void measureFullBuffer() {
  const Bytes buffer = fullBuffer();
  Platform services;
  services.deviceRegistry = std::make_shared<MemoryDriver>(buffer);
  services.preferences = std::make_shared<NoPreferences>();
  services.purgeableSpace = std::make_shared<NoPurgeableSpace>();
  const PlatformScope scope(services);

  volatile std::uint64_t sum = 0;
  const double bare = microseconds(2001, [&] { sum = sumOfValues(buffer); });
  const double linear = microseconds(101, [&] { linearNandInfo(buffer); });
  const double whole = microseconds(2001, [] { CopyNANDInfo(); });
  const double parse = microseconds(2001, [&] {
    SPXParseContext context;
    SPXParseBufferToCxt(&context, buffer.data(), buffer.size());
    SPXReleaseContext(&context);
  });
  std::printf("full buffer: %zu bytes, %zu entries in the dictionary\n", buffer.size(),
              CopyNANDInfo()->size());
  std::printf("  (a) walk that sums the values     %9.1f us\n", bare);
  std::printf("  (b) linear searches               %9.1f us\n", linear);
  std::printf("  parse and release                 %9.1f us  %.1f x (a)\n", parse, parse / bare);
  std::printf("  fetch to dictionary (CopyNANDInfo)%9.1f us  %.1f x (a), (b) takes %.1f x\n", whole,
              whole / bare, linear / whole);
  bench::addFigure("storage statistics, fetch to dictionary", whole, "us", "linear searches",
                   linear, bench::noTarget());
  bench::addFigure("storage statistics, parse and release", parse, "us",
                   "a walk that sums the values", bare, bench::noTarget());
}

void measureMillionRecords() {
  for (const std::uint32_t everyKnown : {1'000'000u, 1'000u, 10u, 1u}) {
    const Bytes buffer = millionRecords(everyKnown);
    std::size_t held = 0;
    const double time = microseconds(9, [&] {
      SPXParseContext context;
      const auto before = mallinfo2();
      SPXParseBufferToCxt(&context, buffer.data(), buffer.size());
      const auto after = mallinfo2();
      held = after.uordblks + after.hblkhd - before.uordblks - before.hblkhd;
      SPXReleaseContext(&context);
    });
    const double megabytes = static_cast<double>(buffer.size()) / 1e6;
    const double known = 1e6 / everyKnown;
    std::printf("a million records, %8.0f known: %7.1f MB/s, %9zu bytes held, %.0f a counter\n",
                known, megabytes / time * 1e6, held, static_cast<double>(held) / known);
  }
}

}  // namespace

int main() {
  measureFullBuffer();
  measureMillionRecords();
}
