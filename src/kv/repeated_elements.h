// Elements of an XML property list that occur again and again to the letter.
#pragma once

#include <array>
#include <cstddef>
#include <string>
#include <string_view>

#include "kv/value.h"

namespace tally {

// A list of many entries gives most of them the same few settings, and comparing an element with
// one that was read before costs a small part of reading it.
class RepeatedElements {
 public:
  struct Element {
    std::string text;         // from its first '<' to its last '>'
    KvRef<KvObject> value;    // null where none is remembered yet
    std::size_t objects = 0;  // values and keys in it
    std::size_t depth = 0;    // containers around it
  };
  // The element that the document goes on with; null if it is not known.
  const Element* find(std::string_view document, std::size_t depth) const {
    for (const Element& known : known_) {
      if (!known.value) return nullptr;
      if (known.depth == depth && document.starts_with(known.text)) return &known;
    }
    return nullptr;
  }
  // REQUIRES: the text is a whole element.
  void remember(std::string_view text, KvRef<KvObject> value, std::size_t objects,
                std::size_t depth) {
    if (text.size() > kLongest) return;
    known_[next_] = {std::string(text), std::move(value), objects, depth};
    next_ = (next_ + 1) % known_.size();
  }

 private:
  // Bound what comparing an element with each of them can cost.
  static constexpr std::size_t kLongest = 2048, kKnown = 16;
  std::array<Element, kKnown> known_;
  std::size_t next_ = 0;
};

}  // namespace tally
