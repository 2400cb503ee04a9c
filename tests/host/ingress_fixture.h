// Sockets on a temporary device root, served by the test itself.
#pragma once

#include <poll.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>

#include <chrono>
#include <functional>
#include <map>
#include <thread>
#include <utility>

#include "host/ingress/socket_directory.h"
#include "host/ingress/socket_ingress.h"
#include "host/temporary_root.h"

namespace tally {

// Keeps what comes in, and ends the loop once the test has what it waits for.
struct IngressRecorder : IngressHandler {
  using Clock = std::chrono::steady_clock;
  void beginRound(std::int64_t, double) override { ++rounds; }
  void onLines(Sender sender, std::string_view text) override {
    lines.emplace_back(sender.user, text);
    if (quota != kUnlimited) quota -= std::min(quota, text.size());
  }
  void onLoss(IngressLoss loss, Sender, std::uint64_t count) override { losses[loss] += count; }
  std::size_t streamQuota(Sender) override { return quota; }
  void onControl(ControlRequest request, std::string_view line) override {
    requests.emplace_back(request, line);
  }
  void onTerminate() override { texts.push_back("terminate"); }
  void onReload() override { texts.push_back("reload"); }
  std::optional<std::int64_t> endRound() override {
    if (!until) return std::nullopt;  // sleeps until something comes
    expired = Clock::now() > end;
    if (expired || until()) ingress->stop();
    return 10'000'000;
  }
  std::string all() const {
    std::string text;
    for (const auto& line : lines) text += line.second;
    return text;
  }

  static constexpr std::size_t kUnlimited = 1u << 30;
  std::size_t quota = kUnlimited;
  std::uint64_t rounds = 0;
  std::vector<std::pair<std::int64_t, std::string>> lines;
  std::map<IngressLoss, std::uint64_t> losses;
  std::vector<std::pair<ControlRequest, std::string>> requests;
  Names texts;
  Ingress* ingress = nullptr;
  std::function<bool()> until;
  Clock::time_point end;
  bool expired = false;
};

class IngressTest : public TemporaryRoot {
 protected:
  static constexpr uid_t kOther = 1234;

  IngressTest() { ::chmod(TemporaryFolder::root.c_str(), 0755); }
  DeviceRoot device() const { return DeviceRoot(TemporaryFolder::root); }
  std::string open(const IngressOptions& options = {}) {
    auto opened = openIngress(device(), options, *log);
    if (!opened) return opened.error().message;
    ingress = *std::move(opened);
    handler.ingress = ingress.get();
    return {};
  }
  // Whether it came within ten seconds.
  bool serveUntil(std::function<bool()> until) {
    handler.until = std::move(until);
    handler.end = IngressRecorder::Clock::now() + std::chrono::seconds(10);
    handler.expired = false;
    const auto served = ingress->run(handler);
    EXPECT_TRUE(served);
    return !handler.expired;
  }
  // The rounds of 200 ms in which nobody sends: one at the beginning, one at the end.
  std::uint64_t idleRounds() {
    const auto before = handler.rounds;
    std::thread waker([&] {
      ::poll(nullptr, 0, 200);
      ingress->stop();
    });
    handler.until = nullptr;
    EXPECT_TRUE(ingress->run(handler));
    waker.join();
    return handler.rounds - before;
  }
  // Runs work as another process, and as another user if one is named; serves meanwhile.
  int serveChild(uid_t user, const std::function<int()>& work) {
    const pid_t child = ::fork();
    if (child == 0)
      ::_exit(user != ::geteuid() && ::setresuid(user, user, user) != 0 ? 99 : work());
    int status = -1;
    EXPECT_TRUE(serveUntil([&] { return ::waitpid(child, &status, WNOHANG) == child; }));
    return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
  }
  Descriptor connectTo(const RecorderSocket& which) const {
    const int type = which.kind == RecorderSocket::Kind::Datagrams ? SOCK_DGRAM : SOCK_STREAM;
    Descriptor socket(::socket(AF_UNIX, type | SOCK_CLOEXEC, 0));
    const auto directory = Directory::open(at("run/tallyd"));
    if (!directory) return {};
    const sockaddr_un address = socketAddress(*directory, which.name);
    if (::connect(socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
      return {};
    }
    return socket;
  }
  static bool sendTo(const Descriptor& socket, std::string_view text) {
    return ::send(socket.get(), text.data(), text.size(), MSG_NOSIGNAL) ==
           static_cast<ssize_t>(text.size());
  }
  // Up to the end that the other side makes, which comes within ten seconds.
  static std::string readAll(const Descriptor& socket) {
    std::string text;
    char piece[4096];
    pollfd ready{socket.get(), POLLIN, 0};
    while (::poll(&ready, 1, 10'000) == 1) {
      const auto count = ::recv(socket.get(), piece, sizeof piece, 0);
      if (count <= 0) return text;
      text.append(piece, static_cast<std::size_t>(count));
    }
    return text + "(no end)";
  }

  IngressRecorder handler;
  std::unique_ptr<Ingress> ingress;
};

}  // namespace tally
