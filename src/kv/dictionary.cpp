// KvDictionary: a vector of entries in insertion order, with a hash index once it is large.
#include "kv/value.h"

#include <algorithm>

#include "base/hash.h"
#include "kv/dictionary_source.h"
#include "kv/maker.h"

namespace tally {
namespace {

constexpr std::size_t kFlatEntries = 12;  // up to here a scan beats a hash index
constexpr std::size_t kNotFound = static_cast<std::size_t>(-1);

}  // namespace

KvDictionary::KvDictionary(std::uint32_t capacity) noexcept
    : KvObject(kType), entries_(this + 1, capacity) {}
KvDictionary::KvDictionary(const KvPending* pending) noexcept
    : KvObject(kType), isPending_(true), pending_(*pending) {}

KvDictionary::~KvDictionary() {
  if (isPending_) {
    pending_.source->release();
  } else {
    entries_.~KvItems();
  }
}

void KvDictionary::fill() const {
  const KvPending pending = pending_;
  isPending_ = false;
  auto* const self = const_cast<KvDictionary*>(this);  // no value is made const
  new (&self->entries_) KvItems<Entry>(self + 1, 0);
  try {
    pending.source->fill(*self, pending);
  } catch (...) {
    entries_.~KvItems();
    self->index_.reset();
    pending_ = pending;
    isPending_ = true;
    throw;
  }
  pending.source->release();
}

KvRef<KvDictionary> KvDictionary::create(std::size_t capacity, KvArena* arena) {
  auto dictionary = KvMaker::makeContainer<KvDictionary, Entry>(arena, capacity);
  dictionary->entries_.reserve(capacity);
  return dictionary;
}

KvRef<KvDictionary> KvDictionary::create(
    std::initializer_list<std::pair<std::string_view, KvRef<KvObject>>> entries) {
  auto dictionary = create(entries.size());
  for (const auto& [key, value] : entries) dictionary->set(key, value);
  return dictionary;
}

std::size_t KvDictionary::find(std::string_view key, std::uint32_t hash) const {
  const auto isKey = [&](std::size_t i) { return entries_[i].key->view() == key; };
  if (index_) {
    const std::uint32_t found = index_->find(hash, isKey);
    return found == HashIndex::kNone ? kNotFound : found;
  }
  for (std::size_t i = 0; i < entries_.size(); ++i) {
    if (isKey(i)) return i;
  }
  return kNotFound;
}

std::size_t KvDictionary::find(std::string_view key) const {
  if (isPending_) fill();
  return find(key, index_ ? hashBytes(key) : 0);
}

std::size_t KvDictionary::find(const KvString& key) const {
  if (isPending_) fill();
  if (index_) return find(key.view(), key.hash_);
  for (std::size_t i = 0; i < entries_.size(); ++i) {
    const KvString* const other = entries_[i].key.get();
    if (other == &key || (other->hash_ == key.hash_ && other->view() == key.view())) return i;
  }
  return kNotFound;
}

KvObject* KvDictionary::get(const KvString& key) const {
  const std::size_t found = find(key);
  return found == kNotFound ? nullptr : entries_[found].value.get();
}

KvObject* KvDictionary::get(std::string_view key) const {
  const std::size_t found = find(key);
  return found == kNotFound ? nullptr : entries_[found].value.get();
}

void KvDictionary::rebuildIndex() {
  index_.reset();
  if (entries_.size() <= kFlatEntries) return;
  index_ = std::make_unique<HashIndex>();
  index_->reserve(std::max<std::size_t>(entries_.size(), entries_.capacity()));
  for (std::size_t i = 0; i < entries_.size(); ++i) {
    index_->add(entries_[i].key->hash_, static_cast<std::uint32_t>(i));
  }
}

void KvDictionary::append(KvRef<KvString> key, KvRef<KvObject> value) {
  const std::uint32_t hash = key->hash_;
  entries_.push_back({std::move(key), std::move(value)});
  if (index_) {
    index_->add(hash, static_cast<std::uint32_t>(entries_.size() - 1));
  } else if (entries_.size() > kFlatEntries) {
    rebuildIndex();
  }
}

void KvDictionary::set(std::string_view key, KvRef<KvObject> value) {
  if (!value) {
    remove(key);
    return;
  }
  const std::size_t found = find(key);
  if (found != kNotFound) {
    entries_[found].value = std::move(value);
  } else {
    set(KvString::create(key), std::move(value));
  }
}

void KvDictionary::set(const KvRef<KvString>& key, KvRef<KvObject> value) {
  const std::size_t found = find(*key);
  if (!value) {
    if (found != kNotFound) remove(key->view());
  } else if (found != kNotFound) {
    entries_[found].value = std::move(value);
  } else {
    append(key, std::move(value));
  }
}

bool KvDictionary::remove(std::string_view key) {
  const std::size_t found = find(key);
  if (found == kNotFound) return false;
  entries_.removeAt(found);
  rebuildIndex();
  return true;
}

void KvDictionary::merge(const KvDictionary& other) {
  if (&other == this) return;
  for (const Entry& entry : other.entries()) set(entry.key, entry.value);
}

KvRef<KvDictionary> KvDictionary::copy(std::size_t more, KvArena* arena) const {
  auto dictionary = create(entries().size() + more, arena);
  dictionary->entries_.appendWithinRoom(entries_);
  if (index_) dictionary->index_ = std::make_unique<HashIndex>(*index_);
  return dictionary;
}

std::optional<std::int64_t> KvDictionary::getInt64(std::string_view key) const {
  const auto* number = getAs<KvNumber>(key);
  return number != nullptr ? std::optional(number->asInt64()) : std::nullopt;
}

std::optional<double> KvDictionary::getDouble(std::string_view key) const {
  const auto* number = getAs<KvNumber>(key);
  return number != nullptr ? std::optional(number->asDouble()) : std::nullopt;
}

std::optional<bool> KvDictionary::getBool(std::string_view key) const {
  const auto* boolean = getAs<KvBoolean>(key);
  return boolean != nullptr ? std::optional(boolean->value()) : std::nullopt;
}

std::optional<std::string_view> KvDictionary::getString(std::string_view key) const {
  const auto* string = getAs<KvString>(key);
  return string != nullptr ? std::optional(string->view()) : std::nullopt;
}

}  // namespace tally
