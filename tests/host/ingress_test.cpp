// What clients send through the sockets of the recorder.
#include <netinet/in.h>
#include <signal.h>
#include <sys/resource.h>

#include <filesystem>
#include <thread>

#include "host/ingress/drain_pace.h"
#include "host/ingress_fixture.h"

namespace tally {
namespace {

using testing::ElementsAre;

std::size_t openDescriptors() {
  const std::filesystem::directory_iterator all("/proc/self/fd");
  return static_cast<std::size_t>(std::distance(begin(all), end(all)));
}

// With a descriptor that the receiver did not ask for.
bool sendWithDescriptor(const Descriptor& socket, std::string text) {
  iovec part{text.data(), text.size()};
  alignas(cmsghdr) char control[CMSG_SPACE(sizeof(int))] = {};
  msghdr message{};
  message.msg_iov = &part;
  message.msg_iovlen = 1;
  message.msg_control = control;
  message.msg_controllen = sizeof control;
  cmsghdr* const header = CMSG_FIRSTHDR(&message);
  *header = {CMSG_LEN(sizeof(int)), SOL_SOCKET, SCM_RIGHTS};
  const int passed = socket.get();
  std::memcpy(CMSG_DATA(header), &passed, sizeof passed);
  return ::sendmsg(socket.get(), &message, 0) > 0;
}

TEST_F(IngressTest, DatagramsArriveWithTheirSender) {
  ASSERT_EQ(open(), "");
  const std::string longest(65536, 'x'), cut = std::string(60000, 'x') + "\n" + longest;
  const struct {
    std::string sent, delivered;
    std::uint64_t truncated;
  } cases[] = {{"a:1|c", "a:1|c", 0},
               {"a:1|c\nb:2|c\n", "a:1|c\nb:2|c\n", 0},
               {longest, longest, 0},
               {cut, cut.substr(0, 60001), 1},
               {longest + "\n", "", 1},
               {"", "", 0},
               {std::string("\0\xff", 2), std::string("\0\xff", 2), 0}};
  const Descriptor socket = connectTo(kDatagramSocket);
  for (const auto& c : cases) {
    handler.lines.clear();
    handler.losses.clear();
    ASSERT_TRUE(sendTo(socket, c.sent) && sendTo(socket, "end"));
    ASSERT_TRUE(serveUntil([&] { return handler.all().ends_with("end"); }));
    EXPECT_EQ(handler.all(), c.delivered + "end");
    EXPECT_EQ(handler.losses[IngressLoss::Truncated], c.truncated) << c.sent.size();
    EXPECT_EQ(handler.lines.back().first, ::getuid());
  }
  if (::geteuid() != 0) GTEST_SKIP() << "only root can send as another user";
  EXPECT_EQ(serveChild(kOther, [&] { return sendTo(connectTo(kDatagramSocket), "u") ? 0 : 1; }), 0);
  ASSERT_TRUE(serveUntil([&] { return handler.all().ends_with("u"); }));
  EXPECT_EQ(handler.lines.back().first, kOther);
}

TEST_F(IngressTest, PassedDescriptorsAreClosed) {
  ASSERT_EQ(open(), "");
  const Descriptor datagrams = connectTo(kDatagramSocket), stream = connectTo(kStreamSocket);
  ASSERT_TRUE(serveUntil([&] { return ingress->hasConnections(); }));
  const std::size_t before = openDescriptors();
  ASSERT_TRUE(sendWithDescriptor(datagrams, "d\n") && sendWithDescriptor(stream, "s\n"));
  ASSERT_TRUE(serveUntil([&] { return handler.lines.size() == 2; }));
  EXPECT_EQ(openDescriptors(), before);
}

TEST_F(IngressTest, StreamsAreReadInLines) {
  ASSERT_EQ(open(), "");
  const std::string longest(65536, 'x');
  const struct {
    Names pieces;
    std::string delivered;
    std::uint64_t tooLong;
  } cases[] = {{{"a:1|c\nb:", "2|c", "\nc:3|c\n"}, "a:1|c\nb:2|cc:3|c\n", 0},
               {{"a:1|c"}, "a:1|c", 0},
               {{"", "\n\n"}, "\n\n", 0},
               {{longest, "\nb\n"}, longest + "b\n", 0},
               {{longest, "x\nb\n"}, "b\n", 1},
               {{longest, longest, longest, "\nb"}, "b", 1},
               {{longest + "x"}, "", 1}};
  for (const auto& c : cases) {
    handler.lines.clear();
    handler.losses.clear();
    {
      const Descriptor socket = connectTo(kStreamSocket);
      for (const std::string& piece : c.pieces) {
        // Each is read before the next one is sent.
        ASSERT_TRUE(sendTo(socket, piece));
        const auto started = handler.rounds;
        ASSERT_TRUE(serveUntil([&] { return handler.rounds > started + 4; }));
      }
    }
    ASSERT_TRUE(serveUntil([&] { return !ingress->hasConnections(); }));
    EXPECT_EQ(handler.all(), c.delivered);
    EXPECT_EQ(handler.losses[IngressLoss::LongLine], c.tooLong) << c.delivered;
  }
}

// A user who sends too much waits, without loss and without keeping the loop busy.
TEST_F(IngressTest, StreamsWaitForTheirQuota) {
  ASSERT_EQ(open(), "");
  std::string sent;
  for (int i = 0; i < 100; ++i) sent += "name" + std::to_string(i) + ":1|c\n";
  ASSERT_TRUE(sendTo(connectTo(kStreamSocket), sent));  // and closed
  handler.quota = 0;
  ASSERT_TRUE(serveUntil([&] { return ingress->hasConnections(); }));
  EXPECT_LT(idleRounds(), 10u) << "at most one each 50 ms";
  handler.lines.clear();
  handler.quota = 100;
  ASSERT_TRUE(serveUntil([&] { return handler.quota < 20; }));
  EXPECT_LE(handler.all().size(), 100u);
  handler.quota = IngressRecorder::kUnlimited;
  ASSERT_TRUE(serveUntil([&] { return !ingress->hasConnections(); }));
  std::erase(sent, '\n');
  std::string delivered = handler.all();
  std::erase(delivered, '\n');
  EXPECT_EQ(delivered, sent);
}

TEST_F(IngressTest, AThousandConnections) {
  constexpr std::size_t kMost = 1024, kRefused = 6;  // of one user
  ASSERT_EQ(open(), "");
  std::vector<Descriptor> sockets;
  for (std::size_t i = 0; i < kMost + kRefused; ++i) {
    sockets.push_back(connectTo(kStreamSocket));
    ASSERT_TRUE(sockets.back());
    ASSERT_TRUE(i >= kMost || sendTo(sockets.back(), "half"));
  }
  const auto refused = [&] { return handler.losses[IngressLoss::ConnectionLimit]; };
  ASSERT_TRUE(serveUntil([&] { return refused() == kRefused; }));
  EXPECT_EQ(readAll(sockets.back()), "");
  EXPECT_TRUE(handler.lines.empty());
  for (std::size_t i = 0; i < kMost; ++i) ASSERT_TRUE(sendTo(sockets[i], "-line\n"));
  ASSERT_TRUE(serveUntil([&] { return handler.lines.size() == kMost; }));
  for (const auto& line : handler.lines) ASSERT_TRUE(line.second.starts_with("half-line"));
  // They cost nothing while they are idle.
  EXPECT_LE(idleRounds(), 2u);
  sockets.clear();
  EXPECT_TRUE(serveUntil([&] { return !ingress->hasConnections(); }));
}

TEST_F(IngressTest, ConnectionsWaitWhileTheProcessHasNoDescriptors) {
#ifdef __SANITIZE_ADDRESS__
  GTEST_SKIP() << "the sanitizer's own checks need descriptors";
#endif
  ASSERT_EQ(open(), "");
  const Descriptor sockets[] = {connectTo(kStreamSocket), connectTo(kStreamSocket)};
  for (const Descriptor& socket : sockets) ASSERT_TRUE(sendTo(socket, "a\n"));
  rlimit before{};
  ASSERT_EQ(::getrlimit(RLIMIT_NOFILE, &before), 0);
  const rlimit low{openDescriptors() - 1, before.rlim_max};
  ASSERT_EQ(::setrlimit(RLIMIT_NOFILE, &low), 0);
  EXPECT_LT(idleRounds(), 20u) << "it tries again each 50 ms";
  ASSERT_EQ(::setrlimit(RLIMIT_NOFILE, &before), 0);
  EXPECT_TRUE(serveUntil([&] { return handler.lines.size() == 2; }));
}

TEST(DrainPaceTest, LeavesBatchesButNeverFillsTheQueue) {
  constexpr std::int64_t kMicrosecond = 1000;
  const struct {
    std::size_t count;
    std::int64_t interval, pause;
  } cases[] = {{1, 1'000'000, 0}, {1, 200, 0},       {1, 50, 1000},   {1, 10, 640},
               {10, 250, 1000},   {64, 250, 250},    {128, 250, 125}, {256, 250, 62},
               {0, 250, 0},       {256, 1'000, 250}, {1, 0, 0},       {100, -5, 0}};
  for (const auto& c : cases) {
    DrainPace pace;
    const std::int64_t start = 1'000'000'000'000;
    (void)pace.pauseAfter(0, start);
    const auto pause = pace.pauseAfter(c.count, start + c.interval * kMicrosecond) / kMicrosecond;
    EXPECT_EQ(pause, c.pause) << c.count << " in " << c.interval;
  }
}

TEST_F(IngressTest, ControlAnswersItsOwnUser) {
  ASSERT_EQ(open(), "");
  const std::string answer(1u << 20, 'a');  // more than a socket holds
  const auto answerAll = [&] {
    for (const auto& [request, line] : std::exchange(handler.requests, {})) {
      handler.texts.push_back(line);
      ingress->answer(request, line == "status" ? answer : "done\n");
      ingress->answer(request, "twice");  // ignored
    }
    return false;
  };
  const struct {
    std::string sent, answer;
    bool halfClosed;
  } cases[] = {{"status\n", answer, false},
               {"commit\nmore", "done\n", false},
               {"commit", "done\n", true},
               {std::string(256, 'x') + "\n", "done\n", false},
               {std::string(257, 'x') + "\n", "", false},
               {"", "", true}};
  for (const auto& c : cases) {
    std::string got;
    bool ended = false;
    const Descriptor socket = connectTo(kControlSocket);
    ASSERT_TRUE(sendTo(socket, c.sent));
    if (c.halfClosed) ::shutdown(socket.get(), SHUT_WR);
    std::thread reader([&] {
      got = readAll(socket);
      ended = true;
      ingress->wake();
    });
    EXPECT_TRUE(serveUntil([&] { return answerAll() || ended; }));
    reader.join();
    EXPECT_EQ(got.size(), c.answer.size()) << c.sent;
    EXPECT_EQ(got.substr(0, 10), c.answer.substr(0, 10)) << c.sent;
  }
  // One that goes before its answer; and more than are served at once.
  ASSERT_TRUE(sendTo(connectTo(kControlSocket), "gone\n"));
  ASSERT_TRUE(serveUntil([&] { return !handler.requests.empty(); }));
  answerAll();
  std::vector<Descriptor> sockets;
  for (int i = 0; i < 9; ++i) sockets.push_back(connectTo(kControlSocket));
  ASSERT_TRUE(serveUntil([&] { return !errors().empty(); }));
  EXPECT_EQ(readAll(sockets.back()), "");
  sockets.clear();
  if (::geteuid() != 0) GTEST_SKIP() << "only root can ask as another user";
  ::chmod(at("run/tallyd/control.sock").c_str(), 0666);
  EXPECT_EQ(serveChild(kOther,
                       [&] {
                         const Descriptor socket = connectTo(kControlSocket);
                         sendTo(socket, "status\n");
                         return readAll(socket).empty() ? 0 : 1;
                       }),
            0);
  EXPECT_TRUE(handler.requests.empty());
}

TEST_F(IngressTest, SignalsComeAfterWhatWasSentBefore) {
  ASSERT_EQ(open(), "");
  const Descriptor stream = connectTo(kStreamSocket);
  ASSERT_TRUE(serveUntil([&] { return ingress->hasConnections(); }));
  handler.quota = 2;
  ASSERT_TRUE(sendTo(stream, "1\n2\n3\n"));
  ASSERT_TRUE(sendTo(connectTo(kDatagramSocket), "d\n"));
  ::kill(::getpid(), SIGHUP);
  ::kill(::getpid(), SIGTERM);
  ASSERT_TRUE(serveUntil([&] { return handler.texts.size() == 2; }));
  EXPECT_THAT(handler.texts, ElementsAre("reload", "terminate"));
  EXPECT_NE(handler.all().find("d\n"), std::string::npos);
}

TEST_F(IngressTest, UdpIsAnonymousAndCountsWhatTheKernelDropped) {
  constexpr int kSent = 500;  // more than the buffer holds
  const std::string large(60'000, 'x');
  const Descriptor reserved(::socket(AF_INET, SOCK_DGRAM, 0));
  sockaddr_in address{};
  address.sin_family = AF_INET;
  address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
  socklen_t size = sizeof address;
  auto* const generic = reinterpret_cast<sockaddr*>(&address);
  ASSERT_EQ(::bind(reserved.get(), generic, size), 0);
  ASSERT_EQ(::getsockname(reserved.get(), generic, &size), 0);
  const IngressOptions options{{"127.0.0.1:" + std::to_string(ntohs(address.sin_port))}};
  EXPECT_NE(open(options), "");  // another program has it
  EXPECT_EQ(names("run/tallyd"), Names{});
  ASSERT_EQ(const_cast<Descriptor&>(reserved).close(), 0);
  ASSERT_EQ(open(options), "");
  const Descriptor socket(::socket(AF_INET, SOCK_DGRAM | SOCK_CLOEXEC, 0));
  ASSERT_EQ(::connect(socket.get(), generic, size), 0);
  const int on = 1;
  if (::setsockopt(socket.get(), SOL_SOCKET, SO_RXQ_OVFL, &on, sizeof on) != 0) {
    GTEST_SKIP() << "this kernel does not say what it dropped";
  }
  for (int i = 0; i < kSent; ++i) ASSERT_TRUE(sendTo(socket, large));
  std::size_t before = 0;
  ASSERT_TRUE(serveUntil([&] {
    return std::exchange(before, handler.lines.size()) == handler.lines.size() && before > 0;
  }));
  ASSERT_TRUE(sendTo(socket, "last"));
  ASSERT_TRUE(serveUntil([&] { return handler.lines.back().second == "last"; }));
  EXPECT_EQ(handler.lines.front().first, Sender::kAnonymous);
  const auto lost = handler.losses[IngressLoss::SocketOverflow];
  EXPECT_GT(lost, 0u);
  EXPECT_EQ(handler.lines.size() + lost, kSent + 1u);
}

}  // namespace
}  // namespace tally
