// The channels of one level of a collection, of which no objects have been made yet.
#pragma once

#include <cstdint>
#include <memory>
#include <unordered_map>
#include <vector>

#include "hwreport/rows/channel_rows.h"
#include "kv/dictionary_source.h"

namespace tally {

// Rows, all of them or some, and their elements if they were sampled. The level's dictionary gets
// its array, and a channel its entries, when somebody looks at them; the library itself reads the
// frame.
class ChannelFrame final : public KvDictionarySource {
 public:
  explicit ChannelFrame(std::shared_ptr<const ChannelRows> rows);
  ~ChannelFrame() override;

  // Of the dictionaries of an array, up to the first item that is not one. With their elements, or
  // without, for a caller that will set them.
  enum class Elements { Copied, Left };
  static KvRef<ChannelFrame> of(const KvArray& channels, Elements elements);
  // The frame of a level, or of an array of its channels, that nobody has changed since. Borrowed;
  // null when there is none.
  static const ChannelFrame* behind(const KvDictionary& level);
  static const ChannelFrame* behind(const KvArray& channels);

  // A frame of the same channels that has no elements.
  KvRef<ChannelFrame> copyWithoutElements() const;
  // The level's dictionary, and the array of its channels.
  KvRef<KvDictionary> makeLevel() const;
  KvRef<KvArray> makeArray() const;

  std::size_t size() const noexcept { return all_ ? rows_->size() : kept_.size(); }
  std::size_t rowOf(std::size_t channel) const noexcept { return all_ ? channel : kept_[channel]; }
  bool hasAllRows() const noexcept { return all_; }
  bool hasRowsOf(const ChannelFrame& other) const {
    return rows_ == other.rows_ && all_ == other.all_ && kept_ == other.kept_;
  }
  // Leaves out the other rows; they ascend.
  void keepRows(std::vector<std::uint32_t> rows);

  const ChannelRows& rows() const noexcept { return *rows_; }
  ChannelReading reading(std::size_t row) const;
  // The name of a channel, which its dictionary has from now on; null when it has none. REQUIRES:
  // it has no odd name.
  KvString* cacheName(KvPending& pending) const;

  // The elements, for all rows.
  void makeBlock(std::size_t sizeOfRuns) { block_ = rows_->makeBlock(sizeOfRuns); }
  bool isSampled() const noexcept { return block_.rows() != 0; }
  RunBlock& block() noexcept { return block_; }
  const RunBlock& block() const noexcept { return block_; }
  // Any value as the elements of a row. REQUIRES: there is a block.
  void setElements(std::size_t row, KvRef<KvObject> elements);
  // Those of another channel, if it has any.
  void copyElements(std::size_t row, const KvDictionary& channel);
  // As a value; null when there are none.
  KvRef<KvObject> makeElements(std::size_t row) const;

  void fill(KvDictionary& dictionary, const KvPending& pending) const override;

 private:
  static constexpr std::uint32_t kLevel = UINT32_MAX;  // instead of a row
  static constexpr std::uint32_t kNamed = 1;           // a mark: the name has been cached
  friend struct FrameChannel;
  static const ChannelFrame& frameOf(const KvPending& pending);
  // Without a value for the elements.
  std::vector<ChannelEntry> entriesOf(const KvPending& pending) const;
  bool hasElements(std::size_t row) const;

  const std::shared_ptr<const ChannelRows> rows_;
  bool all_ = true;
  std::vector<std::uint32_t> kept_;
  RunBlock block_;
  std::unordered_map<std::size_t, KvRef<KvObject>> odd_;  // elements that a block cannot hold
  mutable std::vector<KvRef<KvString>> names_;  // by row; empty while none has been asked for
};

// A channel that is a row still: its dictionary has not been made. The frame is null otherwise.
struct FrameChannel {
  static FrameChannel of(const KvDictionary* channel);
  const ChannelFrame* frame = nullptr;
  KvPending* pending = nullptr;
  std::size_t row() const noexcept { return pending->row; }
  const ChannelShape& shape() const noexcept { return frame->rows().shape(row()); }
  KvArray* legend() const noexcept { return frame->rows().legend(row()); }
};

}  // namespace tally
