#include "simulation/fleet_plan.h"

#include <algorithm>
#include <cmath>
#include <numbers>
#include <numeric>

#include <fmt/format.h>
#include <nlohmann/json.hpp>

#include "simulation/random.h"

namespace tally::simulation {
namespace {

// The shares of the fleet are exact, whatever the seed.
// So many that a small fleet too has enough devices of either version to tell of.
constexpr double kNeverUpdated = 0.30, kWakeTwiceAsOften = 0.03;
constexpr double kLose = 0.05, kRepeat = 0.05, kDelay = 0.05, kFallSilent = 0.02;
constexpr double kOffPerDay = 0.01;
constexpr std::int32_t kWrongClockAhead = 3650;
// All disks are of one age when the first day begins. How many days they have left after the last
// one differs as lifetimes do: its logarithm is normally distributed.
constexpr double kAgeInDays = 150, kMedianDaysLeft = 560, kLifetimeSpread = 0.85;
constexpr double kWornPercent = 90, kWornShare = 0.01;
constexpr double kFewestWakeups = 400, kWakeupRange = 1.75;

enum class Order : std::uint64_t { Versions, Wear, Troubles, Wakeups };

// For each device its place when the fleet is put in an order.
std::vector<std::size_t> places(const FleetSize& size, Order order) {
  std::vector<std::size_t> places(size.devices);
  std::iota(places.begin(), places.end(), std::size_t{0});
  Random random(
      {size.seed, static_cast<std::uint64_t>(Purpose::Order), static_cast<std::uint64_t>(order)});
  for (std::size_t i = places.size(); i > 1; --i) std::swap(places[i - 1], places[random.below(i)]);
  return places;
}

std::size_t countOf(double share, std::size_t devices) {
  return static_cast<std::size_t>(std::lround(share * static_cast<double>(devices)));
}

// Where a place lies among all, from 0 to 1.
double quantile(std::size_t place, std::size_t devices) {
  return (static_cast<double>(place) + 0.5) / static_cast<double>(devices);
}

// Of the normal distribution.
double normalQuantile(double level) {
  double low = -10, high = 10;
  for (int i = 0; i < 64; ++i) {
    const double middle = (low + high) / 2;
    (std::erfc(-middle / std::numbers::sqrt2) / 2 < level ? low : high) = middle;
  }
  return low;
}

double daysLeft(double level) {
  return kMedianDaysLeft * std::exp(kLifetimeSpread * normalQuantile(level));
}

// Takes parts of an order off its front.
class Parts {
 public:
  Parts(std::size_t place, std::size_t devices) : place_(place), devices_(devices) {}
  bool isIn(std::size_t count) {
    const bool in = place_ >= taken_ && place_ < taken_ + count;
    taken_ += count;
    return in;
  }
  bool isIn(double share) { return isIn(countOf(share, devices_)); }

 private:
  std::size_t place_, devices_, taken_ = 0;
};

}  // namespace

FleetPlan::FleetPlan(const FleetSize& size) : size_(size), devices_(size.devices) {
  const auto versions = places(size, Order::Versions), wear = places(size, Order::Wear),
             troubles = places(size, Order::Troubles), wakeups = places(size, Order::Wakeups);
  for (std::size_t i = 0; i < size.devices; ++i) {
    DevicePlan& device = devices_[i];
    Parts version(versions[i], size.devices), trouble(troubles[i], size.devices);
    // An update reaches the fleet within three days.
    if (!version.isIn(kNeverUpdated)) device.updateDay = size.days / 2 + static_cast<int>(i % 3);
    device.wakesTwiceAsOften = version.isIn(kWakeTwiceAsOften);
    device.dailyWakeups =
        kFewestWakeups * std::pow(kWakeupRange, quantile(wakeups[i], size.devices));
    device.wearPerDay =
        kWornPercent / (kAgeInDays + size.days + daysLeft(quantile(wear[i], size.devices)));
    // Neither at the start nor at the end, where a gap could not be seen.
    const int amid = size.days / 4 + static_cast<int>(i % static_cast<std::size_t>(size.days / 2));
    if (trouble.isIn(kLose)) device.lostDay = amid;
    if (trouble.isIn(kRepeat)) device.repeatedDay = amid;
    if (trouble.isIn(kDelay)) device.lateDay = amid;
    if (trouble.isIn(kFallSilent)) device.lastDay = size.days * 3 / 4;
    if (trouble.isIn(std::size_t{1})) device.clockAhead = kWrongClockAhead;
  }
}

double FleetPlan::percentUsed(double wearPerDay, int day) {
  return wearPerDay * (kAgeInDays + day);
}

bool FleetPlan::isOff(std::size_t device, int day) const {
  // A log is only lost on its way if it was made.
  const DevicePlan& plan = devices_[device];
  for (const auto& kept : {plan.lostDay, plan.repeatedDay, plan.lateDay}) {
    if (kept && day >= *kept - 1 && day <= *kept + 2) return false;
  }
  return day > 0 && Random({size_.seed, static_cast<std::uint64_t>(Purpose::Power), device,
                            static_cast<std::uint64_t>(day)})
                            .uniform() < kOffPerDay;
}

std::string FleetPlan::pseudonym(std::size_t device) const {
  Random random({size_.seed, static_cast<std::uint64_t>(Purpose::Pseudonym), device});
  const std::uint64_t high = random.bits();
  return fmt::format("{:016x}{:016x}", high, random.bits());
}

std::int32_t FleetPlan::dayOfWornDevices() const {
  const auto worn =
      static_cast<std::size_t>(std::ceil(kWornShare * static_cast<double>(size_.devices)));
  const double left = daysLeft(quantile(worn - 1, size_.devices));
  return size_.firstDay + size_.days + static_cast<std::int32_t>(std::ceil(left));
}

std::string FleetPlan::truths() const {
  const auto count = [this](auto&& has) { return std::ranges::count_if(devices_, has); };
  double before = 0, rise = 0;
  for (const DevicePlan& device : devices_) {
    if (!device.updateDay) continue;
    before += device.dailyWakeups;
    if (device.wakesTwiceAsOften) rise += device.dailyWakeups;
  }
  const auto updated = count([](const DevicePlan& one) { return one.updateDay.has_value(); });
  const nlohmann::ordered_json truths = {
      {"seed", size_.seed},
      {"devices", size_.devices},
      {"days", size_.days},
      {"first_day", size_.firstDay},
      {"old_version", kOldVersion},
      {"new_version", kNewVersion},
      {"updated_devices", updated},
      {"wakeups",
       {{"key", kWakeupKey},
        {"affected_devices", count([](const DevicePlan& one) { return one.wakesTwiceAsOften; })},
        {"mean_before", before / static_cast<double>(updated)},
        {"mean_rise", rise / static_cast<double>(updated)}}},
      {"wear",
       {{"key", kWearKey},
        {"percent", kWornPercent},
        {"share", kWornShare},
        {"day", dayOfWornDevices()}}},
      {"stopped_key", kStoppedKey},
      {"lost_logs", count([](const DevicePlan& one) { return one.lostDay.has_value(); })},
      {"repeated_logs", count([](const DevicePlan& one) { return one.repeatedDay.has_value(); })},
      {"late_logs", count([](const DevicePlan& one) { return one.lateDay.has_value(); })},
      {"silent_devices", count([](const DevicePlan& one) { return one.lastDay.has_value(); })},
      {"wrong_clocks", count([](const DevicePlan& one) { return one.clockAhead != 0; })}};
  return truths.dump(2) + "\n";
}

}  // namespace tally::simulation
