#include "simulation/maker_metrics.h"

#include <algorithm>
#include <cmath>
#include <string_view>
#include <vector>

#include "simulation/random.h"

namespace tally::simulation {
namespace {

struct ScalarRow {
  std::string_view key;
  double usual;        // of a usual device on a usual day
  double devices;      // by how much devices differ, as a standard deviation of the logarithm
  double days;         // and the days of one
  const char* option;  // null: as it is
  int setting;
};

constexpr const char* kFigures = "sig_fig";
constexpr const char* kStep = "bucket_interval";

constexpr ScalarRow kScalars[] = {
    {"quillet.player.plays", 60, 0.6, 0.3, kStep, 5},
    {"quillet.player.skips", 18, 0.7, 0.4, kStep, 5},
    {"quillet.player.minutes", 140, 0.6, 0.3, kFigures, 2},
    {"quillet.player.underruns", 2, 0.8, 0.8, nullptr, 0},
    {"quillet.player.seeks", 25, 0.6, 0.4, kFigures, 2},
    {"quillet.library.items", 4200, 0.9, 0.001, kFigures, 2},
    {"quillet.library.scans", 4, 0.3, 0.3, nullptr, 0},
    {"quillet.library.scan_failures", 0.2, 0.5, 0.5, nullptr, 0},
    {"quillet.sync.runs", 24, 0.2, 0.1, nullptr, 0},
    {"quillet.sync.failures", 1.2, 0.6, 0.6, nullptr, 0},
    {"quillet.sync.bytes_received", 3.1e7, 0.8, 0.5, kFigures, 2},
    {"quillet.sync.bytes_sent", 2.4e6, 0.8, 0.5, kFigures, 2},
    {"quillet.sync.conflicts", 0.4, 0.6, 0.6, nullptr, 0},
    {kStoppedKey, 14, 0.5, 0.3, kStep, 2},
    {"quillet.radio.bytes_received", 6.4e8, 0.8, 0.5, kFigures, 2},
    {"quillet.radio.association_failures", 1.5, 0.7, 0.6, nullptr, 0},
    {"quillet.radio.minutes_weak", 45, 0.9, 0.4, kStep, 10},
    {"quillet.cache.bytes", 2.1e8, 0.5, 0.05, kFigures, 2},
    {"quillet.cache.hits", 1900, 0.6, 0.3, kFigures, 2},
    {"quillet.cache.misses", 230, 0.6, 0.3, kFigures, 2},
    {"quillet.cache.evictions", 90, 0.7, 0.4, kFigures, 2},
    {"quillet.display.minutes_on", 95, 0.7, 0.3, kStep, 5},
    {"quillet.display.brightness_mean", 55, 0.3, 0.1, kStep, 5},
    {"quillet.input.touches", 420, 0.7, 0.4, kFigures, 2},
    {"quillet.power.charges", 1.4, 0.3, 0.3, nullptr, 0},
    {"quillet.power.minutes_charging", 160, 0.4, 0.3, kStep, 10},
    {"quillet.update.checks", 4, 0.1, 0.1, nullptr, 0},
    {"quillet.crashes.player", 0.15, 0.8, 0.8, nullptr, 0},
    {"quillet.crashes.sync", 0.05, 0.8, 0.8, nullptr, 0},
    {"quillet.crashes.shell", 0.08, 0.8, 0.8, nullptr, 0},
};

enum class Shape { Normal, LogNormal };

struct DistributionRow {
  std::string_view key;
  int samples;  // of a usual device in a day
  Shape shape;
  double middle, spread;  // of LogNormal: the median, and the deviation of the logarithm
  double step;            // in which it is measured
  std::initializer_list<double> bounds;  // of its histogram; empty: none
};

const DistributionRow kDistributions[] = {
    {"quillet.player.start_ms",
     60,
     Shape::LogNormal,
     180,
     0.5,
     1,
     {50, 100, 150, 200, 300, 500, 1000, 2000}},
    {"quillet.player.buffer_ms",
     240,
     Shape::Normal,
     900,
     220,
     1,
     {200, 400, 600, 800, 1000, 1200, 1500}},
    {"quillet.sync.duration_ms",
     24,
     Shape::LogNormal,
     2400,
     0.8,
     1,
     {500, 1000, 2000, 4000, 8000, 16000}},
    {"quillet.radio.rssi_dbm", 288, Shape::Normal, -62, 9, 1, {-90, -80, -75, -70, -65, -60, -50}},
    {"quillet.radio.latency_ms",
     288,
     Shape::LogNormal,
     14,
     0.7,
     0.1,
     {2, 5, 10, 20, 50, 100, 200, 500}},
    {"quillet.battery.temperature_c", 288, Shape::Normal, 28, 4, 0.5, {10, 20, 25, 30, 35, 40, 45}},
    {"quillet.battery.power_mw",
     288,
     Shape::LogNormal,
     850,
     0.6,
     1,
     {100, 250, 500, 1000, 2000, 4000}},
    {"quillet.ui.frame_ms", 400, Shape::LogNormal, 9, 0.35, 0.1, {8, 12, 16.7, 25, 33.3, 50, 100}},
    {"quillet.ui.launch_ms",
     30,
     Shape::LogNormal,
     420,
     0.4,
     1,
     {200, 300, 400, 600, 800, 1200, 2000}},
    {"quillet.storage.write_ms", 200, Shape::LogNormal, 3, 0.9, 0.01, {1, 2, 5, 10, 20, 50, 100}},
    {"quillet.cache.object_bytes",
     150,
     Shape::LogNormal,
     24000,
     1.1,
     1,
     {1000, 4000, 16000, 65000, 262000, 1e6}},
    {"quillet.display.lux", 96, Shape::LogNormal, 130, 1.2, 1, {}},
};

KvRef<KvDictionary> scalarOptions(const ScalarRow& row) {
  auto options = KvDictionary::create();
  if (row.option != nullptr) options->set(row.option, KvNumber::int64(row.setting));
  return options;
}

KvRef<KvDictionary> distributionOptions(const DistributionRow& row) {
  auto options = KvDictionary::create();
  if (row.bounds.size() == 0) return options;
  auto bounds = KvArray::create();
  for (const double bound : row.bounds) bounds->append(KvNumber::float64(bound));
  options->set("intervals", bounds);
  return options;
}

// A number of events whose mean it is: whole, and now and then one more.
std::int64_t wholeEvents(double mean, Random& random) {
  return static_cast<std::int64_t>(std::floor(mean + random.uniform()));
}

Status addSamples(StoreImporter& importer, const DistributionRow& row, double taste,
                  std::int32_t storeDay, Random random) {
  constexpr double kSecondsOfDay = 86400;
  const auto count = static_cast<int>(row.samples * (0.7 + 0.6 * random.uniform())) + 1;
  Status added = Done{};
  for (int i = 0; i < count && added; ++i) {
    const double deviation = row.spread * random.normal();
    const double value = row.shape == Shape::Normal ? row.middle + deviation + row.spread * taste
                                                    : row.middle * std::exp(deviation + taste);
    added =
        importer.addSample(storeDay, row.key, static_cast<std::uint32_t>(kSecondsOfDay * i / count),
                           std::round(value / row.step) * row.step);
  }
  return added;
}

}  // namespace

KvRef<KvDictionary> makerGroup() {
  auto scalars = KvDictionary::create(), distributions = KvDictionary::create();
  for (const ScalarRow& row : kScalars) scalars->set(row.key, scalarOptions(row));
  for (const DistributionRow& row : kDistributions) {
    distributions->set(row.key, distributionOptions(row));
  }
  return KvDictionary::create({{"ScalarKeys", scalars}, {"DistributionKeys", distributions}});
}

Status addMakerMetrics(StoreImporter& importer, const FleetPlan& plan, std::size_t device, int day,
                       std::int32_t storeDay) {
  const std::uint64_t seed = plan.size().seed;
  const auto purpose = [&](Purpose of, std::uint64_t on, std::uint64_t row) {
    return Random({seed, static_cast<std::uint64_t>(of), device, on, row});
  };
  const auto& update = plan.device(device).updateDay;
  const bool isNew = update && day >= *update;
  std::uint64_t number = 0;
  for (const ScalarRow& row : kScalars) {
    ++number;
    if (isNew && row.key == kStoppedKey) continue;
    Random random = purpose(Purpose::Metrics, static_cast<std::uint64_t>(day), number);
    const double habit = purpose(Purpose::Habits, 0, number).normal();
    const double mean = row.usual * std::exp(row.devices * habit + row.days * random.normal());
    const auto added = importer.addScalar(storeDay, row.key, wholeEvents(mean, random));
    if (!added) return added;
  }
  for (const DistributionRow& row : kDistributions) {
    ++number;
    const double taste = 0.2 * purpose(Purpose::Habits, 0, number).normal();
    const auto added =
        addSamples(importer, row, taste, storeDay,
                   purpose(Purpose::Samples, static_cast<std::uint64_t>(day), number));
    if (!added) return added;
  }
  return Done{};
}

}  // namespace tally::simulation
