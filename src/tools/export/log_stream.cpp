#include "tools/export/log_stream.h"

#include <algorithm>

#include "base/text_lines.h"
#include "kv/plist_binary_reader.h"
#include "kv/plist_xml_reader.h"

namespace tally::tools {
namespace {

constexpr auto kNowhere = std::string_view::npos;
constexpr std::string_view kBlanks = " \t\r\n\xEF\xBB\xBF";  // with the byte order mark's bytes
constexpr std::string_view kDeclaration = "<?xml", kComment = "<!--", kSection = "<![CDATA[";
// What follows a '<' is told apart by so many bytes.
constexpr std::size_t kLongestMark = kSection.size();

}  // namespace

void LogStream::readMore() {
  constexpr std::size_t kPiece = 64u << 10;
  if (buffer_.size() > mostBytes_) tooLong_ = true;
  if (tooLong_) {
    buffer_.erase(0, position_);
    position_ = 0;
    if (place_ == Place::Everything) buffer_.clear();
  }
  const std::size_t before = buffer_.size();
  buffer_.resize(before + kPiece);
  const std::size_t count = std::fread(buffer_.data() + before, 1, kPiece, input_);
  buffer_.resize(before + count);
  isAtEnd_ = count == 0;
}

bool LogStream::isBlankBefore(std::size_t end) const {
  return !tooLong_ &&
         std::string_view(buffer_).substr(0, end).find_first_not_of(kBlanks) == kNowhere;
}

void LogStream::begin() {
  buffer_.erase(0, end_);
  position_ = end_ = depth_ = 0;
  place_ = Place::Text;
  tooLong_ = false;
  // So that the blanks between documents never pile up.
  for (;;) {
    buffer_.erase(0, std::min(buffer_.find_first_not_of(" \t\r\n"), buffer_.size()));
    if (!buffer_.empty() || isAtEnd_) break;
    readMore();
  }
  while (buffer_.size() < kLongestMark && !isAtEnd_) readMore();
  if (isBinaryPlist(buffer_) || isUtf16Plist(buffer_)) place_ = Place::Everything;
}

// Moves past markup that ends with the mark; needs more bytes when it is not there yet.
bool LogStream::passUntil(std::string_view mark) {
  const std::size_t found = buffer_.find(mark, position_);
  if (found == kNowhere) {
    position_ = std::max(position_, buffer_.size() - std::min(buffer_.size(), mark.size() - 1));
    return false;
  }
  position_ = found + mark.size();
  place_ = Place::Text;
  return true;
}

// At a '<'. False when the bytes that follow do not tell what it opens.
bool LogStream::openMarkup(std::size_t at) {
  const std::string_view rest = std::string_view(buffer_).substr(at);
  if (rest.size() < kLongestMark && !isAtEnd_) return false;
  if (rest.starts_with(kDeclaration) && !isBlankBefore(at)) {
    end_ = at;
    return true;
  }
  std::size_t length = 1;
  place_ = Place::Tag;
  quote_ = '\0';
  mark_ = rest.size() > 1 ? rest[1] : '\0';
  if (rest.starts_with(kComment)) {
    place_ = Place::Comment;
    length = kComment.size();
  } else if (rest.starts_with(kSection)) {
    place_ = Place::CharacterData;
    length = kSection.size();
  } else if (rest.starts_with("<?")) {
    place_ = Place::Instruction;
    length = 2;
  }
  position_ = at + length;
  return true;
}

// Inside a tag or a document type. A '<' is in neither: what it is in was cut off.
bool LogStream::passTag() {
  const char quoted[] = {'<', quote_, '\0'};
  const std::size_t found = buffer_.find_first_of(quote_ != '\0' ? quoted : "<>\"'", position_);
  if (found == kNowhere) {
    position_ = buffer_.size();
    return false;
  }
  const char character = buffer_[found];
  position_ = found + 1;
  if (character == '<') {
    position_ = found;
    place_ = Place::Text;
  } else if (character != '>') {
    quote_ = quote_ != '\0' ? '\0' : character;
  } else {
    place_ = Place::Text;
    if (mark_ == '!') return true;
    if (mark_ == '/') {
      depth_ -= std::min<std::size_t>(depth_, 1);
    } else if (found == 0 || buffer_[found - 1] != '/') {
      ++depth_;
    }
    if (depth_ == 0) end_ = position_;
  }
  return true;
}

// False when it takes more bytes.
bool LogStream::step() {
  switch (place_) {
    case Place::Text: {
      const std::size_t found = buffer_.find('<', position_);
      position_ = std::min(found, buffer_.size());
      return found != kNowhere && openMarkup(found);
    }
    case Place::Tag:
      return passTag();
    case Place::Comment:
      return passUntil("-->");
    case Place::CharacterData:
      return passUntil("]]>");
    case Place::Instruction:
      return passUntil("?>");
    case Place::Everything:
      position_ = buffer_.size();
      return false;
  }
  return false;
}

std::optional<Result<std::string_view>> LogStream::next() {
  begin();
  while (end_ == 0) {
    if (step()) continue;
    if (isAtEnd_) {
      if (isBroken_) return std::nullopt;
      end_ = buffer_.size();
      isBroken_ = std::ferror(input_) != 0;
      if (isBroken_) return Error{"cannot be read"};
      break;
    }
    readMore();
  }
  if (tooLong_ || end_ > mostBytes_) return Error{"too large"};
  const std::string_view document = trimmed(std::string_view(buffer_).substr(0, end_));
  if (document.empty()) return std::nullopt;
  return document;
}

}  // namespace tally::tools
