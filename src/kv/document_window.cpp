#include "kv/document_window.h"

#include <algorithm>
#include <cstdint>
#include <cstring>
#include <span>

namespace tally {

std::size_t countLines(std::string_view text) {
  // Blocks of a fixed size, whose sums fit in a byte, are what the compiler vectorizes.
  constexpr std::size_t kBlock = 128;
  std::size_t lines = 0;
  for (; text.size() >= kBlock; text.remove_prefix(kBlock)) {
    const char* const block = text.data();
    std::uint8_t inBlock = 0;
    for (std::size_t i = 0; i < kBlock; ++i) {
      inBlock = static_cast<std::uint8_t>(inBlock + (block[i] == '\n' ? 1 : 0));
    }
    lines += inBlock;
  }
  return lines + static_cast<std::size_t>(std::count(text.begin(), text.end(), '\n'));
}

DocumentWindow::DocumentWindow(std::string_view document) : text_(document), endsDocument_(true) {
  look(document);
}

DocumentWindow::DocumentWindow(PlistSource source, std::size_t piece)
    : source_(std::move(source)),
      capacity_(piece),
      buffer_(std::make_unique_for_overwrite<char[]>(piece)) {}

void DocumentWindow::more(std::size_t dropped) {
  linesBefore_ += countLines(text_.substr(0, dropped));
  text_.remove_prefix(dropped);
  if (endsDocument_) return;
  const std::size_t kept = text_.size();
  if (kept > capacity_ / 2) {
    // One part of the document is larger than the window.
    auto larger = std::make_unique_for_overwrite<char[]>(capacity_ * 2);
    std::ranges::copy(text_, larger.get());
    buffer_ = std::move(larger);
    capacity_ *= 2;
  } else if (kept != 0) {
    std::memmove(buffer_.get(), text_.data(), kept);
  }
  const std::size_t added = source_({buffer_.get() + kept, capacity_ - kept});
  endsDocument_ = added == 0;
  text_ = {buffer_.get(), kept + added};
  look(text_.substr(kept));
}

void DocumentWindow::look(std::string_view added) {
  hasZeroBytes_ = hasZeroBytes_ || added.find('\0') != added.npos;
}

}  // namespace tally
