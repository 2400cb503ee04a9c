// What observations of the clocks, by runs and between them, become on the day of the last run.
#include "driver/own_figures.h"

#include <gtest/gtest.h>

#include <fmt/format.h>

#include "fakes/fake_platform.h"

namespace tally {
namespace {

constexpr std::int32_t kFirst = 20000;

struct FakeSelf final : Self {
  std::optional<ClockReading> reading;
  std::optional<ClockReading> clocks() override { return reading; }
  RunCost cost() override { return {120, std::nullopt, 4096}; }
};

OwnMetrics all() {
  OwnMetrics metrics;
  for (std::size_t i = 0; i < kOwnMetricCount; ++i) metrics.add(static_cast<OwnMetric>(i));
  return metrics;
}

struct Observation {
  enum { Run, Keep } by;
  std::int32_t day;
  const char* boot;
  std::int64_t suspended = 0;  // milliseconds since boot
  std::int64_t startedAt = 0;  // milliseconds since 1970 at boot, by the clock of the moment
  std::optional<bool> synchronised = true;
};

TEST(OwnFigures, AmountsAreThoseFromRunToRun) {
  constexpr auto Run = Observation::Run;
  constexpr auto Keep = Observation::Keep;
  const struct {
    const char* name;
    std::vector<Observation> observations;
    std::string expected;  // of the day of the last one
  } kCases[] = {
      {"a first run has nothing to compare with", {{Run, 0, "a"}}, ""},
      {"nothing happened",
       {{Run, 0, "a", 5000}, {Keep, 0, "a", 4999, 20}, {Run, 1, "a", 5000, -20}},
       "synchronised 1, steps 0, boots 0, suspended 0"},
      {"set forward, and back between two observations",
       {{Run, 0, "a"}, {Keep, 0, "a", 0, 100}, {Keep, 0, "a", 0, 150}, {Run, 1, "a", 0, -3600000}},
       "synchronised 1, steps 2, boots 0, suspended 0"},
      {"boots, each with its own sleep",
       {{Run, 0, "a", 1000}, {Keep, 0, "a", 9000}, {Keep, 0, "b", 500, 7000}, {Run, 1, "c", 2000}},
       "synchronised 1, steps 0, boots 2, suspended 10"},
      {"not synchronised once",
       {{Run, 0, "a"}, {Keep, 0, "a", 0, 0, false}, {Keep, 1, "a"}, {Run, 1, "a"}},
       "synchronised 0, steps 0, boots 0, suspended 0"},
      {"the kernel does not say whether it is",
       {{Run, 0, "a"}, {Run, 1, "a", 0, 0, {}}},
       "steps 0, boots 0, suspended 0"},
      {"it is not known in which boot", {{Run, 0, "a"}, {Run, 1, ""}}, ""},
      {"a second run changes nothing",
       {{Run, 0, "a"}, {Run, 1, "b"}, {Run, 1, "c"}},
       "synchronised 1, steps 0, boots 1, suspended 0"},
      {"a day without a run", {{Run, 0, "a"}, {Keep, 1, "b"}, {Run, 2, "b"}}, ""},
      {"a day that the clock had wrong", {{Run, 5, "a"}, {Run, 1, "a"}}, ""},
      {"nobody wanted it for days",
       {{Run, 0, "a"}, {Keep, 2, "b"}, {Run, 3, "c"}, {Run, 4, "c"}},
       "synchronised 1, steps 0, boots 0, suspended 0"},
  };
  for (const auto& [name, observations, expected] : kCases) {
    SCOPED_TRACE(name);
    const auto fake = fakes::makeFakePlatform();
    Platform platform = fake.services();
    const auto self = std::make_shared<FakeSelf>();
    platform.self = self;
    for (const Observation& seen : observations) {
      fake.clock->setDay(kFirst + seen.day, 300);
      constexpr std::int64_t kBoot = 100'000'000, kStarted = 1'700'000'000'000;
      self->reading = {seen.boot, kBoot, kBoot - seen.suspended, kBoot + kStarted + seen.startedAt,
                       seen.synchronised};
      if (seen.by == Run) {
        recordOwnFigures(platform, all());
      } else {
        keepOwnFigures(platform);
      }
    }
    std::string found;
    for (std::size_t i = 0; i < kOwnMetricCount; ++i) {
      const std::string key(kOwnMetrics[i].key);
      const auto row =
          fake.metricsStore->rows.scalars.find({fake.metricsStore->TBDaysSince1970(), key});
      if (row == fake.metricsStore->rows.scalars.end() || key.find(".tallyrun.time.") == key.npos)
        continue;
      found += fmt::format("{}{} {}", found.empty() ? "" : ", ", key.substr(key.rfind('.') + 1),
                           row->second);
    }
    EXPECT_EQ(found, expected);
  }
}

TEST(OwnFigures, WhatNobodyWantsIsNeitherReadNorWritten) {
  const auto fake = fakes::makeFakePlatform();
  Platform platform = fake.services();
  platform.self = std::make_shared<FakeSelf>();
  recordOwnFigures(platform, {});
  EXPECT_EQ(fake.metricsStore->countersRead, 0);
  keepOwnFigures(platform);
  EXPECT_TRUE(fake.metricsStore->counters.empty() && fake.calls->empty());
  OwnMetrics cost;
  cost.add(OwnMetric::Cpu);
  cost.add(OwnMetric::PeakMemory);
  recordOwnFigures(platform, cost);
  EXPECT_TRUE(fake.metricsStore->counters.empty());
  EXPECT_EQ(*fake.calls, fakes::CallLog{"scalar vellum.tallyrun.cost.cpu=120"});
}

}  // namespace
}  // namespace tally
