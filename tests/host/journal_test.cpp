// What the journal receives, and where a message goes that it does not take.
#include <sys/socket.h>
#include <sys/un.h>

#include "base/files/file.h"
#include "host/system/system_log.h"
#include "host/temporary_root.h"

namespace tally {
namespace {

class JournalTest : public TemporaryRoot {
 protected:
  void SetUp() override {
    TemporaryRoot::SetUp();
    sockaddr_un address{.sun_family = AF_UNIX, .sun_path = {}};
    at("socket").copy(address.sun_path, sizeof address.sun_path - 1);
    socket_ = Descriptor(::socket(AF_UNIX, SOCK_DGRAM | SOCK_NONBLOCK, 0));
    ASSERT_EQ(::bind(socket_.get(), reinterpret_cast<sockaddr*>(&address), sizeof address), 0);
    SystemLogSettings settings;
    settings.journal = path_;
    sender_ = makeLinuxSystemLog(settings);
  }
  // What the message left on standard error.
  std::string write(std::string_view message) {
    testing::internal::CaptureStderr();
    sender_->write(LogLevel::Error, message);
    return testing::internal::GetCapturedStderr();
  }
  // The next entry; empty when there is none.
  std::string received() {
    std::string entry(1 << 20, '\0');
    const auto size = ::recv(socket_.get(), entry.data(), entry.size(), 0);
    return entry.substr(0, size > 0 ? static_cast<std::size_t>(size) : 0);
  }

  const std::string path_ = at("socket");
  Descriptor socket_;
  std::shared_ptr<SystemLog> sender_;
};

constexpr std::string_view kOtherFields =
    "PRIORITY=3\nSYSLOG_IDENTIFIER=tallyrun\nSUBSYSTEM=vellum.tallyd.tallyrun\n";

TEST_F(JournalTest, NoMessageForgesAField) {
  using std::string_literals::operator""s;
  const std::string x300(300, 'x'), longest(16384, 'x');
  const struct {
    std::string message, field;  // as the journal's protocol has it
  } cases[] = {
      {"plain = text", "MESSAGE=plain = text\n"},
      {"", "MESSAGE=\n"},
      {"a\nPRIORITY=0\n", "MESSAGE\n\x0d\0\0\0\0\0\0\0a\nPRIORITY=0\n\n"s},
      {x300 + "\n", "MESSAGE\n\x2d\1\0\0\0\0\0\0"s + x300 + "\n\n"},
      {"nul\0\xff\xc3"s, "MESSAGE=nul\0\xef\xbf\xbd\xef\xbf\xbd\n"s},
      {longest + "\nPRIORITY=0", "MESSAGE=" + longest + " [cut short]\n"},
  };
  for (const auto& c : cases) {
    EXPECT_EQ(write(c.message), "") << c.message;
    EXPECT_EQ(received(), c.field + std::string(kOtherFields));
  }
}

TEST_F(JournalTest, WhatItDoesNotTakeGoesToStandardError) {
  const std::string entry = "MESSAGE=message\n" + std::string(kOtherFields);
  std::string left;
  int taken = 0;
  while ((left = write("message")).empty()) ++taken;  // its queue is full at last
  EXPECT_EQ(left, "tallyrun[error]: message\n");
  EXPECT_EQ(write("message"), left) << "no longer waited for";
  for (int i = 0; i < taken; ++i) EXPECT_EQ(received(), entry);
  EXPECT_EQ(write("message"), "") << "it is emptied";
  EXPECT_EQ(received(), entry);
  std::filesystem::remove(path_);
  EXPECT_EQ(write("message"), left) << "it is gone";
}

}  // namespace
}  // namespace tally
