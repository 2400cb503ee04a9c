// How metrics of other programs come in.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "base/result.h"

namespace tally {

// A user as the kernel vouches for it, or the one anonymous user of sockets that carry no
// credentials.
struct Sender {
  static constexpr std::int64_t kAnonymous = -1;
  static constexpr std::int64_t kOthers = -2;  // more users than are told apart
  std::int64_t user = kAnonymous;
  bool operator==(const Sender&) const = default;
};

// What was lost before a line could be read.
enum class IngressLoss {
  Truncated,        // datagrams longer than any that is read; whole lines of them were delivered
  LongLine,         // lines of a stream that are longer than any that is read
  SocketOverflow,   // datagrams that the kernel dropped since a UDP socket's buffer was full
  NoCredentials,    // datagrams of a UNIX socket whose sender is not known
  ConnectionLimit,  // stream connections that were refused
};

// Answers a request on the control socket; the connection closes afterwards.
using ControlRequest = std::uint64_t;

// The recorder, as the loop sees it. All calls come from the loop's thread.
class IngressHandler {
 public:
  virtual ~IngressHandler() = default;
  // Before each round of calls: nanoseconds of CLOCK_BOOTTIME, and seconds since 1970.
  virtual void beginRound(std::int64_t bootNanoseconds, double secondsSince1970) = 0;
  // The lines of one datagram, or whole lines of a stream; the last newline may be missing. The
  // text is borrowed for the call.
  virtual void onLines(Sender sender, std::string_view lines) = 0;
  virtual void onLoss(IngressLoss loss, Sender sender, std::uint64_t count) = 0;
  // How many bytes of the user's streams may be read now; 0: later. Nothing that is in a stream is
  // lost, the sender waits.
  virtual std::size_t streamQuota(Sender sender) = 0;
  // A line from a client of the control socket, who is root or the program's own user. The answer
  // is given by Ingress::answer(), now or later.
  virtual void onControl(ControlRequest request, std::string_view line) = 0;
  // The program is to end (SIGTERM, SIGINT), after what had been sent was handed over; is to read
  // its settings again (SIGHUP).
  virtual void onTerminate() = 0;
  virtual void onReload() = 0;
  // At the end of each round. Returns after how many nanoseconds the next one comes at the latest,
  // empty: only when something arrives. While a time is set, a step of the wall clock begins a
  // round as well.
  virtual std::optional<std::int64_t> endRound() = 0;
};

// The sockets.
class Ingress {
 public:
  virtual ~Ingress() = default;
  // Serves until stop(). Begins with a round, so that the handler can set a time. An error: the
  // sockets failed.
  virtual Status run(IngressHandler& handler) = 0;
  // Ends run() after this round; from any thread.
  virtual void stop() = 0;
  // From the end of this round on, nothing is read any longer: only wake() begins rounds.
  virtual void stopReading() = 0;
  // Begins a round; from any thread.
  virtual void wake() = 0;
  // From the loop's thread, also within onControl(). A client that has gone, or has its answer, is
  // ignored.
  virtual void answer(ControlRequest request, std::string_view text) = 0;
  // Whether clients are connected that would notice the program's end.
  virtual bool hasConnections() const = 0;
  // Whether the sockets stay open when the program ends, so that the next datagram starts it again.
  virtual bool isActivated() const = 0;
};

}  // namespace tally
