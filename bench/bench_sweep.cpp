// The daily sweep on the sample device, store included, beside a bare write of as many scalars in
// one transaction. Each is a process of its own ("bench_sweep NAME ROOT"), whose start-up is taken
// off.
#include <stdlib.h>

#include <algorithm>
#include <cstdio>
#include <filesystem>
#include <string>
#include <string_view>
#include <vector>

#include "driver/telemetry_sweep.h"
#include "figures.h"
#include "host/host_platform.h"
#include "process_cost.h"

namespace {

using namespace tally;

constexpr int kRuns = 15;
constexpr int kScalars = 720;  // about what a sweep of the sample device sets

void sweep() { runTelemetrySweep(platform()); }

void writeScalars() {
  MetricsStore& store = *platform().metricsStore;
  store.beginBatch();
  for (int i = 0; i < kScalars; ++i) {
    store.TBClientSetValueForScalarKey("com.example.subsystem.counter." + std::to_string(i), i);
  }
  store.endBatch();
}

// The CPU time of the least disturbed of several runs, in milliseconds; below 0 when one failed.
double cost(const std::string& self, const char* name, const std::string& root) {
  double least = -1;
  for (int i = 0; i < kRuns; ++i) {
    const auto run = bench::runProcess({self, name, root}, {"TALLYRUN_LOG=stderr"});
    if (run.exitStatus != 0) return -1;
    least = least < 0 ? run.cpuSeconds : std::min(least, run.cpuSeconds);
  }
  return least * 1e3;
}

int measure(const std::string& self) {
  char folder[] = "/tmp/tally-sweep-XXXXXX";
  if (::mkdtemp(folder) == nullptr) return 1;
  const std::string root = std::string(folder) + "/device";
  double costs[3] = {-1, -1, -1};
  if (bench::runProcess({MAKE_DEMO_ROOT, root}).exitStatus == 0) {
    costs[0] = cost(self, "nothing", root);
    costs[1] = cost(self, "sweep", root);
    costs[2] = cost(self, "scalars", root);
  }
  std::filesystem::remove_all(folder);
  if (*std::min_element(std::begin(costs), std::end(costs)) < 0) return 1;
  const double swept = costs[1] - costs[0], written = costs[2] - costs[0];
  std::printf("start-up alone              %8.1f ms CPU\n", costs[0]);
  std::printf("sweep, store included       %8.1f ms CPU\n", swept);
  std::printf("%d scalars, nothing else   %8.1f ms CPU\n", kScalars, written);
  std::printf("ratio                       %8.1f\n", swept / written);
  bench::addFigure("the daily sweep", swept, "ms CPU", bench::atMost(30));
  bench::addFigure("the daily sweep, beside a bare write", swept, "ms CPU",
                   "as many scalars in one transaction", written, bench::noTarget());
  return 0;
}

}  // namespace

int main(int count, char** arguments) {
  if (count != 3) return measure(std::filesystem::canonical(arguments[0]));
  const PlatformScope scope(makeHostPlatform(std::string(arguments[2])));
  const std::string_view name = arguments[1];
  if (name == "sweep") sweep();
  if (name == "scalars") writeScalars();
  return 0;
}
