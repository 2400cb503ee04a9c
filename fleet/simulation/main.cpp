// fleet_simulation: the logs of a fleet, made by the daily job itself on devices whose machines,
// users and clocks are simulated.
#include <cstdio>
#include <exception>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <string>

#include <fmt/format.h>
#include <CLI/CLI.hpp>

#include "kv/plist_codec.h"
#include "simulation/fleet_plan.h"
#include "simulation/maker_metrics.h"
#include "simulation/simulated_device.h"

namespace {

using namespace tally;
using namespace tally::simulation;

// The packaged whitelist with a group for the maker's own metrics, as a maker would add it.
std::string whitelistFrom(const std::string& path) {
  std::stringstream text;
  text << std::ifstream(path).rdbuf();
  const auto packaged = decodePlist(text.str());
  auto* groups = packaged ? kvCast<KvDictionary>(packaged->get()) : nullptr;
  if (groups == nullptr) throw std::runtime_error(path + " is not a whitelist");
  groups->set(kMakerGroup, makerGroup());
  return *encodeXmlPlist(*groups);
}

int simulate(const Folders& folders, const FleetPlan& plan, std::size_t part, std::size_t parts,
             const std::string& whitelist) {
  for (std::size_t number = part; number < plan.size().devices; number += parts) {
    if (!SimulatedDevice(folders, plan, number, whitelist).live()) return 1;
  }
  return 0;
}

}  // namespace

int main(int count, char** arguments) {
  CLI::App app("Makes the logs of a simulated fleet");
  std::string folder, roots, whitelist;
  FleetSize size;
  std::size_t part = 0, parts = 1;
  app.add_option("FOLDER", folder, "where the logs go, in a directory for each day of arrival")
      ->required();
  app.add_option("--roots", roots, "where the devices are while they live, best in memory")
      ->required();
  app.add_option("--whitelist", whitelist, "the packaged whitelist")->required();
  app.add_option("--devices", size.devices)->check(CLI::Range(20, 1'000'000));
  app.add_option("--days", size.days)->check(CLI::Range(10, 30));
  app.add_option("--seed", size.seed);
  app.add_option("--part", part, "which of the parts of the fleet, from 0");
  app.add_option("--parts", parts, "that are simulated by processes of their own")
      ->check(CLI::Range(1, 64));
  CLI11_PARSE(app, count, arguments);
  try {
    const FleetPlan plan(size);
    std::filesystem::create_directories(folder);
    if (part == 0) std::ofstream(std::filesystem::path(folder) / "truths.json") << plan.truths();
    return simulate({roots, std::filesystem::path(folder) / "arrived"}, plan, part, parts,
                    whitelistFrom(whitelist));
  } catch (const std::exception& error) {
    fmt::print(stderr, "fleet_simulation: {}\n", error.what());
    return 1;
  }
}
