#include "hwreport/rows/channel_rows.h"

#include <algorithm>

#include "hwreport/channels/keys.h"
#include "platform/protocol/hub_protocol.h"

namespace tally {
namespace {

bool isKey(const KvString& key, const KvRef<KvString>& known) {
  return &key == known.get() || key.view() == known->view();
}

// True when one value can stand for both: values of these types never change.
bool interchangeable(const KvObject* a, const KvObject* b) {
  if (a == b) return true;
  if (a->type() != b->type()) return false;
  if (const auto* const number = kvCast<KvNumber>(a)) {
    return number->kind() == static_cast<const KvNumber*>(b)->kind() && kvIdentical(a, b);
  }
  return a->type() == KvType::String && kvIdentical(a, b);
}

}  // namespace

ChannelShape::ChannelShape(const std::vector<ChannelEntry>& channel) {
  entries.reserve(channel.size());
  const auto& known = keys();
  const struct {
    const KvRef<KvString>& key;
    KvObject*& value;
  } often[] = {{known.driverID, driverID},
               {known.driverName, driverName},
               {known.group, group},
               {known.subGroup, subGroup},
               {known.channelInfo, information}};
  for (const ChannelEntry& entry : channel) {
    const bool common = entry.kind == EntryKind::Common;
    if (entry.kind == EntryKind::Legend) legendEntry = entries.size();
    entries.push_back({KvRef<KvString>::share(entry.key),
                       KvRef<KvObject>::share(common ? entry.value : nullptr), entry.kind});
    hasOddName = hasOddName || (common && isKey(*entry.key, known.channelName));
    hasElements = hasElements || entry.kind == EntryKind::Elements;
    for (const auto& value : often) {
      if (isKey(*entry.key, value.key)) value.value = entry.value;
    }
  }
}

bool ChannelShape::fits(const std::vector<ChannelEntry>& channel) const {
  return std::ranges::equal(entries, channel, [](const Entry& ours, const ChannelEntry& theirs) {
    return ours.kind == theirs.kind &&
           (ours.key.get() == theirs.key || ours.key->view() == theirs.key->view()) &&
           (ours.kind != EntryKind::Common || interchangeable(ours.value.get(), theirs.value));
  });
}

bool ChannelShape::fitsQuickly(const KvDictionary& channel) const noexcept {
  if (legendEntry >= entries.size() || channel.size() != entries.size()) return false;
  const auto* const others = channel.begin();
  for (std::size_t i = 0; i < entries.size(); ++i) {
    if (entries[i].key.get() != others[i].key.get()) return false;
    const KvObject* const value = others[i].value.get();
    const bool same = i == legendEntry ? value->type() == KvType::Array
                                       : value == entries[i].value.get();  // null: not common
    if (!same) return false;
  }
  return true;
}

bool ChannelRows::addQuickly(const KvDictionary& channel) {
  if (shapes_.empty() || !shapes_.back().fitsQuickly(channel)) return false;
  const auto& legend = channel.begin()[shapes_.back().legendEntry].value;
  legends_.push_back(KvRef<KvArray>::share(static_cast<KvArray*>(legend.get())));
  shapeOf_.push_back(static_cast<std::uint32_t>(shapes_.size() - 1));
  return true;
}

ChannelRows::ChannelRows(std::size_t capacity) {
  legends_.reserve(capacity);
  shapeOf_.reserve(capacity);
}

void ChannelRows::add(const std::vector<ChannelEntry>& channel) {
  if (shapes_.empty() || !shapes_.back().fits(channel)) shapes_.emplace_back(channel);
  KvRef<KvArray> legend;
  for (const ChannelEntry& entry : channel) {
    if (entry.kind == EntryKind::Legend) {
      legend = KvRef<KvArray>::share(static_cast<KvArray*>(entry.value));
    } else if (entry.kind == EntryKind::Name) {
      if (names_.capacity() == 0) names_.reserve(legends_.capacity());
      names_.resize(legends_.size());
      names_.push_back(KvRef<KvString>::share(static_cast<KvString*>(entry.value)));
    }
  }
  shapeOf_.push_back(static_cast<std::uint32_t>(shapes_.size() - 1));
  legends_.push_back(std::move(legend));
}

void ChannelRows::prefetchLegends(std::size_t row) const noexcept {
  constexpr std::size_t kLegendAhead = 24, kWordsAhead = 12;
  if (row + kLegendAhead < size()) __builtin_prefetch(legend(row + kLegendAhead));
  const KvArray* const next = row + kWordsAhead < size() ? legend(row + kWordsAhead) : nullptr;
  // The type word is next to the id.
  if (next != nullptr) __builtin_prefetch(next->get(kLegendTypeWord));
}

std::shared_ptr<const ChannelIndex> ChannelRows::index() const {
  const std::lock_guard lock(mutex_);
  if (!index_ || !index_->isCurrent()) index_ = std::make_shared<ChannelIndex>(*this);
  return index_;
}

void ChannelRows::reorder(std::shared_ptr<const ChannelIndex> index,
                          std::vector<std::uint32_t> order) const {
  const std::lock_guard lock(mutex_);
  if (index_ != index) return;
  index.reset();
  if (index_.use_count() == 1) index_->reorder(std::move(order));
}

RunBlock ChannelRows::makeBlock(std::size_t sizeOfRuns) const {
  BlockMemory memory;
  {
    const std::lock_guard lock(mutex_);
    for (BlockMemory& spare : spare_) {
      if (spare.size() > memory.size()) std::swap(spare, memory);
    }
  }
  return {size(), sizeOfRuns, std::move(memory)};
}

void ChannelRows::keepMemory(BlockMemory memory) const {
  const std::lock_guard lock(mutex_);
  for (BlockMemory& spare : spare_) {
    if (spare.size() < memory.size()) std::swap(spare, memory);
  }
}

}  // namespace tally
