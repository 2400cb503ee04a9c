// A device root in a temporary folder, and a log that keeps its lines.
#pragma once

#include <gmock/gmock.h>
#include <sys/wait.h>
#include <unistd.h>

#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "base/files/device_root.h"
#include "base/files/file.h"
#include "fakes/fake_platform.h"
#include "fakes/temporary_folder.h"

namespace tally {

using Names = std::vector<std::string>;

class TemporaryRoot : public testing::Test, protected TemporaryFolder {
 protected:
  DeviceDirectory folder(std::string_view path) const { return {root, "/" + std::string(path)}; }
  std::string get(std::string_view path) const {
    const auto text = readFile(at(path), 1u << 30);
    return text ? *text : "(" + text.error().message + ")";
  }
  // The entries of a folder, without lock files.
  Names names(std::string_view path) const {
    Names found;
    const auto all = folder(path).list();
    EXPECT_TRUE(all);
    for (const std::string& name : *all) {
      if (!name.ends_with(".lock")) found.push_back(name);
    }
    return found;
  }
  // From here on services get a new log, which writes a fault of each kind once.
  void useBoundedLog() {
    log = std::make_shared<fakes::FakeSystemLog>(fakes::FakeSystemLog::Repeats::Bounded);
  }
  Names errors() const { return log->texts(LogLevel::Error); }

  std::shared_ptr<fakes::FakeSystemLog> log = std::make_shared<fakes::FakeSystemLog>();
  std::shared_ptr<fakes::FakeClock> clock = std::make_shared<fakes::FakeClock>();
};

// Runs work in several processes at once, so many times in each; it must always return true.
template <class Work>
void runTogether(int count, int times, const Work& work) {
  std::vector<pid_t> children;
  for (int i = 0; i < count; ++i) {
    const pid_t child = ::fork();
    ASSERT_NE(child, -1);
    if (child == 0) {
      bool all = true;
      for (int n = 0; n < times; ++n) all = static_cast<bool>(work(i, n)) && all;
      ::_exit(all ? 0 : 1);
    }
    children.push_back(child);
  }
  for (const pid_t child : children) {
    int status = 0;
    ASSERT_EQ(::waitpid(child, &status, 0), child);
    EXPECT_EQ(status, 0);
  }
}

}  // namespace tally
