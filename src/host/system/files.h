// Files of the device, below its root.
#pragma once

#include <memory>
#include <utility>

#include "base/files/device_root.h"
#include "platform/files.h"

namespace tally {

// Paths are absolute on the device; one that climbs out of the root through ".." is refused.
class RootedFiles final : public Files {
 public:
  explicit RootedFiles(DeviceRoot root) : root_(std::move(root)) {}
  Result<std::string> readFile(std::string_view path, std::size_t limit) override {
    return root_.readFile(path, limit);
  }
  Result<FileSource> openFile(std::string_view path, std::size_t limit) override {
    auto opened = root_.openForReading(path, limit);
    if (!opened) return opened.error();
    const auto reader = std::make_shared<FileReader>(*std::move(opened));
    return FileSource([reader](std::span<char> buffer) { return reader->read(buffer); });
  }
  std::optional<std::uint64_t> fileSize(std::string_view path) override {
    const auto identity = root_.identity(path);
    return identity ? std::optional(identity->size) : std::nullopt;
  }

 private:
  DeviceRoot root_;
};

}  // namespace tally
