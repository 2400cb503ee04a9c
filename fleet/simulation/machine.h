// What the kernel of a simulated device shows of itself, in files below its root.
#pragma once

#include <array>
#include <cstdint>
#include <filesystem>
#include <string>

#include "simulation/fleet_plan.h"

namespace tally::simulation {

class Machine {
 public:
  // Makes the files that stay as they are, below a root that exists.
  Machine(std::filesystem::path root, const FleetPlan& plan, std::size_t device);

  // Counts a day on which the version ran, and shows the counts. `day` is the one that begins.
  void count(int day, bool isNewVersion);
  void show(int day) const;

 private:
  static constexpr std::size_t kMostAmounts = 64;
  void write(const std::string& path, std::string_view text) const;
  std::string filled(std::string_view text) const;

  std::filesystem::path root_;
  const FleetPlan& plan_;
  std::size_t device_;
  std::array<double, kMostAmounts> amounts_{};
};

// Writes the name of the system that is installed.
void installVersion(const std::filesystem::path& root, bool isNew);

}  // namespace tally::simulation
