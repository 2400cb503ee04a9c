// libtallyclient, by what a daemon's socket receives from it.
#include "tallyclient/tallyclient.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <charconv>
#include <chrono>
#include <cmath>
#include <cstring>
#include <limits>
#include <map>
#include <memory>
#include <random>
#include <string>
#include <thread>
#include <vector>

#include "fakes/recorder_socket.h"
#include "fakes/temporary_folder.h"

// Every allocation of the process, the C library's own included.
static std::atomic<long> allocations;
#if defined(__GLIBC__) && !defined(__SANITIZE_ADDRESS__)
extern "C" void* __libc_malloc(size_t size);
extern "C" void* malloc(size_t size) {
  ++allocations;
  return __libc_malloc(size);
}
constexpr bool kCountsAllocations = true;
#else
constexpr bool kCountsAllocations = false;
#endif

namespace {

using std::chrono::steady_clock;

class ClientTest : public testing::Test, protected tally::TemporaryFolder {
 protected:
  void open() { client.reset(tallyclient_open(daemon.path().c_str())); }
  // What arrived of each name: the sum of a counter, the number of samples.
  void tally(std::map<std::string, long>& into) const {
    const std::string text = daemon.received();
    for (std::size_t at = 0; at < text.size();) {
      const std::size_t end = text.find('\n', at), colon = text.find(':', at);
      const std::string line = text.substr(at, end - at);
      const bool isCounter = line.ends_with("|c");
      into[text.substr(at, colon - at)] +=
          isCounter ? std::stol(text.substr(colon + 1)) : std::ranges::count(line, ':');
      at = end + 1;
    }
  }

  struct Close {
    void operator()(tallyclient* handle) const { tallyclient_close(handle); }
  };
  tally::fakes::RecorderSocket daemon{at("statsd.sock")};
  std::unique_ptr<tallyclient, Close> client;
};

constexpr auto kLowest = std::numeric_limits<std::int64_t>::min();

TEST_F(ClientTest, CallsAreTheLinesOfTheProtocol) {
  daemon.bind();
  open();
  tallyclient* const c = client.get();
  const double many[] = {1, -2.5, 0.001, 1e300};
  EXPECT_EQ(tallyclient_set(c, "g", 7), 0);
  EXPECT_EQ(tallyclient_set(c, "g", kLowest), 0);
  EXPECT_EQ(tallyclient_add(c, "c", -3), 0);
  EXPECT_EQ(tallyclient_push(c, "h", 12.5), 0);
  EXPECT_EQ(tallyclient_push(c, "h", 1e15), 0);
  EXPECT_EQ(tallyclient_push(c, "hh", -0.1), 0);
  EXPECT_EQ(tallyclient_push_many(c, "hh", many, 4), 0);
  EXPECT_EQ(tallyclient_push_many(c, "none", nullptr, 0), 0);
  EXPECT_EQ(daemon.received(), "") << "sent before it was full or old";
  EXPECT_EQ(tallyclient_flush(c), 0);
  EXPECT_EQ(daemon.datagrams(),
            std::vector<std::string>{"g:7|g\ng:0|g\ng:-9223372036854775808|g\nc:-3|c\n"
                                     "h:12.5:1000000000000000|h\n"
                                     "hh:-0.1:1:-2.5:0.001:1.0000000000000001e+300|h\n"});
}

TEST_F(ClientTest, WhatCannotArriveIsRefusedAndNotADrop) {
  daemon.bind();
  open();
  tallyclient* const c = client.get();
  const std::string longest(512, 'n');
  for (const std::string& name :
       {std::string(), longest + "n", std::string("a\nb"), std::string("a:b"), std::string("a|b"),
        std::string("a#b"), std::string("a@b"), std::string("\x7f"), std::string("_e{1,1}"),
        std::string("\xc0\x80"), std::string("\xed\xa0\x80"), std::string("\xf4\x90\x80\x80"),
        std::string("\xe2\x82"), std::string("\x80")}) {
    EXPECT_EQ(tallyclient_add(c, name.c_str(), 1), EINVAL) << name;
  }
  const double values[] = {1, NAN};
  EXPECT_EQ(tallyclient_push_many(c, "n", values, 2), EINVAL);
  EXPECT_EQ(tallyclient_push(c, "n", INFINITY), EINVAL);
  EXPECT_EQ(tallyclient_push_many(c, "n", nullptr, 1), EINVAL);
  EXPECT_EQ(tallyclient_set(c, nullptr, 1), EINVAL);
  EXPECT_EQ(tallyclient_add(nullptr, "n", 1), EINVAL);
  EXPECT_EQ(tallyclient_flush(nullptr), EINVAL);
  EXPECT_EQ(tallyclient_dropped(nullptr), 0u);
  EXPECT_EQ(tallyclient_close(nullptr), EINVAL);
  EXPECT_EQ(tallyclient_dropped(c), 0u);
  for (const std::string& name : {longest, std::string("ä €\xf0\x9f\x98\x80")}) {
    EXPECT_EQ(tallyclient_add(c, name.c_str(), 1), 0);
    EXPECT_EQ(tallyclient_flush(c), 0);
    EXPECT_EQ(daemon.received(), name + ":1|c\n");
  }
  EXPECT_EQ(tallyclient_open(std::string(108, 'p').c_str()), nullptr);
  EXPECT_EQ(errno, ENAMETOOLONG);
}

TEST_F(ClientTest, RealNumbersReadBackAsTheyWere) {
  daemon.bind();
  open();
  std::mt19937_64 random(1);
  std::vector<double> values = {5e-324,
                                2.2250738585072011e-308,
                                1.7976931348623157e308,
                                1e22,
                                0.1 + 0.2,
                                9007199254740993.0,
                                123456.789,
                                4.35,
                                1e-15,
                                -0.007};
  while (values.size() < 20'000) {
    const std::uint64_t bits = random();
    double value;
    std::memcpy(&value, &bits, sizeof value);
    const double scale = std::pow(10, static_cast<double>(bits % 12));
    values.push_back(static_cast<double>(bits >> 30) / scale);
    if (std::isfinite(value)) values.push_back(value);
  }
  for (const double value : values) {
    ASSERT_EQ(tallyclient_push(client.get(), "n", value), 0);
    ASSERT_EQ(tallyclient_flush(client.get()), 0);
    const std::string line = daemon.received();
    double read = 0;
    const auto [end, fault] = std::from_chars(line.data() + 2, line.data() + line.size(), read);
    ASSERT_EQ(std::string_view(end), "|h\n") << line;
    ASSERT_EQ(read, value) << line;
  }
}

TEST_F(ClientTest, ABlockedDaemonLosesOnlyWhatIsReported) {
  daemon.bind();
  open();
  std::map<std::string, long> arrived;
  constexpr int kCalls = 100'000;
  const std::vector<double> batch(3, 0.25);
  const auto begin = steady_clock::now();
  const long before = allocations;
  EXPECT_EQ(before > 0, kCountsAllocations);
  int refused = 0;
  for (int i = 0; i < kCalls; ++i) {
    errno = 77;
    const int result = tallyclient_push_many(client.get(), "n", batch.data(), batch.size());
    EXPECT_TRUE(result == 0 || result == ENOBUFS);
    EXPECT_EQ(errno, 77);
    refused += result == ENOBUFS;
    tallyclient_set(client.get(), "gauge", 1);
    tallyclient_push(client.get(), "scientific", 1.0 / 3);
  }
  EXPECT_EQ(tallyclient_flush(client.get()), EAGAIN);
  EXPECT_EQ(allocations, before);
  EXPECT_LT(steady_clock::now() - begin, std::chrono::seconds(5));
  EXPECT_GT(refused, kCalls / 2);
  const auto dropped = static_cast<long>(tallyclient_dropped(client.get()));
  tally(arrived);
  EXPECT_EQ(tallyclient_flush(client.get()), 0);  // what was in the buffer, and the report
  tally(arrived);
  EXPECT_EQ(arrived["tallyclient.dropped"], dropped);
  EXPECT_EQ(arrived["n"] + arrived["gauge"] + arrived["scientific"] + dropped, kCalls * 5L);
  EXPECT_EQ(tallyclient_flush(client.get()), 0);
  EXPECT_EQ(daemon.received(), "") << "reported twice";
}

TEST_F(ClientTest, ADaemonMayComeLateAndStartAgain) {
  open();
  ASSERT_NE(client, nullptr);
  EXPECT_EQ(tallyclient_add(client.get(), "early", 1), 0);
  EXPECT_EQ(tallyclient_flush(client.get()), ENOENT);
  daemon.bind();
  EXPECT_EQ(tallyclient_flush(client.get()), ENOENT) << "tried again at once";
  std::this_thread::sleep_for(std::chrono::milliseconds(1050));
  EXPECT_EQ(tallyclient_add(client.get(), "late", 1), 0);  // the buffer is old by now
  EXPECT_EQ(daemon.received(), "early:1|c\nlate:1|c\n");
  daemon.unbind();
  daemon.bind();
  EXPECT_EQ(tallyclient_add(client.get(), "again", 1), 0);
  EXPECT_EQ(tallyclient_flush(client.get()), 0);
  EXPECT_EQ(daemon.received(), "again:1|c\n");
}

TEST_F(ClientTest, ADescriptorThatTheProgramClosedIsNotTouched) {
  daemon.bind();
  const int number = ::dup(daemon.descriptor());
  ::close(number);
  open();
  for (const bool isReused : {false, true}) {
    ::close(number);  // as a program does that detaches itself
    if (isReused) {
      ASSERT_EQ(::open("/dev/null", O_WRONLY), number);
    }
    tallyclient_add(client.get(), "n", 1);
    EXPECT_EQ(tallyclient_flush(client.get()), 0);
    EXPECT_EQ(daemon.received(), "n:1|c\n");
    EXPECT_EQ(::lseek(number, 0, SEEK_SET), isReused ? 0 : -1) << "the program's file was closed";
  }
  ::close(number);
}

// Threads record while the process forks; each child finds the lock free and the buffer empty.
TEST_F(ClientTest, ThreadsAndForksLoseAndRepeatNothing) {
  daemon.bind();
  open();
  constexpr int kThreads = 3, kForks = 100;
  constexpr long kEach = 30'000;
  std::atomic<int> running = kThreads;
  std::map<std::string, long> arrived;
  std::vector<std::thread> threads;
  for (int t = 0; t < kThreads; ++t) {
    threads.emplace_back([&] {
      for (long i = 0; i < kEach; ++i) {
        tallyclient_add(client.get(), "count", 1);
        tallyclient_push(client.get(), "sample", 1);
      }
      --running;
    });
  }
  for (int i = 0; i < kForks; ++i) {
    const pid_t child = ::fork();
    if (child == 0) {
      ::alarm(10);
      tallyclient_add(client.get(), "child", 1);
      while (tallyclient_flush(client.get()) == EAGAIN) ::usleep(100);
      ::_exit(tallyclient_dropped(client.get()) == 0 ? 0 : 1);
    }
    int status = -1;
    while (::waitpid(child, &status, WNOHANG) == 0) tally(arrived);
    ASSERT_EQ(status, 0);
  }
  while (running > 0) tally(arrived);
  for (std::thread& thread : threads) thread.join();
  while (tallyclient_flush(client.get()) == EAGAIN) tally(arrived);
  tally(arrived);
  EXPECT_EQ(arrived["child"], kForks);
  EXPECT_EQ(arrived["tallyclient.dropped"], static_cast<long>(tallyclient_dropped(client.get())));
  EXPECT_EQ(arrived["count"] + arrived["sample"] + arrived["tallyclient.dropped"],
            2 * kThreads * kEach);
}

}  // namespace
