// Records of a CSV stream, one after the other, in constant memory.
#pragma once

#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <string_view>
#include <vector>

namespace tally::tools {

// A record is a line, or several if a quoted field contains line ends. A quote that is never closed
// invalidates only its own line: a record that would be longer than kLongestRecord is cut at its
// first line end.
class RecordReader {
 public:
  static constexpr std::size_t kLongestRecord = 8192;
  struct Record {
    std::string_view text;   // without its line end; valid until the next call
    std::uint64_t line = 0;  // of its first byte, from 1
    bool tooLong = false;    // a line longer than the bound; its text is left out
  };
  // The file is borrowed.
  explicit RecordReader(std::FILE* file) : file_(file), buffer_(kBufferBytes) {}
  // False at the end, or when reading failed.
  bool next(Record& record);
  bool failed() const { return std::ferror(file_) != 0; }
  std::uint64_t bytesTaken() const { return bytesTaken_; }

 private:
  static constexpr std::size_t kBufferBytes = 256u << 10;
  std::string_view ahead() const { return {buffer_.data() + begin_, end_ - begin_}; }
  void refill();
  void skipLine();
  void take(std::size_t bytes) {
    begin_ += bytes;
    bytesTaken_ += bytes;
  }

  std::FILE* file_;
  std::vector<char> buffer_;
  std::size_t begin_ = 0, end_ = 0;
  bool atEnd_ = false;
  std::uint64_t line_ = 0, bytesTaken_ = 0;
};

}  // namespace tally::tools
