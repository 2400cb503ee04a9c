#include "tools/record_reader.h"

#include <algorithm>
#include <cstring>

namespace tally::tools {
namespace {

bool hasOddQuotes(std::string_view text) {
  return std::count(text.begin(), text.end(), '"') % 2 != 0;
}

struct Extent {
  std::size_t end = 0, lines = 0;
};

// Where the record ends whose first line, up to lineEnd, leaves a quote open; no lines when the
// quote is not closed before the end of the text.
Extent extentOfQuoted(std::string_view text, std::size_t lineEnd) {
  Extent extent{lineEnd, 1};
  while (extent.end < text.size()) {
    const std::size_t begin = extent.end + 1;
    extent.end = std::min(text.find('\n', begin), text.size());
    ++extent.lines;
    if (hasOddQuotes(text.substr(begin, extent.end - begin))) return extent;
  }
  return {};
}

}  // namespace

void RecordReader::refill() {
  std::memmove(buffer_.data(), buffer_.data() + begin_, end_ - begin_);
  end_ -= begin_;
  begin_ = 0;
  const std::size_t room = buffer_.size() - end_;
  const std::size_t count = std::fread(buffer_.data() + end_, 1, room, file_);
  end_ += count;
  atEnd_ = count < room;
}

bool RecordReader::next(Record& record) {
  if (ahead().size() <= kLongestRecord && !atEnd_) refill();
  const std::string_view window = ahead().substr(0, kLongestRecord + 1);
  if (window.empty()) return false;
  record = {{}, line_ + 1, false};
  std::size_t end = window.find('\n');
  if (end == std::string_view::npos) {
    if (window.size() > kLongestRecord) {
      record.tooLong = true;
      skipLine();
      return true;
    }
    end = window.size();  // the last line has no line end
  }
  std::size_t lines = 1;
  if (hasOddQuotes(window.substr(0, end))) {
    if (const Extent whole = extentOfQuoted(window, end); whole.lines > 0) {
      end = whole.end;
      lines = whole.lines;
    }
  }
  record.text = window.substr(0, end);
  if (record.text.ends_with('\r')) record.text.remove_suffix(1);
  line_ += lines;
  take(std::min(end + 1, window.size()));
  return true;
}

void RecordReader::skipLine() {
  for (;;) {
    const std::size_t end = ahead().find('\n');
    if (end != std::string_view::npos) {
      take(end + 1);
      break;
    }
    take(ahead().size());
    if (atEnd_) break;
    refill();
  }
  ++line_;
}

}  // namespace tally::tools
