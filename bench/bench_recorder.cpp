// What recording a metric costs tallyd, beside a process that receives the same datagrams and does
// nothing else. "bench_recorder send ADDRESS PER_DATAGRAM METRICS RATE" only sends, for benchmarks
// of other daemons.
#include <stdlib.h>

#include <algorithm>
#include <cstdio>
#include <filesystem>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "figures.h"
#include "recorder/daemon.h"
#include "recorder/load.h"
#include "recorder/own_network.h"
#include "recorder/process_figures.h"

namespace {

using namespace tally::bench;

constexpr int kRuns = 3;
constexpr int kUdpPort = 18125;
constexpr std::int64_t kDatagrams = 200'000;  // of a run
constexpr std::int64_t kPool = 110'000;       // metrics that differ: 200 of each key

struct Case {
  const char* label;
  int perDatagram, queue;  // 0: UDP
  double rate;             // datagrams a second; 0: as fast as they are taken
  double toReach;          // metrics a second and core; 0: none stated
};
// UDP senders are not held back: they keep to a rate.
constexpr Case kCases[] = {
    {"UNIX, queue of 10", 1, 10, 0, 500'000},
    {"UNIX, queue of 512", 1, 512, 0, 500'000},
    {"UDP", 1, 0, 100'000, 0},
    {"UNIX, queue of 10", 20, 10, 0, 3'000'000},
    {"UNIX, queue of 512", 20, 512, 0, 3'000'000},
    {"UDP", 20, 0, 50'000, 0},
};

struct Cost {
  CpuTimes perMetric;  // in seconds
  double taken = 0;    // share of what was sent
};

Cost leastOf(const std::vector<Cost>& costs) {
  return *std::ranges::min_element(costs, {},
                                   [](const Cost& cost) { return cost.perMetric.sum(); });
}

Cost costOf(const CpuTimes& times, std::int64_t metrics, std::int64_t sent) {
  const auto count = static_cast<double>(metrics);
  return {{times.user / count, times.system / count}, count / static_cast<double>(sent)};
}

Cost ofDaemon(const Case& c, const std::vector<std::string>& datagrams) {
  const Daemon daemon(kNoLimits, c.queue == 0 ? kUdpPort : 0);
  Sender sender(c.queue == 0 ? "udp:" + std::to_string(kUdpPort) : daemon.socket());
  sender.send(datagrams, std::ssize(datagrams), c.rate);  // all keys are known from here on
  const std::int64_t before = daemon.settledMetrics();
  const CpuTimes begin = cpuTimesOf(daemon.process());
  sender.send(datagrams, kDatagrams, c.rate);
  const std::int64_t metrics = daemon.settledMetrics() - before;
  daemon.commit();  // counts as well
  return costOf(cpuTimesOf(daemon.process()) - begin, metrics, kDatagrams * c.perDatagram);
}

Cost ofBareReceiver(const Case& c, const std::vector<std::string>& datagrams) {
  char folder[] = "/tmp/tally-recorder-XXXXXX";
  require(::mkdtemp(folder) != nullptr, "no folder in /tmp");
  const std::string address =
      c.queue == 0 ? "udp:" + std::to_string(kUdpPort) : std::string(folder) + "/socket";
  Cost cost;
  {
    const BareReceiver receiver(address);
    Sender(address).send(datagrams, kDatagrams, c.rate);
    const std::int64_t metrics = receiver.settled() * c.perDatagram;
    cost = costOf(cpuTimesOf(receiver.process()), metrics, kDatagrams * c.perDatagram);
  }
  std::filesystem::remove_all(folder);
  return cost;
}

void print(const char* label, int perDatagram, const Cost& cost) {
  std::printf("%-22s %3d %8.0f %8.0f %8.0f %11.2f %8.2f", label, perDatagram,
              cost.perMetric.user * 1e9, cost.perMetric.system * 1e9, cost.perMetric.sum() * 1e9,
              1e-6 / cost.perMetric.sum(), (1 - cost.taken) * 100);
}

int measure() {
  const bool mayChoose = enterOwnNetwork();
  std::printf("%-22s %3s %8s %8s %8s %11s %8s\n", "nanoseconds a metric", "per", "user", "system",
              "sum", "million/s", "% lost");
  for (const Case& c : kCases) {
    if (c.queue != 0 && mayChoose) setQueueLength(c.queue);
    if (c.queue != 0 && queueLength() != c.queue) {
      std::printf("%-22s %3d skipped: the queue's length is root's to set\n", c.label,
                  c.perDatagram);
      continue;
    }
    const auto datagrams = makeDatagrams({}, c.perDatagram, kPool);
    std::vector<Cost> ours, bare;
    for (int i = 0; i < kRuns; ++i) {
      ours.push_back(ofDaemon(c, datagrams));
      bare.push_back(ofBareReceiver(c, datagrams));
    }
    const Cost least = leastOf(ours), yardstick = leastOf(bare);
    print(c.label, c.perDatagram, least);
    std::printf("\n");
    print("  recv and nothing else", c.perDatagram, yardstick);
    std::printf("  tallyd takes %.2f times that\n",
                least.perMetric.sum() / yardstick.perMetric.sum());
    std::fflush(stdout);
    const std::string name =
        std::string("recording, ") + c.label + ", " + std::to_string(c.perDatagram) + " a datagram";
    addFigure(name.c_str(), least.perMetric.sum() * 1e9, "ns CPU", "recv and nothing else",
              yardstick.perMetric.sum() * 1e9, noTarget());
    if (c.toReach > 0) {
      addFigure((name + ", a core").c_str(), 1e-6 / least.perMetric.sum(), "million/s",
                atLeast(c.toReach * 1e-6));
    }
  }
  return 0;
}

}  // namespace

int main(int count, char** arguments) {
  if (count == 1) return measure();
  if (count != 6 || std::string_view(arguments[1]) != "send") return 2;
  const int perDatagram = std::atoi(arguments[3]);
  const auto datagrams = makeDatagrams({}, perDatagram, kPool);
  Sender(arguments[2])
      .send(datagrams, std::atoll(arguments[4]) / perDatagram,
            std::atof(arguments[5]) / perDatagram);
  return 0;
}
