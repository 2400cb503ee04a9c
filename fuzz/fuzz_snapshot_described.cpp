// Snapshots whose layout a description block gives: any block, at any capacity, from any record on.
#include "fuzz.h"
#include "storage/snapshot.h"
#include "storage/snapshot/snapshot_description.h"

using namespace tally;
using fuzz::require;

FUZZ_TARGET(snapshot_described)(const std::uint8_t* data, std::size_t size) {
  fuzz::Input input(data, size);
  const std::uint32_t capacity = input.take<std::uint16_t>() % 8192;
  const std::uint32_t first = input.take<std::uint8_t>();
  const auto description = input.takeCopy(input.take<std::uint16_t>() % 2048);
  const auto records = input.takeRest();
  const bool refused = !SnapshotDescription().parse(description).empty();

  // Continues a few times, as a caller does after a full text.
  std::uint32_t cursor = first;
  for (int texts = 0; texts < 4; ++texts) {
    const std::uint32_t before = cursor;
    std::vector<char> text(capacity, '#');
    std::uint32_t used = capacity;
    const int result = SPXParseSnapshotBufferWithInplaceParser(
        records.data(), static_cast<std::uint32_t>(records.size()), text.data(), &used, description,
        &cursor);
    if (description.data() == nullptr || capacity == 0) {
      require(result == 0 && used == capacity && cursor == before, "without either all stays");
      return 0;
    }
    require(used >= 1 && used <= capacity && text[used - 1] == '\0', "the text is terminated");
    if (refused) {
      require(result == 0 && used == 1 && cursor == before, "a refused block gives an empty text");
      return 0;
    }
    require(used == 1 || text[used - 2] == '\n', "a text ends with a whole line");
    require(cursor >= before, "the cursor never goes back");
    if (result == 1) return 0;
    if (cursor == before) return 0;  // the header alone is too long
  }
  return 0;
}
