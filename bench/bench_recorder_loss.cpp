// Whether metrics are lost between programs and tallyd: at rates that it is to bear, and whether
// those that libtallyclient drops are accounted for.
#include <algorithm>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "figures.h"
#include "recorder/daemon.h"
#include "recorder/load.h"
#include "recorder/own_network.h"
#include "tallyclient/tallyclient.h"

namespace {

using namespace tally::bench;
using namespace std::chrono_literals;
using std::chrono::steady_clock;

constexpr int kSeconds = 1, kRuns = 3;
constexpr int kDefaultQueue = 10, kRaisedQueue = 512;

struct Case {
  int perDatagram, queue;
  bool blocks;
  double metricsPerSecond;
};
constexpr Case kCases[] = {
    {1, kDefaultQueue, true, 250'000},  {20, kDefaultQueue, true, 1'500'000},
    {1, kRaisedQueue, false, 250'000},  {20, kRaisedQueue, false, 1'500'000},
    {1, kDefaultQueue, false, 250'000}, {20, kDefaultQueue, false, 1'500'000},
};

bool useQueue(bool mayChoose, int length) {
  if (mayChoose) setQueueLength(length);
  return queueLength() == length;
}

struct Outcome {
  double rate = 0;            // metrics a second, in fact
  std::int64_t notTaken = 0;  // the sender was told
  std::int64_t lost = 0;
};

template <class Receiver>
Outcome run(const Case& c, const std::vector<std::string>& datagrams, const std::string& socket,
            const Receiver& metricsOf) {
  Sender sender(socket, c.blocks);
  const double rate = c.metricsPerSecond / c.perDatagram;
  const auto count = static_cast<std::int64_t>(rate) * kSeconds;
  const auto begin = steady_clock::now();
  const std::int64_t refused = sender.send(datagrams, count, rate) * c.perDatagram;
  const double seconds = std::chrono::duration<double>(steady_clock::now() - begin).count();
  const std::int64_t sent = count * c.perDatagram;
  return {static_cast<double>(sent) / seconds, refused, sent - refused - metricsOf()};
}

Outcome runDaemon(const Case& c, const std::vector<std::string>& datagrams) {
  const Daemon daemon;
  return run(c, datagrams, daemon.socket(), [&] { return daemon.settledMetrics(); });
}

Outcome runBareReceiver(const Case& c, const std::vector<std::string>& datagrams) {
  const Daemon folder;  // for its own socket's directory alone
  const std::string socket = folder.root() + "/bare";
  const BareReceiver receiver(socket);
  return run(c, datagrams, socket, [&] { return receiver.settled() * c.perDatagram; });
}

template <class Run>
Outcome bestOf(Run runOnce) {
  std::vector<Outcome> runs;
  std::int64_t lost = 0;  // in any of them
  for (int i = 0; i < kRuns; ++i) lost += runs.emplace_back(runOnce()).lost;
  Outcome best = *std::ranges::min_element(runs, [](const Outcome& a, const Outcome& b) {
    return std::pair(a.notTaken, -a.rate) < std::pair(b.notTaken, -b.rate);
  });
  best.lost = lost;
  return best;
}

// Returns the metrics that were lost without notice.
std::int64_t measure(const Case& c) {
  const auto datagrams = makeDatagrams({}, c.perDatagram, 110'000);
  const Outcome ours = bestOf([&] { return runDaemon(c, datagrams); });
  const Outcome bare = bestOf([&] { return runBareReceiver(c, datagrams); });
  std::printf("%-12s %3d %6d %10.0f %10.0f %10lld %6lld %12lld\n",
              c.blocks ? "blocking" : "non-blocking", c.perDatagram, c.queue, c.metricsPerSecond,
              ours.rate, static_cast<long long>(ours.notTaken), static_cast<long long>(ours.lost),
              static_cast<long long>(bare.notTaken));
  if (!c.blocks && c.queue == kRaisedQueue) {
    const double sent = c.metricsPerSecond * kSeconds;
    addFigure((std::to_string(c.perDatagram) + " a datagram, taken without waiting").c_str(),
              sent - static_cast<double>(ours.notTaken), "metrics", "recv and nothing else",
              sent - static_cast<double>(bare.notTaken), atLeast(1));
  }
  return ours.lost;
}

// A program that records without a pause, which no queue bears: what the store has and what the
// client said that it dropped must be all.
void measureClient() {
  const Daemon daemon;
  tallyclient* const client = tallyclient_open(daemon.socket().c_str());
  require(client != nullptr, "no client");
  constexpr const char* kName = "com.example.service.requests";
  constexpr std::int64_t kSent = 20'000'000;
  for (std::int64_t i = 0; i < kSent; ++i) tallyclient_add(client, kName, 1);
  for (int i = 0; i < 100 && tallyclient_flush(client) != 0; ++i) std::this_thread::sleep_for(10ms);
  // The number of the last ones goes with the next datagram.
  tallyclient_add(client, kName, 0);
  tallyclient_flush(client);
  const auto dropped = static_cast<std::int64_t>(tallyclient_dropped(client));
  tallyclient_close(client);
  (void)daemon.settledMetrics();
  daemon.commit();
  const std::int64_t stored = daemon.stored(kName);
  const std::int64_t reported = daemon.stored("vellum.tallyd.client.metrics_dropped");
  std::printf("libtallyclient, queue of %d, as fast as it goes: %lld recorded\n", queueLength(),
              static_cast<long long>(kSent));
  std::printf("  in the store %lld, dropped %lld, vellum.tallyd.client.metrics_dropped %lld\n",
              static_cast<long long>(stored), static_cast<long long>(dropped),
              static_cast<long long>(reported));
  const std::int64_t unaccounted = std::abs(kSent - stored - reported);
  std::printf("  unaccounted for: %lld\n", static_cast<long long>(unaccounted));
  addFigure("dropped by libtallyclient, and not reported", static_cast<double>(unaccounted),
            "metrics", atMost(0));
}

}  // namespace

int main() {
  const bool mayChoose = enterOwnNetwork();
  std::printf("%-12s %3s %6s %10s %10s %10s %6s %12s\n", "sender", "per", "queue", "metrics/s",
              "in fact", "not taken", "lost", "bare recv's");
  std::int64_t lost = 0;
  for (const Case& c : kCases) {
    if (useQueue(mayChoose, c.queue)) {
      lost += measure(c);
    } else {
      std::printf("%-12s %3d %6d skipped: the queue's length is root's to set\n",
                  c.blocks ? "blocking" : "non-blocking", c.perDatagram, c.queue);
    }
    std::fflush(stdout);
  }
  addFigure("lost without notice", static_cast<double>(lost), "metrics", atMost(0));
  (void)useQueue(mayChoose, kDefaultQueue);
  measureClient();
  return 0;
}
