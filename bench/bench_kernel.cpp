// Samples of the kernel's channels on a large machine, beside loops that only read the same files;
// and the daily sweep of that machine. "bench_kernel NAME ROOT" is one process of the measurement.
#include <fcntl.h>
#include <stdlib.h>
#include <time.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <filesystem>
#include <string>
#include <string_view>
#include <vector>

#include "driver/telemetry_sweep.h"
#include "figures.h"
#include "host/host_platform.h"
#include "host/kernel/kernel_channels.h"
#include "hwreport/hwreport.h"
#include "kernel_tree.h"
#include "process_cost.h"

namespace {

using namespace tally;

constexpr int kSamples = 200, kRuns = 7;
constexpr std::uint16_t kRaw = 0x1;

double cpuSeconds() {
  timespec now{};
  ::clock_gettime(CLOCK_PROCESS_CPUTIME_ID, &now);
  return static_cast<double>(now.tv_sec) + static_cast<double>(now.tv_nsec) * 1e-9;
}

// Microseconds of CPU time for one call, of the least disturbed of several runs.
template <class Work>
double costOf(const Work& work) {
  double least = 1e9;
  for (int run = 0; run < kRuns; ++run) {
    const double begin = cpuSeconds();
    for (int i = 0; i < kSamples; ++i) work();
    least = std::min(least, (cpuSeconds() - begin) / kSamples);
  }
  return least * 1e6;
}

char buffer[1 << 20];

double readAll(const std::vector<std::string>& paths) {
  return costOf([&] {
    for (const std::string& path : paths) {
      const int file = ::open(path.c_str(), O_RDONLY | O_CLOEXEC);
      while (::read(file, buffer, sizeof buffer) > 0) continue;
      ::close(file);
    }
  });
}

double readOpen(const std::vector<std::string>& paths) {
  std::vector<int> files;
  files.reserve(paths.size());
  for (const std::string& path : paths) files.push_back(::open(path.c_str(), O_RDONLY | O_CLOEXEC));
  const double cost = costOf([&] {
    for (const int file : files) (void)!::pread(file, buffer, sizeof buffer, 0);
  });
  for (const int file : files) ::close(file);
  return cost;
}

std::vector<std::string> filesOf(const std::string& root) {
  const SystemTree tree((DeviceRoot(root)));
  std::vector<std::string> paths;
  const KernelChannels channels(tree);
  for (const FoundFile& file : channels.findings().files()) {
    if (tree.exists(file.path)) paths.push_back(root + file.path);
  }
  return paths;
}

int sampleAll(const std::string& root, const char* name) {
  const PlatformScope scope(makeHostPlatform(DeviceRoot(root)));
  const auto channels = HwReportCopyChannelsInCategories(kRaw, 0);
  KvRef<KvDictionary> subscribed;
  const auto subscription = HwReportCreateSubscription(nullptr, channels.get(), &subscribed, 0);
  if (!subscription) return 1;
  const auto paths = filesOf(root);
  const double sample = costOf([&] {
    if (!HwReportCreateSamples(subscription.get(), subscribed.get())) std::abort();
  });
  const double opened = readAll(paths), kept = readOpen(paths);
  std::printf("%5d channels of %4zu files, a sample           %8.0f us CPU\n",
              HwReportGetChannelCount(channels.get()), paths.size(), sample);
  std::printf("open, read and close of these files            %8.0f us CPU\n", opened);
  std::printf("pread of these files, kept open                %8.0f us CPU\n", kept);
  std::printf("a sample beside open, read and close           %8.2f\n", sample / opened);
  std::printf("a sample a second, of a core                   %8.3f %%\n", sample * 1e-4);
  bench::addFigure(name, sample, "us CPU", "open, read and close of the same files", opened,
                   bench::atMost(1.5));
  return 0;
}

// CPU time in milliseconds and peak memory in MiB of a process of this program.
struct Cost {
  double milliseconds = 1e9, mebibytes = 1e9;
};
Cost costOfProcess(const std::string& self, const char* name, const std::string& root) {
  Cost least;
  for (int i = 0; i < kRuns; ++i) {
    const auto run = bench::runProcess({self, name, root}, {"TALLYRUN_LOG=stderr"});
    if (run.exitStatus != 0) std::abort();
    least.milliseconds = std::min(least.milliseconds, run.cpuSeconds * 1e3);
    least.mebibytes = std::min(least.mebibytes, static_cast<double>(run.peakKibibytes) / 1024);
  }
  return least;
}

int measure(const std::string& self) {
  char folder[] = "/tmp/tally-kernel-XXXXXX";
  if (::mkdtemp(folder) == nullptr) return 1;
  bench::makeKernelTree(folder);
  // First, since a process that is started begins with the memory of this one.
  const Cost nothing = costOfProcess(self, "nothing", folder);
  const Cost sweep = costOfProcess(self, "sweep", folder);
  std::printf("64 processors, 20 disks, 30 interfaces:\n");
  int status = sampleAll(folder, "kernel statistics, a large machine");
  std::printf("the daily sweep, beyond start-up               %8.1f ms CPU\n",
              sweep.milliseconds - nothing.milliseconds);
  std::printf("                                               %8.1f MiB\n",
              sweep.mebibytes - nothing.mebibytes);
  bench::addFigure("the daily sweep of a large machine", sweep.milliseconds - nothing.milliseconds,
                   "ms CPU", bench::atMost(50));
  bench::addFigure("the daily sweep of a large machine, memory",
                   sweep.mebibytes - nothing.mebibytes, "MiB", bench::atMost(8));
  std::filesystem::remove_all(folder);
  std::printf("this machine:\n");
  status |= sampleAll("", "kernel statistics, this machine");
  return status;
}

}  // namespace

int main(int argc, char** argv) {
  if (argc < 3) return measure(std::filesystem::canonical(argv[0]));
  const std::string_view name = argv[1];
  const PlatformScope scope(makeHostPlatform(DeviceRoot(argv[2])));
  if (name == "sweep") runTelemetrySweep(platform());
  return 0;
}
