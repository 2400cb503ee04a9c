// KvDictionary: a vector of entries in insertion order, with a hash index once it is large.
#include <bit>

#include "base/hash.h"
#include "kv/maker.h"
#include "kv/value.h"

namespace tally {
namespace {

constexpr std::size_t kFlatEntries = 12;  // up to here a scan beats a hash index
constexpr std::size_t kNotFound = static_cast<std::size_t>(-1);

}  // namespace

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

std::size_t KvDictionary::find(std::string_view key, std::uint32_t hash) const noexcept {
  if (!index_) {
    for (std::size_t i = 0; i < entries_.size(); ++i) {
      if (entries_[i].key->view() == key) return i;
    }
    return kNotFound;
  }
  const auto& index = *index_;
  const std::size_t mask = index.size() - 1;
  for (std::size_t slot = hash & mask; index[slot] != 0; slot = (slot + 1) & mask) {
    const Entry& entry = entries_[index[slot] - 1];
    if (entry.key->hash_ == hash && entry.key->view() == key) return index[slot] - 1;
  }
  return kNotFound;
}

std::size_t KvDictionary::find(std::string_view key) const noexcept {
  return find(key, index_ ? hashBytes(key) : 0);
}

std::size_t KvDictionary::find(const KvString& key) const noexcept {
  if (index_) return find(key.view(), key.hash_);
  for (std::size_t i = 0; i < entries_.size(); ++i) {
    const KvString* const other = entries_[i].key.get();
    if (other == &key || (other->hash_ == key.hash_ && other->view() == key.view())) return i;
  }
  return kNotFound;
}

KvObject* KvDictionary::get(const KvString& key) const noexcept {
  const std::size_t found = find(key);
  return found == kNotFound ? nullptr : entries_[found].value.get();
}

KvObject* KvDictionary::get(std::string_view key) const noexcept {
  const std::size_t found = find(key);
  return found == kNotFound ? nullptr : entries_[found].value.get();
}

void KvDictionary::rebuildIndex() {
  if (entries_.size() <= kFlatEntries) {
    index_.reset();
    return;
  }
  if (!index_) index_ = std::make_unique<std::vector<std::uint32_t>>();
  index_->assign(std::bit_ceil(entries_.size() * 2), 0);
  for (std::size_t i = 0; i < entries_.size(); ++i) addToIndex(i);
}

void KvDictionary::addToIndex(std::size_t number) {
  auto& index = *index_;
  const std::size_t mask = index.size() - 1;
  std::size_t slot = entries_[number].key->hash_ & mask;
  while (index[slot] != 0) slot = (slot + 1) & mask;
  index[slot] = static_cast<std::uint32_t>(number + 1);
}

void KvDictionary::append(KvRef<KvString> key, KvRef<KvObject> value) {
  entries_.push_back({std::move(key), std::move(value)});
  // At most three quarters full, so that a search stays short.
  const std::size_t indexed = index_ ? index_->size() : 0;
  if (entries_.size() > kFlatEntries && entries_.size() * 4 > indexed * 3) {
    rebuildIndex();
  } else if (index_) {
    addToIndex(entries_.size() - 1);
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
  for (const Entry& entry : other.entries_) set(entry.key, entry.value);
}

KvRef<KvDictionary> KvDictionary::copy(std::size_t more, KvArena* arena) const {
  auto dictionary = create(entries_.size() + more, arena);
  dictionary->entries_.appendWithinRoom(entries_);
  if (index_) dictionary->index_ = std::make_unique<std::vector<std::uint32_t>>(*index_);
  return dictionary;
}

std::optional<std::int64_t> KvDictionary::getInt64(std::string_view key) const noexcept {
  const auto* number = getAs<KvNumber>(key);
  return number != nullptr ? std::optional(number->asInt64()) : std::nullopt;
}

std::optional<double> KvDictionary::getDouble(std::string_view key) const noexcept {
  const auto* number = getAs<KvNumber>(key);
  return number != nullptr ? std::optional(number->asDouble()) : std::nullopt;
}

std::optional<bool> KvDictionary::getBool(std::string_view key) const noexcept {
  const auto* boolean = getAs<KvBoolean>(key);
  return boolean != nullptr ? std::optional(boolean->value()) : std::nullopt;
}

std::optional<std::string_view> KvDictionary::getString(std::string_view key) const noexcept {
  const auto* string = getAs<KvString>(key);
  return string != nullptr ? std::optional(string->view()) : std::nullopt;
}

}  // namespace tally
