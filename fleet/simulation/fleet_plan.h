// What happens to the devices of a fleet, and what a question about the fleet must therefore find.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace tally::simulation {

struct FleetSize {
  std::uint64_t seed = 1;
  std::size_t devices = 200;
  int days = 30;
  std::int32_t firstDay = 20150;  // 2025-03-03
};

inline constexpr std::string_view kOldVersion = "Quillet 4.1 (R410)";
inline constexpr std::string_view kNewVersion = "Quillet 4.2 (R420)";
// The key that only the old version records, and those of the two curves.
inline constexpr std::string_view kStoppedKey = "quillet.radio.reconnects";
inline constexpr std::string_view kWakeupKey = "vellum.hwreport.wakeup.pci.wakeups";
inline constexpr std::string_view kWearKey = "vellum.NANDInfo.UserPartitionPEPercentUsed";

// Days count from the first one of the fleet.
struct DevicePlan {
  std::optional<int> updateDay;                      // the first day with the new version
  double dailyWakeups = 0;                           // with the old version
  bool wakesTwiceAsOften = false;                    // with the new one
  double wearPerDay = 0;                             // in percent of what the disk is made for
  std::optional<int> lastDay;                        // it is silent afterwards
  std::optional<int> lostDay, repeatedDay, lateDay;  // what happens to the log of that day
  std::int32_t clockAhead = 0;                       // in days
};

class FleetPlan {
 public:
  explicit FleetPlan(const FleetSize& size);

  const FleetSize& size() const { return size_; }
  const DevicePlan& device(std::size_t number) const { return devices_[number]; }
  // Of a device whose disk wears at this rate, on a day.
  static double percentUsed(double wearPerDay, int day);
  bool isOff(std::size_t device, int day) const;
  // Devices draw theirs from the kernel; here a seed always gives the same fleet.
  std::string pseudonym(std::size_t device) const;

  // What there is to find, as JSON.
  std::string truths() const;

 private:
  std::int32_t dayOfWornDevices() const;

  FleetSize size_;
  std::vector<DevicePlan> devices_;
};

}  // namespace tally::simulation
