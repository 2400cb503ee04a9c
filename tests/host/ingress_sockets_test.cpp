// Where the recorder's sockets come from, and how others find and ask it.
#include <fcntl.h>
#include <netinet/in.h>
#include <sys/un.h>

#include <filesystem>
#include <thread>

#include "host/ingress/recorder_client.h"
#include "host/ingress/udp_address.h"
#include "host/ingress_fixture.h"

namespace tally {
namespace {

using std::chrono::milliseconds;
using testing::HasSubstr;

constexpr milliseconds kPatience{10'000}, kShort{50};

class IngressSocketsTest : public IngressTest {
 protected:
  Descriptor serve(const std::string& path, int type) {
    Descriptor socket(::socket(AF_UNIX, type | SOCK_CLOEXEC, 0));
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    at(path).copy(address.sun_path, sizeof address.sun_path - 1);
    std::filesystem::create_directories(std::filesystem::path(at(path)).parent_path());
    EXPECT_EQ(::bind(socket.get(), reinterpret_cast<sockaddr*>(&address), sizeof address), 0);
    EXPECT_TRUE(type == SOCK_DGRAM || ::listen(socket.get(), 4) == 0);
    return socket;
  }
  unsigned mode(const std::string& path) const {
    struct stat status {};
    return ::lstat(at(path).c_str(), &status) == 0 ? status.st_mode & 0777 : 0;
  }
  void clear() { std::filesystem::remove_all(at("run")); }
};

TEST_F(IngressSocketsTest, OneProgramServesADevice) {
  const mode_t mask = ::umask(077);
  EXPECT_EQ(open(), "");
  ::umask(mask);
  EXPECT_EQ(mode("run/tallyd"), 0755u);
  EXPECT_EQ(mode("run/tallyd/statsd.sock"), 0666u);
  EXPECT_EQ(mode("run/tallyd/statsd-stream.sock"), 0666u);
  EXPECT_EQ(mode("run/tallyd/control.sock"), 0600u);
  EXPECT_THAT(openIngress(device(), {}, *log).error().message,
              HasSubstr("another tallyd serves this device root"));
  // Another's name is not removed.
  std::filesystem::remove(at("run/tallyd/statsd.sock"));
  put("run/tallyd/statsd.sock", "");
  ingress.reset();
  EXPECT_EQ(names("run/tallyd"), Names{"statsd.sock"});
  EXPECT_THAT(open(), HasSubstr("is not a socket"));
  clear();
  for (const int type : {SOCK_DGRAM, SOCK_STREAM}) {
    const std::string path =
        type == SOCK_DGRAM ? "run/tallyd/statsd.sock" : "run/tallyd/control.sock";
    {
      const Descriptor other = serve(path, type);
      EXPECT_THAT(open(), HasSubstr("is already served"));
    }
    EXPECT_EQ(open(), "") << "a dead one is replaced";
    ingress.reset();
    clear();
  }
}

TEST_F(IngressSocketsTest, HostileDirectoriesAreRefused) {
  const struct {
    const char* what;
    std::function<void()> make;
    const char* error;
  } cases[] = {
      {"link",
       [&] {
         std::filesystem::create_directories(at("run"));
         std::filesystem::create_directories(at("elsewhere"));
         std::filesystem::create_directory_symlink(at("elsewhere"), at("run/tallyd"));
       },
       "symbolic link"},
      {"writable", [&] { ::chmod(at("run/tallyd").c_str(), 01777); }, "can be written by other"},
      {"writable above", [&] { ::chmod(at("run").c_str(), 0777); }, "can be written by other"},
      {"foreign",
       [&] {
         if (::chown(at("run/tallyd").c_str(), kOther, 0) != 0) clear();
       },
       "belongs to user 1234"},
      {"file",
       [&] {
         clear();
         put("run/tallyd", "");
       },
       "Not a directory"},
  };
  for (const auto& c : cases) {
    clear();
    if (std::string_view(c.what) != "link") std::filesystem::create_directories(at("run/tallyd"));
    c.make();
    if (!exists("run/tallyd")) continue;  // only root can give it to another
    EXPECT_THAT(open(), HasSubstr(c.error)) << c.what;
    EXPECT_THAT(SocketRecorderLink(device()).commit(kShort).error().message, HasSubstr(c.error));
  }
  EXPECT_FALSE(exists("elsewhere/statsd.sock"));
}

TEST_F(IngressSocketsTest, OnlyLoopbackAddresses) {
  const std::pair<const char*, const char*> cases[] = {
      {"127.0.0.1:8125", nullptr},         {"[::1]:8125", nullptr},
      {"127.255.0.9:1", nullptr},          {"0.0.0.0:8125", "only loopback"},
      {"[::]:8125", "only loopback"},      {"192.168.1.1:8125", "only loopback"},
      {"128.0.0.1:8125", "only loopback"}, {"[::ffff:127.0.0.1]:8125", "only loopback"},
      {"localhost:8125", "not a UDP"},     {"127.0.0.1", "not a UDP"},
      {"127.0.0.1:0", "not a UDP"},        {"127.0.0.1:65536", "not a UDP"},
      {"::1:8125", "not a UDP"},           {"[::1%lo]:8125", "not a UDP"},
      {"127.1:8125", "not a UDP"},         {"", "not a UDP"}};
  for (const auto& [text, error] : cases) {
    const auto parsed = parseLoopback(text);
    const std::string got = parsed ? addressText(parsed->storage) : parsed.error().message;
    EXPECT_THAT(got, HasSubstr(error == nullptr ? text : error));
    EXPECT_EQ(static_cast<bool>(parsed), error == nullptr) << text;
  }
}

TEST_F(IngressSocketsTest, SocketsThatArePassedInAreChecked) {
  const auto unixSocket = [&](int type) {
    return [this, type](const std::string& path) { return serve(path, type).release(); };
  };
  const auto inetSocket = [](int type, std::uint32_t host) {
    return [type, host](const std::string&) {
      const int socket = ::socket(AF_INET, type, 0);
      sockaddr_in address{};
      address.sin_family = AF_INET;
      address.sin_addr.s_addr = htonl(host);
      return ::bind(socket, reinterpret_cast<sockaddr*>(&address), sizeof address) == 0 ? socket
                                                                                        : -1;
    };
  };
  const struct {
    const char *what, *names, *error;
    std::function<int(const std::string&)> make;
  } cases[] = {
      {"datagrams", "any", nullptr, unixSocket(SOCK_DGRAM)},
      {"stream", "", nullptr, unixSocket(SOCK_STREAM)},
      {"control alone", "control", "none of the sockets", unixSocket(SOCK_STREAM)},
      {"packets", "x", "neither datagrams nor a stream", unixSocket(SOCK_SEQPACKET)},
      {"no path", "x", "without a path",
       [](const std::string&) { return ::socket(AF_UNIX, SOCK_DGRAM, 0); }},
      {"UDP", "udp:", nullptr, inetSocket(SOCK_DGRAM, INADDR_LOOPBACK)},
      {"any address", "x", "only 127.0.0.0/8 and ::1", inetSocket(SOCK_DGRAM, INADDR_ANY)},
      {"TCP", "x", "is not UDP", inetSocket(SOCK_STREAM, INADDR_LOOPBACK)},
      {"file", "x", "is not a socket",
       [](const std::string&) { return ::open("/dev/null", O_RDONLY); }},
  };
  for (const auto& c : cases) {
    const pid_t child = ::fork();
    if (child == 0) {
      ::dup2(c.make("given/x.sock"), 3);
      ::setenv("LISTEN_PID", std::to_string(::getpid()).c_str(), 1);
      ::setenv("LISTEN_FDS", "1", 1);
      ::setenv("LISTEN_FDNAMES", c.names, 1);
      const std::string error = open();
      const bool right = c.error == nullptr ? error.empty() && ingress->isActivated()
                                            : error.find(c.error) != std::string::npos;
      if (!right) std::fprintf(stderr, "%s: %s\n", c.what, error.c_str());
      ::_exit(right && ::getenv("LISTEN_FDS") == nullptr ? 0 : 1);
    }
    int status = -1;
    ASSERT_EQ(::waitpid(child, &status, 0), child);
    EXPECT_EQ(status, 0) << c.what;
    std::filesystem::remove_all(at("given"));
  }
  // Those of another process are not taken.
  ::setenv("LISTEN_PID", "1", 1);
  ::setenv("LISTEN_FDS", "1", 1);
  EXPECT_EQ(open(), "");
  EXPECT_FALSE(ingress->isActivated());
}

TEST_F(IngressSocketsTest, TheRecorderIsAskedAndAnswers) {
  EXPECT_EQ(askRecorder(device(), "status", kShort).error().systemError, ENOENT);
  EXPECT_FALSE(*SocketRecorderLink(device()).commit(kShort));
  EXPECT_FALSE(*isRecorderServed(device()));
  ASSERT_EQ(open(), "");
  EXPECT_TRUE(*isRecorderServed(device()));
  const std::string large(3u << 20, 'a');
  for (const std::string& text : {std::string("done\n"), large, std::string("failed: full\n")}) {
    std::string got;
    bool ended = false;
    std::thread asker([&] {
      got = *askRecorder(device(), "status", kPatience);
      ended = true;
    });
    EXPECT_TRUE(serveUntil([&] {
      for (const auto& each : std::exchange(handler.requests, {})) {
        ingress->answer(each.first, text);
      }
      return ended;
    }));
    asker.join();
    EXPECT_EQ(got, text);
  }
}

// A server that means no good, or is none: an error after the time, never more.
TEST_F(IngressSocketsTest, ForeignServersCannotHoldUpTheDailyJob) {
  const struct {
    std::string answer;
    const char* error;  // of the commit; none: it succeeds
    int times;
    bool closes;
  } cases[] = {{"done\n", nullptr, 1, true},
               {"failed: disk\x1b full\n", "could not commit: disk\\x1b full", 1, true},
               {"rubbish", "unknown answer: rubbish", 1, true},
               {"", "no answer", 1, true},
               {"", "did not answer in time", 1, false},
               {"done\n", "did not answer in time", 1, false},
               {std::string(65536, 'd'), "answers without an end", 1 << 10, true}};
  for (const auto& c : cases) {
    const Descriptor listener = serve("run/tallyd/control.sock", SOCK_STREAM);
    std::thread server([&] {
      Descriptor client(::accept(listener.get(), nullptr, nullptr));
      char line[16];
      EXPECT_EQ(::recv(client.get(), line, sizeof line, 0), 7);
      for (int i = 0; i < c.times && sendTo(client, c.answer); ++i) continue;
      if (!c.closes) (void)readAll(client);
    });
    const auto committed = SocketRecorderLink(device()).commit(c.closes ? kPatience : kShort);
    server.join();
    EXPECT_EQ(static_cast<bool>(committed), c.error == nullptr);
    if (!committed && c.error != nullptr) {
      EXPECT_THAT(committed.error().message, HasSubstr(c.error));
    }
    clear();
  }
  if (::geteuid() != 0) GTEST_SKIP() << "only root can serve as another user";
  // Another user's socket in a directory that he was given by mistake.
  std::filesystem::create_directories(at("run/tallyd"));
  int ready[2];
  ASSERT_EQ(::pipe(ready), 0);
  const pid_t child = ::fork();
  if (child == 0) {
    ::chmod(at("run/tallyd").c_str(), 0777);
    const bool changed = ::setresuid(kOther, kOther, kOther) == 0;
    const Descriptor socket = serve("run/tallyd/control.sock", SOCK_STREAM);
    if (!changed || ::write(ready[1], "", 1) != 1) ::_exit(1);
    ::pause();
  }
  char byte;
  ASSERT_EQ(::read(ready[0], &byte, 1), 1);
  ::chmod(at("run/tallyd").c_str(), 0755);
  EXPECT_THAT(SocketRecorderLink(device()).commit(kPatience).error().message,
              HasSubstr("served by user 1234"));
  ::kill(child, SIGKILL);
  EXPECT_EQ(::waitpid(child, nullptr, 0), child);
}

}  // namespace
}  // namespace tally
