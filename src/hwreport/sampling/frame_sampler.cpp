#include "hwreport/sampling/frame_sampler.h"

#include <algorithm>

#include "base/byte_reader.h"
#include "hwreport/channels/type_word.h"

namespace tally {
namespace {

// How far ahead memory is prefetched; beyond the end of the buffer that is harmless.
constexpr std::size_t kFetchAhead = 2048;

std::uint64_t wordAt(std::span<const std::byte> buffer, std::size_t offset) {
  return ByteReader(buffer).read<std::uint64_t>(offset).value_or(0);
}

// A run in a block takes at most a header more than in the buffer.
std::size_t mostOfRuns(std::size_t bytes) {
  return bytes / element::kSize * std::max(RunBlock::sizeOf(1), element::kSize);
}

// Writes the type of a channel that was requested by its id alone. The legend channel array is
// shared, so every copy of the channel gets it.
void learnType(KvArray* legend, const ElementRun& run) {
  const auto known = typeWordOfLegend(legend);
  if (legend == nullptr || (known && known->format() != kHwReportFormatUnknown)) return;
  auto type = KvNumber::uint64(run.typeWord().bits);
  if (legend->size() == kLegendTypeWord) {
    legend->append(std::move(type));
  } else {
    legend->replaceAt(kLegendTypeWord, std::move(type));
  }
}

}  // namespace

FrameSampler::FrameSampler(ChannelFrame& frame, std::span<const std::byte> buffer)
    : frame_(frame),
      index_(frame.rows().index()),
      buffer_(buffer.first(buffer.size() / element::kSize * element::kSize)) {
  frame_.makeBlock(std::min(index_->sizeOfRuns(), mostOfRuns(buffer_.size())));
}

FrameSampler::Result FrameSampler::sample(ChannelFrame& frame, std::span<const std::byte> buffer) {
  FrameSampler sampler(frame, buffer);
  const bool stopped = sampler.scan();
  while (sampler.added_ < sampler.notedCount_) sampler.add();
  return sampler.finish(stopped);
}

bool FrameSampler::scan() {
  for (std::size_t offset = 0; offset < buffer_.size();) {
    const TypeWord type{wordAt(buffer_, offset + element::kTypeWord)};
    const std::size_t size = type.elementCount() * element::kSize;
    if (size == 0) return true;
    if (size > buffer_.size() - offset) break;
    for (std::size_t line = 0; line < size; line += element::kSize) {
      __builtin_prefetch(buffer_.data() + offset + kFetchAhead + line);
    }
    note(offset, size);
    offset += size;
  }
  return false;
}

void FrameSampler::note(std::size_t offset, std::size_t size) {
  if (notedCount_ - added_ == noted_.size()) add();
  Noted& noted = noted_[notedCount_++ % noted_.size()];
  noted = {offset,
           size,
           wordAt(buffer_, offset + element::kDriverID),
           wordAt(buffer_, offset + element::kChannelID),
           ChannelIndex::kNone,
           0};
  if (index_->isAt(expected_, noted.driverID, noted.channelID)) {
    noted.position = static_cast<std::uint32_t>(expected_++);
    frame_.block().prefetchPlace(index_->row(noted.position));
  } else {
    noted.slot = index_->slotOf(noted.driverID, noted.channelID);
    index_->prefetchSlot(noted.slot);
  }
}

void FrameSampler::add() {
  Noted noted = noted_[added_++ % noted_.size()];
  if (const std::size_t next = added_ + kChannelAhead; next < notedCount_) {
    const Noted& later = noted_[next % noted_.size()];
    if (later.position == ChannelIndex::kNone) index_->prefetchChannel(later.slot);
  }
  if (noted.position == ChannelIndex::kNone) {
    noted.position = index_->find(noted.slot, noted.driverID, noted.channelID);
    if (noted.position == ChannelIndex::kNone) return;
    ++searched_;
    expected_ = noted.position + 1 + (notedCount_ - added_);
  }
  // The first run is the channel's.
  const std::uint32_t row = index_->row(noted.position);
  if (!frame_.block().has(row)) {
    frame_.block().add(row, buffer_.subspan(noted.offset, noted.size));
  }
}

void FrameSampler::learnOrder() {
  std::vector<std::uint32_t> order;
  order.reserve(frame_.size());
  frame_.block().eachInOrder([](std::uint32_t) {},
                             [&](std::size_t row, const ElementRun&) {
                               order.push_back(static_cast<std::uint32_t>(row));
                               return true;
                             });
  frame_.rows().reorder(std::move(index_), std::move(order));
}

FrameSampler::Result FrameSampler::finish(bool stopped) {
  RunBlock& block = frame_.block();
  for (const auto& repeated : index_->repeated()) block.share(repeated.row, repeated.first);
  std::vector<std::uint32_t> found;
  const auto rows = static_cast<std::uint32_t>(frame_.size());
  std::uint32_t missing = 0;
  while (missing < rows && block.has(missing)) ++missing;
  // A scan that was stopped ends the sample at the first channel that it has not found.
  for (const std::uint32_t row : index_->formless()) {
    if (stopped && row >= missing) break;
    if (block.has(row)) learnType(frame_.rows().legend(row), block.run(row));
  }
  // The last use of the index.
  if (index_->isInOrderOfRows() && searched_ > rows / 2) learnOrder();
  if (missing == rows) return Result::Complete;
  if (stopped) return Result::Stopped;
  for (std::uint32_t row = 0; row < rows; ++row) {
    if (block.has(row)) found.push_back(row);
  }
  frame_.keepRows(std::move(found));
  return Result::SomeMissing;
}

}  // namespace tally
