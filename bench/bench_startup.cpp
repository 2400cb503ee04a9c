// Start-up: `tallyrun -d` on a day that is already done, beside an empty C++ program. Both are
// started in turn, so that a machine whose speed drifts slows both alike.
#include <stdlib.h>

#include <algorithm>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <vector>

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
  std::vector<double> job, yardstick;
  for (int i = 0; i < kRuns; ++i) {
    const ProcessCost a = runProcess({tallyrun, "-d"}, environment);
    const ProcessCost b = runProcess({empty});
    if (a.exitStatus != 0 || b.exitStatus != 0) return 1;
    job.push_back(a.wallSeconds);
    yardstick.push_back(b.wallSeconds);
  }
  std::filesystem::remove_all(root);
  std::printf("tallyrun -d, day done   %8.3f ms (median of %d)\n", median(job) * 1e3, kRuns);
  std::printf("empty C++ program       %8.3f ms\n", median(yardstick) * 1e3);
  std::printf("ratio                   %8.2f (to reach: at most 4)\n",
              median(job) / median(yardstick));
  return 0;
}
