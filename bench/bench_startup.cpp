// Start-up: `tallyrun -d` on a day that is already done, beside an empty C++ program and beside the
// same program without a module, in which all is linked; then a whole run of each. All are started
// in turn, so that a machine whose speed drifts slows them alike.
#include <stdlib.h>

#include <algorithm>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <vector>

#include "figures.h"
#include "process_cost.h"

namespace {

using tally::bench::ProcessCost;
using tally::bench::runProcess;

constexpr int kRuns = 400;

double median(std::vector<double> values) {
  std::nth_element(values.begin(), values.begin() + static_cast<long>(values.size() / 2),
                   values.end());
  return values[values.size() / 2];
}

}  // namespace

int main(int, char** arguments) {
  const auto folder = std::filesystem::canonical(arguments[0]).parent_path();
  const std::string tallyrun = folder / "tallyrun";
  const std::string linked = folder / "bench_linked_tallyrun";
  const std::string empty = folder / "bench_empty";
  char root[] = "/tmp/tally-startup-XXXXXX";
  if (::mkdtemp(root) == nullptr) return 1;
  const std::vector<std::string> environment = {"TALLYRUN_ROOT=" + std::string(root),
                                                "TALLYRUN_LOG=stderr"};
  // Without a whitelist the day would never count as done.
  const auto whitelist =
      std::filesystem::path(root) / "Library/Application Support/Tallybook/Whitelist_Nimbus.plist";
  std::filesystem::create_directories(whitelist.parent_path());
  std::ofstream(whitelist) << "<plist version=\"1.0\"><dict/></plist>";
  runProcess({tallyrun, "-d"}, environment);  // does the day; what follows finds it done
  const struct {
    const char* label;
    std::vector<std::string> command;
  } programs[] = {{"tallyrun -d, day done", {tallyrun, "-d"}},
                  {"the same, all linked", {linked, "-d"}},
                  {"empty C++ program", {empty}},
                  {"tallyrun -f, nothing to log", {tallyrun, "-f"}},
                  {"the same, all linked", {linked, "-f"}}};
  constexpr std::size_t kPrograms = std::size(programs);
  std::vector<double> wall[kPrograms], cpu[kPrograms];
  for (int i = 0; i < kRuns; ++i) {
    for (std::size_t p = 0; p < kPrograms; ++p) {
      const ProcessCost cost = runProcess(programs[p].command, environment);
      if (cost.exitStatus != 0) return 1;
      wall[p].push_back(cost.wallSeconds * 1e3);
      cpu[p].push_back(cost.cpuSeconds * 1e3);
    }
  }
  std::filesystem::remove_all(root);
  std::printf("%-28s %12s %12s   medians of %d\n", "", "ms", "ms CPU", kRuns);
  for (std::size_t p = 0; p < kPrograms; ++p) {
    std::printf("%-28s %12.3f %12.3f\n", programs[p].label, median(wall[p]), median(cpu[p]));
  }
  std::printf("ratio to the empty program %14.2f, CPU %.2f\n", median(wall[0]) / median(wall[2]),
              median(cpu[0]) / median(cpu[2]));
  std::printf("module / all linked, CPU %16.3f -d, %.3f -f\n", median(cpu[0]) / median(cpu[1]),
              median(cpu[3]) / median(cpu[4]));
  tally::bench::addFigure("starting for nothing", median(wall[0]), "ms", "an empty C++ program",
                          median(wall[2]), tally::bench::atMost(1.5));
  return 0;
}
