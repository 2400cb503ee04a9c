// The rise of counters from day to day: the rule, and what the store keeps of it.
#include "host/kernel/daily_amounts.h"

#include <gtest/gtest.h>

#include <array>

#include "base/byte_reader.h"
#include "fakes/fake_platform.h"
#include "host/kernel/ecc_events.h"
#include "host/store_fixture.h"

namespace tally {
namespace {

TEST(DailyAmounts, RiseFollowsTheCounterThroughWrapsAndRestarts) {
  const struct {
    const char* what;
    std::uint64_t last, now;
    const char* epoch;
    std::uint8_t width;
    std::uint64_t rise;
  } kCases[] = {
      {"rises", 10, 17, "boot", 64, 7},
      {"stays", 10, 10, "boot", 64, 0},
      {"wraps at 32 bits", 0xFFFFFFF0, 4, "boot", 32, 20},
      {"falls from below the top quarter: a restart", 0x80000000, 4, "boot", 32, 4},
      {"falls, of a width that is not known", 0xFFFFFFF0, 4, "boot", 0, 4},
      {"is larger than its width, and falls", 0x1FFFFFFFF, 4, "boot", 32, 4},
      {"wraps at 64 bits", UINT64_MAX, 1, "boot", 64, 2},
      {"another boot", 10, 17, "next boot", 64, 17},
      {"another boot, lower", 10, 3, "next boot", 64, 3},
  };
  for (const auto& row : kCases) {
    const CounterState kept{"key", "boot", row.last, 0, 0, {}};
    EXPECT_EQ(riseOf(kept, {row.now, row.epoch, row.width}), row.rise) << row.what;
  }
}

// A sweep is what the driver does; accumulate() is what the unit does at shutdown.
using DailyAmountsOfStore = StoreTest;

TEST_F(DailyAmountsOfStore, AmountRunsFromTheFirstSweepOfADayToTheNextDays) {
  enum Action { Sample, Sweep, Accumulate };
  const struct {
    int day;
    Action action;
    std::uint64_t value;
    const char* boot;
    std::optional<std::int64_t> amount;
  } kSteps[] = {
      {100, Sweep, 1000, "a", std::nullopt},  // seen for the first time
      {100, Sweep, 1010, "a", std::nullopt},
      {101, Sample, 1100, "a", 100},
      {101, Sample, 1110, "a", 110},  // nobody's sample moves what is kept
      {101, Sweep, 1120, "a", 120},
      {101, Sweep, 1150, "a", 120},       // the day's amount is fixed
      {101, Accumulate, 1200, "a", 120},  // before a reboot, which loses 10
      {102, Sweep, 5, "b", 85},
      {105, Sweep, 25, "b", 20},
      {103, Sweep, 26, "b", std::nullopt},  // the clock was set back
      {104, Sweep, 30, "b", 4 + 1},
  };
  for (const auto& step : kSteps) {
    clock->setDay(step.day, 7);
    // A process each, as on a device.
    const auto metrics = store();
    DailyAmounts days(metrics, clock);
    days.beginSample();
    const auto amount = days.amount("disk.sda.read", {step.value, step.boot, 64});
    EXPECT_EQ(amount, step.amount) << "day " << step.day << ", value " << step.value;
    metrics->beginBatch();
    if (step.action == Sweep) days.commitSweep();
    EXPECT_EQ(step.action == Accumulate ? days.accumulate() : 1, 1u);
    metrics->endBatch();
  }
}

TEST_F(DailyAmountsOfStore, ACounterThatMissedASweepHasNoAmountOfThatDay) {
  const auto sweep = [&](std::int32_t day, const std::vector<std::string>& present) {
    clock->setDay(day, 7);
    const auto metrics = store();
    DailyAmounts days(metrics, clock);
    days.beginSample();
    std::string amounts;
    for (const std::string& key : present) {
      const auto value = static_cast<std::uint64_t>(day) * 10;
      const auto amount = days.amount(key, {value, "boot", 64});
      amounts += " " + (amount ? std::to_string(*amount) : std::string("none"));
    }
    metrics->beginBatch();
    days.commitSweep();
    metrics->endBatch();
    return amounts;
  };
  EXPECT_EQ(sweep(100, {"sda", "sdb"}), " none none");
  EXPECT_EQ(sweep(101, {"sda"}), " 10");
  EXPECT_EQ(sweep(102, {"sda", "sdb"}), " 10 none");
  EXPECT_EQ(sweep(103, {"sda", "sdb"}), " 10 10");
  EXPECT_EQ(sweep(140, {"sda"}), " 370") << "the machine was off";
  EXPECT_EQ(store()->counterStates().size(), 1u) << "unseen for more than 30 days";
}

TEST_F(DailyAmountsOfStore, MemoryErrorsAreForwardedOnceThoughTheyWereKeptBeforeTheSweep) {
  put("proc/sys/kernel/random/boot_id", "boot\n");
  const auto errors = [&](int corrected) {
    put("sys/devices/system/edac/mc/mc1/ce_count", std::to_string(corrected) + "\n");
    put("sys/devices/system/edac/mc/mc1/ue_count", "0\n");
  };
  const auto tree = std::make_shared<const SystemTree>(DeviceRoot(root));
  const auto nextEvent = [&] {
    EccEvents values(std::make_shared<fakes::FakeKernelValues>(), tree, store());
    std::array<std::byte, 72> record{};
    std::size_t length = record.size();
    const int error = values.readKernelValue("kern.next_ecc_event", record, &length);
    if (error != 0) return std::string(error == 2 ? "none" : "error");
    const ByteReader reader(record);
    return std::to_string(*reader.read<std::uint8_t>(0)) + ": " +
           std::to_string(*reader.read<std::int64_t>(8)) + " corrected, " +
           std::to_string(*reader.read<std::int64_t>(16)) + " not";
  };
  const auto keep = [&](std::uint64_t value) {
    const auto metrics = store();
    DailyAmounts days(metrics, clock);
    days.beginSample();
    (void)days.amount("edac.mc1.corrected", {value, "boot", 32});
    days.accumulate();
  };
  errors(5);
  EXPECT_EQ(nextEvent(), "none") << "since when it counts is not known";
  store()->setCounterState({"edac.mc1.corrected", "boot", 5, 0, kToday, {}});
  errors(8);
  keep(8);
  errors(9);
  EXPECT_EQ(nextEvent(), "1: 4 corrected, 0 not");
  EXPECT_EQ(nextEvent(), "none");
}

}  // namespace
}  // namespace tally
