// Text on its way to a file, written in large pieces.
#pragma once

#include <cstddef>
#include <cstdio>
#include <string>

#include "tools/frame/tool.h"

namespace tally::tools {

class BufferedOutput {
 public:
  explicit BufferedOutput(std::FILE* file) : file_(file) {}
  ~BufferedOutput() { flush(); }
  BufferedOutput(const BufferedOutput&) = delete;
  BufferedOutput& operator=(const BufferedOutput&) = delete;
  // What is appended to is written by a later call, or at the end.
  std::string& text() {
    constexpr std::size_t kPiece = 64u << 10;
    if (text_.size() >= kPiece) flush();
    return text_;
  }
  // A former piece could not be written: there is no reader any more, or no space.
  bool failed() const { return std::ferror(file_) != 0; }

 private:
  void flush() {
    print(file_, text_);
    text_.clear();
  }
  std::FILE* file_;
  std::string text_;
};

}  // namespace tally::tools
