#include "platform/linux/files.h"

namespace tally {

std::optional<std::string> RootedFiles::below(std::string_view path) const {
  if (!path.starts_with('/') || path.find('\0') != std::string_view::npos) return std::nullopt;
  for (std::size_t begin = 1; begin <= path.size();) {
    const std::size_t end = std::min(path.find('/', begin), path.size());
    if (path.substr(begin, end - begin) == "..") return std::nullopt;
    begin = end + 1;
  }
  return prefix_ + std::string(path);
}

Result<std::string> RootedFiles::readFile(std::string_view path, std::size_t limit) {
  const auto place = below(path);
  if (!place) return Error{std::string(path) + " does not name a file of the device"};
  return tally::readFile(*place, limit);
}

std::optional<std::uint64_t> RootedFiles::fileSize(std::string_view path) {
  const auto place = below(path);
  return place ? tally::fileSize(*place) : std::nullopt;
}

}  // namespace tally
