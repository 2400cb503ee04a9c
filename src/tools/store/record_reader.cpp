#include "tools/store/record_reader.h"

#include <algorithm>
#include <cstring>

namespace tally::tools {
namespace {

// Whether text, so far, ends inside a quoted field. A quote that is not at the start of a field is
// an ordinary character.
class QuoteState {
 public:
  void add(std::string_view text) {
    for (const char character : text) {
      switch (state_) {
        case State::FieldStart:
          state_ = character == '"' ? State::Quoted : character == ',' ? state_ : State::Plain;
          break;
        case State::Plain:
          if (character == ',') state_ = State::FieldStart;
          break;
        case State::Quoted:
          if (character == '"') state_ = State::AfterQuote;
          break;
        case State::AfterQuote:
          state_ = character == '"'   ? State::Quoted
                   : character == ',' ? State::FieldStart
                                      : State::Plain;
          break;
      }
    }
  }
  bool isOpen() const { return state_ == State::Quoted; }

 private:
  enum class State { FieldStart, Plain, Quoted, AfterQuote } state_ = State::FieldStart;
};

struct Extent {
  std::size_t end = 0, lines = 0;
};

// Where the record ends that the text begins with; its first line ends at lineEnd. A quoted field
// that is not closed before the end of the text ends with its line.
Extent extentOfRecord(std::string_view text, std::size_t lineEnd) {
  const std::string_view line = text.substr(0, lineEnd);
  if (line.find('"') == std::string_view::npos) return {lineEnd, 1};
  QuoteState quotes;
  quotes.add(line);
  Extent extent{lineEnd, 1};
  while (quotes.isOpen()) {
    if (extent.end == text.size()) return {lineEnd, 1};
    const std::size_t begin = extent.end + 1;
    extent.end = std::min(text.find('\n', begin), text.size());
    ++extent.lines;
    quotes.add(text.substr(begin, extent.end - begin));
  }
  return extent;
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
  const Extent extent = extentOfRecord(window, end);
  end = extent.end;
  record.text = window.substr(0, end);
  if (record.text.ends_with('\r')) record.text.remove_suffix(1);
  line_ += extent.lines;
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
