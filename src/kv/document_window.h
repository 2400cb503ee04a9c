// The part of a document that is in memory.
#pragma once

#include <cstddef>
#include <memory>
#include <string_view>

#include "kv/plist_receiver.h"

namespace tally {

// A document is read front to back through a window: as large as the piece that its reader needs at
// once, not as the document.
class DocumentWindow {
 public:
  static constexpr std::size_t kPiece = 128u << 10;

  // The whole document at once.
  explicit DocumentWindow(std::string_view document);
  explicit DocumentWindow(PlistSource source, std::size_t piece = kPiece);

  DocumentWindow(const DocumentWindow&) = delete;
  DocumentWindow& operator=(const DocumentWindow&) = delete;

  // Valid until more() is called.
  std::string_view text() const { return text_; }
  // Whether the document ends with the text.
  bool endsDocument() const { return endsDocument_; }
  // Drops the first bytes of the text, and adds at least one byte unless the document ends.
  void more(std::size_t dropped);
  // Of what was dropped.
  std::size_t linesBefore() const { return linesBefore_; }
  // Whether some byte of the document so far is zero.
  bool hasZeroBytes() const { return hasZeroBytes_; }

 private:
  void look(std::string_view added);
  PlistSource source_;
  std::size_t capacity_ = 0;
  std::unique_ptr<char[]> buffer_;
  std::string_view text_;
  bool endsDocument_ = false;
  bool hasZeroBytes_ = false;
  std::size_t linesBefore_ = 0;
};

// Line ends in a text.
std::size_t countLines(std::string_view text);

}  // namespace tally
