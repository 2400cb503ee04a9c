// The private memory of tallyd: idle, with a million samples, and while it commits them.
#include <algorithm>
#include <atomic>
#include <chrono>
#include <cstdio>
#include <string>
#include <string_view>
#include <thread>

#include "figures.h"
#include "recorder/daemon.h"
#include "recorder/load.h"
#include "recorder/process_figures.h"

namespace {

using namespace tally::bench;
using namespace std::chrono_literals;

constexpr int kKeys = 10'000;
constexpr std::int64_t kSamples = 1'000'000;

double mebibytes(long kibibytes) { return static_cast<double>(kibibytes) / 1024; }

void print(const char* label, const PrivateMemory& memory) {
  std::printf("%-52s %7.2f %7.2f\n", label, mebibytes(memory.sum()), mebibytes(memory.dirty));
}

void addMemory(const std::string& name, const PrivateMemory& memory, double mostMebibytes) {
  addFigure(("memory of tallyd, " + name).c_str(), mebibytes(memory.sum()), "MiB",
            atMost(mostMebibytes));
}

// The largest of many looks, while a function runs.
template <class Function>
PrivateMemory peakDuring(pid_t process, Function function) {
  std::atomic<bool> ended = false;
  std::thread worker([&] {
    function();
    ended = true;
  });
  PrivateMemory peak;
  while (!ended) {
    const PrivateMemory now = privateMemoryOf(process);
    if (now.sum() > peak.sum()) peak = now;
    std::this_thread::sleep_for(1ms);
  }
  worker.join();
  return peak;
}

// The recorder returns what a burst took once it has been quiet for a second.
PrivateMemory idleMemoryOf(const Daemon& daemon) {
  std::this_thread::sleep_for(2s);
  return privateMemoryOf(daemon.process());
}

struct Case {
  const char* what;
  Mix::Samples samples;
  std::string_view settings;
  double mostReceiving, mostCommitting;  // MiB
};
// By default the recorder commits at half of its limit.
constexpr std::string_view kMoreMemory =
    "<key>MemoryLimit</key><integer>67108864</integer>"
    "<key>MetricsPerSecond</key><integer>1000000000</integer>";
constexpr double kLimit = 32;
constexpr Case kCases[] = {
    {"whole milliseconds", Mix::Samples::WholeMilliseconds, kNoLimits, 16, kLimit},
    {"any doubles", Mix::Samples::Doubles, kNoLimits, kLimit, kLimit},
    {"any doubles, a limit of 64 MiB", Mix::Samples::Doubles, kMoreMemory, 24, 64},
};

void measure(const Case& c) {
  const Daemon daemon(c.settings);
  const auto datagrams = makeDatagrams({0, kKeys, c.samples}, 20, kSamples);
  std::printf("%d keys, %lld samples: %s\n", kKeys, static_cast<long long>(kSamples), c.what);
  const auto receiving = peakDuring(daemon.process(), [&] {
    Sender(daemon.socket()).send(datagrams, std::ssize(datagrams));
    require(daemon.settledMetrics() == kSamples, "tallyd has not taken all samples");
  });
  print("  peak while they come", receiving);
  addMemory(std::string(c.what) + ", receiving", receiving, c.mostReceiving);
  const auto held = static_cast<long long>(daemon.figure("samples_held"));
  print(("  then, with " + std::to_string(held) + " in memory").c_str(), idleMemoryOf(daemon));
  const auto peak = peakDuring(daemon.process(), [&] { daemon.commit(); });
  print("  peak while these are committed", peak);
  addMemory(std::string(c.what) + ", committing", peak, c.mostCommitting);
  print("  afterwards", idleMemoryOf(daemon));
}

}  // namespace

int main() {
  std::printf("%-52s %7s %7s\n", "private memory, MiB", "all", "written");
  {
    const Daemon daemon;
    const PrivateMemory started = idleMemoryOf(daemon);
    print("idle, just started", started);
    addMemory("just started", started, 2);
    const auto datagrams = makeDatagrams({}, 20, 110'000);
    Sender(daemon.socket()).send(datagrams, std::ssize(datagrams));
    require(daemon.settledMetrics() == 110'000, "tallyd has not taken all metrics");
    daemon.commit();
    const PrivateMemory idle = idleMemoryOf(daemon);
    print("idle, after a commit of 110,000 metrics", idle);
    addMemory("idle after a commit", idle, 2);
  }
  for (const Case& c : kCases) measure(c);
  return 0;
}
