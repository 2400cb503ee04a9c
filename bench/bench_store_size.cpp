// What a day of samples takes in the store, and what reading it costs: packed, as they are (schema
// version 1), and the raw columns compressed by a general library, with and without byte shuffling.
// Each reading is a process of its own.
#include <stdlib.h>
#include <zstd.h>

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <ctime>
#include <filesystem>
#include <functional>
#include <limits>
#include <random>
#include <string_view>
#include <vector>

#include "data/raw_store.h"
#include "figures.h"
#include "host/store/store_history.h"
#include "host/store/store_writer.h"
#include "process_cost.h"

namespace {

using namespace tally;
using namespace tally::bench;

constexpr std::int32_t kDay = 20514;
constexpr int kRounds = 5;
constexpr std::size_t kPiece = 16384;
volatile double keep;  // what is computed must not be optimised away

using Random = std::mt19937_64;

struct Data {
  const char* name;
  std::size_t keys, samplesEach;
  std::function<double(Random& random, double before)> draw;
  Target size;  // of the packed store beside the raw one
};

double logNormal(Random& random, double median, double deviation) {
  return std::round(median * std::exp(deviation * std::normal_distribution<double>()(random)));
}

const Data kData[] = {
    {"milliseconds", 1000, 2000, [](Random& random, double) { return logNormal(random, 120, 1); },
     timesLess(3)},
    {"milliseconds, 200 a key", 1000, 200,
     [](Random& random, double) { return logNormal(random, 120, 1); }, timesLess(3)},
    {"sizes in bytes", 1000, 2000,
     [](Random& random, double) { return logNormal(random, 4096, 2); }, timesLess(3)},
    {"temperatures in tenths", 1000, 2000,
     [](Random& random, double before) {
       const double step = static_cast<double>(random() % 5) - 2;
       return std::clamp(std::round(before * 10) + step, 200.0, 900.0) / 10;
     },
     noTarget()},
    {"random doubles", 1000, 2000,
     [](Random& random, double) { return std::uniform_real_distribution<double>()(random); },
     atMost(1.01)},
    {"constant", 1000, 2000, [](Random&, double) { return 1.0; }, noTarget()},
};

struct Samples {
  std::vector<double> values;
  std::vector<std::uint32_t> offsets;
};

// The samples of a key, always the same ones, at random moments of the day.
Samples samplesOf(const Data& data, std::size_t key) {
  Random random(key);
  Samples samples;
  double value = 0;
  for (std::size_t i = 0; i < data.samplesEach; ++i) {
    samples.values.push_back(value = data.draw(random, value));
    samples.offsets.push_back(static_cast<std::uint32_t>(random() % 86400));
  }
  std::ranges::sort(samples.offsets);
  return samples;
}

std::string keyOf(std::size_t key) { return "vellum.bench.series." + std::to_string(key); }

StoreFile storeIn(const std::string& folder) { return {{folder, "/store"}, "day.sqlitedb"}; }

// Makes both stores of the data.
bool make(const std::string& folder, const Data& data) {
  auto raw = RawStore::make(storeIn(folder + "/raw"));
  auto packed = StoreWriter::open(storeIn(folder + "/packed"), IfMissing::Create);
  if (!raw || !packed || !(*packed)->begin()) return false;
  for (std::size_t key = 0; key < data.keys; ++key) {
    const Samples samples = samplesOf(data, key);
    const SampleColumns columns{samples.values, samples.offsets, {}};
    if (!raw->addSamples(kDay, keyOf(key), columns)) return false;
    if (!(*packed)->appendSamples(kDay, keyOf(key), columns)) return false;
  }
  return raw->finish() && (*packed)->commit();
}

// Reads all values of a store as doubles.
int readStore(const std::string& folder, std::size_t expected) {
  std::size_t count = 0;
  std::vector<double> values(kPiece);
  const auto history = openSqliteHistory(storeIn(folder), [](const std::string&) { std::exit(1); });
  using Days = std::numeric_limits<std::int32_t>;
  history->enumerateDistributions(
      "", Days::min(), Days::max(),
      [&](std::string_view, std::int32_t, DistributionValues& from, bool&) {
        while (const auto more = from.nextValues(values.data(), nullptr, kPiece)) count += more;
        keep = values[0];
      });
  return count == expected ? 0 : 1;
}

// The bytes of a column, all first ones, then all second ones.
std::vector<std::byte> shuffled(std::span<const std::byte> column, std::size_t width) {
  std::vector<std::byte> out(column.size());
  const std::size_t count = column.size() / width;
  for (std::size_t i = 0; i < column.size(); ++i) out[i % width * count + i / width] = column[i];
  return out;
}

std::vector<std::byte> unshuffled(std::span<const std::byte> column, std::size_t width) {
  std::vector<std::byte> out(column.size());
  const std::size_t count = column.size() / width;
  for (std::size_t byte = 0; byte < width; ++byte) {
    for (std::size_t i = 0; i < count; ++i) out[i * width + byte] = column[byte * count + i];
  }
  return out;
}

double cpuSeconds() { return static_cast<double>(std::clock()) / CLOCKS_PER_SEC; }

struct Compressed {
  std::size_t bytes = 0;
  double readSeconds = 0;  // of the values alone
};

// One frame for each column of a key, without a store around them.
Compressed compress(const Data& data, bool shuffle) {
  Compressed result;
  for (std::size_t key = 0; key < data.keys; ++key) {
    const Samples samples = samplesOf(data, key);
    const struct {
      std::span<const std::byte> bytes;
      std::size_t width;
    } columns[] = {{std::as_bytes(std::span(samples.values)), sizeof(double)},
                   {std::as_bytes(std::span(samples.offsets)), sizeof(std::uint32_t)}};
    for (const auto& [bytes, width] : columns) {
      std::vector<std::byte> input(bytes.begin(), bytes.end());
      if (shuffle) input = shuffled(input, width);
      std::vector<std::byte> frame(::ZSTD_compressBound(input.size()));
      const std::size_t size =
          ::ZSTD_compress(frame.data(), frame.size(), input.data(), input.size(), 1);
      if (::ZSTD_isError(size)) std::exit(1);
      result.bytes += size;
      if (width != sizeof(double)) continue;
      const double before = cpuSeconds();
      std::vector<std::byte> output(input.size());
      if (::ZSTD_decompress(output.data(), output.size(), frame.data(), size) != input.size()) {
        std::exit(1);
      }
      if (shuffle) output = unshuffled(output, width);
      keep = static_cast<double>(std::to_integer<int>(output[0]));
      result.readSeconds += cpuSeconds() - before;
    }
  }
  return result;
}

double leastSeconds(const std::vector<std::string>& command) {
  double best = 0;
  for (int round = 0; round < kRounds; ++round) {
    const ProcessCost cost = runProcess(command);
    if (cost.exitStatus != 0) std::exit(1);
    if (round == 0 || cost.cpuSeconds < best) best = cost.cpuSeconds;
  }
  return best;
}

int measure(const std::string& self) {
  std::printf("%-24s %21s %21s %9s %21s %21s %9s\n", "", "raw, schema 1", "packed, schema 2",
              "smaller", "zstd -1", "zstd -1, shuffled", "");
  std::printf("%-24s %12s %8s %12s %8s %9s %12s %8s %12s %8s\n", "", "bytes each", "s CPU",
              "bytes each", "s CPU", "times", "bytes each", "s CPU", "bytes each", "s CPU");
  for (std::size_t number = 0; number < std::size(kData); ++number) {
    const Data& data = kData[number];
    char name[] = "/tmp/tally-store-size-XXXXXX";
    if (::mkdtemp(name) == nullptr) return 1;
    const std::string folder = name, which = std::to_string(number);
    if (runProcess({self, "make", folder, which}).exitStatus != 0) return 1;
    const double samples = static_cast<double>(data.keys * data.samplesEach);
    double bytes[2], seconds[2];
    const char* const kinds[] = {"/raw", "/packed"};
    for (int kind = 0; kind < 2; ++kind) {
      bytes[kind] =
          static_cast<double>(std::filesystem::file_size(storeIn(folder + kinds[kind]).text()));
      seconds[kind] = leastSeconds({self, "read", folder + kinds[kind], which});
    }
    std::filesystem::remove_all(folder);
    const Compressed plain = compress(data, false), shuffle = compress(data, true);
    std::printf("%-24s %12.2f %8.3f %12.2f %8.3f %9.2f %12.2f %8.3f %12.2f %8.3f\n", data.name,
                bytes[0] / samples, seconds[0], bytes[1] / samples, seconds[1], bytes[0] / bytes[1],
                static_cast<double>(plain.bytes) / samples, plain.readSeconds,
                static_cast<double>(shuffle.bytes) / samples, shuffle.readSeconds);
    const std::string of = std::string("store, ") + data.name;
    addFigure((of + ": size").c_str(), bytes[1] / samples, "bytes a sample", "schema version 1",
              bytes[0] / samples, data.size);
    addFigure((of + ": reading").c_str(), seconds[1], "s CPU", "schema version 1", seconds[0],
              atMost(1));
  }
  return 0;
}

}  // namespace

int main(int count, char** arguments) {
  const std::string_view mode = count > 1 ? arguments[1] : "";
  const std::size_t number = count == 4 ? std::stoul(arguments[3]) : 0;
  if (number >= std::size(kData)) return 1;
  const Data& data = kData[number];
  if (mode == "make" && count == 4) return make(arguments[2], data) ? 0 : 1;
  if (mode == "read" && count == 4) return readStore(arguments[2], data.keys * data.samplesEach);
  return measure(std::filesystem::canonical("/proc/self/exe"));
}
