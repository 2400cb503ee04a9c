// The folder of a described device, in memory where there is such a file system (TMPDIR).
#pragma once

#include <unistd.h>

#include <cstdio>
#include <filesystem>
#include <string>

#include "fuzz_values.h"
#include "platform/system_log.h"

namespace tally::fuzz {

// A log that counts as one that everything is written to.
struct UnreadLog final : SystemLog {
  bool enabled(LogLevel) const override { return true; }
  void write(LogLevel, std::string_view) override {}
};

class DescribedFolder {
 public:
  DescribedFolder()
      : path_(std::filesystem::temp_directory_path() / ("fuzz-" + std::to_string(::getpid()))) {
    std::filesystem::create_directories(path_);
    write("File", "bytes of a file that a description names");
  }
  ~DescribedFolder() {
    std::error_code ignored;
    std::filesystem::remove_all(path_, ignored);
  }
  DescribedFolder(const DescribedFolder&) = delete;
  DescribedFolder& operator=(const DescribedFolder&) = delete;

  std::string path() const { return path_; }
  // The input as a file: a property list as it stands, or what a value is written as.
  void writeInput(const std::string& name, Input& input) const {
    if (isDocument(input.rest())) return write(name, input.rest());
    const auto written = encodeXmlPlist(*valueOf(input));
    write(name, written ? *written : "");
  }

 private:
  void write(const std::string& name, std::string_view content) const {
    const std::string file = path_ / name;
    std::FILE* const stream = std::fopen(file.c_str(), "w");
    require(stream != nullptr, "the folder can be written to");
    std::fwrite(content.data(), 1, content.size(), stream);
    std::fclose(stream);
  }

  std::filesystem::path path_;
};

}  // namespace tally::fuzz
