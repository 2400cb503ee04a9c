// Datagrams of metrics, and a sender of them at a steady rate.
#pragma once

#include <sys/socket.h>

#include <cstdint>
#include <string>
#include <vector>

namespace tally::bench {

// What the datagrams hold: counters and samples in turn of so many keys each.
struct Mix {
  int counters = 500, distributions = 50;
  enum class Samples { WholeMilliseconds, Doubles } samples = Samples::WholeMilliseconds;
};
std::vector<std::string> makeDatagrams(const Mix& mix, int perDatagram, std::int64_t metrics);

// A UNIX datagram socket of this path, or the UDP port "udp:PORT" of 127.0.0.1.
class Sender {
 public:
  explicit Sender(const std::string& address, bool blocks = true);
  Sender(const Sender&) = delete;
  Sender& operator=(const Sender&) = delete;
  ~Sender();

  // Sends the datagrams over and over until so many are through; returns how many were not taken,
  // which is none with a blocking sender. A rate is in datagrams per second; 0: what is possible.
  std::int64_t send(const std::vector<std::string>& datagrams, std::int64_t count, double rate = 0);

 private:
  int socket_;
  bool blocks_;
};

// Another process that receives the same and does nothing else.
class BareReceiver {
 public:
  explicit BareReceiver(const std::string& address);
  BareReceiver(const BareReceiver&) = delete;
  BareReceiver& operator=(const BareReceiver&) = delete;
  ~BareReceiver();
  int process() const { return process_; }
  // Datagrams, once no more come.
  std::int64_t settled() const;

 private:
  int socket_ = -1, process_ = -1;
  volatile std::int64_t* count_;
};

}  // namespace tally::bench
