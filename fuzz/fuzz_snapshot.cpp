// Snapshots of the fixed layout at any capacity.
#include "storage/snapshot.h"

#include <string>

#include "fuzz.h"

using namespace tally;
using fuzz::require;

namespace {

constexpr char kUntouched = '#';

struct Rendered {
  int result;
  std::uint32_t size;
  std::vector<char> text;
};

Rendered render(std::span<const std::byte> records, std::uint32_t capacity) {
  Rendered made{-1, capacity, std::vector<char>(capacity, kUntouched)};
  made.result = SPXParseSnapshotBuffer(records.data(), static_cast<std::uint32_t>(records.size()),
                                       made.text.data(), &made.size);
  return made;
}

}  // namespace

FUZZ_TARGET(snapshot)(const std::uint8_t* data, std::size_t size) {
  fuzz::Input input(data, size);
  const std::uint32_t capacity = input.take<std::uint16_t>() % 8192;
  const auto records = input.takeRest();

  const auto longest = static_cast<std::uint32_t>(4096 + records.size() * 8);
  const Rendered whole = render(records, longest);
  require(whole.result == 1 && whole.size < longest && whole.text[whole.size] == '\0',
          "with enough capacity the text is whole");
  const Rendered made = render(records, capacity);
  require(made.result == (whole.size < capacity ? 1 : 0), "the text is whole when it fits");
  require(made.size == (made.result != 0 ? whole.size : capacity), "the size says what there is");
  if (capacity == 0) return 0;
  const std::size_t length = std::min<std::size_t>(whole.size, capacity - 1);
  require(
      std::memcmp(made.text.data(), whole.text.data(), length) == 0 && made.text[length] == '\0',
      "what does not fit is cut");
  require(std::all_of(made.text.begin() + static_cast<std::ptrdiff_t>(length) + 1, made.text.end(),
                      [](char c) { return c == kUntouched; }),
          "nothing is written after the text");
  return 0;
}
