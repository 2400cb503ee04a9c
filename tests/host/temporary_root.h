// A folder of its own for each test, used as a device root, and a log that remembers.
#pragma once

#include <gtest/gtest.h>
#include <signal.h>
#include <stdlib.h>
#include <sys/mount.h>
#include <sys/wait.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "base/device_root.h"
#include "base/file.h"
#include "fakes/fake_platform.h"

namespace tally {

class TemporaryRoot : public testing::Test {
 protected:
  TemporaryRoot() {
    std::string name = (std::filesystem::temp_directory_path() / "tally-linux-XXXXXX").string();
    root = ::mkdtemp(name.data());
  }
  ~TemporaryRoot() override {
    std::error_code ignored;
    std::filesystem::remove_all(root, ignored);
  }

  std::string at(std::string_view path) const { return root + "/" + std::string(path); }
  DeviceDirectory folder(std::string_view path) const { return {root, "/" + std::string(path)}; }
  bool exists(std::string_view path) const { return std::filesystem::exists(at(path)); }
  void put(std::string_view path, std::string_view text) const {
    std::filesystem::create_directories(std::filesystem::path(at(path)).parent_path());
    std::ofstream(at(path), std::ios::binary) << text;
  }
  void putPlist(std::string_view path, const std::string& body) const {
    put(path, "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<plist version=\"1.0\">" + body +
                  "</plist>\n");
  }
  std::string get(std::string_view path) const {
    const auto text = readFile(at(path), 1u << 30);
    return text ? *text : "(" + text.error().message + ")";
  }
  // The entries of a folder, without lock files.
  std::vector<std::string> names(std::string_view path) const {
    std::vector<std::string> found;
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
  std::vector<std::string> errors() const { return log->texts(LogLevel::Error); }

  std::string root;
  std::shared_ptr<fakes::FakeSystemLog> log = std::make_shared<fakes::FakeSystemLog>();
};

// Runs work in a child process and kills it after so many microseconds, if it lives that long.
template <class Work>
void runAndKill(std::uint_fast32_t microseconds, const Work& work) {
  const pid_t child = ::fork();
  ASSERT_NE(child, -1);
  if (child == 0) {
    work();
    ::_exit(0);
  }
  ::usleep(static_cast<useconds_t>(microseconds));
  ::kill(child, SIGKILL);
  int status = 0;
  ASSERT_EQ(::waitpid(child, &status, 0), child);
}

// Runs work in several processes at once; each must return true.
template <class Work>
void runTogether(int count, const Work& work) {
  std::vector<pid_t> children;
  for (int i = 0; i < count; ++i) {
    const pid_t child = ::fork();
    ASSERT_NE(child, -1);
    if (child == 0) ::_exit(work(i) ? 0 : 1);
    children.push_back(child);
  }
  for (const pid_t child : children) {
    int status = 0;
    ASSERT_EQ(::waitpid(child, &status, 0), child);
    EXPECT_EQ(status, 0);
  }
}

// True when the folder's volume was mounted as a small one; it is unmounted with the object.
class TinyVolume {
 public:
  TinyVolume(std::string folder, const char* size) : folder_(std::move(folder)) {
    std::filesystem::create_directories(folder_);
    mounted_ = ::mount("tally", folder_.c_str(), "tmpfs", 0, size) == 0;
  }
  ~TinyVolume() {
    if (mounted_) ::umount(folder_.c_str());
  }
  explicit operator bool() const { return mounted_; }

 private:
  std::string folder_;
  bool mounted_;
};

}  // namespace tally
