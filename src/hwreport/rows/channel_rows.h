// Channels as rows: what the channels of a collection have in common is stored once.
#pragma once

#include <cstdint>
#include <memory>
#include <mutex>
#include <vector>

#include "hwreport/rows/channel_index.h"
#include "hwreport/rows/run_block.h"
#include "kv/value.h"

namespace tally {

// Entries of a channel's dictionary that differ from channel to channel have a place of their own.
enum class EntryKind : std::uint8_t { Common, Legend, Name, Elements };

// Borrowed, while rows are being made of dictionaries.
struct ChannelEntry {
  KvString* key = nullptr;
  KvObject* value = nullptr;  // null for elements
  EntryKind kind = EntryKind::Common;
};

// The entries that consecutive channels share, in the order of their dictionaries.
struct ChannelShape {
  explicit ChannelShape(const std::vector<ChannelEntry>& channel);
  bool fits(const std::vector<ChannelEntry>& channel) const;
  // True only if all objects are the same, which is quickly found out.
  bool fitsQuickly(const KvDictionary& channel) const noexcept;

  struct Entry {
    KvRef<KvString> key;
    KvRef<KvObject> value;  // null unless it is common
    EntryKind kind;
  };
  std::vector<Entry> entries;
  std::size_t legendEntry = SIZE_MAX;  // of them, if there is one
  // Values among them that are read often; null when there is none.
  KvObject* driverID = nullptr;
  KvObject* driverName = nullptr;
  KvObject* group = nullptr;
  KvObject* subGroup = nullptr;
  KvObject* information = nullptr;
  bool hasOddName = false;  // one that is not text
  bool hasElements = false;
};

// Never changes once it is shared, apart from what it caches.
class ChannelRows {
 public:
  explicit ChannelRows(std::size_t capacity);
  // REQUIRES: the legend and the name are among the entries, if there are any.
  void add(const std::vector<ChannelEntry>& channel);
  // The same for a channel of the last one's shape; false when it is of another one.
  bool addQuickly(const KvDictionary& channel);

  std::size_t size() const noexcept { return legends_.size(); }
  const ChannelShape& shape(std::size_t row) const noexcept { return shapes_[shapeOf_[row]]; }
  // Shapes are numbered in the order of their first rows.
  std::uint32_t shapeNumber(std::size_t row) const noexcept { return shapeOf_[row]; }
  KvArray* legend(std::size_t row) const noexcept { return legends_[row].get(); }
  // For a pass over all rows that reads the ids and types of their legends.
  void prefetchLegends(std::size_t row) const noexcept;
  // A name that the dictionary had already.
  KvString* name(std::size_t row) const noexcept {
    return row < names_.size() ? names_[row].get() : nullptr;
  }

  // What finds the row of a run, made anew when an array has changed since. Safe from any thread.
  std::shared_ptr<const ChannelIndex> index() const;

  // Puts the index into the order of the runs of a sample, for the next ones, unless somebody else
  // uses it just now.
  void reorder(std::shared_ptr<const ChannelIndex> index, std::vector<std::uint32_t> order) const;

  // A block for the runs of all rows, and its memory back.
  RunBlock makeBlock(std::size_t sizeOfRuns) const;
  void keepMemory(BlockMemory memory) const;

 private:
  std::vector<KvRef<KvArray>> legends_;
  std::vector<std::uint32_t> shapeOf_;
  std::vector<ChannelShape> shapes_;
  std::vector<KvRef<KvString>> names_;  // shorter when the last ones have none
  mutable std::mutex mutex_;
  mutable std::shared_ptr<ChannelIndex> index_;
  // Of the samples that were released last: a sample and a difference are taken again and again,
  // and touching fresh memory would cost more than filling it.
  mutable BlockMemory spare_[2];
};

}  // namespace tally
