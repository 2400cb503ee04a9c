// What the journal receives, and where a message goes that it does not take.
#include <sys/socket.h>
#include <sys/un.h>

#include <map>

#include "base/files/file.h"
#include "base/utf8.h"
#include "host/system/system_log.h"
#include "host/temporary_root.h"

namespace tally {
namespace {

using Fields = std::multimap<std::string, std::string>;

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
  // The next entry, read as the journal reads it; empty when there is none or it is malformed.
  Fields received() {
    std::string entry(1 << 20, '\0');
    const auto size = ::recv(socket_.get(), entry.data(), entry.size(), 0);
    entry.resize(size > 0 ? static_cast<std::size_t>(size) : 0);
    Fields fields;
    for (std::size_t at = 0; at < entry.size();) {
      const auto end = entry.find_first_of("=\n", at);
      if (end == std::string::npos) return {};
      auto begin = end + 1;
      std::size_t length = entry.find('\n', begin) - begin;
      if (entry[end] == '\n') {
        length = 0;
        for (int byte = 7; byte >= 0; --byte) {
          length = length << 8 | static_cast<unsigned char>(entry.at(begin + byte));
        }
        begin += 8;
      }
      if (begin + length >= entry.size() || entry[begin + length] != '\n') return {};
      fields.emplace(entry.substr(at, end - at), entry.substr(begin, length));
      at = begin + length + 1;
    }
    return fields;
  }

  const std::string path_ = at("socket");
  Descriptor socket_;
  std::shared_ptr<SystemLog> sender_;
};

TEST_F(JournalTest, NoMessageForgesAField) {
  using std::string_literals::operator""s;
  const std::string messages[] = {"plain",
                                  "",
                                  "a\nPRIORITY=0\nMESSAGE=forged\n",
                                  "\n",
                                  "=\nMESSAGE\n\1\0\0\0\0\0\0\0x\n"s,
                                  "nul\0end"s,
                                  "\xff\xc3",
                                  std::string(20000, '\xff') + "\n"};
  for (const std::string& message : messages) {
    EXPECT_EQ(write(message), "") << message;
    const std::string text =
        repairUtf8(message.substr(0, 16384)) + (message.size() > 16384 ? " [cut short]" : "");
    EXPECT_EQ(received(), (Fields{{"MESSAGE", text},
                                  {"PRIORITY", "3"},
                                  {"SYSLOG_IDENTIFIER", "tallyrun"},
                                  {"SUBSYSTEM", "vellum.tallyd.tallyrun"}}))
        << message;
  }
}

TEST_F(JournalTest, WhatItDoesNotTakeGoesToStandardError) {
  std::string left;
  int taken = 0;
  while ((left = write("message")).empty()) ++taken;  // its queue is full at last
  EXPECT_EQ(left, "tallyrun[error]: message\n");
  EXPECT_EQ(write("message"), left) << "no longer waited for";
  for (int i = 0; i < taken; ++i) EXPECT_EQ(received().count("MESSAGE"), 1u);
  EXPECT_EQ(write("taken again"), "");
  EXPECT_EQ(received().find("MESSAGE")->second, "taken again");
  std::filesystem::remove(path_);
  EXPECT_EQ(write("gone"), "tallyrun[error]: gone\n");
}

}  // namespace
}  // namespace tally
