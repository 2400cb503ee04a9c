// Files of the system, named by their absolute path on the device.
#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <optional>
#include <span>
#include <string>
#include <string_view>

#include "base/result.h"

namespace tally {

// An open file: fills the front of the buffer with what follows, and returns how much; 0 at the
// end.
using FileSource = std::function<Result<std::size_t>(std::span<char> buffer)>;

class Files {
 public:
  virtual ~Files() = default;
  // The whole file; an error if it is missing, unreadable, not a regular file or larger than limit.
  virtual Result<std::string> readFile(std::string_view path, std::size_t limit) = 0;
  // Opens it to be read once, piece by piece; an error under the same conditions, of which some are
  // known only from a piece.
  virtual Result<FileSource> openFile(std::string_view path, std::size_t limit) = 0;
  // Empty when the file cannot be examined.
  virtual std::optional<std::uint64_t> fileSize(std::string_view path) = 0;
};

}  // namespace tally
