// A folder of a test's own, which is removed with it.
#pragma once

#include <stdlib.h>

#include <filesystem>
#include <fstream>
#include <string>
#include <string_view>

namespace tally {

class TemporaryFolder {
 public:
  TemporaryFolder() {
    std::string name = (std::filesystem::temp_directory_path() / "tally-XXXXXX").string();
    root = ::mkdtemp(name.data());
  }
  ~TemporaryFolder() {
    std::error_code ignored;
    std::filesystem::remove_all(root, ignored);
  }
  TemporaryFolder(const TemporaryFolder&) = delete;
  TemporaryFolder& operator=(const TemporaryFolder&) = delete;

  std::string at(std::string_view path) const { return root + "/" + std::string(path); }
  bool exists(std::string_view path) const { return std::filesystem::exists(at(path)); }
  void put(std::string_view path, std::string_view text) const {
    std::filesystem::create_directories(std::filesystem::path(at(path)).parent_path());
    std::ofstream(at(path), std::ios::binary) << text;
  }
  void putPlist(std::string_view path, std::string_view body) const {
    put(path, "<plist version=\"1.0\">" + std::string(body) + "</plist>\n");
  }

  std::string root;
};

}  // namespace tally
