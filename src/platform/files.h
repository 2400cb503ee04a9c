// Files of the system, named by their absolute path on the device.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "base/result.h"

namespace tally {

class Files {
 public:
  virtual ~Files() = default;
  // The whole file; an error if it is missing, unreadable, not a regular file or larger than limit.
  virtual Result<std::string> readFile(std::string_view path, std::size_t limit) = 0;
  // Empty when the file cannot be examined.
  virtual std::optional<std::uint64_t> fileSize(std::string_view path) = 0;
};

}  // namespace tally
