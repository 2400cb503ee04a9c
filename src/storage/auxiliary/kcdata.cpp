// Searches kcdata, a sequence of items some of which open and close containers, for the I/O
// statistics of a thread. One pass at any nesting; a small stack keeps the open containers.
#include "storage/kcdata.h"

#include <algorithm>
#include <array>
#include <optional>
#include <string_view>

#include "base/byte_reader.h"

namespace tally {
namespace {

// An item: 32-bit type, 32-bit payload size, 64-bit flags, payload.
constexpr std::size_t kSizeOffset = 4, kFlagsOffset = 8, kHeaderSize = 16;
constexpr std::uint32_t kBufferEnd = 0xF19158ED;
constexpr std::uint32_t kContainerBegin = 0x13;
constexpr std::uint32_t kContainerEnd = 0x14;
constexpr std::uint32_t kThreadName = 0x909;
constexpr std::uint32_t kIoStatistics = 0x901;

constexpr std::size_t kContainerPayload = 4;  // at least; less opens no container
constexpr std::size_t kNameLength = 64;
// A task contains threads: two levels. Deeper nesting than this is an attack.
constexpr std::size_t kDeepest = 64;

struct Item {
  std::uint32_t type = 0;
  std::uint64_t flags = 0;
  std::span<const std::byte> payload;

  bool opensContainer() const {
    return type == kContainerBegin && payload.size() >= kContainerPayload;
  }
};

class ItemReader {
 public:
  explicit ItemReader(std::span<const std::byte> bytes) : reader_(bytes) {}
  // Empty, at the same position, when the item is not wholly inside.
  std::optional<Item> next() {
    const auto type = reader_.read<std::uint32_t>(at_);
    const auto size = reader_.read<std::uint32_t>(at_ + kSizeOffset);
    const auto flags = reader_.read<std::uint64_t>(at_ + kFlagsOffset);
    if (!type || !size || !flags) return std::nullopt;
    const auto payload = reader_.slice(at_ + kHeaderSize, *size);
    if (!payload) return std::nullopt;
    if (*type != kBufferEnd) at_ += kHeaderSize + *size;  // nothing is read beyond it
    return Item{*type, *flags, *payload};
  }
  std::size_t position() const { return at_; }

 private:
  ByteReader reader_;
  std::size_t at_ = 0;
};

struct Container {
  std::uint64_t id = 0;
  std::optional<std::span<const std::byte>> name;
  std::span<const std::byte> ioStatistics;

  void take(const Item& item) {
    if (item.type == kThreadName) {
      name = item.payload.first(std::min(item.payload.size(), kNameLength));
    } else if (item.type == kIoStatistics) {
      ioStatistics = item.payload;
    }
  }
  // The recorded characters begin the wanted name; a zero byte ends both.
  bool isNamed(std::string_view wanted) const {
    if (!name) return false;
    for (std::size_t i = 0; i < name->size(); ++i) {
      const char recorded = static_cast<char>((*name)[i]);
      const char expected = i < wanted.size() ? wanted[i] : '\0';
      if (recorded != expected) return false;
      if (expected == '\0') break;
    }
    return true;
  }
};

// The containers that are open at one point of the data.
using ContainerStack = std::array<Container, kDeepest>;

enum class Outcome { Found, NotFound, DataEnded };

// Reads to the end of the container that `first` opened, and closes it and each one inside in turn.
Outcome searchContainer(ItemReader& items, const Item& first, std::string_view wanted,
                        ContainerStack& open, std::span<const std::byte>* ioStats) {
  std::size_t depth = 0;
  open[depth++] = {first.flags, {}, {}};
  while (depth > 0) {
    const std::optional<Item> item = items.next();
    if (!item) return Outcome::DataEnded;
    if (item->opensContainer()) {
      if (depth == kDeepest) return Outcome::DataEnded;
      open[depth++] = {item->flags, {}, {}};
      continue;
    }
    // The end of the data closes all that is open, the innermost first.
    const bool all = item->type == kBufferEnd;
    while (depth > 0 &&
           (all || (item->type == kContainerEnd && item->flags == open[depth - 1].id))) {
      const Container& closed = open[--depth];
      if (closed.isNamed(wanted)) {
        *ioStats = closed.ioStatistics;
        return Outcome::Found;
      }
      if (!all) break;
    }
    if (depth > 0) open[depth - 1].take(*item);
  }
  return Outcome::NotFound;
}

// Searches the first container of the items, and all that is nested in it.
Outcome searchFirstContainer(ItemReader& items, std::string_view wanted, ContainerStack& open,
                             std::span<const std::byte>* ioStats) {
  for (std::optional<Item> item = items.next(); item && item->type != kBufferEnd;
       item = items.next()) {
    if (item->opensContainer()) return searchContainer(items, *item, wanted, open, ioStats);
  }
  return Outcome::DataEnded;
}

}  // namespace

int getIOStatsWithThreadnameFromKCDataHelper(const std::byte* begin, const std::byte* end,
                                             const char* threadName,
                                             std::span<const std::byte>* ioStatsOut,
                                             const std::byte** positionOut) {
  if (positionOut != nullptr) *positionOut = nullptr;
  if (threadName == nullptr) return 0;
  ContainerStack open;
  ItemReader items({begin, end});
  const Outcome outcome = searchFirstContainer(items, threadName, open, ioStatsOut);
  if (positionOut != nullptr && outcome != Outcome::DataEnded) {
    *positionOut = begin + items.position();
  }
  return outcome == Outcome::Found ? 1 : 0;
}

int getIOStatsWithThreadnameFromKCData(const std::byte* begin, const std::byte* end,
                                       const char* threadName,
                                       std::span<const std::byte>* ioStatsOut) {
  if (threadName == nullptr) return 0;
  ContainerStack open;
  ItemReader items({begin, end});
  Outcome outcome;
  do {
    outcome = searchFirstContainer(items, threadName, open, ioStatsOut);
  } while (outcome == Outcome::NotFound);
  return outcome == Outcome::Found ? 1 : 0;
}

}  // namespace tally
