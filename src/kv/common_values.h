// Values that documents repeat, each of them made once.
#pragma once

#include <array>
#include <cstddef>
#include <string_view>

#include "kv/value.h"

namespace tally {

// Documents repeat a few short texts very often ("type", "scalar"), and most of their counts and
// settings are small numbers.
class CommonValues {
 public:
  // The text as a value, which the last ones of the same text share if it is short.
  KvRef<KvString> string(std::string_view text) {
    constexpr std::size_t kLongestShared = 24;
    if (text.empty() || text.size() > kLongestShared) return KvString::create(text);
    const auto byte = [&](std::size_t i) {
      return std::size_t{static_cast<unsigned char>(text[i])};
    };
    const std::size_t mixed =
        text.size() * 131 + byte(0) * 31 + byte(text.size() / 2) * 7 + byte(text.size() - 1);
    KvRef<KvString>& slot = recent_[mixed % recent_.size()];
    if (!slot || slot->view() != text) slot = KvString::create(text);
    return slot;
  }

  static constexpr std::size_t kSmallIntegers = 100;
  // REQUIRES: the value is below kSmallIntegers.
  KvRef<KvNumber> smallInteger(std::size_t value) {
    KvRef<KvNumber>& slot = smallIntegers_[value];
    if (!slot) slot = KvNumber::int64(static_cast<std::int64_t>(value));
    return slot;
  }

 private:
  std::array<KvRef<KvString>, 256> recent_;
  std::array<KvRef<KvNumber>, kSmallIntegers> smallIntegers_;
};

}  // namespace tally
