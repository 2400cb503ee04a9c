// What a program pays for a call of libtallyclient, beside one datagram a value as clients without
// a buffer send them. Everything is received between the timed rounds, so that no queue is ever
// full.
#include <stdlib.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <time.h>
#include <unistd.h>

#include <algorithm>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <functional>
#include <string>
#include <vector>

#include "figures.h"
#include "tallyclient/tallyclient.h"

namespace {

constexpr int kRounds = 4000, kPerRound = 256;
// Few enough that a queue of 10 datagrams, which is the kernel's default, takes a round.
constexpr int kDatagramsPerRound = 8;
constexpr char kName[] = "com.example.subsystem.requests";

sockaddr_un address{};
int receiver = -1;

void drain() {
  static char buffer[1 << 16];
  while (::recv(receiver, buffer, sizeof buffer, MSG_DONTWAIT) >= 0) continue;
}

double secondsOfThread() {
  timespec now{};
  ::clock_gettime(CLOCK_THREAD_CPUTIME_ID, &now);
  return static_cast<double>(now.tv_sec) + static_cast<double>(now.tv_nsec) * 1e-9;
}

// Nanoseconds of CPU time for one value, over all rounds but the slowest tenth, which something
// else disturbed.
double costOf(int callsPerRound, int valuesPerCall, const std::function<void(int)>& call) {
  std::vector<double> rounds;
  for (int round = 0; round < kRounds; ++round) {
    const double begin = secondsOfThread();
    for (int i = 0; i < callsPerRound; ++i) call(i);
    rounds.push_back(secondsOfThread() - begin);
    drain();
  }
  std::ranges::sort(rounds);
  double sum = 0;
  const std::size_t counted = rounds.size() - rounds.size() / 10;
  for (std::size_t i = 0; i < counted; ++i) sum += rounds[i];
  return sum / static_cast<double>(counted) / callsPerRound / valuesPerCall * 1e9;
}

void require(bool succeeded) {
  if (!succeeded) std::abort();
}

double print(const char* label, double cost, double yardstick) {
  std::printf("%-48s %7.0f ns  %6.2f\n", label, cost, cost / yardstick);
  return cost;
}

// One call is one datagram.
double costOfSendto(int sender, bool printsLine) {
  return costOf(kDatagramsPerRound, 1, [&](int i) {
    constexpr int kLineBytes = sizeof kName + 5;
    char text[128] = "com.example.subsystem.requests:1|c\n";
    const int printed =
        printsLine ? std::snprintf(text, sizeof text, "%s:%d|c\n", kName, i) : kLineBytes;
    require(::sendto(sender, text, static_cast<std::size_t>(printed), MSG_DONTWAIT | MSG_NOSIGNAL,
                     reinterpret_cast<const sockaddr*>(&address), sizeof address) > 0);
  });
}

// The last case sends, all others record: of these, the first and the dearest are in the table.
void measureCalls(tallyclient* client, double bare) {
  std::vector<double> quarters, thirds;
  for (int i = 0; i < 100; ++i) {
    quarters.push_back(i * 0.25);
    thirds.push_back(i / 3.0);
  }
  const struct {
    const char* label;
    int calls, values;
    std::function<int(int)> call;
  } cases[] = {
      {"tallyclient_add", kPerRound, 1, [&](int i) { return tallyclient_add(client, kName, i); }},
      {"tallyclient_set", kPerRound, 1, [&](int i) { return tallyclient_set(client, kName, i); }},
      {"tallyclient_push, changing names", kPerRound, 1,
       [&](int i) { return tallyclient_push(client, i % 2 != 0 ? kName : "other", i * 0.25); }},
      {"tallyclient_push", kPerRound, 1,
       [&](int i) { return tallyclient_push(client, kName, i * 0.25); }},
      {"tallyclient_push, 17 digits", kPerRound, 1,
       [&](int i) { return tallyclient_push(client, kName, i / 3.0); }},
      {"tallyclient_push_many, 100 values", kDatagramsPerRound, 100,
       [&](int) { return tallyclient_push_many(client, kName, quarters.data(), 100); }},
      {"tallyclient_push_many, 100 values of 17 digits", kDatagramsPerRound, 100,
       [&](int) { return tallyclient_push_many(client, kName, thirds.data(), 100); }},
      {"tallyclient_add and tallyclient_flush", kDatagramsPerRound, 1,
       [&](int i) { return tallyclient_add(client, kName, i) + tallyclient_flush(client); }},
  };
  std::vector<double> costs;
  for (const auto& c : cases) {
    const double cost = costOf(c.calls, c.values, [&](int i) { require(c.call(i) == 0); });
    costs.push_back(print(c.label, cost, bare));
  }
  tally::bench::addFigure(cases[0].label, costs[0], "ns", "sendto of a datagram", bare,
                          tally::bench::noTarget());
  tally::bench::addFigure("the dearest recording call of libtallyclient",
                          *std::max_element(costs.begin(), costs.end() - 1), "ns",
                          tally::bench::atMost(1000));
  require(tallyclient_dropped(client) == 0);
}

// What a program pays while nothing is taken from it.
void measureDrops(tallyclient* client, const char* label, double bare) {
  constexpr int kCalls = 1'000'000;
  const double begin = secondsOfThread();
  for (int i = 0; i < kCalls; ++i) tallyclient_add(client, kName, i);
  print(label, (secondsOfThread() - begin) / kCalls * 1e9, bare);
}

int measure(const std::string& path) {
  receiver = ::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0);
  const int sender = ::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0);
  address.sun_family = AF_UNIX;
  std::strcpy(address.sun_path, path.c_str());
  if (::bind(receiver, reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) return 1;
  tallyclient* const client = tallyclient_open(path.c_str());
  require(client != nullptr);
  std::printf("%-48s %10s  %6s\n", "", "a value", "ratio");
  const double bare = costOfSendto(sender, false);
  print("sendto, one datagram a value", bare, bare);
  print("snprintf and sendto", costOfSendto(sender, true), bare);
  const int connected = ::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0);
  require(::connect(connected, reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0);
  const std::string line = std::string(kName) + ":1|c\n";
  print("send on a connected socket",
        costOf(kDatagramsPerRound, 1,
               [&](int) {
                 require(::send(connected, line.data(), line.size(), MSG_DONTWAIT | MSG_NOSIGNAL) >
                         0);
               }),
        bare);
  ::close(connected);
  measureCalls(client, bare);
  measureDrops(client, "tallyclient_add, the daemon's queue is full", bare);
  ::close(receiver);
  measureDrops(client, "tallyclient_add, no daemon", bare);
  tallyclient_close(client);
  ::close(sender);
  return 0;
}

}  // namespace

int main() {
  char folder[] = "/tmp/tally-client-XXXXXX";
  if (::mkdtemp(folder) == nullptr) return 1;
  const int status = measure(std::string(folder) + "/socket");
  std::filesystem::remove_all(folder);
  return status;
}
