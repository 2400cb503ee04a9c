// The metrics that were refused last, by name.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string_view>
#include <vector>

#include "recorder/refusal.h"

namespace tally {

// Takes the same memory always, and noting a refusal allocates none: programs that send what is
// refused may do so as fast as they can.
class RefusedNames {
 public:
  static constexpr std::size_t kMost = 64, kLongest = 512;

  enum class Kind : std::uint8_t { Unknown, Scalar, Distribution };
  struct Row {
    std::string_view text;       // what identifies the metric, or its key
    std::size_t nameLength = 0;  // of its name, of which the rest are tags; 0: the text is the key
    Refusal refusal = Refusal::Malformed;  // the last one
    Kind kind = Kind::Unknown;
    std::optional<std::int32_t> day;
    std::uint64_t count = 0;  // of that day, while it was among the last ones
  };
  // A text that no key can have is ignored.
  void note(const Row& row);
  // Nothing of what was noted stays in memory.
  void clear();
  // The newest first; their texts are valid until the next note.
  std::vector<Row> all() const;

 private:
  struct Slot {
    Row row;  // without its text
    std::size_t length = 0;
    std::array<char, kLongest> text;
  };
  std::string_view textOf(const Slot& slot) const { return {slot.text.data(), slot.length}; }
  std::array<std::uint32_t, kMost> hashes_{};
  std::array<Slot, kMost> slots_;
  std::size_t added_ = 0;  // in all; the slots are used in turn
};

}  // namespace tally
