#include "hwreport/rows/channel_frame.h"

#include "hwreport/channels/keys.h"
#include "hwreport/channels/naming.h"

namespace tally {
namespace {

EntryKind kindOf(const KvString& key, const KvObject& value) {
  const auto& known = keys();
  const auto is = [&](const KvRef<KvString>& other) {
    return &key == other.get() || key.view() == other->view();
  };
  if (is(known.legendChannel) && value.type() == KvType::Array) return EntryKind::Legend;
  if (is(known.channelName) && value.type() == KvType::String) return EntryKind::Name;
  return is(known.rawElements) ? EntryKind::Elements : EntryKind::Common;
}

// A channel of six entries.
void prefetch(const KvObject* dictionary) {
  if (dictionary == nullptr) return;
  constexpr std::size_t kLines = 3, kCacheLine = 64;
  const auto* const start = reinterpret_cast<const char*>(dictionary);
  for (std::size_t line = 0; line < kLines; ++line) __builtin_prefetch(start + line * kCacheLine);
}
constexpr std::size_t kAhead = 24;

KvRef<KvData> dataOf(const ElementRun& run) {
  std::vector<std::byte> bytes(run.elements() * element::kSize);
  run.copyTo(bytes);
  return KvData::create(bytes);
}

}  // namespace

ChannelFrame::ChannelFrame(std::shared_ptr<const ChannelRows> rows) : rows_(std::move(rows)) {}
ChannelFrame::~ChannelFrame() { rows_->keepMemory(block_.takeMemory()); }

const ChannelFrame& ChannelFrame::frameOf(const KvPending& pending) {
  return static_cast<const ChannelFrame&>(*pending.source);  // there is no other source
}

FrameChannel FrameChannel::of(const KvDictionary* channel) {
  KvPending* const pending = KvPendingAccess::of(channel);
  if (pending == nullptr || pending->row == ChannelFrame::kLevel) return {};
  return {&ChannelFrame::frameOf(*pending), pending};
}

const ChannelFrame* ChannelFrame::behind(const KvDictionary& level) {
  const KvPending* const pending = KvPendingAccess::of(&level);
  return pending != nullptr && pending->row == kLevel ? &frameOf(*pending) : nullptr;
}

const ChannelFrame* ChannelFrame::behind(const KvArray& channels) {
  const ChannelFrame* const frame = FrameChannel::of(channels.getAs<KvDictionary>(0)).frame;
  if (frame == nullptr || frame->size() != channels.size()) return nullptr;
  for (std::size_t i = 0; i < channels.size(); ++i) {
    const KvPending* const pending = KvPendingAccess::of(channels.getAs<KvDictionary>(i));
    if (pending == nullptr || pending->source != frame || pending->marks != 0 ||
        pending->row != frame->rowOf(i)) {
      return nullptr;
    }
  }
  return frame;
}

KvRef<ChannelFrame> ChannelFrame::of(const KvArray& channels, Elements elements) {
  const auto rows = std::make_shared<ChannelRows>(channels.size());
  std::vector<ChannelEntry> entries;
  for (std::size_t i = 0; i < channels.size(); ++i) {
    prefetch(channels.get(i + kAhead));
    const auto* const channel = channels.getAs<KvDictionary>(i);
    if (channel == nullptr) break;
    if (const auto row = FrameChannel::of(channel); row.frame != nullptr) {
      entries = row.frame->entriesOf(*row.pending);
    } else {
      if (rows->addQuickly(*channel)) continue;
      entries.clear();
      for (const auto& entry : *channel) {
        entries.push_back({entry.key.get(), entry.value.get(), kindOf(*entry.key, *entry.value)});
      }
    }
    rows->add(entries);
  }
  auto frame = KvRef<ChannelFrame>::adopt(new ChannelFrame(rows));
  if (elements == Elements::Left) return frame;
  for (std::size_t row = 0; row < rows->size(); ++row) {
    if (!rows->shape(row).hasElements) continue;
    if (frame->block_.rows() == 0) frame->makeBlock(0);
    frame->copyElements(row, *channels.getAs<KvDictionary>(row));
  }
  return frame;
}

void ChannelFrame::copyElements(std::size_t row, const KvDictionary& channel) {
  if (const auto from = FrameChannel::of(&channel);
      from.frame != nullptr && from.frame->block_.has(from.row())) {
    const ElementRun run = from.frame->block_.run(from.row());
    block_.addCopy(row, run, run.elements());
    return;
  }
  KvObject* const elements = channel.get(*keys().rawElements);
  if (elements != nullptr) setElements(row, KvRef<KvObject>::share(elements));
}

KvRef<ChannelFrame> ChannelFrame::copyWithoutElements() const {
  auto copy = KvRef<ChannelFrame>::adopt(new ChannelFrame(rows_));
  copy->all_ = all_;
  copy->kept_ = kept_;
  return copy;
}

KvRef<KvDictionary> ChannelFrame::makeLevel() const { return KvPendingAccess::make(*this, kLevel); }

KvRef<KvArray> ChannelFrame::makeArray() const {
  KvArena arena;
  auto array = KvArray::create(size());
  for (std::size_t i = 0; i < size(); ++i) {
    array->append(KvPendingAccess::make(*this, static_cast<std::uint32_t>(rowOf(i)), &arena));
  }
  return array;
}

void ChannelFrame::keepRows(std::vector<std::uint32_t> rows) {
  all_ = false;
  kept_ = std::move(rows);
}

void ChannelFrame::setElements(std::size_t row, KvRef<KvObject> elements) {
  const auto* const data = kvCast<KvData>(elements.get());
  const std::size_t size = data != nullptr ? data->bytes().size() : 0;
  if (size != 0 && size % element::kSize == 0) {
    block_.add(row, data->bytes());
  } else {
    odd_[row] = std::move(elements);
  }
}

bool ChannelFrame::hasElements(std::size_t row) const {
  return block_.has(row) || odd_.contains(row);
}

KvRef<KvObject> ChannelFrame::makeElements(std::size_t row) const {
  if (block_.has(row)) return dataOf(block_.run(row));
  const auto found = odd_.find(row);
  return found != odd_.end() ? found->second : nullptr;
}

ChannelReading ChannelFrame::reading(std::size_t row) const {
  ChannelReading reading;
  const KvArray* const legend = rows_->legend(row);
  reading.type = typeWordOfLegend(legend);
  if (block_.has(row)) {
    reading.elements = block_.run(row);
  } else if (!odd_.empty()) {
    const auto found = odd_.find(row);
    if (found != odd_.end()) reading.elements = runOfValue(found->second.get());
  }
  return reading;
}

KvString* ChannelFrame::cacheName(KvPending& pending) const {
  const std::size_t row = pending.row;
  if (KvString* const known = rows_->name(row)) return known;
  if ((pending.marks & kNamed) != 0) return names_[row].get();
  if (row >= names_.size() || !names_[row]) {
    auto name = nameOfLegend(rows_->legend(row));
    if (!name) return nullptr;
    names_.resize(rows_->size());
    names_[row] = std::move(name);
  }
  pending.marks |= kNamed;
  return names_[row].get();
}

std::vector<ChannelEntry> ChannelFrame::entriesOf(const KvPending& pending) const {
  const std::size_t row = pending.row;
  const ChannelShape& shape = rows_->shape(row);
  std::vector<ChannelEntry> entries;
  entries.reserve(shape.entries.size() + 2);
  for (const auto& entry : shape.entries) {
    if (entry.kind == EntryKind::Elements && !hasElements(row)) continue;
    KvObject* const value = entry.kind == EntryKind::Legend ? rows_->legend(row)
                            : entry.kind == EntryKind::Name ? rows_->name(row)
                                                            : entry.value.get();
    entries.push_back({entry.key.get(), value, entry.kind});
  }
  if (!shape.hasElements && hasElements(row)) {
    entries.push_back({keys().rawElements.get(), nullptr, EntryKind::Elements});
  }
  if ((pending.marks & kNamed) != 0) {
    entries.push_back({keys().channelName.get(), names_[row].get(), EntryKind::Name});
  }
  return entries;
}

void ChannelFrame::fill(KvDictionary& dictionary, const KvPending& pending) const {
  if (pending.row == kLevel) {
    dictionary.set(keys().channels, makeArray());
    return;
  }
  const auto entries = entriesOf(pending);
  KvPendingAccess::reserve(dictionary, entries.size() + 1);  // a name may be cached
  for (const ChannelEntry& entry : entries) {
    KvPendingAccess::append(dictionary, KvRef<KvString>::share(entry.key),
                            entry.kind == EntryKind::Elements
                                ? makeElements(pending.row)
                                : KvRef<KvObject>::share(entry.value));
  }
}

}  // namespace tally
