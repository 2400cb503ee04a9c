#include "base/files/file.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <vector>

namespace tally {
namespace {

Error tooLarge(const std::string& path, std::size_t limit) {
  return {path + " is larger than " + std::to_string(limit) + " bytes", EFBIG};
}

// The size of a regular file that is not larger than limit.
Result<std::size_t> sizeToRead(int descriptor, const std::string& path, std::size_t limit) {
  struct stat status {};
  if (::fstat(descriptor, &status) != 0) return systemError("cannot examine", path);
  if (!S_ISREG(status.st_mode)) return Error{path + " is not a regular file"};
  if (static_cast<std::uint64_t>(status.st_size) > limit) return tooLarge(path, limit);
  return static_cast<std::size_t>(status.st_size);
}

}  // namespace

int Descriptor::close() {
  const int descriptor = std::exchange(value_, -1);
  return descriptor >= 0 ? ::close(descriptor) : 0;
}

Error systemError(std::string_view what, const std::string& path) {
  return systemError(what, path, errno);
}

Error systemError(std::string_view what, const std::string& path, int code) {
  return {std::string(what) + " " + path + ": " + std::strerror(code), code};
}

Result<std::string> readFile(const std::string& path, std::size_t limit) {
  // Non-blocking, so that a pipe in a file's place cannot block the run.
  const Descriptor file(
      retried([&] { return ::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK); }));
  if (!file) return systemError("cannot open", path);
  return readDescriptor(file.get(), path, limit);
}

Result<std::string> readDescriptor(int descriptor, const std::string& path, std::size_t limit) {
  constexpr std::size_t kPiece = 128u << 10;
  constexpr std::size_t kSmallestPiece = 4096;  // files of the kernel report a size of 0
  const auto size = sizeToRead(descriptor, path, limit);
  if (!size) return size.error();
  // Through a buffer that stays in the cache, so that the contents are written to memory once.
  std::string contents;
  contents.reserve(*size);
  std::vector<char> piece(std::clamp(*size + 1, kSmallestPiece, kPiece));
  for (;;) {
    const auto count = retried([&] { return ::read(descriptor, piece.data(), piece.size()); });
    if (count < 0) return systemError("cannot read", path);
    if (count == 0) return contents;
    contents.append(piece.data(), static_cast<std::size_t>(count));
    if (contents.size() > limit) return tooLarge(path, limit);
  }
}

Result<FileReader> FileReader::start(Descriptor file, std::string path, std::size_t limit) {
  if (const auto size = sizeToRead(file.get(), path, limit); !size) return size.error();
  return FileReader(std::move(file), std::move(path), limit);
}

Result<std::size_t> FileReader::read(std::span<char> buffer) {
  const auto count = retried([&] { return ::read(file_.get(), buffer.data(), buffer.size()); });
  if (count < 0) return systemError("cannot read", path_);
  read_ += static_cast<std::size_t>(count);
  if (read_ > limit_) return tooLarge(path_, limit_);
  return static_cast<std::size_t>(count);
}

std::optional<std::uint64_t> fileSize(const std::string& path) {
  struct stat status {};
  if (::stat(path.c_str(), &status) != 0) return std::nullopt;
  return static_cast<std::uint64_t>(status.st_size);
}

bool isSafeFileName(std::string_view name) {
  constexpr std::size_t kLongestName = 200;
  return !name.empty() && name != "." && name != ".." && name.size() <= kLongestName &&
         name.find('/') == std::string_view::npos && name.find('\0') == std::string_view::npos;
}

}  // namespace tally
