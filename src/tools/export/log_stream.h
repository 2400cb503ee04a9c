// A stream of property lists, one after the other.
#pragma once

#include <cstddef>
#include <cstdio>
#include <optional>
#include <string>
#include <string_view>

#include "base/result.h"

namespace tally::tools {

// Finds where each document of a stream ends: at the end of its outermost XML element, and where
// the XML declaration of the next one begins, so that a document that was cut off takes none with
// it. Text, comments and sections of character data end nothing, whatever they hold. A binary
// document, and one in UTF-16, do not say where they end: they take the rest of the stream.
class LogStream {
 public:
  // The file is borrowed. A document that is longer than mostBytes is passed over.
  LogStream(std::FILE* input, std::size_t mostBytes) : input_(input), mostBytes_(mostBytes) {}
  // The next document, without blanks around it; valid until the next call. Empty at the end of the
  // stream. An error stands for a document that is too long, or for the rest of the stream when
  // that cannot be read.
  std::optional<Result<std::string_view>> next();

 private:
  // What the position is in.
  enum class Place { Text, Tag, Comment, CharacterData, Instruction, Everything };

  void readMore();
  bool isBlankBefore(std::size_t end) const;
  bool step();
  bool openMarkup(std::size_t at);
  bool passTag();
  bool passUntil(std::string_view mark);
  void begin();

  std::FILE* input_;
  const std::size_t mostBytes_;
  std::string buffer_;        // from the start of the document, or of what is kept of it
  std::size_t position_ = 0;  // what is before it has been looked at
  std::size_t end_ = 0;       // of the document that was found
  Place place_ = Place::Text;
  std::size_t depth_ = 0;  // of open elements
  char quote_ = '\0';      // around an attribute's value
  char mark_ = '\0';       // what follows the '<' of a tag
  bool tooLong_ = false;   // only what is needed to find its end is kept
  bool isAtEnd_ = false, isBroken_ = false;
};

}  // namespace tally::tools
