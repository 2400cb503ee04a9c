// Open files, and files that the caller names: those of the command line, and the kernel's own.
// Files of the device are reached through directories (base/files/directory.h).
#pragma once

#include <cerrno>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <utility>

#include "base/result.h"

namespace tally {

// An owned file descriptor.
class Descriptor {
 public:
  Descriptor() = default;
  explicit Descriptor(int value) : value_(value) {}
  Descriptor(Descriptor&& other) noexcept : value_(std::exchange(other.value_, -1)) {}
  Descriptor& operator=(Descriptor&& other) noexcept {
    std::swap(value_, other.value_);
    return *this;
  }
  ~Descriptor() { (void)close(); }
  int get() const { return value_; }
  explicit operator bool() const { return value_ >= 0; }
  // Hands the descriptor over to the caller.
  int release() { return std::exchange(value_, -1); }
  // What close(2) returned; 0 when nothing was open.
  int close();

 private:
  int value_ = -1;
};

// Repeats the call while signals interrupt it. Returns its result; -1 with errno on failure.
template <class Call>
auto retried(Call call) {
  auto result = call();
  while (result == -1 && errno == EINTR) result = call();
  return result;
}

// The error of a system call on a path; the reason is that of errno or of the given code.
Error systemError(std::string_view what, const std::string& path);
Error systemError(std::string_view what, const std::string& path, int code);

// An open file that is read from its start to its end.
class FileReader {
 public:
  // The path names the file in messages. Refuses directories, devices and files larger than limit.
  static Result<FileReader> start(Descriptor file, std::string path, std::size_t limit);
  // Fills the front of the buffer with what follows, and returns how much; 0 at the end. An error
  // also if the file has grown past the limit.
  Result<std::size_t> read(std::span<char> buffer);

 private:
  FileReader(Descriptor file, std::string path, std::size_t limit)
      : file_(std::move(file)), path_(std::move(path)), limit_(limit) {}
  Descriptor file_;
  std::string path_;
  std::size_t limit_;
  std::size_t read_ = 0;
};

// The whole file. Refuses directories, devices and files larger than limit, without reading them.
Result<std::string> readFile(const std::string& path, std::size_t limit);
// The same for an open one, which the path names in messages. The descriptor stays open.
Result<std::string> readDescriptor(int descriptor, const std::string& path, std::size_t limit);

// Size in bytes of a regular file; empty when it cannot be examined.
std::optional<std::uint64_t> fileSize(const std::string& path);

// True when name can be one component of a path: not empty, not "." or "..", no '/', no NUL, at
// most 200 bytes. Every untrusted name of a file is checked with this.
bool isSafeFileName(std::string_view name);

}  // namespace tally
