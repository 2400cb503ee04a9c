// tallyctl record, by what the daemon's socket of the device receives.
#include <fcntl.h>

#include <array>
#include <atomic>
#include <thread>

#include "base/child_process.h"
#include "fakes/recorder_socket.h"
#include "tools/tool_fixture.h"

namespace tally::tools {
namespace {

using testing::HasSubstr;
using testing::MatchesRegex;

class RecordCommandsTest : public ToolTest {
 protected:
  RecordCommandsTest() { std::filesystem::create_directories(at("device/run/tallyd")); }
  Outcome runWithInput(const std::string& input, std::vector<std::string> arguments) {
    put("input", input);
    const int kept = ::dup(0), file = ::open(at("input").c_str(), O_RDONLY);
    ::dup2(file, 0);
    Outcome outcome = run(std::move(arguments));
    ::dup2(kept, 0);
    ::close(kept);
    ::close(file);
    return outcome;
  }
  fakes::RecorderSocket daemon{at("device/run/tallyd/statsd.sock")};
};

TEST_F(RecordCommandsTest, WordsBecomeValuesOrAreRefusedAsAWhole) {
  daemon.bind();
  const struct {
    std::vector<std::string> words;
    int status;
    std::string received;  // an expression
    std::string complaint = "";
  } cases[] = {
      {{"set", "a", "1", "b", "-2"}, kSuccess, "a:1\\|g\nb:0\\|g\nb:-2\\|g\n"},
      {{"set", "a", "1", "b"}, kBadUsage, "", "keys and values come in pairs"},
      {{"set", "a", "1", "b:c", "2"}, kBadUsage, "", "a key is valid UTF-8"},
      {{"set", "a", "1.5"}, kBadUsage, "", "1.5 is not a whole number"},
      {{"add", "a"}, kSuccess, "a:1\\|c\n"},
      {{"add", "a", "-7"}, kSuccess, "a:-7\\|c\n"},
      {{"push", "a", "1.5", "-2"}, kSuccess, "a:1.5:-2\\|h\n"},
      {{"push", "a", "1", "inf"}, kBadUsage, "", "inf is not a finite number"},
      {{"time", "a", "true"}, kSuccess, "a:[0-9.]+\\|h\na.exit.0:1\\|c\n"},
      // Words that would be ours elsewhere.
      {{"time", "a", "sh", "-c", "test \"$*\" = '--json store --'; exit 4", "0", "--json", "store",
        "--"},
       4,
       "a:[0-9.]+\\|h\na.exit.4:1\\|c\n"},
      {{"time", "a", "--", "sh", "-c", "kill -15 $$"}, 143, "a:[0-9.]+\\|h\na.exit.143:1\\|c\n"},
      {{"time", "a", "/no/such/program"}, 127, "", "cannot run /no/such/program"},
      {{"time", "a", at("device")}, 126, "", "cannot run"},
      {{"time", std::string(505, 'a'), "true"}, kBadUsage, "", "a key is valid UTF-8"},
  };
  // An emulated process learns only by its child's status that a program cannot be run.
  const bool isTold = !runInForeground(std::array<std::string, 1>{"/no/such/program"});
  for (const auto& c : cases) {
    if (!isTold && c.complaint.starts_with("cannot run")) continue;
    const auto outcome = runUnder({"record"}, c.words);
    EXPECT_EQ(outcome.status, c.status) << testing::PrintToString(c.words) << outcome.err;
    EXPECT_THAT(daemon.received(), MatchesRegex(c.received)) << testing::PrintToString(c.words);
    EXPECT_EQ(outcome.err.empty(), c.complaint.empty()) << outcome.err;
    EXPECT_THAT(outcome.err, HasSubstr(c.complaint));
  }
}

TEST_F(RecordCommandsTest, GoodLinesAreRecordedAndBadOnesNumbered) {
  daemon.bind();
  const auto outcome =
      runWithInput("set a 1 b 2\nsat a 1\n\n\tpush\tc 1  2\r\nadd " + std::string(70'000, 'x') +
                       std::string("\nadd \0\nadd d", 12),
                   {"record", "lines", "--json"});
  EXPECT_EQ(outcome.status, kWrong);
  EXPECT_EQ(daemon.received(), "a:1|g\nb:2|g\nc:1:2|h\nd:1|c\n");
  expectValues(outcome.json(), R"({"/values": 5, "/rejected": 3, "/firstRejected/0/line": 2,
      "/firstRejected/1/reason": "longer than 65,536 bytes", "/firstRejected/2/line": 6})");
}

TEST_F(RecordCommandsTest, AFullQueueIsWaitedForAndAMissingDaemonIsNot) {
  EXPECT_THAT(run({"record", "add", "a"}).err, HasSubstr("no metrics daemon listens at"));
  EXPECT_EQ(run({"record", "add", "a"}).status, kWrong);
  EXPECT_EQ(run({"record", "time", "a", "sh", "-c", "exit 5"}).status, 5);
  daemon.bind();
  constexpr int kLines = 60'000;
  std::string input;
  for (int i = 0; i < kLines; ++i) input += "push some.key 0.5\nadd other.key\n";
  std::atomic<bool> ended = false;
  std::string received;
  std::thread reader([&] {
    for (bool last = false; !last;) {
      last = ended;
      ::usleep(1000);  // the queue fills meanwhile
      received += daemon.received();
    }
  });
  const auto outcome = runWithInput(input, {"record", "lines", "--json"});
  ended = true;
  reader.join();
  EXPECT_EQ(outcome.status, kSuccess) << outcome.err;
  expectValues(outcome.json(), R"({"/values": 120000, "/rejected": 0})");
  EXPECT_EQ(std::ranges::count(received, ':'), 2 * kLines);
  EXPECT_THAT(received, testing::Not(HasSubstr("dropped")));
}

}  // namespace
}  // namespace tally::tools
