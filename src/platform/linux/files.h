// Files of the device, below its root.
#pragma once

#include <string>

#include "base/file.h"
#include "platform/files.h"

namespace tally {

// Paths are absolute on the device; one that climbs out of the root through ".." is refused.
class RootedFiles final : public Files {
 public:
  explicit RootedFiles(std::string prefix) : prefix_(std::move(prefix)) {}
  Result<std::string> readFile(std::string_view path, std::size_t limit) override;
  std::optional<std::uint64_t> fileSize(std::string_view path) override;

 private:
  std::optional<std::string> below(std::string_view path) const;
  std::string prefix_;  // the root without a slash at its end
};

}  // namespace tally
