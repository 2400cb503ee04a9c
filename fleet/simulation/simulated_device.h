// A device of the fleet: its root, its days, and where its logs go.
#pragma once

#include <cstddef>
#include <filesystem>
#include <memory>
#include <string>

#include "platform/clock.h"
#include "simulation/fleet_plan.h"
#include "simulation/machine.h"

namespace tally::simulation {

// A clock that only the simulation moves.
class SimulatedClock final : public Clock {
 public:
  double secondsSince1970() const override { return seconds_; }
  void set(double seconds) { seconds_ = seconds; }

 private:
  double seconds_ = 0;
};

struct Folders {
  std::filesystem::path roots;    // of the devices, which are gone when they have lived
  std::filesystem::path arrived;  // their logs, in a directory for each date of arrival
};

class SimulatedDevice {
 public:
  // Makes its root, with the whitelist; the destructor removes it.
  SimulatedDevice(const Folders& folders, const FleetPlan& plan, std::size_t number,
                  const std::string& whitelist);
  ~SimulatedDevice();
  SimulatedDevice(const SimulatedDevice&) = delete;
  SimulatedDevice& operator=(const SimulatedDevice&) = delete;

  // All days of the fleet. False when the device's programs reported an error.
  bool live();

 private:
  bool isNew(int day) const;
  void record(int day);
  void runDailyJob(int day);
  void handOver(int day);

  const std::filesystem::path arrived_, root_;
  const FleetPlan& plan_;
  const DevicePlan& device_;
  const std::size_t number_;
  const std::shared_ptr<SimulatedClock> clock_ = std::make_shared<SimulatedClock>();
  Machine machine_;
  bool failed_ = false;
};

}  // namespace tally::simulation
